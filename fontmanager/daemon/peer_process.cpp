#include "fontmanager/daemon/peer_process.h"

#include "platform/linux/exec_generation.h"
#include "platform/linux/pidfd.h"

#include <cerrno>
#include <cstdint>
#include <optional>
#include <string>

#include <fcntl.h>
#include <sys/socket.h>

namespace typhon {

namespace {

constexpr int soPeerPidfd = 77;

FileDescriptor pidfdOfPeer(int socket, pid_t peer)
{
    int pidfd = -1;
    socklen_t length = sizeof pidfd;
    if (::getsockopt(socket, SOL_SOCKET, soPeerPidfd, &pidfd, &length) == 0) {
        return FileDescriptor(pidfd);
    }
    // Kernels before 6.5 know the number only, which may have been reused since.
    return errno == ENOPROTOOPT ? openPidfd(peer) : FileDescriptor();
}

std::optional<std::uint64_t> instanceOf(int pidfd, pid_t process)
{
    if (kernelHasProcessInodes()) {
        return inodeOfPidfd(pidfd);
    }
    const auto path = "/proc/" + std::to_string(process);
    const FileDescriptor directory(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    return startTime(directory.get());
}

}  // namespace

AuditToken instanceOfPeer(int socket)
{
    ucred credentials{};
    socklen_t length = sizeof credentials;
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0 || credentials.pid <= 0) {
        return {};
    }
    const auto pidfd = pidfdOfPeer(socket, credentials.pid);
    const auto instance = pidfd ? instanceOf(pidfd.get(), credentials.pid) : std::nullopt;
    if (!instance) {
        return {};
    }
    return {.version = 1,
            .processIdentifier = credentials.pid,
            .processInstance = *instance,
            .effectiveUser = credentials.uid,
            .bootEpoch = bootEpoch()};
}

FileDescriptor pidfdOfInstance(const AuditToken& token)
{
    if (token.processIdentifier <= 0) {
        return {};
    }
    auto pidfd = openPidfd(token.processIdentifier);
    return pidfd && instanceOf(pidfd.get(), token.processIdentifier) == token.processInstance
               ? std::move(pidfd)
               : FileDescriptor();
}

}  // namespace typhon
