#include "platform/linux/audit_tokens.h"

#include "platform/linux/exec_generation.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/pidfd.h"

#include <cerrno>
#include <optional>
#include <string>

#include <fcntl.h>
#include <sys/socket.h>

namespace typhon {

namespace {

constexpr int soPeerPidfd = 77;

/// Versions of the token: what `processInstance` holds.
constexpr std::uint32_t versionInode = 1;
constexpr std::uint32_t versionStartTime = 2;

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

/// Fills the instance and its kind; false when it cannot be told.
bool setInstance(AuditToken& token, int pidfd, int directory)
{
    const auto instance = kernelHasProcessInodes() ? inodeOfPidfd(pidfd) : startTime(directory);
    token.version = kernelHasProcessInodes() ? versionInode : versionStartTime;
    token.processInstance = instance.value_or(0);
    return instance.has_value();
}

}  // namespace

AuditToken tokenOfProcess(int pidfd)
{
    const auto process = processOfPidfd(pidfd);
    if (!process) {
        return {};
    }
    const auto path = "/proc/" + std::to_string(process->processIdentifier);
    const FileDescriptor directory(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    AuditToken token{.processIdentifier = process->processIdentifier,
                     .effectiveUser = process->effectiveUser,
                     .bootEpoch = bootEpoch()};
    token.execGeneration = execGeneration(token.processIdentifier, directory.get());
    if (token.execGeneration == 0 || !setInstance(token, pidfd, directory.get())) {
        return {};
    }
    // Only a process that is still there surely had that number, and so that directory, all the time.
    const auto after = processOfPidfd(pidfd);
    return after && after->processIdentifier == process->processIdentifier ? token : AuditToken{};
}

AuditToken tokenOfPeer(int socket)
{
    ucred credentials{};
    socklen_t length = sizeof credentials;
    if (::getsockopt(socket, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0 || credentials.pid <= 0) {
        return {};
    }
    const auto pidfd = pidfdOfPeer(socket, credentials.pid);
    auto token = pidfd ? tokenOfProcess(pidfd.get()) : AuditToken{};
    if (token.processIdentifier != credentials.pid) {
        return {};
    }
    token.effectiveUser = credentials.uid;
    return token;
}

}  // namespace typhon
