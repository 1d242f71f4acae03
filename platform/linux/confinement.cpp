#include "platform/linux/confinement.h"

#include "platform/linux/mount_identifier.h"

#include <charconv>
#include <string>
#include <string_view>

#include <fcntl.h>
#include <unistd.h>

// What can be seen of a sandbox from outside: namespaces, root, seccomp filter, LSM label. A Landlock domain
// cannot be seen. Files that sandboxes describe themselves with (".flatpak-info") prove nothing, since
// anybody can put one at the root of a sandbox of his own, and are not looked at.

namespace typhon {

namespace {

/// Under `--ro-bind / /` the root is the same directory on another mount, so the mount counts.
std::optional<std::array<std::uint64_t, 3>> rootSeenFrom(int processDirectory)
{
    struct statx status;
    for (const unsigned mountId : {STATX_MNT_ID_UNIQUE, static_cast<unsigned>(STATX_MNT_ID)}) {
        if (::statx(processDirectory, "root", 0, STATX_INO | mountId, &status) != 0) {
            return std::nullopt;
        }
        if ((status.stx_mask & mountId) != 0) {
            const auto device = (std::uint64_t{status.stx_dev_major} << 32) | status.stx_dev_minor;
            return std::array<std::uint64_t, 3>{status.stx_mnt_id, device, status.stx_ino};
        }
    }
    return std::nullopt;
}

/// The inode number of a namespace, from the text of its link, "mnt:[4026531841]": that takes a third of the
/// time of looking up what the link leads to.
std::optional<std::uint64_t> namespaceOf(int processDirectory, const char* name)
{
    std::array<char, 64> buffer;
    const auto length = ::readlinkat(processDirectory, name, buffer.data(), buffer.size());
    const std::string_view text(buffer.data(), length > 0 ? static_cast<std::size_t>(length) : 0);
    const auto bracket = text.find(":[");
    std::uint64_t number = 0;
    if (bracket == std::string_view::npos || !text.ends_with(']')) {
        return std::nullopt;
    }
    const auto* end = text.data() + text.size() - 1;
    const auto parsed = std::from_chars(text.data() + bracket + 2, end, number);
    return parsed.ec == std::errc{} && parsed.ptr == end ? std::optional(number) : std::nullopt;
}

/// True when the label of an AppArmor or SELinux process leaves it unconfined.
bool isUnconfined(std::string_view label)
{
    while (!label.empty() && (label.back() == '\n' || label.back() == '\0')) {
        label.remove_suffix(1);
    }
    return label == "unconfined" || label.ends_with(" (unconfined)") ||
           label.find(":unconfined_t:") != std::string_view::npos || label.ends_with(":unconfined_t");
}

/// The value of a line of /proc/PID/status, one of the last, or empty.
std::string_view statusLine(std::string_view status, std::string_view name)
{
    const auto start = status.rfind(name);
    if (start == std::string_view::npos) {
        return {};
    }
    const auto from = start + name.size();
    return status.substr(from, status.find('\n', from) - from);
}

}  // namespace

ConfinementProbe::View ConfinementProbe::viewOf(int directory)
{
    return {namespaceOf(directory, "ns/mnt"), namespaceOf(directory, "ns/user"),
            namespaceOf(directory, "ns/pid"), rootSeenFrom(directory)};
}

ConfinementProbe::ConfinementProbe()
{
    const FileDescriptor one(::open("/proc/1", O_PATH | O_DIRECTORY | O_CLOEXEC));
    const FileDescriptor self(::open("/proc/self", O_PATH | O_DIRECTORY | O_CLOEXEC));
    host_ = viewOf(one.get());
    const bool isProcessOne = host_.isWhole();
    if (!isProcessOne) {
        host_ = viewOf(self.get());
    }
    const auto& host = isProcessOne ? one : self;
    hostProcessNamespace_ = inodeAt(host.get(), "ns/pid");
    hostRoot_ = std::make_shared<const FileDescriptor>(
        ::openat(host.get(), "root", O_PATH | O_DIRECTORY | O_CLOEXEC));
    // Without a labelling LSM the file exists and reading it fails.
    const FileDescriptor label(::openat(self.get(), "attr/current", O_RDONLY | O_CLOEXEC));
    char first = 0;
    hasLabels_ = label && ::read(label.get(), &first, 1) > 0;
}

bool ConfinementProbe::isRestricted(const ProcessInspection& process) const
{
    const auto status = process.status();
    const auto seccomp = status ? statusLine(*status, "\nSeccomp:\t") : std::string_view();
    if (seccomp != "0") {
        return true;
    }
    if (!hasLabels_) {
        return false;
    }
    const auto label = process.contents("attr/current", 4096);
    return !label || !isUnconfined(*label);
}

Confinement ConfinementProbe::look(const ProcessInspection& process) const
{
    auto& known = process.seen().confinement;
    if (!known) {
        known = examine(process);
    }
    return *known;
}

Confinement ConfinementProbe::examine(const ProcessInspection& process) const
{
    const auto view = viewOf(process.directory());
    if (!host_.isWhole() || !view.isWhole()) {
        return {};
    }
    Confinement seen;
    seen.hasOwnProcessNamespace = view.process != host_.process;
    seen.hasOwnUserNamespace = view.user != host_.user;
    seen.hasOwnRoot = view.root != host_.root;
    seen.isSandboxed = seen.hasOwnProcessNamespace || seen.hasOwnUserNamespace || view.mount != host_.mount ||
                       seen.hasOwnRoot || isRestricted(process);
    return seen;
}

std::shared_ptr<const FileDescriptor> ConfinementProbe::rootOf(const ProcessInspection& process) const
{
    return look(process).hasOwnRoot ? process.root() : hostRoot_;
}

}  // namespace typhon
