// One peer-to-peer D-Bus connection. sd-bus objects and their reference counts know no threads: the bus, and
// every message made for it or read from it, is touched under the link's lock only, and no code of anybody
// else runs meanwhile; what such code has to do is collected and done afterwards. There is no object vtable
// and no reply slot: idle connections are many and must stay small, so messages are taken off sd-bus
// unhandled.

#include "platform/linux/bus_link.h"

#include "platform/linux/introspection.h"
#include "platform/linux/wire_text.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <sys/socket.h>

namespace typhon {

namespace {

/// Bytes; what the kernel gives by default.
constexpr int sendBuffer = 212992;

const IpcError disconnectedError{ipc_errors::disconnected, "the connection is gone"};

std::string errorText(int error)
{
    return std::strerror(error < 0 ? -error : error);
}

}  // namespace

BusLink::BusLink(std::shared_ptr<IpcContext> context, FileDescriptor socket, Role role, AuditToken peerToken,
                 std::weak_ptr<Owner> owner)
    : peer(peerToken), context_(std::move(context)), role_(role), owner_(std::move(owner)),
      socket_(std::move(socket)), sizeGuard_(context_->limits.message.bytes)
{}

BusLink::~BusLink()
{
    watch_.reset();
    context_->dispose(std::move(handshakeTimer_));
    sd_bus_close_unref(bus_);
}

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

void BusLink::start()
{
    locked([&](Afterwards& afterwards) {
        if (ended_) {
            return;
        }
        const int result = open();
        if (result < 0) {
            abandonLocked("the handshake could not begin: " + errorText(result), afterwards);
            return;
        }
        handshakeTimer_ = startTimer(context_->limits.handshake, [](BusLink& link) {
            link.locked([&](Afterwards& later) {
                if (!link.ready_) {
                    link.abandonLocked("it did not finish the handshake in time", later);
                }
            });
        });
        arm();
    });
}

int BusLink::open()
{
    int result = sd_bus_new(&bus_);
    if (result < 0) {
        return result;
    }
    result = sd_bus_set_fd(bus_, socket_.get(), socket_.get());
    if (result < 0) {
        return result;
    }
    const int descriptor = socket_.release();
    sd_bus_negotiate_fds(bus_, 1);
    if (role_ == Role::server) {
        sd_id128_t identifier;
        sd_id128_randomize(&identifier);
        sd_bus_set_server(bus_, 1, identifier);
        // Who the peer claims to be is of no interest: it may be user 0 of a user namespace. Decisions are
        // made by what the kernel says about the socket.
        sd_bus_set_anonymous(bus_, 1);
    }
    sd_bus_add_filter(bus_, nullptr, sawMessage, this);
    result = sd_bus_start(bus_);
    if (result >= 0) {
        // Where privileges allow, sd-bus enlarges it a hundredfold, and each peer could leave that unread.
        ::setsockopt(descriptor, SOL_SOCKET, SO_SNDBUF, &sendBuffer, sizeof sendBuffer);
        watch_ = context_->pool.watch(descriptor, [weak = weak_from_this()](std::uint32_t) {
            if (const auto self = weak.lock()) {
                self->handleEvents();
            }
        });
    }
    return result;
}

int BusLink::sawMessage(sd_bus_message*, void* link, sd_bus_error*)
{
    static_cast<BusLink*>(link)->sawMessage_ = true;
    return 0;
}

void BusLink::close()
{
    locked([&](Afterwards& afterwards) { end(afterwards, false); });
}

void BusLink::handleEvents()
{
    // The next event may be handled, by another thread, while this one goes on with what has arrived.
    locked([&](Afterwards& afterwards) {
        if (ended_) {
            return;
        }
        processInput(afterwards);
        if (!ended_) {
            checkOutgoing(afterwards);
        }
        if (!ended_) {
            arm();
        }
    });
}

void BusLink::arm()
{
    watch_->arm(static_cast<std::uint32_t>(sd_bus_get_events(bus_)));
}

/// Reads one message, or as far as there is input. Right after the handshake, all of it.
void BusLink::processInput(Afterwards& afterwards)
{
    constexpr int maximumSteps = 4096;
    for (int step = 0; step < maximumSteps; ++step) {
        const auto progress = processOnce(afterwards);
        if (progress == Progress::ended || (progress == Progress::message && !draining_)) {
            return;
        }
        if (progress == Progress::none) {
            draining_ = !ready_;
            return;
        }
    }
}

BusLink::Progress BusLink::processOnce(Afterwards& afterwards)
{
    if (ready_ && !sizeGuard_.admits(sd_bus_get_fd(bus_))) {
        abandonLocked("its message is too large", afterwards);
        return Progress::ended;
    }
    sawMessage_ = false;
    sd_bus_message* raw = nullptr;
    const int result = sd_bus_process(bus_, &raw);
    const BusMessage message(raw);
    if (result < 0 || sd_bus_is_open(bus_) <= 0) {
        if (result < 0) {
            abandonLocked(errorText(result), afterwards);
        }
        end(afterwards, true);
        return Progress::ended;
    }
    if (!ready_ && sd_bus_is_ready(bus_) > 0) {
        becomeReady(afterwards);
    } else if (ready_ && !sizeGuard_.hasRead(sawMessage_, draining_)) {
        abandonLocked("its message is too large", afterwards);
    }
    if (message && !ended_) {
        receive(message.get(), afterwards);
    }
    return ended_        ? Progress::ended
           : sawMessage_ ? Progress::message
           : result > 0  ? Progress::some
                         : Progress::none;
}

void BusLink::becomeReady(Afterwards& afterwards)
{
    ready_ = true;
    context_->dispose(std::move(handshakeTimer_));
    descriptorsAllowed_ = sd_bus_can_send(bus_, SD_BUS_TYPE_UNIX_FD) > 0;
    std::vector<std::uint64_t> waiting;
    for (const auto& [number, call] : pending_) {
        waiting.push_back(number);
    }
    for (const auto number : waiting) {
        transmit(number, afterwards);
    }
}

void BusLink::receive(sd_bus_message* message, Afterwards& afterwards)
{
    if (sd_bus_message_is_method_call(message, nullptr, nullptr) > 0) {
        if (const auto owner = owner_.lock()) {
            afterwards.push_back([owner] {});
            owner->receivedCall(*this, message, afterwards);
        }
        return;
    }
    std::uint8_t type = 0;
    sd_bus_message_get_type(message, &type);
    if (type != SD_BUS_MESSAGE_SIGNAL) {
        complete(message, afterwards);
    }
}

void BusLink::complete(sd_bus_message* message, Afterwards& afterwards)
{
    std::uint64_t cookie = 0;
    const bool hasCookie = sd_bus_message_get_reply_cookie(message, &cookie) >= 0;
    const auto number = hasCookie ? numberByCookie_.find(cookie) : numberByCookie_.end();
    if (number == numberByCookie_.end()) {
        return;
    }
    if (sd_bus_message_is_method_error(message, nullptr) > 0) {
        const auto* error = sd_bus_message_get_error(message);
        const std::string text = error->message == nullptr ? "" : error->message;
        completeCall(number->second, {std::nullopt, {error->name, text}}, afterwards);
        return;
    }
    const auto& call = pending_.at(number->second).call;
    auto reading = readMessage(message, call.outTypes, peer, context_->limits.message);
    IpcError error;
    if (!reading.arguments) {
        error = {ipc_errors::failed,
                 "the reply of " + call.member + " does not fit \"" + call.outTypes + "\""};
    }
    completeCall(number->second, {std::move(reading.arguments), std::move(error)}, afterwards);
}

void BusLink::completeCall(std::uint64_t number, CallResult result, Afterwards& afterwards)
{
    auto node = pending_.extract(number);
    if (node.empty()) {
        return;
    }
    auto& pending = node.mapped();
    numberByCookie_.erase(pending.cookie);
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
        auto& pending = pending_.emplace(number, PendingCall{std::move(call), 0, nullptr}).first->second;
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
    const auto found = pending_.find(number);
    if (found == pending_.end() || ended_) {
        return;
    }
    auto& pending = found->second;
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
        numberByCookie_.emplace(cookie, number);
    } else {
        completeCall(number, {Arguments{}, {}}, afterwards);
    }
}

