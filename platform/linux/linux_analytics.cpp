#include "platform/linux/linux_analytics.h"

#include "platform/linux/file_descriptor.h"

#include <chrono>
#include <cstddef>
#include <cstring>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

// The journal's socket takes datagrams of lines. It is written to directly rather than through libsystemd,
// which knows one socket only and does not say whether anybody reads it.
//
// Building and writing an event takes a good part of the time that a request for fonts takes altogether, and
// waking another thread for it would take the processor from the one that is about to answer. So a timer has
// it done.

namespace typhon {

namespace {

constexpr std::chrono::milliseconds aMoment(10);

bool isThere(const std::string& path)
{
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 && S_ISSOCK(status.st_mode);
}

std::string readBootIdentifier()
{
    const FileDescriptor file(::open("/proc/sys/kernel/random/boot_id", O_RDONLY | O_CLOEXEC));
    char text[64];
    const auto length = file ? ::read(file.get(), text, sizeof text) : 0;
    std::string identifier;
    for (const char c : std::string_view(text, static_cast<std::size_t>(length > 0 ? length : 0))) {
        identifier += c == '-' || c == '\n' ? std::string() : std::string(1, c);
    }
    return identifier;
}

/// The boot, as the journal names it.
const std::string& bootIdentifier()
{
    static const auto identifier = readBootIdentifier();
    return identifier;
}

}  // namespace

LinuxAnalytics::LinuxAnalytics(const RootDirectory& root, Log& log, WorkQueues& queues, std::string socket)
    : log_(log), isScratch_(root.isScratch()),
      destination_(root.isScratch() ? root.real(eventsPath) : std::move(socket)),
      queue_(queues.createSerialQueue("com.vorlan.typhond.analytics")),
      timer_(queues.createTimer(*queue_, [this] { collect(); }))
{}

void LinuxAnalytics::sendEventLazily(std::string name, std::function<PropertyList()> builder)
{
    bool isFirst = false;
    {
        const std::lock_guard lock(mutex_);
        isFirst = offers_.empty();
        offers_.push_back({std::move(name), std::move(builder)});
    }
    if (isFirst) {
        timer_->schedule(aMoment, aMoment);
    }
}

void LinuxAnalytics::collect()
{
    std::vector<Offer> offers;
    {
        const std::lock_guard lock(mutex_);
        offers.swap(offers_);
    }
    for (const auto& offer : offers) {
        if (isCollecting()) {
            write(eventFields(offer.name, offer.builder()));
        }
    }
}

void LinuxAnalytics::write(const EventFields& fields)
{
    if (isScratch_) {
        // An empty line ends an exported entry.
        writeToFile("_BOOT_ID=" + bootIdentifier() + "\n" + eventText(fields) + "\n");
    } else {
        writeToJournal(eventText(fields) + "SYSLOG_IDENTIFIER=typhond\n");
    }
}

bool LinuxAnalytics::isCollecting()
{
    return isScratch_ ? hasRoomInFile() : isThere(destination_);
}

bool LinuxAnalytics::hasRoomInFile()
{
    struct stat status {};
    if (::stat(destination_.c_str(), &status) != 0 || status.st_size < largestFile) {
        return true;
    }
    if (!std::exchange(isFull_, true)) {
        TYLog_Error(log_, destination_ + " is full: no more analytics events are kept");
    }
    return false;
}

void LinuxAnalytics::writeToFile(const std::string& text)
{
    const FileDescriptor file(
        ::open(destination_.c_str(), O_WRONLY | O_APPEND | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!file || ::write(file.get(), text.data(), text.size()) != static_cast<ssize_t>(text.size())) {
        TYLog_Error(log_, "an analytics event could not be written to " + destination_);
    }
}

void LinuxAnalytics::writeToJournal(const std::string& text)
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    destination_.copy(address.sun_path, sizeof address.sun_path - 1);
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!socket || ::sendto(socket.get(), text.data(), text.size(), MSG_NOSIGNAL,
                            reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0) {
        TYLog_Error(log_, "an analytics event did not reach the journal");
    }
}

}  // namespace typhon
