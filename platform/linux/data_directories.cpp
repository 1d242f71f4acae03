#include "platform/linux/data_directories.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <filesystem>
#include <mutex>
#include <set>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <linux/openat2.h>
#include <pwd.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr std::size_t mostUsers = 10'000;
constexpr uid_t firstUser = 1000;
/// What a user installed in a user's own way, and what flatpak exports for that user.
constexpr std::array usersData = {".local/share", ".local/share/flatpak/exports/share"};

std::uint64_t resolutionFor(const DataDirectory& directory)
{
    return directory.isUsers ? RESOLVE_NO_XDEV | RESOLVE_NO_MAGICLINKS : 0;
}

std::string pathBelow(const DataDirectory& directory, const std::string& path)
{
    return directory.below.empty() ? path : directory.below + "/" + path;
}

FileDescriptor openBase(const DataDirectory& directory)
{
    return FileDescriptor(::open(directory.base.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

struct Homes {
    std::set<std::string> paths;
    bool isComplete = true;
};

/// Who cannot log in has no applications, and often no home either.
bool canLogIn(const passwd& user)
{
    const std::string shell = user.pw_shell == nullptr ? "" : user.pw_shell;
    return !shell.ends_with("/nologin") && !shell.ends_with("/false");
}

/// The user database cannot be walked by two threads at once.
Homes homesOfUsers()
{
    static std::mutex walking;
    const std::lock_guard lock(walking);
    Homes homes{.paths = {}, .isComplete = false};
    ::setpwent();
    for (const auto* user = ::getpwent(); user != nullptr && homes.paths.size() < mostUsers;
         user = ::getpwent()) {
        // There is always a user 0, but not when the database could not be opened.
        homes.isComplete = homes.isComplete || user->pw_uid == 0;
        const std::string home = user->pw_dir == nullptr ? "" : user->pw_dir;
        const bool isPerson = user->pw_uid == 0 || (user->pw_uid >= firstUser && canLogIn(*user));
        if (isPerson && home.starts_with('/') && home != "/") {
            homes.paths.insert(home);
        }
    }
    ::endpwent();
    return homes;
}

Homes homesBelow(const std::string& folder)
{
    Homes homes;
    std::error_code error;
    for (const auto& entry : std::filesystem::directory_iterator(folder, error)) {
        if (homes.paths.size() < mostUsers) {
            homes.paths.insert(entry.path().string());
        }
    }
    homes.isComplete = !error || error == std::errc::no_such_file_or_directory;
    return homes;
}

}  // namespace

FileDescriptor DataDirectory::openDirectory(const std::string& path) const
{
    const auto opened = openBase(*this);
    if (!opened) {
        return FileDescriptor();
    }
    open_how how{};
    how.flags = O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NONBLOCK;
    how.resolve = resolutionFor(*this);
    const auto whole = pathBelow(*this, path);
    return FileDescriptor(
        static_cast<int>(::syscall(SYS_openat2, opened.get(), whole.c_str(), &how, sizeof how)));
}

OpenedFile DataDirectory::openFile(const std::string& path) const
{
    const auto opened = openBase(*this);
    if (!opened) {
        return {.file = {}, .status = {}, .error = errno};
    }
    return openRegularFile(pathBelow(*this, path), opened.get(), resolutionFor(*this));
}

bool DataDirectory::isAway() const
{
    std::error_code error;
    return isUsers && (std::filesystem::is_empty(base, error) || error);
}

DataDirectories dataDirectories(const RootDirectory& root)
{
    DataDirectories directories;
    for (const char* path : {"/usr/share", "/usr/local/share", "/var/lib/flatpak/exports/share"}) {
        directories.found.push_back({.base = root.real(path), .below = {}, .isUsers = false});
    }
    const auto homes = root.isScratch() ? homesBelow(root.real("/home")) : homesOfUsers();
    directories.isComplete = homes.isComplete;
    for (const auto& home : homes.paths) {
        for (const char* below : usersData) {
            directories.found.push_back({.base = home, .below = below, .isUsers = true});
        }
    }
    return directories;
}

std::optional<FileIdentity> identityOfUserDatabase(const RootDirectory& root)
{
    struct stat status {};
    const auto path = root.isScratch() ? root.real("/home") : std::string("/etc/passwd");
    if (::stat(path.c_str(), &status) != 0) {
        return std::nullopt;
    }
    const FileIdentity identity(status);
    return identity.isSettled() ? std::optional(identity) : std::nullopt;
}

}  // namespace typhon
