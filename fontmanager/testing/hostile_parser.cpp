// A font-reading program whose reader does what a font file that took it over might do: the deed that the
// file names. It is confined exactly as the real one is.

#include "fontmanager/font_zygote_process.h"
#include "fontmanager/parser_confinement.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <map>
#include <new>
#include <string>
#include <utility>

#include <fcntl.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/ptrace.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {
namespace {

std::array<char, 1 << 16> contents;

long numberOfX32(long number)
{
    return number | 0x40000000;
}

/// The call of the 32-bit convention with that number (20 asks for the process's identifier).
long callOf32Bits(long number)
{
#ifdef __x86_64__
    long result = number;
    asm volatile("int $0x80" : "+a"(result) : : "memory");
    return result;
#else
    return ::syscall(SYS_getppid) + number;
#endif
}

/// By name, the things that must end it at once.
const std::map<std::string, long (*)()>& forbiddenDeeds()
{
    static const std::map<std::string, long (*)()> deeds{
        {"open", [] { return ::syscall(SYS_openat, AT_FDCWD, "/etc/passwd", O_RDONLY); }},
        {"openat2", [] { return ::syscall(SYS_openat2, AT_FDCWD, "/", nullptr, 0); }},
        {"stat", [] { return ::syscall(SYS_newfstatat, AT_FDCWD, "/etc", nullptr, 0); }},
        {"unlink", [] { return ::syscall(SYS_unlinkat, AT_FDCWD, "file", 0); }},
        {"socket", [] { return ::syscall(SYS_socket, AF_UNIX, SOCK_STREAM, 0); }},
        {"socketpair", [] { return ::syscall(SYS_socketpair, AF_UNIX, SOCK_STREAM, 0, nullptr); }},
        {"receive", [] { return ::syscall(SYS_recvmsg, zygoteControl, nullptr, 0); }},
        {"exec", [] { return ::syscall(SYS_execve, "/bin/true", nullptr, nullptr); }},
        {"execOfTheFont",
         [] { return ::syscall(SYS_execveat, readerFont, "", nullptr, nullptr, AT_EMPTY_PATH); }},
        {"fork", [] { return ::syscall(SYS_clone, SIGCHLD, nullptr, nullptr, nullptr, nullptr); }},
        {"clone3", [] { return ::syscall(SYS_clone3, nullptr, 0); }},
        {"namespace", [] { return ::syscall(SYS_unshare, CLONE_NEWUSER); }},
        {"trace", [] { return ::syscall(SYS_ptrace, PTRACE_TRACEME, 0, nullptr, nullptr); }},
        {"readMemory", [] { return ::syscall(SYS_process_vm_readv, 1, nullptr, 0, nullptr, 0, 0); }},
        {"kill", [] { return ::syscall(SYS_kill, -1, 0); }},
        {"killThread", [] { return ::syscall(SYS_tgkill, 1, 1, SIGTERM); }},
        {"queueSignal", [] { return ::syscall(SYS_rt_sigqueueinfo, 1, SIGTERM, nullptr); }},
        {"mapExecutable",
         [] {
             return ::syscall(SYS_mmap, nullptr, 4096, PROT_READ | PROT_EXEC, MAP_PRIVATE | MAP_ANONYMOUS, -1,
                              0);
         }},
        {"mapTheFont",
         [] { return ::syscall(SYS_mmap, nullptr, 4096, PROT_READ, MAP_PRIVATE, readerFont, 0); }},
        {"makeExecutable",
         [] { return ::syscall(SYS_mprotect, contents.data(), 4096, PROT_READ | PROT_EXEC); }},
        {"writeToTheFont", [] { return ::syscall(SYS_write, readerFont, "x", 1); }},
        {"writeElsewhere", [] { return ::syscall(SYS_write, STDERR_FILENO, "x", 1); }},
        {"readElsewhere", [] { return ::syscall(SYS_pread64, 2, contents.data(), 1, 0); }},
        {"seekInTheFont", [] { return ::syscall(SYS_lseek, readerFont, 0, SEEK_END); }},
        {"truncateTheFont", [] { return ::syscall(SYS_ftruncate, readerFont, 0); }},
        {"changeModeOfTheFont", [] { return ::syscall(SYS_fchmod, readerFont, 0777); }},
        {"lockTheFont", [] { return ::syscall(SYS_flock, readerFont, 2); }},
        {"duplicate", [] { return ::syscall(SYS_dup, readerFont); }},
        {"raiseLimits", [] { return ::syscall(SYS_prlimit64, 0, RLIMIT_AS, nullptr, nullptr); }},
        {"moveTheTimer", [] { return ::syscall(SYS_setitimer, ITIMER_REAL, nullptr, nullptr); }},
        {"filter", [] { return ::syscall(SYS_seccomp, 0, 0, nullptr); }},
        {"ring", [] { return ::syscall(SYS_io_uring_setup, 1, nullptr); }},
        {"bpf", [] { return ::syscall(SYS_bpf, 0, nullptr, 0); }},
        {"memoryFile", [] { return ::syscall(SYS_memfd_create, "x", 0); }},
        {"pidfd", [] { return ::syscall(SYS_pidfd_open, 1, 0); }},
        {"mount", [] { return ::syscall(SYS_fsopen, "tmpfs", 0); }},
        {"changeDirectory", [] { return ::syscall(SYS_fchdir, readerFont); }},
        {"becomeAnother", [] { return ::syscall(SYS_setuid, 0); }},
        {"x32", [] { return ::syscall(numberOfX32(SYS_getppid)); }},
        {"x32OfAnAllowedCall", [] { return ::syscall(numberOfX32(SYS_brk), 0); }},
        {"otherArchitecture", [] { return callOf32Bits(20); }},
        {"unknownCall", [] { return ::syscall(1000); }},
    };
    return deeds;
}

[[noreturn]] void talkForever()
{
    while (::write(readerAnswer, contents.data(), contents.size()) > 0) {
    }
    ::_exit(0);
}

[[noreturn]] void answerWith(const std::string& bytes)
{
    ::_exit(::write(readerAnswer, bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size()) ? 0 : 1);
}

[[noreturn]] void spin()
{
    volatile unsigned long rounds = 0;
    while (true) {
        rounds = rounds + 1;
    }
}

void eatMemory()
{
    while (true) {
        auto* block = new volatile char[1 << 20];
        for (std::size_t at = 0; at < 1 << 20; at += 4096) {
            block[at] = 1;
        }
    }
}

FontNamesReading nameOf(const std::string& name)
{
    return {.familyNames = std::map<std::string, std::string>{{"Name", name}}, .error = {}};
}

FontNamesReading doDeed(const std::string& deed, const std::string& argument)
{
    static int readings = 0;
    if (deed == "crash") {
        *static_cast<volatile char*>(::mmap(nullptr, 1, PROT_NONE, MAP_PRIVATE | MAP_ANONYMOUS, -1, 0)) = 1;
    } else if (deed == "abort") {
        std::abort();
    } else if (deed == "exit") {
        ::_exit(42);
    } else if (deed == "spin") {
        spin();
    } else if (deed == "eat") {
        eatMemory();
    } else if (deed == "talk") {
        talkForever();
    } else if (deed == "answer") {
        answerWith(argument);
    } else if (deed == "count") {
        return nameOf(std::to_string(++readings));
    } else if (deed == "environment") {
        return nameOf(environ == nullptr || *environ == nullptr ? "empty" : *environ);
    } else if (deed == "list") {
        FontNamesReading deeds{.familyNames = std::map<std::string, std::string>{}, .error = {}};
        for (const auto& [name, action] : forbiddenDeeds()) {
            deeds.familyNames->emplace(name, "forbidden");
        }
        return deeds;
    } else {
        return nameOf("survived: " + std::to_string(forbiddenDeeds().at(deed)()));
    }
    return nameOf("survived");
}

FontNamesReading readHostileFont(int descriptor, std::uint64_t, const FontLimits&)
{
    const auto size = ::pread(descriptor, contents.data(), contents.size(), 0);
    const std::string text(contents.data(), size < 0 ? 0 : static_cast<std::size_t>(size));
    const auto end = text.find(' ');
    return doDeed(text.substr(0, end), end == std::string::npos ? std::string() : text.substr(end + 1));
}

}  // namespace
}  // namespace typhon

int main()
{
    return typhon::runFontZygote(typhon::readHostileFont);
}
