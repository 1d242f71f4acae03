#include "tools/downloader/confinement.h"

#include "platform/linux/file_descriptor.h"
#include "platform/linux/syscall_filter.h"

#include <array>
#include <cerrno>
#include <initializer_list>
#include <limits>

#include <fcntl.h>
#include <grp.h>
#include <linux/capability.h>
#include <linux/landlock.h>
#include <pwd.h>
#include <sched.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

// The walls, from the inside out: the filter of system calls, which leaves no way to start a program, to send
// a signal or to reach the sockets of this machine's services; Landlock, which leaves nothing to be written
// and little to be read; and a user of its own. What the libraries try beyond the list fails as on a kernel
// that does not have it, which they are made for: that way another version of them still works.

namespace typhon {

namespace {

using Kind = SyscallFilter::Condition::Kind;
using std::uint32_t;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool isSanitized = true;
#else
constexpr bool isSanitized = false;
#endif

constexpr std::uint64_t mostMemory = std::uint64_t{1} << 30;
constexpr std::uint64_t mostDescriptors = 64;
constexpr uid_t nobody = 65534;

bool limit(int resource, std::uint64_t value)
{
    const rlimit limits{value, value};
    return ::setrlimit(static_cast<__rlimit_resource_t>(resource), &limits) == 0;
}

bool limitResources(const DownloadLimits& limits)
{
    constexpr int least = 19;
    constexpr int less = 5;
    ::setpriority(PRIO_PROCESS, 0, limits.isPatient ? least : less);
    // The sanitizers reserve terabytes for their books.
    return (isSanitized || limit(RLIMIT_AS, mostMemory)) && limit(RLIMIT_NOFILE, mostDescriptors) &&
           limit(RLIMIT_FSIZE, limits.fileBytes) && limit(RLIMIT_MEMLOCK, 0) && limit(RLIMIT_MSGQUEUE, 0) &&
           limit(RLIMIT_CPU, limits.processorSeconds);
}

/// Root has no business with the network. In a user namespace there may be nobody else to become.
bool becomeSomebodyElse()
{
    if (::geteuid() != 0) {
        return true;
    }
    const auto* entry = ::getpwnam("typhon-assets");
    const uid_t user = entry != nullptr ? entry->pw_uid : nobody;
    const gid_t group = entry != nullptr ? entry->pw_gid : nobody;
    const bool isDone = ::setgroups(0, nullptr) == 0 && ::setresgid(group, group, group) == 0 &&
                        ::setresuid(user, user, user) == 0;
    return isDone || errno == EPERM || errno == EINVAL;
}

bool dropCapabilities()
{
    ::prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_CLEAR_ALL, 0, 0, 0);
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct nothing[_LINUX_CAPABILITY_U32S_3]{};
    return ::syscall(SYS_capset, &header, nothing) == 0;
}

void allowReading(int rules, const char* path)
{
    const FileDescriptor place(::open(path, O_PATH | O_CLOEXEC));
    struct stat status {};
    if (!place || ::fstat(place.get(), &status) != 0) {
        return;
    }
    landlock_path_beneath_attr rule{};
    rule.allowed_access = LANDLOCK_ACCESS_FS_READ_FILE |
                          (S_ISDIR(status.st_mode) ? LANDLOCK_ACCESS_FS_READ_DIR : std::uint64_t{0});
    rule.parent_fd = place.get();
    ::syscall(SYS_landlock_add_rule, rules, LANDLOCK_RULE_PATH_BENEATH, &rule, 0);
}

/// Everything is forbidden that the oldest version of Landlock knows, but for reading in these places.
bool restrictFiles()
{
    landlock_ruleset_attr handled{};
    handled.handled_access_fs = (LANDLOCK_ACCESS_FS_MAKE_SYM << 1U) - 1;
    const FileDescriptor rules(static_cast<int>(
        ::syscall(SYS_landlock_create_ruleset, &handled, sizeof handled.handled_access_fs, 0)));
    if (!rules) {
        return errno == ENOSYS || errno == EOPNOTSUPP;
    }
    for (const char* path : {"/etc/ssl",
                             "/etc/pki",
                             "/etc/ca-certificates",
                             "/etc/crypto-policies",
                             "/etc/resolv.conf",
                             "/etc/hosts",
                             "/etc/nsswitch.conf",
                             "/etc/host.conf",
                             "/etc/gai.conf",
                             "/etc/services",
                             "/etc/localtime",
                             "/etc/ld.so.cache",
                             "/usr/lib",
                             "/usr/lib64",
                             "/lib",
                             "/lib64",
                             "/usr/share/ca-certificates",
                             "/usr/local/share/ca-certificates",
                             "/usr/share/pki",
                             "/run/systemd/resolve",
                             "/run/resolvconf",
                             "/run/NetworkManager/resolv.conf",
                             "/dev/urandom",
                             "/dev/null",
                             "/proc/sys/crypto",
                             "/proc/self",
                             "/sys/devices/system/cpu"}) {
        allowReading(rules.get(), path);
    }
    return ::syscall(SYS_landlock_restrict_self, rules.get(), 0) == 0;
}

void allowCalls(SyscallFilter& filter, std::initializer_list<long> calls)
{
    for (const long call : calls) {
        filter.allow(call);
    }
}

void allowWork(SyscallFilter& filter)
{
    allowCalls(filter, {SYS_brk,
                        SYS_mmap,
                        SYS_munmap,
                        SYS_mremap,
                        SYS_mprotect,
                        SYS_madvise,
                        SYS_futex,
                        SYS_exit,
                        SYS_exit_group,
                        SYS_rt_sigaction,
                        SYS_rt_sigprocmask,
                        SYS_rt_sigreturn,
                        SYS_sigaltstack,
                        SYS_restart_syscall,
                        SYS_sched_yield,
                        SYS_sched_getaffinity,
                        SYS_set_robust_list,
                        SYS_rseq,
                        SYS_set_tid_address,
                        SYS_getpid,
                        SYS_gettid,
                        SYS_getuid,
                        SYS_geteuid,
                        SYS_getgid,
                        SYS_getegid,
                        SYS_getrandom,
                        SYS_clock_gettime,
                        SYS_clock_getres,
                        SYS_gettimeofday,
                        SYS_clock_nanosleep,
                        SYS_nanosleep,
                        SYS_uname,
                        SYS_sysinfo});
    filter.allow(SYS_prctl, {{0, Kind::equals, PR_SET_NAME}})
        .allow(SYS_prlimit64, {{0, Kind::equals, 0}})
        // Threads, and no processes. The newer call shows its arguments to no filter.
        .allow(SYS_clone,
               {{0, Kind::hasAll, CLONE_VM | CLONE_FS | CLONE_FILES | CLONE_SIGHAND | CLONE_THREAD}});
}

void allowFiles(SyscallFilter& filter)
{
    allowCalls(filter,
               {SYS_read,       SYS_readv,      SYS_pread64, SYS_write,      SYS_writev, SYS_lseek,
                SYS_close,      SYS_openat,     SYS_fstat,   SYS_newfstatat, SYS_statx,  SYS_faccessat,
                SYS_faccessat2, SYS_readlinkat, SYS_getcwd,  SYS_getdents64, SYS_fcntl,  SYS_ftruncate,
                SYS_pipe2,      SYS_eventfd2,   SYS_ppoll,   SYS_pselect6});
#if defined(__x86_64__)
    allowCalls(filter, {SYS_open, SYS_stat, SYS_lstat, SYS_access, SYS_readlink, SYS_poll, SYS_select,
                        SYS_pipe, SYS_time, SYS_arch_prctl});
#endif
    filter.allow(SYS_ioctl, {{1, Kind::equals, FIONBIO}}).allow(SYS_ioctl, {{1, Kind::equals, FIONREAD}});
}

void allowNetwork(SyscallFilter& filter)
{
    filter.allow(SYS_socket, {{0, Kind::equals, AF_INET}}).allow(SYS_socket, {{0, Kind::equals, AF_INET6}});
    // A pair is between threads of this process.
    allowCalls(filter,
               {SYS_socketpair, SYS_connect, SYS_getsockname, SYS_getpeername, SYS_getsockopt, SYS_setsockopt,
                SYS_sendto, SYS_sendmsg, SYS_sendmmsg, SYS_recvfrom, SYS_recvmsg, SYS_shutdown});
}

}  // namespace

bool shedInheritance()
{
    return ::close_range(STDERR_FILENO + 1, std::numeric_limits<unsigned>::max(), 0) == 0 &&
           ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 && ::prctl(PR_SET_DUMPABLE, 0, 0, 0, 0) == 0 &&
           limit(RLIMIT_CORE, 0);
}

bool confineDownload(const DownloadLimits& limits)
{
    // Landlock opens the places it allows, as the user that this still is.
    if (!limitResources(limits) || !restrictFiles() || !becomeSomebodyElse() || !dropCapabilities() ||
        ::prctl(PR_SET_DUMPABLE, 0, 0, 0, 0) != 0) {
        return false;
    }
    SyscallFilter filter;
    allowWork(filter);
    allowFiles(filter);
    allowNetwork(filter);
    return filter.installRefusing() == 0;
}

}  // namespace typhon
