#pragma once

#include "platform/task.h"
#include "protocol/replies.h"

namespace typhon {

/// What the daemon asks of a web-content process, at that process's endpoint.
class TyphonSilkpageSupportServerProtocol {
public:
    virtual ~TyphonSilkpageSupportServerProtocol() = default;

    /// `ping:`. The answer makes the process known to the daemon.
    virtual Task<void> ping(EmptyReply reply) = 0;
    /// `userInstalledFontsInfo:reply:`. The fonts and extensions of the process, or null.
    virtual Task<void> userInstalledFontsInfo(std::optional<PropertyList> info, EmptyReply reply) = 0;
};

}  // namespace typhon
