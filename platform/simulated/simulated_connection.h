#pragma once

#include "platform/ipc.h"
#include "platform/simulated/simulated_machine.h"

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <variant>

namespace typhon {

/// One end of a simulated connection. What the peer sends waits in the inbox, and each message is an item of
/// this end's serial queue.
class SimulatedConnection : public Connection, public std::enable_shared_from_this<SimulatedConnection> {
public:
    /// Makes the other end of a new connection, or null when nobody listens.
    using Connector =
        std::function<std::shared_ptr<SimulatedConnection>(const std::shared_ptr<SimulatedConnection>&)>;
    /// Accepted by a listener; made by `connector` and lost with its peer; made anew at need.
    enum class Origin { accepted, endpoint, service };

    SimulatedConnection(std::shared_ptr<SimulatedMachine> machine, AuditToken owner, Origin origin,
                        Connector connector);
    ~SimulatedConnection() override;

    AuditToken auditToken() const override { return peerToken_; }
    std::int32_t processIdentifier() const override { return peerToken_.processIdentifier; }
    void setExportedInterfaces(InterfaceDescriptions interfaces) override { exported_ = interfaces; }
    void setExportedObject(std::shared_ptr<ExportedObject> object) override { object_ = std::move(object); }
    std::shared_ptr<ExportedObject> exportedObject() const override { return object_; }
    void setRemoteObjectInterfaces(InterfaceDescriptions interfaces) override { remote_ = interfaces; }
    void setInvalidationHandler(std::function<void()> handler) override;
    void setInterruptionHandler(std::function<void()> handler) override;
    void resume() override;
    void invalidate() override;
    void send(std::string_view interface, std::string_view member, Arguments arguments,
              ErrorHandler onError) override;
    void call(std::string_view interface, std::string_view member, Arguments arguments, ReplyHandler onReply,
              ErrorHandler onError) override;
    Task<CallResult> callAndWait(std::string interface, std::string member, Arguments arguments,
                                 std::int64_t timeout) override;

    /// Ties an accepted end to the end that connected.
    void setPeer(const std::shared_ptr<SimulatedConnection>& peer);
    bool isUsable() const { return !ended_; }
    /// The end of the process that holds this end: nothing of it runs any more.
    void die();
    const AuditToken owner;

    using Completion = std::function<void(CallResult)>;
    struct Call {
        std::string interface;
        std::string member;
        Arguments arguments;
        /// Zero when no reply is expected.
        std::uint64_t number;
    };
    struct Reply {
        std::uint64_t number;
        CallResult result;
    };
    struct Closed {};
    using Message = std::variant<Call, Reply, Closed>;
    /// A message from the peer.
    void deliver(Message message);

private:
    struct PendingCall {
        std::string outTypes;
        Completion completion;
        std::unique_ptr<Timer> timer;
    };

    bool ensurePeer();
    void startCall(std::string_view interface, std::string_view member, Arguments arguments, bool expectReply,
                   std::int64_t timeout, Completion completion);
    void completeCall(std::uint64_t number, CallResult result);
    void callTimedOut(std::uint64_t number);
    void receive(Message message);
    void receiveCall(Call call);
    void peerClosed();
    void failPendingCalls();
    void end();
    void dropHandlers();
    void post(Task<void> work);
    void postError(ErrorHandler onError, IpcError error);
    static Task<CallResult> await(std::shared_ptr<SimulatedConnection> self, std::string interface,
                                  std::string member, Arguments arguments, std::int64_t timeout);
    static Task<void> handleUnlessEnded(std::shared_ptr<SimulatedConnection> self,
                                        std::shared_ptr<IncomingCall> call);
    static Task<void> runInvalidation(std::shared_ptr<SimulatedConnection> self,
                                      std::shared_ptr<void> dropping);

    const std::shared_ptr<SimulatedMachine> machine_;
    const Origin origin_;
    const std::shared_ptr<WorkQueue> queue_;
    Connector connector_;
    std::weak_ptr<SimulatedConnection> peer_;
    AuditToken peerToken_;
    InterfaceDescriptions exported_;
    InterfaceDescriptions remote_;
    std::shared_ptr<ExportedObject> object_;
    std::function<void()> invalidationHandler_;
    std::function<void()> interruptionHandler_;
    bool resumed_ = false;
    /// No more traffic; `invalidatedHere_` also drops the calls that wait on the queue.
    bool ended_ = false;
    bool invalidatedHere_ = false;
    bool dead_ = false;
    std::deque<Message> inbox_;
    std::uint64_t lastNumber_ = 0;
    std::map<std::uint64_t, PendingCall> pending_;
};

}  // namespace typhon
