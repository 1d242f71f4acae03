#pragma once

#include "platform/linux/file_descriptor.h"

#include <cstdlib>
#include <stdexcept>
#include <string>

#include <fcntl.h>
#include <sys/ioctl.h>
#include <unistd.h>

namespace typhon::testing {

/// A pseudo-terminal, both ends held.
class PseudoTerminal {
public:
    PseudoTerminal() : ours(::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC))
    {
        char name[128];
        if (!ours || ::grantpt(ours.get()) != 0 || ::unlockpt(ours.get()) != 0 ||
            ::ptsname_r(ours.get(), name, sizeof name) != 0) {
            throw std::runtime_error("no pseudo-terminal");
        }
        path = name;
        theirs = FileDescriptor(::open(name, O_RDWR | O_NOCTTY | O_CLOEXEC));
    }

    /// In a child: leads a new session on this terminal, in the foreground.
    void becomeLeader() const
    {
        if (::setsid() < 0 || ::ioctl(theirs.get(), TIOCSCTTY, 0) != 0) {
            ::_exit(126);
        }
    }

    FileDescriptor ours;
    FileDescriptor theirs;
    std::string path;
};

}  // namespace typhon::testing
