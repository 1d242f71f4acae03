#include "platform/linux/unix_sockets.h"

#include <cerrno>
#include <cstddef>
#include <cstring>
#include <optional>
#include <string_view>

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

namespace typhon {

namespace {

SocketResult problem(const std::string& what)
{
    return {{}, what + ": " + std::strerror(errno)};
}

FileDescriptor newSocket()
{
    return FileDescriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
}

std::string pathOfDescriptor(int descriptor)
{
    return "/proc/self/fd/" + std::to_string(descriptor);
}

struct Address {
    sockaddr_un address{};
    socklen_t length = 0;

    explicit Address(std::string_view path)
    {
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        length = static_cast<socklen_t>(offsetof(sockaddr_un, sun_path) + path.size() + 1);
    }
    const sockaddr* get() const { return reinterpret_cast<const sockaddr*>(&address); }
    static bool holds(std::string_view path) { return path.size() < sizeof(sockaddr_un::sun_path); }
};

SocketResult connectToAddress(const std::string& path)
{
    auto socket = newSocket();
    const Address address(path);
    if (!socket || ::connect(socket.get(), address.get(), address.length) != 0) {
        return problem("connect");
    }
    return {std::move(socket), {}};
}

/// The same socket, under a path that fits an address, for as long as `directory` is open.
std::string shortPath(const FileDescriptor& directory, const std::string& name)
{
    return pathOfDescriptor(directory.get()) + "/" + name;
}

FileDescriptor openDirectory(const std::string& path)
{
    return FileDescriptor(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
}

}  // namespace

SocketResult listenAt(const std::string& directory, const std::string& name)
{
    const auto folder = openDirectory(directory);
    if (!folder) {
        return problem(directory);
    }
    const auto full = directory + "/" + name;
    const auto path = Address::holds(full) ? full : shortPath(folder, name);
    if (!Address::holds(path)) {
        return {{}, "its name is too long"};
    }
    auto socket = newSocket();
    const Address address(path);
    if (!socket || ::bind(socket.get(), address.get(), address.length) != 0) {
        return problem("bind " + full);
    }
    // Nobody can connect before `listen`, so the mode is in place in time.
    if (::fchmodat(folder.get(), name.c_str(), 0666, 0) != 0 || ::listen(socket.get(), SOMAXCONN) != 0) {
        return problem("listen " + full);
    }
    return {std::move(socket), {}};
}

SocketResult connectToPath(const std::string& path)
{
    if (Address::holds(path)) {
        return connectToAddress(path);
    }
    const auto slash = path.rfind('/');
    const auto folder = openDirectory(path.substr(0, slash));
    if (!folder) {
        return problem(path);
    }
    const auto shorter = shortPath(folder, path.substr(slash + 1));
    return Address::holds(shorter) ? connectToAddress(shorter) : SocketResult{{}, "its name is too long"};
}

SocketResult connectToDescriptor(int descriptor)
{
    struct stat status = {};
    if (::fstat(descriptor, &status) != 0) {
        return problem("endpoint");
    }
    if (!S_ISSOCK(status.st_mode)) {
        return {{}, "the endpoint is not a socket"};
    }
    return connectToAddress(pathOfDescriptor(descriptor));
}

}  // namespace typhon
