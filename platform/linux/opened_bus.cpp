#include "platform/linux/opened_bus.h"

#include <cerrno>
#include <cstdint>
#include <string_view>

#include <fcntl.h>
#include <linux/sockios.h>
#include <sys/ioctl.h>
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

std::size_t waitingBytes(int socket)
{
    int waiting = 0;
    return ::ioctl(socket, SIOCINQ, &waiting) == 0 ? static_cast<std::size_t>(waiting) : 0;
}

}  // namespace

IdleSocket::IdleSocket()
{
    makePair(near_, far_);
}

int OpenedBus::open(bool withDescriptors)
{
    FileDescriptor output;
    if (!makePair(output, far_)) {
        return -errno;
    }
    FileDescriptor input(::fcntl(output.get(), F_DUPFD_CLOEXEC, 3));
    sd_bus* bus = nullptr;
    int result = input ? sd_bus_new(&bus) : -errno;
    bus_.reset(bus);
    if (result >= 0) {
        result = sd_bus_set_fd(bus, input.get(), output.get());
    }
    if (result >= 0) {
        input_ = input.release();
        output_ = output.release();
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
    if (::dup3(socket.get(), input_, O_CLOEXEC) < 0 || ::dup3(socket.get(), output_, O_CLOEXEC) < 0) {
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

int OpenedBus::readMessage(std::size_t size, sd_bus_message** message)
{
    std::uint64_t queuedBefore = 0;
    std::uint64_t queuedAfter = 0;
    sd_bus_get_n_queued_write(bus_.get(), &queuedBefore);
    const auto before = waitingBytes(output_);
    sawMessage_ = false;
    const int result = sd_bus_process(bus_.get(), message);
    if (result < 0) {
        return result;
    }
    sd_bus_get_n_queued_write(bus_.get(), &queuedAfter);
    if (!sawMessage_) {
        return queuedAfter < queuedBefore ? 0 : -EBADMSG;
    }
    return waitingBytes(output_) + size < before ? -EBADMSG : 1;
}

int OpenedBus::writeOnly(const IdleSocket& idle)
{
    if (::dup3(idle.get(), input_, O_CLOEXEC) < 0) {
        return -errno;
    }
    const int result = sd_bus_process(bus_.get(), nullptr);
    return ::dup3(output_, input_, O_CLOEXEC) < 0 ? -errno : result;
}

void OpenedBus::close()
{
    bus_.reset();
    far_ = FileDescriptor();
    input_ = -1;
    output_ = -1;
}

}  // namespace typhon
