#pragma once

#include "child.h"

#include <string>

namespace typhon::bench {

/// How a client may mean no good.
enum class Hostility {
    /// Calls as fast as it can, and reads the answers.
    floods,
    /// Calls until it is cut off, and never reads.
    neverReads,
    /// Leaves a message unfinished on many connections.
    halfMessages,
    /// Connects and leaves, as fast as it can.
    connects,
    /// Sends as many descriptors as the kernel passes with one message, again and again.
    manyDescriptors,
    /// Calls what is never answered, as fast as it can.
    neverAnswered,
    /// Sends values of 16 MiB in memory files, on several connections.
    largeValues,
};

/// A process that goes on like that at a daemon's socket until it is killed.
Child hostileClient(const std::string& socketPath, Hostility hostility);

}  // namespace typhon::bench
