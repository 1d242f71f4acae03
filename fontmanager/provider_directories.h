#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"

#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The directories of the providers' font files, each held open while somebody works in it. Everything in
/// them is reached through the open directory, and no symbolic link is followed on the way. A directory that
/// holds nothing is removed when the last one has left it. Any thread.
class ProviderDirectories {
public:
    explicit ProviderDirectories(RootDirectory root) : root_(std::move(root)) {}

    /// One user's hold on an open directory. Does not outlive the `ProviderDirectories`.
    class Lease {
    public:
        Lease(ProviderDirectories& owner, std::string name, FileDescriptor directory)
            : owner_(owner), name_(std::move(name)), directory_(std::move(directory))
        {}
        Lease(const Lease&) = delete;
        Lease& operator=(const Lease&) = delete;
        ~Lease() { owner_.leave(name_); }

        /// Owned by this.
        int descriptor() const { return directory_.get(); }
        const std::string& name() const { return name_; }

    private:
        ProviderDirectories& owner_;
        const std::string name_;
        const FileDescriptor directory_;
    };
    struct Opening {
        std::unique_ptr<Lease> lease;
        std::optional<std::string> error;
    };

    /// Opens the directory with that name, which is a provider's; makes it first when `create`.
    Opening open(const std::string& name, bool create);
    /// The names of all providers' directories, sorted.
    std::vector<std::string> names();

private:
    friend class Lease;
    void leave(const std::string& name);
    FileDescriptor openFontFiles() const;

    const RootDirectory root_;
    std::mutex mutex_;
    // Below: protected by the mutex.
    std::map<std::string, unsigned> leases_;
};

/// Flushes the names of an open directory. Null, or why it failed.
std::optional<std::string> flushOpenDirectory(int directory, const std::string& name);

}  // namespace typhon
