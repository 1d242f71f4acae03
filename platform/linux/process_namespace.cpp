#include "platform/linux/process_namespace.h"

#include <string_view>

#include <fcntl.h>
#include <linux/nsfs.h>
#include <sys/ioctl.h>

namespace typhon {

namespace {

/// The kernel nests process namespaces no deeper.
constexpr int maximumNesting = 32;

}  // namespace

FileDescriptor openProcessNamespace(int processDirectory)
{
    return FileDescriptor(::openat(processDirectory, "ns/pid", O_RDONLY | O_CLOEXEC));
}

bool walkOutwards(FileDescriptor at, const std::function<bool(const Inode&)>& visit)
{
    for (int level = 0; at && level <= maximumNesting; ++level) {
        const auto identity = inodeAt(at.get(), "");
        if (!identity) {
            return false;
        }
        if (visit(*identity)) {
            return true;
        }
        at = FileDescriptor(::ioctl(at.get(), NS_GET_PARENT));
    }
    return false;
}

bool isFirstOfItsNamespace(const ProcessInspection& process)
{
    const auto status = process.status();
    const std::string_view text = status ? std::string_view(*status) : std::string_view();
    // The identifiers of the process in each namespace from the daemon's inwards, separated by tabs.
    const auto line = text.find("\nNSpid:\t");
    if (line == std::string_view::npos) {
        return false;
    }
    const auto identifiers = text.substr(line + 8, text.find('\n', line + 8) - line - 8);
    return identifiers.ends_with("\t1");
}

}  // namespace typhon
