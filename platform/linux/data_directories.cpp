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

/// The user database cannot be walked by two threads at once.
std::set<std::string> homesOfUsers()
{
    static std::mutex walking;
    const std::lock_guard lock(walking);
    std::set<std::string> homes;
    ::setpwent();
    for (const auto* user = ::getpwent(); user != nullptr && homes.size() < mostUsers; user = ::getpwent()) {
        const std::string home = user->pw_dir == nullptr ? "" : user->pw_dir;
        const bool isPerson = user->pw_uid == 0 || user->pw_uid >= firstUser;
        if (isPerson && home.starts_with('/') && home != "/") {
            homes.insert(home);
        }
    }
    ::endpwent();
    return homes;
}

std::set<std::string> homesBelow(const std::string& folder)
{
    std::set<std::string> homes;
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator(folder, ignored)) {
        if (homes.size() < mostUsers) {
            homes.insert(entry.path().string());
        }
    }
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

std::vector<DataDirectory> dataDirectories(const RootDirectory& root)
{
    std::vector<DataDirectory> directories;
    for (const char* path : {"/usr/share", "/usr/local/share", "/var/lib/flatpak/exports/share"}) {
        directories.push_back({.base = root.real(path), .below = {}, .isUsers = false});
    }
    for (const auto& home : root.isScratch() ? homesBelow(root.real("/home")) : homesOfUsers()) {
        for (const char* below : usersData) {
            directories.push_back({.base = home, .below = below, .isUsers = true});
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
