#include "fontmanager/parser_confinement.h"

#include "platform/linux/syscall_filter.h"

#include <cerrno>
#include <csignal>
#include <limits>

#include <linux/capability.h>
#include <linux/futex.h>
#include <linux/mount.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <unistd.h>

// The filters are what holds: they forbid every way to name a file, a socket or a process. The namespaces are
// a second wall behind them and may be missing, as in a container that permits none. What is allowed here is
// what the C library of Debian 12 calls for the work; another one shows in the tests by readers that are
// killed.

namespace typhon {

namespace {

using Kind = SyscallFilter::Condition::Kind;
using std::uint32_t;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool isSanitized = true;
#elif defined(__has_feature)
constexpr bool isSanitized = __has_feature(address_sanitizer) || __has_feature(thread_sanitizer);
#else
constexpr bool isSanitized = false;
#endif

int errorOf(long result)
{
    return result < 0 ? errno : 0;
}

int dropCapabilities()
{
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct nothing[_LINUX_CAPABILITY_U32S_3]{};
    return errorOf(::syscall(SYS_capset, &header, nothing));
}

/// An empty, read-only file system as root directory. Its mount is attached nowhere.
bool enterEmptyRoot()
{
    const int context = static_cast<int>(::syscall(SYS_fsopen, "tmpfs", FSOPEN_CLOEXEC));
    if (context < 0 || ::syscall(SYS_fsconfig, context, FSCONFIG_CMD_CREATE, nullptr, nullptr, 0) != 0) {
        return false;
    }
    const int mount = static_cast<int>(
        ::syscall(SYS_fsmount, context, FSMOUNT_CLOEXEC,
                  MOUNT_ATTR_RDONLY | MOUNT_ATTR_NOSUID | MOUNT_ATTR_NODEV | MOUNT_ATTR_NOEXEC));
    const bool isEntered = mount >= 0 && ::fchdir(mount) == 0 && ::chroot(".") == 0;
    ::close(mount);
    ::close(context);
    return isEntered;
}

void enterNamespaces()
{
    constexpr int namespaces =
        CLONE_NEWUSER | CLONE_NEWNS | CLONE_NEWNET | CLONE_NEWIPC | CLONE_NEWUTS | CLONE_NEWCGROUP;
    if (::unshare(namespaces) == 0) {
        enterEmptyRoot();
    }
}

int limit(int resource, std::uint64_t value, std::uint64_t hardValue)
{
    const rlimit limits{value, hardValue};
    return errorOf(::setrlimit(static_cast<__rlimit_resource_t>(resource), &limits));
}

int limitReader(std::uint64_t memory, uint32_t seconds)
{
    // The sanitizers reserve terabytes for their books.
    const int error = isSanitized ? 0 : limit(RLIMIT_AS, memory, memory);
    for (const int resource : {RLIMIT_NOFILE, RLIMIT_FSIZE, RLIMIT_CORE, RLIMIT_MEMLOCK, RLIMIT_MSGQUEUE}) {
        if (limit(resource, 0, 0) != 0) {
            return errno;
        }
    }
    // The hard limit would end it with a signal that says less.
    return error != 0 ? error : limit(RLIMIT_CPU, seconds, seconds + 1);
}

void allowMemory(SyscallFilter& filter)
{
    filter.allow(SYS_brk)
        .allow(SYS_mmap, {{2, Kind::hasNone, PROT_EXEC}, {3, Kind::hasAll, MAP_ANONYMOUS}})
        .allow(SYS_munmap)
        // The first exception, which is that there is no memory, says that what it needs is set up.
        .allow(SYS_futex, {{1, Kind::equals, FUTEX_WAKE_PRIVATE}})
        .allow(SYS_mremap)
        .allow(SYS_madvise);
}

/// The sanitizers' runtimes protect pages, and have locks and stacks for signals of their own.
void allowSanitizers(SyscallFilter& filter)
{
    if (!isSanitized) {
        return;
    }
    filter.allow(SYS_mprotect, {{2, Kind::hasNone, PROT_EXEC}});
    for (const long call :
         {SYS_futex, SYS_sched_yield, SYS_sigaltstack, SYS_rt_sigprocmask, SYS_rt_sigaction, SYS_gettid,
          SYS_getpid, SYS_getrlimit, SYS_clock_nanosleep, SYS_nanosleep, SYS_set_robust_list, SYS_rseq,
          SYS_sched_getaffinity, SYS_rt_sigreturn, SYS_exit, SYS_prctl}) {
        filter.allow(call);
    }
}

int installReaderFilter()
{
    SyscallFilter filter;
    filter.allow(SYS_pread64, {{0, Kind::equals, readerFont}})
        .allow(SYS_write, {{0, Kind::equals, readerAnswer}})
        // The C library's sorting asks how much memory there is.
        .allow(SYS_sysinfo)
        .allow(SYS_exit_group);
    allowMemory(filter);
    allowSanitizers(filter);
    return filter.install();
}

/// The thread sanitizer starts a thread of its own in each new process, before that is confined further.
void allowThreadOfSanitizer(SyscallFilter& filter)
{
    constexpr uint32_t thread = CLONE_VM | CLONE_FS | CLONE_FILES | CLONE_SIGHAND | CLONE_THREAD;
    if (isSanitized) {
        filter.allow(SYS_clone, {{0, Kind::hasAll, thread}})
            .refuse(SYS_clone3, ENOSYS)
            .allow(SYS_gettimeofday)
            .allow(SYS_clock_gettime);
    }
}

int installZygoteFilter()
{
    SyscallFilter filter;
    constexpr uint32_t forkOnly = CLONE_CHILD_SETTID | CLONE_CHILD_CLEARTID | SIGCHLD;
    filter.allow(SYS_pread64)
        .allow(SYS_write)
        .allow(SYS_recvmsg, {{0, Kind::equals, zygoteControl}})
        .allow(SYS_sendto, {{0, Kind::equals, zygoteControl}})
        .allow(SYS_clone, {{0, Kind::equals, forkOnly}})
        .allow(SYS_prctl, {{0, Kind::equals, PR_SET_PDEATHSIG}})
        .allow(SYS_prlimit64, {{0, Kind::equals, 0}});
    for (const long call :
         {SYS_wait4, SYS_close, SYS_dup3, SYS_close_range, SYS_setitimer, SYS_getpid, SYS_getppid,
          SYS_seccomp, SYS_set_robust_list, SYS_rt_sigprocmask, SYS_sysinfo, SYS_exit_group}) {
        filter.allow(call);
    }
    allowMemory(filter);
    allowSanitizers(filter);
    allowThreadOfSanitizer(filter);
    return filter.install();
}

}  // namespace

int confineZygote()
{
    if (::close_range(STDERR_FILENO + 1, std::numeric_limits<unsigned>::max(), 0) != 0 ||
        ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 || ::prctl(PR_SET_DUMPABLE, 0, 0, 0, 0) != 0) {
        return errno;
    }
    enterNamespaces();
    if (const int error = dropCapabilities()) {
        return error;
    }
    return installZygoteFilter();
}

int confineReader(int font, int answer, std::uint64_t memory, uint32_t seconds, int zygote)
{
    if (::dup3(font, readerFont, 0) < 0 || ::dup3(answer, readerAnswer, 0) < 0 ||
        ::close_range(readerAnswer + 1, std::numeric_limits<unsigned>::max(), 0) != 0 ||
        ::prctl(PR_SET_PDEATHSIG, SIGKILL, 0, 0, 0) != 0) {
        return errno;
    }
    // It may have ended before that.
    if (::getppid() != zygote) {
        return ESRCH;
    }
    const itimerval timer{.it_interval = {}, .it_value = {static_cast<time_t>(seconds), 0}};
    if (::setitimer(ITIMER_REAL, &timer, nullptr) != 0) {
        return errno;
    }
    if (const int error = limitReader(memory, seconds)) {
        return error;
    }
    return installReaderFilter();
}

}  // namespace typhon
