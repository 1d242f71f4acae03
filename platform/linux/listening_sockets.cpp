#include "platform/linux/listening_sockets.h"

#include "platform/linux/unix_sockets.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <memory>
#include <mutex>
#include <set>
#include <system_error>
#include <vector>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <systemd/sd-daemon.h>

namespace typhon {

namespace {

constexpr const char* serviceDirectory = "/run/typhon";

ListeningSocket failed(std::string problem)
{
    ListeningSocket result;
    result.problem = std::move(problem);
    return result;
}

/// The descriptors that the service manager passed to this process, by name, each taken once.
class HandedOverSockets {
public:
    FileDescriptor take(const std::string& name)
    {
        const std::lock_guard lock(mutex_);
        char** names = nullptr;
        const int count = sd_listen_fds_with_names(0, &names);
        FileDescriptor result;
        for (int index = 0; index < count; ++index) {
            const int descriptor = SD_LISTEN_FDS_START + index;
            if (!result && name == names[index] && !taken_.contains(descriptor) &&
                sd_is_socket_unix(descriptor, SOCK_STREAM, 1, nullptr, 0) > 0) {
                taken_.insert(descriptor);
                ::fcntl(descriptor, F_SETFL, ::fcntl(descriptor, F_GETFL) | O_NONBLOCK);
                result = FileDescriptor(descriptor);
            }
            std::free(names[index]);
        }
        std::free(names);
        return result;
    }
    static HandedOverSockets& shared()
    {
        static HandedOverSockets sockets;
        return sockets;
    }

private:
    std::mutex mutex_;
    std::set<int> taken_;
};

bool isServiceName(const std::string& name)
{
    constexpr std::size_t longest = 200;
    return !name.empty() && name.size() <= longest && name.front() != '.' &&
           name.find('/') == std::string::npos;
}

/// Held by whoever serves the name. It says more than a socket does: a socket of a process that is gone looks
/// like that of one which is just about to listen.
FileDescriptor lockService(const std::string& path)
{
    FileDescriptor lock(::open((path + ".lock").c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (lock && ::flock(lock.get(), LOCK_EX | LOCK_NB) != 0) {
        return {};
    }
    return lock;
}

bool removeStaleSocket(const std::string& path)
{
    struct stat status = {};
    if (::lstat(path.c_str(), &status) != 0) {
        return errno == ENOENT;
    }
    return S_ISSOCK(status.st_mode) && ::unlink(path.c_str()) == 0;
}

/// Directories in which an anonymous socket may be made, the first that can be written to being used.
std::vector<std::string> privatePlaces(const RootDirectory& root)
{
    return {root.real(serviceDirectory), "/run/user/" + std::to_string(::geteuid()), "/tmp", "/dev/shm"};
}

ListeningSocket listenIn(const std::string& directory)
{
    const std::string name = "s";
    auto listening = listenAt(directory, name);
    const auto path = directory + "/" + name;
    ListeningSocket result;
    if (listening.socket) {
        result.endpoint = FileDescriptor(::open(path.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
        result.socket = std::move(listening.socket);
    }
    ::unlink(path.c_str());
    result.problem = result.endpoint             ? ""
                     : listening.problem.empty() ? std::strerror(errno)
                                                 : listening.problem;
    return result;
}

}  // namespace

std::string pathOfService(const RootDirectory& root, const std::string& name)
{
    return root.real(std::string(serviceDirectory) + "/" + name);
}

ListeningSocket listenForService(const RootDirectory& root, const std::string& name)
{
    if (!isServiceName(name)) {
        return failed("it is not the name of a service");
    }
    ListeningSocket result;
    result.socket = HandedOverSockets::shared().take(name);
    if (result.socket) {
        return result;
    }
    const auto directory = root.real(serviceDirectory);
    std::error_code error;
    std::filesystem::create_directories(directory, error);
    const auto path = pathOfService(root, name);
    result.lock = lockService(path);
    if (!result.lock) {
        result.isTaken = errno == EWOULDBLOCK;
        result.problem =
            result.isTaken ? "another process serves it" : path + ".lock: " + std::strerror(errno);
        return result;
    }
    if (!removeStaleSocket(path)) {
        return failed(path + " is in the way");
    }
    auto listening = listenAt(directory, name);
    result.socket = std::move(listening.socket);
    result.problem = std::move(listening.problem);
    result.path = path;
    return result;
}

ListeningSocket listenAnonymously(const RootDirectory& root)
{
    std::string problem = "no place for a socket";
    for (const auto& place : privatePlaces(root)) {
        std::string directory = place + "/typhon-endpoint-XXXXXX";
        if (::mkdtemp(directory.data()) == nullptr) {
            continue;
        }
        auto result = listenIn(directory);
        ::rmdir(directory.c_str());
        if (result.endpoint) {
            return result;
        }
        problem = result.problem;
    }
    return failed(problem);
}

}  // namespace typhon
