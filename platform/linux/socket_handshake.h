#pragma once

#include "platform/linux/handshake.h"

#include <string>

namespace typhon {

/// Goes on with a handshake over a non-blocking socket as far as possible without waiting. Takes off the
/// socket what belongs to the handshake and not a byte more, so that the first message and its descriptors
/// stay where they are; descriptors that came with the handshake itself are dropped. Gives why the connection
/// is of no use, or nothing.
std::string continueHandshake(Handshake& handshake, int socket);

}  // namespace typhon
