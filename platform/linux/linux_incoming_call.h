#pragma once

#include "platform/ipc.h"
#include "platform/linux/bus_link.h"
#include "platform/linux/unanswered_calls.h"

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>

namespace typhon {

/// A call that arrived over a link. It keeps the link's cookie for the answer, not the message.
class LinuxIncomingCall : public IncomingCall {
public:
    struct Origin {
        std::weak_ptr<BusLink> link;
        std::uint64_t cookie;
        bool replyExpected;
    };
    /// What is called, among the interfaces that were exported when the call came.
    struct Operation {
        InterfaceDescriptions exported;
        const InterfaceDescription& interface;
        const MemberDescription& member;
    };
    LinuxIncomingCall(Origin origin, Operation operation, Arguments arguments,
                      std::unique_ptr<UnansweredCalls::Charge> charge);

    const std::string& interface() const override { return operation_.interface.name; }
    const std::string& member() const override { return operation_.member.name; }
    const Arguments& arguments() const override { return arguments_; }
    bool isReplyExpected() const override { return origin_.replyExpected; }
    void reply(Arguments results) override;
    void fail(IpcError error) override;

    /// Its handler has ended: a call that no answer belongs to stops counting as unanswered.
    void handled();

private:
    /// The link to answer on, the first time; null afterwards, and when nobody waits.
    std::shared_ptr<BusLink> takeAnswer();

    const Origin origin_;
    const Operation operation_;
    const Arguments arguments_;
    std::mutex mutex_;
    std::unique_ptr<UnansweredCalls::Charge> charge_;
    bool answered_ = false;
};

}  // namespace typhon
