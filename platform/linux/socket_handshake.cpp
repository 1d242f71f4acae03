#include "platform/linux/socket_handshake.h"

#include <array>
#include <cerrno>
#include <cstring>

#include <sys/socket.h>

namespace typhon {

namespace {

bool sendOutput(Handshake& handshake, int socket)
{
    const auto output = handshake.takeOutput();
    // All it ever says fits any socket's buffer: one that has no room is not being read.
    return output.empty() || ::send(socket, output.data(), output.size(), MSG_NOSIGNAL | MSG_DONTWAIT) ==
                                 static_cast<ssize_t>(output.size());
}

}  // namespace

std::string continueHandshake(Handshake& handshake, int socket)
{
    std::array<char, 512> bytes;
    for (;;) {
        if (!sendOutput(handshake, socket)) {
            return "it does not read the handshake";
        }
        if (handshake.state() != Handshake::State::going) {
            return handshake.problem();
        }
        const auto waiting = ::recv(socket, bytes.data(), bytes.size(), MSG_PEEK | MSG_DONTWAIT);
        if (waiting < 0 && (errno == EAGAIN || errno == EINTR)) {
            return {};
        }
        if (waiting <= 0) {
            return waiting == 0 ? "it left during the handshake" : std::strerror(errno);
        }
        const auto taken = handshake.receive({bytes.data(), static_cast<std::size_t>(waiting)});
        if (::recv(socket, bytes.data(), taken, MSG_DONTWAIT) != static_cast<ssize_t>(taken)) {
            return "the handshake cannot be read";
        }
    }
}

}  // namespace typhon
