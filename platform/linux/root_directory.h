#pragma once

#include <string>
#include <string_view>

namespace typhon {

/// Where the system's logical paths lie on this machine: under a scratch folder given by `--root`, or at
/// themselves. Registry, tokens and messages carry logical paths only.
class RootDirectory {
public:
    /// `directory` is absolute, or empty for the machine's own root.
    explicit RootDirectory(std::string directory = {}) : directory_(std::move(directory))
    {
        while (!directory_.empty() && directory_.back() == '/') {
            directory_.pop_back();
        }
    }

    /// The real path of an absolute logical path. Purely textual.
    std::string real(std::string_view logicalPath) const { return directory_ + std::string(logicalPath); }
    /// The scratch folder without a final "/", or empty.
    const std::string& directory() const { return directory_; }
    bool isScratch() const { return !directory_.empty(); }

private:
    std::string directory_;
};

}  // namespace typhon
