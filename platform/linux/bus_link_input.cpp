// What arrives over a link. One message at a time is read, by one thread. Small messages are understood under
// the lock. Those that we put together ourselves belong to no bus that others use: they are understood
// without the lock, the large ones moreover one after another for the whole transport, so that they occupy
// one thread at most; meanwhile the link is written to, and nothing is read from it.

#include "platform/linux/bus_link.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <sys/epoll.h>

namespace typhon {

namespace {

using Clock = std::chrono::steady_clock;

/// Others get their turn after so many messages, or after that time.
constexpr int messagesAtOnce = 16;
constexpr std::chrono::microseconds turn{100};
/// Messages of more bytes, with those of their memory files, wait for the others of their size.
constexpr std::size_t quicklyDecoded = 256U << 10;
/// What a large message that somebody really needs may take.
constexpr std::chrono::milliseconds ordinaryDecoding{10};

constexpr const char* noMessage = "it sent something that is no message";

/// What a peer has done wrong when its input ends like that; null when that is no offence.
const char* offenceOf(MessageReception::Outcome outcome)
{
    using Outcome = MessageReception::Outcome;
    switch (outcome) {
    case Outcome::malformed:
        return noMessage;
    case Outcome::tooLarge:
        return "its message is too large";
    case Outcome::tooManyDescriptors:
        return "its message has too many descriptors";
    case Outcome::tooMuchHeld:
        return "it left too many messages unfinished";
    default:
        return nullptr;
    }
}

bool isCall(sd_bus_message* message)
{
    return sd_bus_message_is_method_call(message, nullptr, nullptr) > 0;
}

}  // namespace

void BusLink::handleEvents(std::uint32_t events)
{
    const bool hasHungUp = (events & (EPOLLHUP | EPOLLERR)) != 0;
    // What arrives meanwhile is not announced to another thread, which could do no more than wait for this
    // one: it is read when this one is done. What lay there before its predecessor was answered counts: its
    // sender did not wait for the answer.
    auto next = Next::look;
    std::chrono::nanoseconds taken{};
    std::chrono::nanoseconds owed{};
    for (int count = 0; next != Next::wait && count < messagesAtOnce && taken < turn; ++count) {
        const bool layThere = next == Next::read;
        const auto begin = count > 0 ? Clock::now() : Clock::time_point();
        locked([&](Afterwards& later) { next = handleInput(std::exchange(events, 0), later); });
        if (next == Next::decode) {
            decode();
            next = Next::read;
        }
        if (count > 0 && next != Next::wait) {
            const auto duration = Clock::now() - begin;
            taken += duration;
            owed += layThere ? duration : Clock::duration::zero();
        }
    }
    proceedAfter(owed, hasHungUp);
}

/// Goes on reading, now or when the peer has rested enough for the time that it has taken.
void BusLink::proceedAfter(std::chrono::nanoseconds taken, bool hasHungUp)
{
    constexpr auto none = std::chrono::nanoseconds::zero();
    const auto pause = taken > none ? context_->pace.rest(peer, taken, Clock::now()) : none;
    const std::lock_guard lock(mutex_);
    if (ended_) {
        return;
    }
    if (!inputHeld_ && pause > none) {
        rest(pause);
    }
    // A peer that is gone is announced again and again; it is noticed when reading goes on.
    if (!inputHeld_ || !hasHungUp) {
        arm();
    }
}

/// The caller locks.
void BusLink::rest(std::chrono::nanoseconds duration)
{
    inputHeld_ = true;
    if (!restTimer_) {
        restTimer_ = context_->queues.createTimer(*context_->deadlines, [weak = weak_from_this()] {
            if (const auto self = weak.lock()) {
                self->endRest();
            }
        });
    }
    restTimer_->schedule(duration, duration / 50);
}

void BusLink::endRest()
{
    locked([&](Afterwards& afterwards) {
        if (ended_) {
            return;
        }
        if (decodingDue_) {
            queueDecoding(afterwards);
            return;
        }
        inputHeld_ = false;
        arm();
    });
}

BusLink::Next BusLink::handleInput(std::uint32_t events, Afterwards& afterwards)
{
    if (ended_) {
        return Next::wait;
    }
    if (!ready_) {
        proceedWithHandshake(afterwards);
        return Next::wait;
    }
    if ((events & EPOLLOUT) != 0) {
        processOutput(afterwards);
    }
    const auto next = ended_ || inputHeld_ ? Next::wait : processInput(afterwards);
    if (!ended_) {
        outgoing_.update(countWaiting(), holder());
        checkExcess(afterwards);
    }
    return ended_ ? Next::wait : next;
}

/// Reads at most one message.
BusLink::Next BusLink::processInput(Afterwards& afterwards)
{
    using Outcome = MessageReception::Outcome;
    const auto& limits = context_->limits.message;
    const auto outcome = reception_.next(
        {bus_.socket(), limits.bytes, descriptorsAllowed_ ? limits.descriptors : 0, holder()});
    if (outcome == Outcome::ready || outcome == Outcome::readyAmongOthers) {
        processReadyMessage(afterwards);
        return outcome == Outcome::ready ? Next::look : Next::read;
    }
    if (outcome == Outcome::assembled) {
        return processAssembledMessage(afterwards);
    }
    if (outcome == Outcome::begun) {
        awaitRest();
    } else if (outcome == Outcome::closed) {
        end(afterwards, true);
    } else if (const auto* offence = offenceOf(outcome)) {
        punishLocked(offence, afterwards);
    }
    return Next::wait;
}

void BusLink::processReadyMessage(Afterwards& afterwards)
{
    sd_bus_message* raw = nullptr;
    const int result = bus_.readMessage(&raw);
    const BusMessage message(raw);
    if (result == -EBADMSG) {
        punishLocked(noMessage, afterwards);
    } else if (result < 0 || sd_bus_is_open(bus_.get()) <= 0) {
        abandonLocked(std::strerror(-result), afterwards);
    } else if (message) {
        receive(message.get(), afterwards);
    }
}

/// The message stays where it is until it is decoded, so that it counts as held.
BusLink::Next BusLink::processAssembledMessage(Afterwards& afterwards)
{
    context_->dispose(std::move(deadline_));
    inputHeld_ = true;
    decodingDue_ = true;
    if (!context_->pace.isLimited() || reception_.assembledBytes() <= quicklyDecoded) {
        return Next::decode;
    }
    queueDecoding(afterwards);
    return Next::wait;
}

void BusLink::awaitRest()
{
    if (!deadline_) {
        startDeadline(context_->limits.wholeMessage, "it did not finish a message in time");
    }
}

void BusLink::queueDecoding(Afterwards& afterwards)
{
    afterwards.push_back(
        [self = shared_from_this()] { self->context_->largeMessages->async(decodeInTurn(self)); });
}

Task<void> BusLink::decodeInTurn(std::shared_ptr<BusLink> self)
{
    const auto begin = Clock::now();
    const auto owed = self->context_->pace.rest(self->peer, std::chrono::nanoseconds(1), begin);
    if (owed > std::chrono::nanoseconds::zero()) {
        // Its process has had others decoded meanwhile.
        const std::lock_guard lock(self->mutex_);
        if (!self->ended_) {
            self->rest(owed);
        }
        co_return;
    }
    self->decode();
    self->proceedAfter(Clock::now() - begin - ordinaryDecoding, false);
}

/// Understands the message that was put together, without the lock.
void BusLink::decode()
{
    ReceivedMessage received;
    {
        const std::lock_guard lock(mutex_);
        if (ended_ || !std::exchange(decodingDue_, false)) {
            return;
        }
        received = reception_.take();
    }
    MessageDecoder decoder;
    if (auto* message = decoder.decode(std::move(received))) {
        deliver(message);
    } else {
        locked([&](Afterwards& afterwards) { punishLocked(noMessage, afterwards); });
    }
}

void BusLink::deliver(sd_bus_message* message)
{
    const auto owner = owner_.lock();
    if (isCall(message)) {
        auto call = owner ? owner->readCall(*this, message) : ReceivedCall();
        locked([&](Afterwards& afterwards) {
            inputHeld_ = false;
            if (!ended_ && owner) {
                owner->receivedCall(*this, std::move(call), afterwards);
            }
        });
        return;
    }
    std::optional<std::uint64_t> number;
    OutgoingCall asked;
    {
        const std::lock_guard lock(mutex_);
        number = numberOfReply(message);
        if (number) {
            const auto& call = pendingCall(*number)->call;
            asked.member = call.member;
            asked.outTypes = call.outTypes;
        }
    }
    auto result = number ? readReply(message, asked) : CallResult();
    locked([&](Afterwards& afterwards) {
        inputHeld_ = false;
        if (number) {
            completeCall(*number, std::move(result), afterwards);
        }
    });
}

/// Understands a message of the link's own bus.
void BusLink::receive(sd_bus_message* message, Afterwards& afterwards)
{
    if (isCall(message)) {
        if (const auto owner = owner_.lock()) {
            constexpr std::size_t usualActions = 4;
            afterwards.reserve(usualActions);
            afterwards.push_back([owner] {});
            owner->receivedCall(*this, owner->readCall(*this, message), afterwards);
        }
    } else if (const auto number = numberOfReply(message)) {
        completeCall(*number, readReply(message, pendingCall(*number)->call), afterwards);
    }
}

/// The pending call that `message` answers; null when it is no answer, or nobody waits for it.
std::optional<std::uint64_t> BusLink::numberOfReply(sd_bus_message* message) const
{
    std::uint8_t type = 0;
    std::uint64_t cookie = 0;
    sd_bus_message_get_type(message, &type);
    if (type == SD_BUS_MESSAGE_SIGNAL || sd_bus_message_get_reply_cookie(message, &cookie) < 0) {
        return std::nullopt;
    }
    if (!pending_) {
        return std::nullopt;
    }
    const auto number = pending_->numberByCookie.find(cookie);
    return number == pending_->numberByCookie.end() ? std::nullopt : std::optional(number->second);
}

CallResult BusLink::readReply(sd_bus_message* message, const OutgoingCall& call) const
{
    if (sd_bus_message_is_method_error(message, nullptr) > 0) {
        const auto* error = sd_bus_message_get_error(message);
        return {std::nullopt, {error->name, error->message == nullptr ? "" : error->message}};
    }
    auto reading = readMessage(message, call.outTypes, peer, context_->limits.message);
    IpcError error;
    if (!reading.arguments) {
        error = {ipc_errors::failed,
                 "the reply of " + call.member + " does not fit \"" + call.outTypes + "\""};
    }
    return {std::move(reading.arguments), std::move(error)};
}

}  // namespace typhon
