#pragma once

#include "platform/linux/bus_message_codec.h"
#include "platform/linux/peer_pace.h"

#include <chrono>
#include <cstddef>

namespace typhon {

/// What peers may cost. Whatever goes beyond is refused or closed, and logged once for each offender.
struct IpcLimits {
    /// Connections of one process, and of all processes of one user: accepted ones, and ones made to its
    /// endpoints.
    unsigned connectionsPerProcess = 256;
    unsigned connectionsPerUser = 16384;
    /// Calls of one connection that were read and neither answered nor dropped, and the memory of their
    /// arguments. Further calls get `LimitsExceeded`; one that expects no reply closes the connection.
    unsigned unansweredCalls = 64;
    std::size_t unansweredBytes = 64U << 20;
    /// What one peer may leave unread beyond the socket's own buffer before its connection is closed.
    std::size_t queuedBytes = 64U << 20;
    std::size_t queuedMessages = 4096;
    /// Descriptors sent to one peer since it last had read everything.
    unsigned unreadDescriptors = 64;
    /// One incoming message; its bytes are also the most that is read of it at all.
    MessageLimits message;
    /// From accepting or connecting to the end of the D-Bus handshake.
    std::chrono::nanoseconds handshake = std::chrono::seconds(25);
    /// From the first bytes of a message to its last, where it does not come at once.
    std::chrono::nanoseconds wholeMessage = std::chrono::seconds(25);
    /// How long to try for the name of a service that another process still holds, as one does that was
    /// killed just now, until the last of its threads and of the children that it was starting is gone.
    std::chrono::nanoseconds nameOfService = std::chrono::seconds(30);
    /// Parts of unfinished messages, arguments of unanswered calls, and what was left unread: of one process,
    /// and of all processes of one user.
    std::size_t heldBytesPerProcess = 128U << 20;
    std::size_t heldBytesPerUser = 512U << 20;
    /// What of our time one process may take.
    PaceLimits pace;
    /// From the end of a connection until free memory is given back to the system; zero for never.
    std::chrono::nanoseconds memoryReturn{};
};

/// Those of the daemon. Nobody has to tell it as much as it tells others, whose views have every font.
inline IpcLimits limitsOfDaemon()
{
    IpcLimits limits;
    limits.message.memoryFileBytes = 16U << 20;
    limits.message.memoryFileValues = 1U << 20;
    limits.memoryReturn = std::chrono::seconds(10);
    limits.pace.allowance = std::chrono::milliseconds(250);
    return limits;
}

}  // namespace typhon
