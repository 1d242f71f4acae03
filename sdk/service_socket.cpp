#include "sdk/service_socket.h"

#include "sdk/client_errors.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace typhon {

namespace {

ClientError connectionError(int number, const std::string& path)
{
    if (number == ENOENT || number == ENOTDIR || number == ECONNREFUSED) {
        return clientError(client_errors::serviceUnknown, "no service answers at " + path);
    }
    return systemError(number, "cannot connect to " + path);
}

/// 0, or the errno of a failed connect. `path` fits an address.
int connectShort(int socket, const std::string& path)
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), path.size());
    int outcome = 0;
    do {
        outcome = ::connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address);
    } while (outcome < 0 && errno == EINTR);
    return outcome < 0 ? errno : 0;
}

constexpr std::size_t longestAddress = sizeof(sockaddr_un::sun_path) - 1;

/// Connects by way of the socket's open directory, since an address holds 107 bytes only.
int connectLong(int socket, const std::string& path)
{
    const std::filesystem::path whole(path);
    const FileDescriptor directory(::open(whole.parent_path().c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    if (!directory) {
        return errno;
    }
    const auto address = "/proc/self/fd/" + std::to_string(directory.get()) + "/" + whole.filename().string();
    return address.size() > longestAddress ? ENAMETOOLONG : connectShort(socket, address);
}

}  // namespace

RootDirectory chosenRoot(const std::optional<std::string>& chosen)
{
    const char* inherited = ::secure_getenv("TYPHON_ROOT");
    const auto directory = chosen ? *chosen : std::string(inherited == nullptr ? "" : inherited);
    if (directory.empty() || directory == "/") {
        return RootDirectory{};
    }
    return RootDirectory(std::filesystem::absolute(directory).lexically_normal().string());
}

std::string serviceSocketPath(const RootDirectory& root, std::string_view serviceName)
{
    return root.real("/run/typhon/" + std::string(serviceName));
}

ClientResult<FileDescriptor> connectToSocket(const std::string& path)
{
    FileDescriptor connection(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!connection) {
        return systemError(errno, "cannot make a socket");
    }
    const int number = path.size() > longestAddress ? connectLong(connection.get(), path)
                                                    : connectShort(connection.get(), path);
    if (number != 0) {
        return connectionError(number, path);
    }
    return connection;
}

}  // namespace typhon
