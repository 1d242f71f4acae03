#include "fontmanager/daemon/helper_life.h"

#include "fontmanager/font_registry_wire.h"
#include "fontmanager/helper_files.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/listening_sockets.h"

#include <vector>

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr mode_t runPermissions = 0755;

std::optional<ino_t> inodeOfSocket(const RootDirectory& root)
{
    struct stat status {};
    const auto path = pathOfService(root, font_registry_wire::serviceName);
    return ::lstat(path.c_str(), &status) == 0 ? std::optional(status.st_ino) : std::nullopt;
}

}  // namespace

HelperLife::HelperLife(RootDirectory root, Options options)
    : root_(std::move(root)), options_(options), socket_(inodeOfSocket(root_))
{}

bool HelperLife::awaitName(const RootDirectory& root, std::chrono::milliseconds patience)
{
    makeDirectories(root.real(helper_files::runDirectory), runPermissions);
    const FileLock name(pathOfService(root, font_registry_wire::serviceName) + ".lock", patience);
    return !name.error();
}

std::optional<std::string> HelperLife::announce(const RootDirectory& root)
{
    if (auto error = makeDirectories(root.real(helper_files::runDirectory), runPermissions)) {
        return error;
    }
    const auto text = std::to_string(::getpid()) + "\n";
    constexpr mode_t permissions = 0644;
    return replaceFile(root.real(helper_files::processIdentifier),
                       std::vector<std::uint8_t>(text.begin(), text.end()), permissions);
}

void HelperLife::withdraw(const RootDirectory& root)
{
    ::unlink(root.real(helper_files::processIdentifier).c_str());
}

bool HelperLife::isSocketMine() const
{
    return socket_ && inodeOfSocket(root_) == socket_;
}

/// A daemon that serves under this root holds the lock of its socket.
bool HelperLife::isDaemonRunning() const
{
    const auto path = pathOfService(root_, wire::serviceName) + ".lock";
    const FileDescriptor lock(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
    return lock && ::flock(lock.get(), LOCK_SH | LOCK_NB) != 0;
}

std::optional<std::string> HelperLife::reasonToEnd(std::size_t connections,
                                                   std::chrono::steady_clock::time_point now)
{
    if (!options_.isSocketActivated && !isSocketMine()) {
        return "its socket is gone";
    }
    if (connections > 0 || (!options_.isSocketActivated && isDaemonRunning())) {
        idleSince_.reset();
        return std::nullopt;
    }
    idleSince_ = idleSince_.value_or(now);
    return now - *idleSince_ >= options_.idle ? std::optional<std::string>("nobody needs it") : std::nullopt;
}

}  // namespace typhon
