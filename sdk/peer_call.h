#pragma once

#include "platform/ipc.h"
#include "protocol/wire.h"

#include <functional>
#include <optional>

struct sd_bus_message;

namespace typhon {

/// A call that the other end of a connection makes of this program. Valid while it is handled.
class PeerCall {
public:
    explicit PeerCall(sd_bus_message* message) : message_(message) {}

    /// The arguments, if it is a call of that operation with the types of that; else null.
    std::optional<Arguments> argumentsOf(const wire::Operation& operation) const;
    /// Answers without results, unless no answer is expected.
    void reply() const;
    /// Answers with the results that the operation gives, unless no answer is expected.
    void reply(const wire::Operation& operation, const Arguments& results) const;
    /// Answers without results when it is called, which may be after the call was handled. Dropped uncalled,
    /// the peer never hears. For the thread of the connection.
    std::function<void()> laterReply() const;
    /// Says that there is no such operation, or that it is not called like that.
    void refuse() const;

private:
    sd_bus_message* message_;
};

}  // namespace typhon