BusMessage BusLink::newCall(const OutgoingCall& call)
{
    sd_bus_message* raw = nullptr;
    if (sd_bus_message_new_method_call(bus_, &raw, nullptr, exportedObjectPath, call.interface.c_str(),
                                       call.member.c_str()) < 0) {
        return nullptr;
    }
    sd_bus_message_set_expect_reply(raw, call.expectReply ? 1 : 0);
    return BusMessage(raw);
}

bool BusLink::send(BusMessage message, const MessageAppending& size, std::uint64_t* cookie,
                   Afterwards& afterwards)
{
    outgoing_.sending(size, sd_bus_get_fd(bus_));
    const int result = sd_bus_send(bus_, message.get(), cookie);
    message.reset();
    if (result < 0) {
        abandonLocked("a message could not be sent: " + errorText(result), afterwards);
        return false;
    }
    checkOutgoing(afterwards);
    if (!ended_ && !outgoing_.isEmpty()) {
        arm();
    }
    return !ended_;
}

void BusLink::checkOutgoing(Afterwards& afterwards)
{
    std::uint64_t waiting = 0;
    sd_bus_get_n_queued_write(bus_, &waiting);
    outgoing_.update(waiting);
    const auto excess = outgoing_.excess(context_->limits);
    if (!excess.empty()) {
        TYLog_Error(context_->log,
                    "connection to process " + std::to_string(peer.processIdentifier) + " closed: " + excess);
        end(afterwards, true);
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
    if (sd_bus_message_new_method_call(bus_, &raw, nullptr, "/", "call.to", "Answer") < 0) {
        return nullptr;
    }
    BusMessage call(raw);
    return sd_bus_message_seal(raw, cookie, 1) < 0 ? nullptr : std::move(call);
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
    watch_.reset();
    context_->dispose(std::move(handshakeTimer_));
    while (!pending_.empty()) {
        completeCall(pending_.begin()->first, {std::nullopt, disconnectedError}, afterwards);
    }
    sd_bus_close_unref(std::exchange(bus_, nullptr));
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

}  // namespace typhon
