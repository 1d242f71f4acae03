#pragma once

#include "platform/ipc.h"
#include "platform/linux/bus_link.h"
#include "platform/linux/ipc_context.h"
#include "platform/linux/standard_interfaces.h"
#include "platform/linux/unanswered_calls.h"

#include <functional>
#include <list>
#include <memory>
#include <mutex>
#include <string>

namespace typhon {

/// A socket to the peer, or why there is none.
struct ConnectedSocket {
    FileDescriptor socket;
    AuditToken peer;
    BusLink::Role role = BusLink::Role::client;
    std::string problem;
    /// Given back when the connection ends; empty where the peer is not charged for it.
    ConnectionAccounting::Charge charge = {};
};

/// A connection over Unix sockets: dispatches what its link reads to the exported object, in order, as items
/// of its serial queue. Any thread.
class LinuxConnection : public Connection,
                        public BusLink::Owner,
                        public std::enable_shared_from_this<LinuxConnection> {
public:
    /// Gets the socket, when the connection is resumed; for a service again whenever the last one was lost.
    using Connector = std::function<ConnectedSocket()>;
    enum class Lifetime { oneSocket, service };

    /// `peer` as far as it is known already; `charge` is given back when the connection ends.
    LinuxConnection(std::shared_ptr<IpcContext> context, Lifetime lifetime, Connector connector,
                    AuditToken peer = {}, ConnectionAccounting::Charge charge = {});
    ~LinuxConnection() override;

    AuditToken auditToken() const override;
    std::int32_t processIdentifier() const override { return auditToken().processIdentifier; }
    void setExportedInterfaces(InterfaceDescriptions interfaces) override;
    void setExportedObject(std::shared_ptr<ExportedObject> object) override;
    std::shared_ptr<ExportedObject> exportedObject() const override;
    void setRemoteObjectInterfaces(InterfaceDescriptions interfaces) override;
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

    ReceivedCall readCall(const BusLink& link, sd_bus_message* call) override;
    void receivedCall(BusLink& link, ReceivedCall call, BusLink::Afterwards& afterwards) override;
    void linkClosed(BusLink& link, BusLink::Afterwards& afterwards) override;

private:
    using Self = std::shared_ptr<LinuxConnection>;
    /// What waits for its turn on the queue. It holds no connection, so that one that never runs keeps none.
    using Item = std::function<Task<void>(Self)>;
    /// What a connection has until it has its socket, and one to a service for good.
    struct Dialling {
        explicit Dialling(Connector function) : connector(std::move(function)) {}

        const Connector connector;
        /// Held while connecting, so that a service is connected to once.
        std::mutex connecting;
        /// Protected by the connection's mutex.
        std::function<void()> interruptionHandler;
    };

    std::shared_ptr<BusLink> usableLink();
    std::shared_ptr<BusLink> connect(const Connector& connector, ConnectionAccounting::Charge& charge);
    void startCall(std::string_view interface, std::string_view member, Arguments arguments, bool expectReply,
                   std::int64_t timeout, BusLink::Completion completion);
    static void answerOther(BusLink& link, const ReceivedCall& call, BusLink::Afterwards& afterwards);
    void refuseExcess(BusLink& link, const ReceivedCall& call, BusLink::Afterwards& afterwards);
    void enqueue(Item item, BusLink::Afterwards& afterwards);
    void enqueueError(const ErrorHandler& onError, IpcError error, BusLink::Afterwards& afterwards);
    Item takeItem();
    bool isInvalidatedHere() const;

    static Task<void> runNext(Self self);
    static Task<void> runInvalidation(Self self);
    static Task<void> handleCall(Self self, std::shared_ptr<IncomingCall> call);
    static Task<CallResult> await(Self self, std::string interface, std::string member, Arguments arguments,
                                  std::int64_t timeout);

    const std::shared_ptr<IpcContext> context_;
    const std::shared_ptr<WorkQueue> queue_;
    /// Used under the link's lock.
    UnansweredCalls unanswered_;

    /// Innermost: no other lock is taken under it.
    mutable std::mutex mutex_;
    // Below: protected by `mutex_`.
    std::shared_ptr<Dialling> dialling_;
    ConnectionAccounting::Charge charge_;
    AuditToken peer_;
    InterfaceDescriptions exported_;
    InterfaceDescriptions remote_;
    std::shared_ptr<ExportedObject> object_;
    std::function<void()> invalidationHandler_;
    std::shared_ptr<BusLink> link_;
    std::list<Item> inbox_;
    /// Constant.
    const Lifetime lifetime_;
    bool resumed_ = false;
    bool ended_ = false;
    bool invalidatedHere_ = false;
};

}  // namespace typhon
