#include "platform/linux/syscall_filter.h"

#include <bit>
#include <cerrno>
#include <cstddef>

#include <linux/audit.h>
#include <linux/seccomp.h>
#include <sys/syscall.h>
#include <unistd.h>

// The program of the filter looks at the architecture, then goes through the allowed calls one after another;
// the lists here are short. Each allowed call is a block that begins and ends with the number of the call as
// the current value, so that the next block can compare it.

namespace typhon {

namespace {

#if defined(__x86_64__) && !defined(__ILP32__)
constexpr std::uint32_t architecture = AUDIT_ARCH_X86_64;
#elif defined(__aarch64__) && !defined(__ILP32__)
constexpr std::uint32_t architecture = AUDIT_ARCH_AARCH64;
#else
constexpr std::uint32_t architecture = 0;
#endif

constexpr std::uint32_t firstX32Call = 0x40000000;
static_assert(std::endian::native == std::endian::little, "the lower half of an argument comes first");

sock_filter load(std::size_t offset)
{
    return BPF_STMT(BPF_LD | BPF_W | BPF_ABS, static_cast<std::uint32_t>(offset));
}

sock_filter loadArgument(std::uint32_t index)
{
    return load(offsetof(seccomp_data, args) + index * sizeof(seccomp_data::args[0]));
}

sock_filter jump(int kind, std::uint32_t value, std::size_t whenTrue, std::size_t whenFalse)
{
    return BPF_JUMP(static_cast<std::uint16_t>(BPF_JMP | kind | BPF_K), value,
                    static_cast<std::uint8_t>(whenTrue), static_cast<std::uint8_t>(whenFalse));
}

sock_filter answer(std::uint32_t action)
{
    return BPF_STMT(BPF_RET | BPF_K, action);
}

sock_filter loadNumber()
{
    return load(offsetof(seccomp_data, nr));
}

/// Whether the loaded argument meets the condition; what follows is skipped by `otherwise` when not.
sock_filter test(const SyscallFilter::Condition& condition, std::size_t otherwise)
{
    return condition.kind == SyscallFilter::Condition::Kind::hasNone
               ? jump(BPF_JSET, condition.value, otherwise, 0)
               : jump(BPF_JEQ, condition.value, 0, otherwise);
}

}  // namespace

SyscallFilter::SyscallFilter()
    : program_{load(offsetof(seccomp_data, arch)), jump(BPF_JEQ, architecture, 1, 0),
               answer(SECCOMP_RET_KILL_PROCESS),   loadNumber(),
               jump(BPF_JGE, firstX32Call, 0, 1),  answer(SECCOMP_RET_KILL_PROCESS)}
{}

SyscallFilter& SyscallFilter::allow(long number, const std::vector<Condition>& conditions)
{
    // From the end: the reload of the number, the permission, then the conditions from last to first.
    std::vector<sock_filter> reversed{loadNumber(), answer(SECCOMP_RET_ALLOW)};
    for (auto condition = conditions.rbegin(); condition != conditions.rend(); ++condition) {
        reversed.push_back(test(*condition, reversed.size() - 1));
        if (condition->kind == Condition::Kind::hasAll) {
            reversed.push_back(BPF_STMT(BPF_ALU | BPF_AND | BPF_K, condition->value));
        }
        reversed.push_back(loadArgument(condition->argument));
    }
    reversed.push_back(jump(BPF_JEQ, static_cast<std::uint32_t>(number), 0, reversed.size()));
    program_.insert(program_.end(), reversed.rbegin(), reversed.rend());
    return *this;
}

SyscallFilter& SyscallFilter::refuse(long number, int error)
{
    program_.push_back(jump(BPF_JEQ, static_cast<std::uint32_t>(number), 0, 1));
    program_.push_back(answer(SECCOMP_RET_ERRNO | static_cast<std::uint32_t>(error)));
    return *this;
}

int SyscallFilter::install()
{
    return installWith(SECCOMP_RET_KILL_PROCESS);
}

int SyscallFilter::installRefusing()
{
    return installWith(SECCOMP_RET_ERRNO | ENOSYS);
}

int SyscallFilter::installWith(std::uint32_t otherwise)
{
    if (architecture == 0) {
        return ENOSYS;
    }
    auto whole = program_;
    whole.push_back(answer(otherwise));
    const sock_fprog program{static_cast<unsigned short>(whole.size()), whole.data()};
    return ::syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, 0, &program) == 0 ? 0 : errno;
}

}  // namespace typhon
