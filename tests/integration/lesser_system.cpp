// Runs a program on a system that lacks something: lesser-system WHAT PROGRAM [ARGUMENT]...
//   memory-files     memory files do not exist
//   user-namespaces  user namespaces may not be made
//   copies           neither of them
//   old-kernel       process descriptors have no inodes and say nothing, peers have no process descriptor
// A system call filter answers as such a system would.

#include <array>
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <map>
#include <string>
#include <vector>

#include <linux/filter.h>
#include <linux/sched.h>
#include <linux/seccomp.h>
#include <sys/ioctl.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

/// A call that fails; with `argument` only where that argument has all bits of `value`.
struct Missing {
    long call;
    int error;
    int argument = -1;
    std::uint32_t value = 0;
};

using PidfdInfo = std::array<char, 64>;

constexpr std::uint32_t peerPidfd = 77;
constexpr std::uint32_t pidfdInfo = _IOWR(0xFF, 11, PidfdInfo);

const Missing memoryFiles{SYS_memfd_create, ENOSYS};
const Missing userNamespaces{SYS_unshare, EPERM, 0, CLONE_NEWUSER};

const std::map<std::string, std::vector<Missing>> systems{
    {"memory-files", {memoryFiles}},
    {"user-namespaces", {userNamespaces}},
    {"copies", {memoryFiles, userNamespaces}},
    {"old-kernel",
     {{SYS_statfs, ENOSYS}, {SYS_getsockopt, ENOPROTOOPT, 2, peerPidfd}, {SYS_ioctl, ENOTTY, 1, pidfdInfo}}},
};

std::uint32_t offsetOfArgument(int index)
{
    return static_cast<std::uint32_t>(offsetof(seccomp_data, args) +
                                      static_cast<std::size_t>(index) * sizeof(std::uint64_t));
}

std::vector<sock_filter> filterOf(const std::vector<Missing>& all)
{
    constexpr std::uint32_t number = offsetof(seccomp_data, nr);
    std::vector<sock_filter> filter;
    for (const auto& missing : all) {
        const bool always = missing.argument < 0;
        filter.push_back(BPF_STMT(BPF_LD | BPF_W | BPF_ABS, number));
        filter.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, static_cast<std::uint32_t>(missing.call), 0,
                                  static_cast<std::uint8_t>(always ? 1 : 4)));
        if (!always) {
            filter.push_back(BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetOfArgument(missing.argument)));
            filter.push_back(BPF_STMT(BPF_ALU | BPF_AND | BPF_K, missing.value));
            filter.push_back(BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, missing.value, 0, 1));
        }
        filter.push_back(
            BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | static_cast<std::uint32_t>(missing.error)));
    }
    filter.push_back(BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW));
    return filter;
}

}  // namespace

int main(int argc, char** argv)
{
    const auto system = systems.find(argc > 2 ? argv[1] : "");
    if (system == systems.end()) {
        std::fputs(
            "usage: lesser-system memory-files|user-namespaces|copies|old-kernel PROGRAM [ARGUMENT]...\n",
            stderr);
        return 2;
    }
    auto filter = filterOf(system->second);
    const sock_fprog program{static_cast<unsigned short>(filter.size()), filter.data()};
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 ||
        ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) != 0) {
        std::perror("lesser-system");
        return 1;
    }
    ::execv(argv[2], argv + 2);
    std::perror(argv[2]);
    return 1;
}
