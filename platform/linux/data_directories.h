#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/root_directory.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// A folder whose `applications` and `metainfo` describe installed applications.
struct DataDirectory {
    /// Real path of a folder that the administrator answers for: the data directory, or a user's home.
    std::string base;
    /// The data directory below `base`; empty when it is `base`.
    std::string below;
    /// True when a user fills it. Nothing in it may lead onto another file system, which that user might be
    /// serving, and make a reader wait.
    bool isUsers = false;

    /// The data directory's own real path.
    std::string path() const { return below.empty() ? base : base + "/" + below; }

    /// Opens a directory or a regular file of it. `path` is relative to the data directory.
    FileDescriptor openDirectory(const std::string& path) const;
    OpenedFile openFile(const std::string& path) const;
    /// True when it is a user's and the home is not there to be looked at: gone, closed, or nothing but the
    /// empty directory onto which it is mounted at that user's next login.
    bool isAway() const;
};

struct DataDirectories {
    /// Those of the system first, in the order in which they are asked, then those of the users with a home
    /// directory, each user's own before that user's flatpaks. Under a scratch root, homes are the folders in
    /// its /home.
    std::vector<DataDirectory> found;
    /// False when the users could not be listed just now.
    bool isComplete = true;
};
DataDirectories dataDirectories(const RootDirectory& root);

/// Changes when the set of users does.
std::optional<FileIdentity> identityOfUserDatabase(const RootDirectory& root);

}  // namespace typhon
