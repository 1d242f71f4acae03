#pragma once

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// What the launcher needs to know of the machine's files to lay out a sandbox.
class HostFiles {
public:
    enum class Kind { missing, directory, file, symbolicLink, other };

    virtual ~HostFiles() = default;
    /// The kind of the last component itself; a symbolic link is not followed.
    virtual Kind kind(const std::string& path) const = 0;
    virtual std::string linkTarget(const std::string& path) const = 0;
    /// The names in a directory, sorted, or null when it cannot be listed.
    virtual std::optional<std::vector<std::string>> names(const std::string& directory) const = 0;
    /// The path with every symbolic link of its existing part resolved, without "." and "..".
    virtual std::string resolved(const std::string& path) const = 0;
};

/// The real ones.
class LinuxHostFiles : public HostFiles {
public:
    Kind kind(const std::string& path) const override;
    std::string linkTarget(const std::string& path) const override;
    std::optional<std::vector<std::string>> names(const std::string& directory) const override;
    std::string resolved(const std::string& path) const override;
};

}  // namespace typhon
