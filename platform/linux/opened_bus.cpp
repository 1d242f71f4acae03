#include "platform/linux/opened_bus.h"

#include <cerrno>
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
    return 0;
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
