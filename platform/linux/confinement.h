#pragma once

#include "platform/linux/inode.h"
#include "platform/linux/process_inspection.h"

#include <array>
#include <cstdint>
#include <optional>

namespace typhon {

/// What holds a process in.
struct Confinement {
    /// True as well when it cannot be told.
    bool isSandboxed = true;
    /// It lives in another process namespace than the host's, or that cannot be told.
    bool hasOwnProcessNamespace = true;
    /// It lives in another user namespace than the host's, or that cannot be told.
    bool hasOwnUserNamespace = true;
};

/// Tells whether processes are confined, by comparing their namespaces and root with those of process 1 (with
/// the daemon's own where process 1 cannot be read), and by their seccomp filter and LSM label. Nothing is
/// remembered: a process may confine itself at any time, and a look costs about as much as checking that the
/// process is the same. Any thread.
class ConfinementProbe {
public:
    /// Looks at the host.
    ConfinementProbe();

    /// The confinement of the process, now. The caller checks afterwards that it still is the same process.
    Confinement look(const ProcessInspection& process) const;

    /// The process namespace of the host.
    const std::optional<Inode>& hostProcessNamespace() const { return host_.process; }
    /// True when the host was taken from process 1.
    bool isComparedWithProcessOne() const { return isProcessOne_; }

private:
    /// The namespaces and the root a process sees; members that cannot be read are null.
    struct View {
        std::optional<Inode> mount;
        std::optional<Inode> user;
        std::optional<Inode> process;
        /// Mount, device and inode of the root directory.
        std::optional<std::array<std::uint64_t, 3>> root;
        bool isWhole() const { return mount && user && process && root; }
    };
    static View viewOf(int processDirectory);
    bool isRestricted(const ProcessInspection& process) const;

    View host_;
    bool isProcessOne_ = false;
    bool hasLabels_ = false;
};

}  // namespace typhon
