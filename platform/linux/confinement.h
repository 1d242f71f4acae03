#pragma once

#include "platform/linux/inode.h"
#include "platform/linux/message_looks.h"
#include "platform/linux/process_inspection.h"

#include <array>
#include <cstdint>
#include <optional>

namespace typhon {

/// Tells whether processes are confined, by comparing their namespaces and root with those of process 1 (with
/// the daemon's own where process 1 cannot be read), and by their seccomp filter and LSM label. Nothing is
/// remembered beyond the message at hand: a process may confine itself at any time. Any thread.
class ConfinementProbe {
public:
    /// Looks at the host.
    ConfinementProbe();

    /// The confinement of the process, now, or at an earlier look of the same message. The caller checks
    /// afterwards that it still is the same process.
    Confinement look(const ProcessInspection& process) const;

    /// The root directory of the process, as an `O_PATH` descriptor; none if that cannot be opened. The
    /// host's, which is held open, where the process has none of its own.
    std::shared_ptr<const FileDescriptor> rootOf(const ProcessInspection& process) const;

    /// The process namespace of the host.
    const std::optional<Inode>& hostProcessNamespace() const { return hostProcessNamespace_; }

private:
    /// The namespaces and the root a process sees; members that cannot be read are null. Namespaces are told
    /// apart by their inode numbers: they all live on one file system.
    struct View {
        std::optional<std::uint64_t> mount;
        std::optional<std::uint64_t> user;
        std::optional<std::uint64_t> process;
        /// Mount, device and inode of the root directory.
        std::optional<std::array<std::uint64_t, 3>> root;
        bool isWhole() const { return mount && user && process && root; }
    };
    static View viewOf(int processDirectory);
    bool isRestricted(const ProcessInspection& process) const;

    Confinement examine(const ProcessInspection& process) const;

    View host_;
    std::optional<Inode> hostProcessNamespace_;
    std::shared_ptr<const FileDescriptor> hostRoot_;
    bool hasLabels_ = false;
};

}  // namespace typhon
