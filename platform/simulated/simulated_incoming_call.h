#pragma once

#include "platform/ipc.h"
#include "platform/simulated/simulated_connection.h"

#include <memory>
#include <string>

namespace typhon {

/// A call that arrived at a simulated connection. The first answer travels back as a message.
class SimulatedIncomingCall : public IncomingCall {
public:
    /// `at` is the connection it arrived at, `from` the caller's end.
    SimulatedIncomingCall(std::shared_ptr<SimulatedMachine> machine, std::weak_ptr<SimulatedConnection> at,
                          std::weak_ptr<SimulatedConnection> from, SimulatedConnection::Call call,
                          std::string outTypes, bool replies);

    const std::string& interface() const override { return call_.interface; }
    const std::string& member() const override { return call_.member; }
    const Arguments& arguments() const override { return call_.arguments; }
    bool isReplyExpected() const override { return call_.number != 0; }
    void reply(Arguments results) override;
    void fail(IpcError error) override;

private:
    void answer(CallResult result);

    const std::shared_ptr<SimulatedMachine> machine_;
    const std::weak_ptr<SimulatedConnection> at_;
    const std::weak_ptr<SimulatedConnection> from_;
    const SimulatedConnection::Call call_;
    const std::string outTypes_;
    const bool replies_;
    bool answered_ = false;
};

/// The arguments as their receiver gets them: an endpoint notes who handed it over.
Arguments argumentsFrom(const AuditToken& sender, Arguments arguments);

}  // namespace typhon
