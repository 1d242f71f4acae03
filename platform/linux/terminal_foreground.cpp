#include "platform/linux/terminal_foreground.h"

#include "platform/linux/audit_tokens.h"
#include "platform/linux/pidfd.h"
#include "platform/linux/process_inspection.h"
#include "platform/linux/process_stat.h"

#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <termios.h>

// The kernel tells the foreground process group of a terminal to the session of that terminal only, but it
// shows it in /proc/PID/stat of every process that the terminal controls. The device number found there does
// not name a terminal for sure: a sandbox can mount a pseudo-terminal file system of its own, whose terminals
// are numbered from 0 as well. So the leader of the session has to be outside of any sandbox, where all share
// one such file system. A session's number is not reused while a process is in the session, so it names its
// leader for as long as that runs; the kernel takes the terminal away from all when the leader ends.

namespace typhon {

namespace {

/// More than any sandbox nests its processes before the one that asks for fonts.
constexpr int mostGenerations = 64;

std::optional<ProcessStat> statOf(const ProcessInspection& process)
{
    const auto text = process.contents("stat", 4096);
    return text ? processStatFrom(*text) : std::nullopt;
}

std::optional<ProcessInspection> inspectNumber(pid_t number)
{
    const auto pidfd = number > 0 ? openPidfd(number) : FileDescriptor();
    return pidfd ? ProcessInspection::begin(tokenOfProcess(pidfd.get())) : std::nullopt;
}

/// Whether that session of `user` began outside of any sandbox, and has that terminal.
bool isLoginSession(pid_t session, std::uint32_t terminal, uid_t user, const ConfinementProbe& probe)
{
    const auto leader = inspectNumber(session);
    const auto stat = leader ? statOf(*leader) : std::nullopt;
    const auto owner = leader ? processOfPidfd(leader->pidfd()) : std::nullopt;
    return stat && owner && stat->session == session && stat->terminal == terminal &&
           (owner->realUser == user || owner->realUser == 0) && !probe.look(*leader).isSandboxed &&
           leader->isStillTheSame();
}

/// Where the process itself stands.
std::optional<std::uint32_t> foregroundTerminal(const ProcessInspection& process, uid_t user,
                                                const ConfinementProbe& probe)
{
    const auto stat = statOf(process);
    if (!stat || stat->terminal == 0 || stat->group <= 0 || stat->group != stat->foregroundGroup ||
        !isLoginSession(stat->session, stat->terminal, user, probe)) {
        return std::nullopt;
    }
    return stat->terminal;
}

/// The parent, if it surely was that while it was looked for.
std::optional<ProcessInspection> parentOf(const ProcessInspection& process)
{
    const auto before = statOf(process);
    auto parent = before ? inspectNumber(before->parent) : std::nullopt;
    const auto after = parent ? statOf(process) : std::nullopt;
    return after && after->parent == before->parent && process.isStillTheSame() ? std::move(parent)
                                                                                : std::nullopt;
}

/// The nearest ancestor in the host's process namespace: a process cannot get another one than the launcher
/// of its sandbox, since orphans are adopted within the namespace.
std::optional<ProcessInspection> launcherOf(const ProcessInspection& process, const ConfinementProbe& probe)
{
    auto ancestor = parentOf(process);
    for (int count = 0; ancestor && count < mostGenerations; ++count) {
        if (!probe.look(*ancestor).hasOwnProcessNamespace) {
            return ancestor->isStillTheSame() ? std::move(ancestor) : std::nullopt;
        }
        ancestor = parentOf(*ancestor);
    }
    return std::nullopt;
}

}  // namespace

std::optional<std::uint32_t> terminalOfDescriptor(int descriptor)
{
    struct stat status {};
    const int flags = ::fcntl(descriptor, F_GETFL);
    if (flags < 0 || (flags & O_PATH) != 0 || (flags & O_ACCMODE) != O_RDWR ||
        ::fstat(descriptor, &status) != 0 || !S_ISCHR(status.st_mode) || ::isatty(descriptor) != 1) {
        return std::nullopt;
    }
    // Not the device number of the file: /dev/tty has one of its own.
    unsigned int terminal = 0;
    if (::ioctl(descriptor, TIOCGDEV, &terminal) != 0 || terminal == 0) {
        return std::nullopt;
    }
    return terminal;
}

std::optional<std::uint32_t> foregroundTerminalOf(const AuditToken& token, const ConfinementProbe& probe)
{
    return inspectProcess(token, [&](const ProcessInspection& process) -> std::optional<std::uint32_t> {
        const auto own = foregroundTerminal(process, token.effectiveUser, probe);
        if (own || !probe.look(process).hasOwnProcessNamespace) {
            return own;
        }
        const auto launcher = launcherOf(process, probe);
        return launcher ? foregroundTerminal(*launcher, token.effectiveUser, probe) : std::nullopt;
    });
}

}  // namespace typhon
