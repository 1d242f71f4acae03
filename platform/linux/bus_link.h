#pragma once

#include "platform/ipc.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/handshake.h"
#include "platform/linux/ipc_context.h"
#include "platform/linux/message_decoder.h"
#include "platform/linux/message_reception.h"
#include "platform/linux/opened_bus.h"
#include "platform/linux/outgoing_queue.h"
#include "platform/linux/received_call.h"

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include <systemd/sd-bus.h>

namespace typhon {

/// One sd-bus object over one connected socket, from the handshake to the end: reads when the socket is
/// ready, writes from any thread, matches replies to calls, and closes itself when a limit is exceeded. Any
/// thread.
class BusLink : public EventPool::Handler, public std::enable_shared_from_this<BusLink> {
public:
    enum class Role { server, client };
    /// What is left to do once the lock is released.
    using Afterwards = std::vector<std::function<void()>>;

    class Owner {
    public:
        virtual ~Owner() = default;
        /// What a call says. Without the link's lock, if `call` belongs to no bus that others use.
        virtual ReceivedCall readCall(const BusLink& link, sd_bus_message* call) = 0;
        /// Told what arrives, under the link's lock: it may answer, and leaves everything else for
        /// afterwards.
        virtual void receivedCall(BusLink& link, ReceivedCall call, Afterwards& afterwards) = 0;
        /// Once, unless `close` was called before.
        virtual void linkClosed(BusLink& link, Afterwards& afterwards) = 0;
    };

    /// Called under the link's lock.
    using Completion = std::function<void(CallResult, Afterwards&)>;
    struct OutgoingCall {
        std::string interface;
        std::string member;
        std::string inTypes;
        std::string outTypes;
        Arguments arguments;
        bool expectReply;
        /// Nanoseconds; zero for none.
        std::int64_t timeout;
        Completion completion;
    };

    BusLink(std::shared_ptr<IpcContext> context, FileDescriptor socket, Role role, AuditToken peer,
            std::weak_ptr<Owner> owner);
    ~BusLink() override;

    /// Begins the handshake; the owner is told when that fails.
    void start();
    /// Ends the link without telling the owner; pending calls fail with `disconnected`.
    void close();

    /// Sends a call, once the handshake is done.
    void call(OutgoingCall call);
    /// Answers a call by its cookie.
    void reply(std::uint64_t cookie, const std::string& types, const Arguments& results,
               const std::string& member);
    void fail(std::uint64_t cookie, const IpcError& error);

    /// The same, by an owner that was just told of the call.
    void replyLocked(std::uint64_t cookie, const std::string& types, const Arguments& results,
                     const std::string& member, Afterwards& afterwards);
    void failLocked(std::uint64_t cookie, const IpcError& error, Afterwards& afterwards);
    /// Closes because of what the peer has done, and logs it, once for each kind of offence of a process.
    void punishLocked(const std::string& offence, Afterwards& afterwards);
    /// Closes for a reason that is nobody's fault, or of no interest.
    void abandonLocked(const std::string& reason, Afterwards& afterwards);

    void handleEvents(std::uint32_t events) override;

    const AuditToken peer;

private:
    struct PendingCall {
        OutgoingCall call;
        /// Zero until it was sent.
        std::uint64_t cookie = 0;
        std::unique_ptr<Timer> timer;
    };
    struct PendingCalls {
        std::map<std::uint64_t, PendingCall> byNumber;
        std::map<std::uint64_t, std::uint64_t> numberByCookie;
    };

    template <class Body>
    void locked(Body body);
    /// What is to be done after something was read: `look` whether there is more, `read` what is known to be
    /// there.
    enum class Next { wait, look, read, decode };

    Next handleInput(std::uint32_t events, Afterwards& afterwards);
    Next processInput(Afterwards& afterwards);
    void processReadyMessage(Afterwards& afterwards);
    Next processAssembledMessage(Afterwards& afterwards);
    void awaitRest();
    void decode();
    void deliver(sd_bus_message* message);
    void queueDecoding(Afterwards& afterwards);
    static Task<void> decodeInTurn(std::shared_ptr<BusLink> self);
    void proceedAfter(std::chrono::nanoseconds taken, bool hasHungUp);
    void rest(std::chrono::nanoseconds duration);
    void endRest();
    void proceedWithHandshake(Afterwards& afterwards);
    void becomeReady(Afterwards& afterwards);
    void processOutput(Afterwards& afterwards);
    void startDeadline(std::chrono::nanoseconds delay, const char* offence);
    void receive(sd_bus_message* message, Afterwards& afterwards);
    std::optional<std::uint64_t> numberOfReply(sd_bus_message* message) const;
    CallResult readReply(sd_bus_message* message, const OutgoingCall& call) const;
    PendingCall* pendingCall(std::uint64_t number);
    void completeCall(std::uint64_t number, CallResult result, Afterwards& afterwards);
    void transmit(std::uint64_t number, Afterwards& afterwards);
    BusMessage newCall(const OutgoingCall& call);
    bool send(BusMessage message, const MessageAppending& size, std::uint64_t* cookie,
              Afterwards& afterwards);
    BusMessage callToAnswer(std::uint64_t cookie);
    void checkExcess(Afterwards& afterwards);
    std::uint64_t countWaiting() const;
    HeldBytes::Peer holder() const { return {context_->heldBytes, peer}; }
    void arm();
    void end(Afterwards& afterwards, bool tellOwner);
    std::unique_ptr<Timer> startTimer(std::chrono::nanoseconds delay, std::function<void(BusLink&)> handler);

    const std::shared_ptr<IpcContext> context_;
    const Role role_;
    const std::weak_ptr<Owner> owner_;

    std::mutex mutex_;
    // Below: protected by the mutex.
    /// Until the handshake is done; then it belongs to the bus.
    FileDescriptor socket_;
    std::unique_ptr<Handshake> handshake_;
    OpenedBus bus_;
    EventPool::HandlerWatch watch_;
    /// For the handshake, later for the message that has begun.
    std::unique_ptr<Timer> deadline_;
    std::unique_ptr<Timer> restTimer_;
    /// Tells a deadline whose handler comes late from its successor.
    unsigned deadlinesStarted_ = 0;
    bool ready_ = false;
    bool ended_ = false;
    bool descriptorsAllowed_ = false;
    /// Nothing is read: a message is being decoded, or the peer has to rest.
    bool inputHeld_ = false;
    /// The message that `reception_` has put together waits to be decoded.
    bool decodingDue_ = false;
    MessageReception reception_;
    OutgoingQueue outgoing_;
    std::uint64_t lastNumber_ = 0;
    /// Null while there are none.
    std::unique_ptr<PendingCalls> pending_;
};

/// Runs `body` under the lock, then what it left for afterwards.
template <class Body>
void BusLink::locked(Body body)
{
    Afterwards afterwards;
    {
        const std::lock_guard lock(mutex_);
        body(afterwards);
    }
    for (const auto& action : afterwards) {
        action();
    }
}

}  // namespace typhon
