#pragma once

#include "platform/ipc.h"
#include "platform/task.h"
#include "protocol/replies.h"

#include <memory>

namespace typhon {

/// What a web-content host may ask of the daemon. The rules of `TyphonProtocol` apply.
class TyphonSilkpageSupportProtocol {
public:
    virtual ~TyphonSilkpageSupportProtocol() = default;

    /// `checkinForSilkpageProcess:reply:`. Passes the caller's fonts on to the content process that listens
    /// at the endpoint; answered once that process has them.
    virtual Task<void> checkinForSilkpageProcess(std::shared_ptr<ListenerEndpoint> endpoint,
                                                 EmptyReply reply) = 0;
    /// `sendFonts:reply:`. Accepted, ignored and never answered.
    virtual Task<void> sendFonts(PropertyList::Array fonts, EmptyReply reply) = 0;
};

}  // namespace typhon
