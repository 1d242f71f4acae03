#pragma once

#include <cstdint>
#include <vector>

#include <linux/filter.h>

namespace typhon {

/// A list of the only system calls that a process may make from now on; any other kills it at once, or fails.
/// Any call of another architecture than the one this was built for, and of the x32 convention, kills it in
/// either case. Where no architecture is known, nothing can be installed.
class SyscallFilter {
public:
    /// What an argument must be for a call to be allowed. Arguments are compared in their lower 32 bits,
    /// which is all that the kernel looks at in the arguments that are compared here.
    struct Condition {
        std::uint32_t argument;
        enum class Kind { equals, hasAll, hasNone } kind;
        std::uint32_t value;
    };

    SyscallFilter();

    /// Allows the call when all of the conditions hold. A call may be named several times.
    SyscallFilter& allow(long number, const std::vector<Condition>& conditions = {});

    /// Lets the call fail with that errno, for callers that then do it in another way.
    SyscallFilter& refuse(long number, int error);

    /// Installs it for this thread and what it starts, forever. 0 or an errno. The process must have given
    /// up new privileges before.
    int install();
    /// The same, but other calls fail as those do that the kernel does not have. For work of which it cannot
    /// be known what all the libraries try.
    int installRefusing();

private:
    int installWith(std::uint32_t otherwise);

    std::vector<sock_filter> program_;
};

}  // namespace typhon
