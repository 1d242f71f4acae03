#include "platform/linux/opened_bus.h"

#include "platform/linux/bus_message.h"

#include <cerrno>
#include <cstdint>
#include <string_view>

#include <fcntl.h>
#include <sys/socket.h>

namespace typhon {

namespace {

constexpr std::string_view plainHandshake("\0AUTH ANONYMOUS 61\r\nBEGIN\r\n", 27);
constexpr std::string_view handshakeWithDescriptors("\0AUTH ANONYMOUS 61\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n",
                                                    46);

bool makePair(FileDescriptor& first, FileDescriptor& second)
{
    int pair[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0, pair) != 0) {
        return false;
    }
    first = FileDescriptor(pair[0]);
    second = FileDescriptor(pair[1]);
    return true;
}

}  // namespace

int OpenedBus::open(bool withDescriptors)
{
    FileDescriptor near;
    if (!makePair(near, far_)) {
        return -errno;
    }
    sd_bus* bus = nullptr;
    int result = sd_bus_new(&bus);
    bus_.reset(bus);
    if (result >= 0) {
        result = sd_bus_set_fd(bus, near.get(), near.get());
    }
    if (result >= 0) {
        socket_ = near.release();
        result = begin(withDescriptors);
    }
    return result;
}

int OpenedBus::begin(bool withDescriptors)
{
    const auto handshake = withDescriptors ? handshakeWithDescriptors : plainHandshake;
    if (::send(far_.get(), handshake.data(), handshake.size(), MSG_NOSIGNAL) !=
        static_cast<ssize_t>(handshake.size())) {
        return -EIO;
    }
    sd_bus_negotiate_fds(bus_.get(), withDescriptors ? 1 : 0);
    sd_id128_t identifier;
    sd_id128_randomize(&identifier);
    sd_bus_set_server(bus_.get(), 1, identifier);
    sd_bus_set_anonymous(bus_.get(), 1);
    int result = sd_bus_start(bus_.get());
    constexpr int maximumSteps = 16;
    for (int step = 0; step < maximumSteps && result >= 0 && sd_bus_is_ready(bus_.get()) <= 0; ++step) {
        result = sd_bus_process(bus_.get(), nullptr);
    }
    return result < 0 ? result : sd_bus_is_ready(bus_.get()) > 0 ? 0 : -EPROTO;
}

int OpenedBus::moveOnto(FileDescriptor socket)
{
    if (::dup3(socket.get(), socket_, O_CLOEXEC) < 0) {
        return -errno;
    }
    far_ = FileDescriptor();
    return sd_bus_add_filter(bus_.get(), nullptr, sawMessage, this);
}

int OpenedBus::sawMessage(sd_bus_message*, void* bus, sd_bus_error*)
{
    static_cast<OpenedBus*>(bus)->sawMessage_ = true;
    return 0;
}

int OpenedBus::readMessage(sd_bus_message** message)
{
    std::uint64_t queuedBefore = 0;
    std::uint64_t queuedAfter = 0;
    sd_bus_get_n_queued_write(bus_.get(), &queuedBefore);
    sawMessage_ = false;
    const int result = sd_bus_process(bus_.get(), message);
    if (result < 0) {
        return result;
    }
    sd_bus_get_n_queued_write(bus_.get(), &queuedAfter);
    if (!sawMessage_) {
        return queuedAfter < queuedBefore ? 0 : -EBADMSG;
    }
    return 1;
}

int OpenedBus::writeOnly()
{
    // sd-bus writes what it can, and then takes a message: one that waits in its own queue rather than one
    // from the socket. So a message of our own is put there, and when it comes out there is nothing more to
    // write.
    sd_bus_message* raw = nullptr;
    int result = sd_bus_message_new_signal(bus_.get(), &raw, "/", "nothing.to", "Read");
    const BusMessage ours(raw);
    if (result >= 0) {
        result = sd_bus_message_seal(raw, 1, 0);
    }
    if (result >= 0) {
        result = sd_bus_enqueue_for_read(bus_.get(), raw);
    }
    sd_bus_message* taken = nullptr;
    while (result >= 0 && taken == nullptr) {
        result = sd_bus_process(bus_.get(), &taken);
    }
    sd_bus_message_unref(taken);
    return result;
}

void OpenedBus::close()
{
    bus_.reset();
    far_ = FileDescriptor();
    socket_ = -1;
}

}  // namespace typhon
