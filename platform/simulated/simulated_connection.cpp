#include "platform/simulated/simulated_connection.h"

#include "platform/argument_types.h"
#include "platform/connection_work.h"
#include "platform/simulated/simulated_arguments.h"
#include "platform/simulated/simulated_incoming_call.h"

#include <chrono>
#include <vector>

namespace typhon {

namespace {

const IpcError disconnectedError{ipc_errors::disconnected, "the connection is gone"};

}  // namespace

SimulatedConnection::SimulatedConnection(std::shared_ptr<SimulatedMachine> machine, AuditToken ownerToken,
                                         Origin origin, Connector connector)
    : owner(ownerToken), machine_(std::move(machine)), origin_(origin),
      queue_(machine_->queues.createSerialQueue("connection")), connector_(std::move(connector))
{}

SimulatedConnection::~SimulatedConnection()
{
    if (const auto peer = peer_.lock(); peer && !ended_) {
        peer->deliver(Closed{});
    }
}

void SimulatedConnection::setInvalidationHandler(std::function<void()> handler)
{
    invalidationHandler_ = std::move(handler);
}

void SimulatedConnection::setInterruptionHandler(std::function<void()> handler)
{
    interruptionHandler_ = std::move(handler);
}

void SimulatedConnection::setPeer(const std::shared_ptr<SimulatedConnection>& peer)
{
    peer_ = peer;
    peerToken_ = peer->owner;
}

void SimulatedConnection::resume()
{
    if (resumed_ || ended_) {
        return;
    }
    resumed_ = true;
    machine_->resumedConnections.push_back(shared_from_this());
    if (!ensurePeer() && origin_ == Origin::endpoint) {
        peerClosed();
    }
    for (auto waiting = std::exchange(inbox_, {}); !waiting.empty(); waiting.pop_front()) {
        receive(std::move(waiting.front()));
    }
}

bool SimulatedConnection::ensurePeer()
{
    if (!resumed_ || ended_) {
        return false;
    }
    if (peer_.expired() && connector_) {
        if (const auto peer = connector_(shared_from_this())) {
            setPeer(peer);
        }
    }
    return !peer_.expired();
}

void SimulatedConnection::invalidate()
{
    if (ended_) {
        return;
    }
    invalidatedHere_ = true;
    if (const auto peer = peer_.lock()) {
        peer->deliver(Closed{});
    }
    end();
}

void SimulatedConnection::die()
{
    dead_ = true;
    pending_.clear();
    invalidate();
    invalidationHandler_ = nullptr;
    dropHandlers();
}

void SimulatedConnection::end()
{
    const auto self = shared_from_this();
    ended_ = true;
    inbox_.clear();
    failPendingCalls();
    std::erase(machine_->resumedConnections, self);
    // Also when a device without power never runs the handler, which would then hold the connection for ever.
    std::shared_ptr<void> dropping(nullptr, [self](void*) {
        self->invalidationHandler_ = nullptr;
        self->dropHandlers();
    });
    post(runInvalidation(self, std::move(dropping)));
}

Task<void> SimulatedConnection::runInvalidation(std::shared_ptr<SimulatedConnection> self,
                                                std::shared_ptr<void> dropping)
{
    if (auto handler = std::exchange(self->invalidationHandler_, nullptr)) {
        Task<void> running = connection_work::runCallback(self->machine_->log, handler);
        co_await std::move(running);
    }
    dropping.reset();
}

void SimulatedConnection::dropHandlers()
{
    interruptionHandler_ = nullptr;
    connector_ = nullptr;
    object_.reset();
}

void SimulatedConnection::peerClosed()
{
    if (origin_ != Origin::service) {
        end();
        return;
    }
    peer_.reset();
    failPendingCalls();
    if (interruptionHandler_) {
        post(connection_work::runCallback(machine_->log, interruptionHandler_));
    }
}

void SimulatedConnection::failPendingCalls()
{
    for (auto& [number, call] : std::exchange(pending_, {})) {
        call.completion({std::nullopt, disconnectedError});
    }
}

void SimulatedConnection::deliver(Message message)
{
    if (ended_) {
        return;
    }
    if (resumed_) {
        receive(std::move(message));
    } else {
        inbox_.push_back(std::move(message));
    }
}

void SimulatedConnection::receive(Message message)
{
    if (auto* call = std::get_if<Call>(&message)) {
        receiveCall(std::move(*call));
    } else if (auto* reply = std::get_if<Reply>(&message)) {
        completeCall(reply->number, std::move(reply->result));
    } else {
        peerClosed();
    }
}

void SimulatedConnection::receiveCall(Call call)
{
    const auto* member = findMember(exported_, call.interface, call.member);
    const auto inTypes = member == nullptr ? std::string() : member->inTypes;
    auto incoming = std::make_shared<SimulatedIncomingCall>(
        machine_, weak_from_this(), peer_, std::move(call), member == nullptr ? "" : member->outTypes,
        member != nullptr && member->replies);
    if (member == nullptr) {
        incoming->fail(unknownMethodError(incoming->interface(), incoming->member()));
    } else if (!argumentsFit(inTypes, incoming->arguments())) {
        incoming->fail(invalidArgumentsError(incoming->member(), inTypes));
    } else {
        post(handleUnlessEnded(shared_from_this(), std::move(incoming)));
    }
}

Task<void> SimulatedConnection::handleUnlessEnded(std::shared_ptr<SimulatedConnection> self,
                                                  std::shared_ptr<IncomingCall> call)
{
    // Calls that came before the peer closed are still handled; after `invalidate` nothing is.
    if (!self->invalidatedHere_) {
        Task<void> handling =
            connection_work::handleCall(self->machine_->log, self->object_, std::move(call));
        co_await std::move(handling);
    }
}

void SimulatedConnection::post(Task<void> work)
{
    if (!dead_) {
        queue_->asyncForConnection(shared_from_this(), std::move(work));
    }
}

void SimulatedConnection::postError(ErrorHandler onError, IpcError error)
{
    if (onError) {
        post(connection_work::runCallback(machine_->log, [onError, error] { onError(error); }));
    }
}

void SimulatedConnection::send(std::string_view interface, std::string_view member, Arguments arguments,
                               ErrorHandler onError)
{
    const auto self = shared_from_this();
    startCall(interface, member, std::move(arguments), false, 0, [self, onError](CallResult result) {
        if (!result.results) {
            self->postError(onError, std::move(result.error));
        }
    });
}

void SimulatedConnection::call(std::string_view interface, std::string_view member, Arguments arguments,
                               ReplyHandler onReply, ErrorHandler onError)
{
    const auto self = shared_from_this();
    startCall(interface, member, std::move(arguments), true, 0, [self, onReply, onError](CallResult result) {
        if (!result.results) {
            self->postError(onError, std::move(result.error));
        } else if (onReply) {
            self->post(
                connection_work::handleReply(self->machine_->log, onReply, std::move(*result.results)));
        }
    });
}

Task<CallResult> SimulatedConnection::callAndWait(std::string interface, std::string member,
                                                  Arguments arguments, std::int64_t timeout)
{
    return await(shared_from_this(), std::move(interface), std::move(member), std::move(arguments), timeout);
}

Task<CallResult> SimulatedConnection::await(std::shared_ptr<SimulatedConnection> self, std::string interface,
                                            std::string member, Arguments arguments, std::int64_t timeout)
{
    AwaitCompletion<CallResult>::Start start = [&](Completion done) {
        self->startCall(interface, member, std::move(arguments), true, timeout, std::move(done));
    };
    auto completion = awaitCompletion<CallResult>(std::move(start));
    co_return co_await completion;
}

/// Checks the call against the remote interfaces and sends it. `completion` is called once, at once for a
/// call that cannot be sent and for one that expects no reply.
void SimulatedConnection::startCall(std::string_view interface, std::string_view member, Arguments arguments,
                                    bool expectReply, std::int64_t timeout, Completion completion)
{
    const auto* description = findMember(remote_, interface, member);
    if (description == nullptr) {
        completion({std::nullopt, unknownMethodError(interface, member)});
        return;
    }
    if (!argumentsFit(description->inTypes, arguments)) {
        completion({std::nullopt, invalidArgumentsError(member, description->inTypes)});
        return;
    }
    if (!ensurePeer()) {
        completion({std::nullopt, disconnectedError});
        return;
    }
    const auto number = expectReply ? ++lastNumber_ : 0;
    Call outgoing{std::string(interface), std::string(member), argumentsFrom(owner, std::move(arguments)),
                  number};
    if (expectReply) {
        auto& pending = pending_[number];
        pending = {description->outTypes, std::move(completion), nullptr};
        if (timeout > 0) {
            pending.timer =
                machine_->queues.createTimer(*machine_->deadlines, [weak = weak_from_this(), number] {
                    if (const auto self = weak.lock()) {
                        self->callTimedOut(number);
                    }
                });
            pending.timer->schedule(std::chrono::nanoseconds(timeout), std::chrono::nanoseconds(0));
        }
    }
    peer_.lock()->deliver(std::move(outgoing));
    if (!expectReply) {
        // NOLINTNEXTLINE(bugprone-use-after-move): it was moved only when a reply is expected.
        completion({Arguments{}, {}});
    }
}

void SimulatedConnection::callTimedOut(std::uint64_t number)
{
    const auto found = pending_.find(number);
    if (found != pending_.end()) {
        // The timer must outlive its own handler.
        machine_->deadlines->async([timer = std::shared_ptr<Timer>(std::move(found->second.timer))] {});
    }
    completeCall(number, {std::nullopt, {ipc_errors::timeout, "no reply in time"}});
}

void SimulatedConnection::completeCall(std::uint64_t number, CallResult result)
{
    auto call = pending_.extract(number);
    if (call.empty()) {
        return;
    }
    if (result.results && !argumentsFit(call.mapped().outTypes, *result.results)) {
        result = {std::nullopt, {ipc_errors::failed, "the reply has unexpected types"}};
    }
    call.mapped().completion(std::move(result));
}

}  // namespace typhon
