// One peer-to-peer D-Bus connection. sd-bus objects and their reference counts know no threads: the bus, and
// every message made for it or read from it, is touched under the link's lock only, and no code of anybody
// else runs meanwhile; what such code has to do is collected and done afterwards. There is no object vtable
// and no reply slot: idle connections are many and must stay small, so messages are taken off sd-bus
// unhandled.

#include "platform/linux/bus_link.h"

#include "platform/linux/introspection.h"
#include "platform/linux/socket_handshake.h"
#include "platform/linux/wire_text.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <utility>

#include <fcntl.h>
#include <sys/epoll.h>

namespace typhon {

namespace {

const IpcError disconnectedError{ipc_errors::disconnected, "the connection is gone"};

std::string errorText(int error)
{
    return std::strerror(error < 0 ? -error : error);
}

std::unique_ptr<Handshake> newHandshake(BusLink::Role role)
{
    if (role == BusLink::Role::client) {
        return std::make_unique<ClientHandshake>();
    }
    sd_id128_t identifier;
    sd_id128_randomize(&identifier);
    std::array<char, SD_ID128_STRING_MAX> text;
    return std::make_unique<ServerHandshake>(sd_id128_to_string(identifier, text.data()));
}

}  // namespace

BusLink::BusLink(std::shared_ptr<IpcContext> context, FileDescriptor socket, Role role, AuditToken peerToken,
                 std::weak_ptr<Owner> owner)
    : peer(peerToken), context_(std::move(context)), role_(role), owner_(std::move(owner)),
      socket_(std::move(socket))
{}

BusLink::~BusLink()
{
    watch_ = {};
    context_->dispose(std::move(deadline_));
    context_->dispose(std::move(restTimer_));
}

void BusLink::start()
{
    locked([&](Afterwards& afterwards) {
        if (ended_) {
            return;
        }
        ::fcntl(socket_.get(), F_SETFL, O_NONBLOCK);
        handshake_ = newHandshake(role_);
        startDeadline(context_->limits.handshake, "it did not finish the handshake in time");
        watch_ = context_->pool.watch(socket_.get(), weak_from_this());
        const auto pause = context_->pace.restAfterConnecting(peer, std::chrono::steady_clock::now());
        if (pause > std::chrono::nanoseconds::zero()) {
            rest(pause);
        } else {
            proceedWithHandshake(afterwards);
            if (!ended_) {
                arm();
            }
        }
    });
}

void BusLink::close()
{
    locked([&](Afterwards& afterwards) { end(afterwards, false); });
}

void BusLink::arm()
{
    auto events = ready_ ? static_cast<std::uint32_t>(sd_bus_get_events(bus_.get())) : EPOLLIN;
    events &= inputHeld_ ? ~std::uint32_t{EPOLLIN} : ~std::uint32_t{};
    if (events != 0) {
        watch_.arm(events);
    }
}

/// Leaves the arming to its caller, who is done only then: two threads would read otherwise, the one on and
/// on while the other handles what it read.
void BusLink::proceedWithHandshake(Afterwards& afterwards)
{
    const auto problem = continueHandshake(*handshake_, socket_.get());
    if (!problem.empty()) {
        abandonLocked(problem, afterwards);
    } else if (handshake_->state() == Handshake::State::done) {
        becomeReady(afterwards);
    }
}

void BusLink::becomeReady(Afterwards& afterwards)
{
    descriptorsAllowed_ = handshake_->descriptorsAgreed();
    handshake_.reset();
    context_->dispose(std::move(deadline_));
    watch_ = {};
    int result = bus_.open(descriptorsAllowed_);
    if (result >= 0) {
        result = bus_.moveOnto(std::move(socket_));
    }
    if (result < 0) {
        context_->offenders.report({}, "bus", "a connection cannot be set up: " + errorText(result));
        end(afterwards, true);
        return;
    }
    ready_ = true;
    watch_ = context_->pool.watch(bus_.socket(), weak_from_this());
    std::vector<std::uint64_t> waiting;
    if (pending_) {
        for (const auto& [number, call] : pending_->byNumber) {
            waiting.push_back(number);
        }
    }
    for (const auto number : waiting) {
        transmit(number, afterwards);
    }
}

void BusLink::processOutput(Afterwards& afterwards)
{
    const int result = outgoing_.isEmpty() ? 0 : bus_.writeOnly();
    // A peer that has hung up makes sd-bus close its socket, and that is no failure to it.
    if (result < 0 || sd_bus_is_open(bus_.get()) <= 0) {
        abandonLocked(errorText(result), afterwards);
    }
}

BusLink::PendingCall* BusLink::pendingCall(std::uint64_t number)
{
    if (!pending_) {
        return nullptr;
    }
    const auto found = pending_->byNumber.find(number);
    return found == pending_->byNumber.end() ? nullptr : &found->second;
}

void BusLink::completeCall(std::uint64_t number, CallResult result, Afterwards& afterwards)
{
    if (pendingCall(number) == nullptr) {
        return;
    }
    auto node = pending_->byNumber.extract(number);
    auto& pending = node.mapped();
    pending_->numberByCookie.erase(pending.cookie);
    if (pending_->byNumber.empty()) {
        pending_.reset();
    }
    context_->dispose(std::move(pending.timer));
    pending.call.completion(std::move(result), afterwards);
    // What the completion holds may be the last reference to the owner.
    afterwards.push_back([keep = std::move(pending.call.completion)] {});
}

void BusLink::call(OutgoingCall call)
{
    locked([&](Afterwards& afterwards) {
        if (ended_) {
            call.completion({std::nullopt, disconnectedError}, afterwards);
            return;
        }
        const auto number = ++lastNumber_;
        if (!pending_) {
            pending_ = std::make_unique<PendingCalls>();
        }
        auto& pending =
            pending_->byNumber.emplace(number, PendingCall{std::move(call), 0, nullptr}).first->second;
        if (pending.call.timeout > 0) {
            pending.timer =
                startTimer(std::chrono::nanoseconds(pending.call.timeout), [number](BusLink& link) {
                    link.locked([&](Afterwards& later) {
                        link.completeCall(number, {std::nullopt, {ipc_errors::timeout, "no reply in time"}},
                                          later);
                    });
                });
        }
        if (ready_) {
            transmit(number, afterwards);
        }
    });
}

void BusLink::transmit(std::uint64_t number, Afterwards& afterwards)
{
    auto* found = pendingCall(number);
    if (found == nullptr || ended_) {
        return;
    }
    auto& pending = *found;
    auto message = newCall(pending.call);
    const auto size = message ? appendMessage(message.get(), pending.call.inTypes, pending.call.arguments,
                                              descriptorsAllowed_)
                              : MessageAppending{-EINVAL, 0, 0};
    pending.call.arguments.clear();
    if (size.result < 0) {
        const auto* name =
            size.result == -EOPNOTSUPP ? ipc_errors::notSupported : ipc_errors::invalidArguments;
        message.reset();
        completeCall(
            number,
            {std::nullopt, {name, pending.call.member + " cannot be sent: " + errorText(size.result)}},
            afterwards);
        return;
    }
    std::uint64_t cookie = 0;
    if (!send(std::move(message), size, &cookie, afterwards)) {
        return;
    }
    if (pending.call.expectReply) {
        pending.cookie = cookie;
        pending_->numberByCookie.emplace(cookie, number);
    } else {
        completeCall(number, {Arguments{}, {}}, afterwards);
    }
}

BusMessage BusLink::newCall(const OutgoingCall& call)
{
    sd_bus_message* raw = nullptr;
    if (sd_bus_message_new_method_call(bus_.get(), &raw, nullptr, exportedObjectPath, call.interface.c_str(),
                                       call.member.c_str()) < 0) {
        return nullptr;
    }
    sd_bus_message_set_expect_reply(raw, call.expectReply ? 1 : 0);
    return BusMessage(raw);
}

bool BusLink::send(BusMessage message, const MessageAppending& size, std::uint64_t* cookie,
                   Afterwards& afterwards)
{
    outgoing_.sending(size, bus_.socket());
    const int result = sd_bus_send(bus_.get(), message.get(), cookie);
    message.reset();
    if (result < 0) {
        abandonLocked("a message could not be sent: " + errorText(result), afterwards);
        return false;
    }
    outgoing_.sent(size, countWaiting(), holder());
    checkExcess(afterwards);
    if (!ended_ && !outgoing_.isEmpty()) {
        arm();
    }
    return !ended_;
}

std::uint64_t BusLink::countWaiting() const
{
    std::uint64_t waiting = 0;
    sd_bus_get_n_queued_write(bus_.get(), &waiting);
    return waiting;
}

void BusLink::checkExcess(Afterwards& afterwards)
{
    const auto excess = outgoing_.excess(context_->limits);
    if (!excess.empty()) {
        punishLocked(excess, afterwards);
    }
}

void BusLink::reply(std::uint64_t cookie, const std::string& types, const Arguments& results,
                    const std::string& member)
{
    locked([&](Afterwards& afterwards) { replyLocked(cookie, types, results, member, afterwards); });
}

void BusLink::fail(std::uint64_t cookie, const IpcError& error)
{
    locked([&](Afterwards& afterwards) { failLocked(cookie, error, afterwards); });
}

void BusLink::replyLocked(std::uint64_t cookie, const std::string& types, const Arguments& results,
                          const std::string& member, Afterwards& afterwards)
{
    if (ended_) {
        return;
    }
    const auto call = callToAnswer(cookie);
    sd_bus_message* raw = nullptr;
    int result = call ? sd_bus_message_new_method_return(call.get(), &raw) : -ENOMEM;
    BusMessage message(raw);
    MessageAppending size;
    if (result >= 0) {
        size = appendMessage(message.get(), types, results, descriptorsAllowed_);
        result = size.result;
    }
    if (result < 0) {
        message.reset();
        TYLog_Error(context_->log, "reply of " + member + " cannot be sent: " + errorText(result));
        failLocked(cookie, {ipc_errors::failed, "the reply could not be sent"}, afterwards);
        return;
    }
    send(std::move(message), size, nullptr, afterwards);
}

void BusLink::failLocked(std::uint64_t cookie, const IpcError& error, Afterwards& afterwards)
{
    const auto call = ended_ ? nullptr : callToAnswer(cookie);
    if (!call) {
        return;
    }
    const auto text = wireText(error.message);
    sd_bus_message* raw = nullptr;
    if (sd_bus_message_new_method_errorf(call.get(), &raw, error.name.c_str(), "%s", text.c_str()) < 0 &&
        sd_bus_message_new_method_errorf(call.get(), &raw, ipc_errors::failed, "%s", text.c_str()) < 0) {
        return;
    }
    send(BusMessage(raw), {0, text.size(), 0}, nullptr, afterwards);
}

/// Stands in for a received call: answering needs no more of it than its cookie, and the message itself, with
/// all its descriptors, is not kept until somebody answers.
BusMessage BusLink::callToAnswer(std::uint64_t cookie)
{
    sd_bus_message* raw = nullptr;
    if (sd_bus_message_new(bus_.get(), &raw, SD_BUS_MESSAGE_METHOD_CALL) < 0) {
        return nullptr;
    }
    BusMessage call(raw);
    return sd_bus_message_seal(raw, cookie, 1) < 0 ? nullptr : std::move(call);
}

void BusLink::punishLocked(const std::string& offence, Afterwards& afterwards)
{
    if (!ended_) {
        const auto who = "process " + std::to_string(peer.processIdentifier);
        // Numbers make no other offence of it.
        const auto kind = offence.substr(0, offence.find_first_of("0123456789"));
        context_->offenders.report(peer, kind, "connection to " + who + " closed: " + offence);
        end(afterwards, true);
    }
}

void BusLink::abandonLocked(const std::string& reason, Afterwards& afterwards)
{
    if (!ended_) {
        TYLog_Debug(context_->log,
                    "connection to process " + std::to_string(peer.processIdentifier) + " closed: " + reason);
        end(afterwards, true);
    }
}

void BusLink::end(Afterwards& afterwards, bool tellOwner)
{
    if (std::exchange(ended_, true)) {
        return;
    }
    watch_ = {};
    context_->dispose(std::move(deadline_));
    context_->dispose(std::move(restTimer_));
    reception_.take();
    outgoing_.clear();
    while (pending_) {
        completeCall(pending_->byNumber.begin()->first, {std::nullopt, disconnectedError}, afterwards);
    }
    bus_.close();
    socket_ = FileDescriptor();
    if (const auto owner = tellOwner ? owner_.lock() : nullptr) {
        afterwards.push_back([owner] {});
        owner->linkClosed(*this, afterwards);
    }
}

std::unique_ptr<Timer> BusLink::startTimer(std::chrono::nanoseconds delay,
                                           std::function<void(BusLink&)> handler)
{
    auto timer = context_->queues.createTimer(*context_->deadlines, [weak = weak_from_this(), handler] {
        if (const auto self = weak.lock()) {
            handler(*self);
        }
    });
    timer->schedule(delay, delay / 50);
    return timer;
}

/// Punishes the peer unless the deadline is disposed of in time.
void BusLink::startDeadline(std::chrono::nanoseconds delay, const char* offence)
{
    deadline_ = startTimer(delay, [offence, started = ++deadlinesStarted_](BusLink& link) {
        link.locked([&](Afterwards& later) {
            if (link.deadline_ && started == link.deadlinesStarted_) {
                link.punishLocked(offence, later);
            }
        });
    });
}

}  // namespace typhon
