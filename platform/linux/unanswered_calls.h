#pragma once

#include "platform/linux/held_bytes.h"
#include "platform/linux/ipc_limits.h"

#include <atomic>
#include <cstddef>
#include <memory>

namespace typhon {

/// Counts the calls of one connection that somebody may still answer, and the memory they hold. Charged by
/// one thread at a time, given back by any.
class UnansweredCalls {
public:
    /// Given back when the call is answered or dropped, whichever comes first. It keeps no connection; but
    /// giving it back may be what ends one, so that no lock should be held.
    class Charge {
    public:
        /// Of nothing yet.
        explicit Charge(const HeldBytes::Peer& peer) : held_(peer) {}
        ~Charge()
        {
            if (const auto calls = calls_.lock()) {
                --calls->count_;
                calls->memory_ -= held_.bytes();
            }
        }
        Charge(const Charge&) = delete;
        Charge& operator=(const Charge&) = delete;

    private:
        friend UnansweredCalls;

        HeldBytes::Claim held_;
        std::weak_ptr<UnansweredCalls> calls_;
    };

    /// Charges `calls` with one more. Null when that is too much, for this connection or for `peer`. As far
    /// as the connection is concerned a lone call may be as large as a message may.
    static std::unique_ptr<Charge> charge(const std::shared_ptr<UnansweredCalls>& calls, std::size_t memory,
                                          const IpcLimits& limits, const HeldBytes::Peer& peer)
    {
        auto charge = std::make_unique<Charge>(peer);
        const bool isLone = calls->count_ == 0;
        if (!charge->held_.grow(memory) || (!isLone && (calls->count_ >= limits.unansweredCalls ||
                                                        calls->memory_ + memory > limits.unansweredBytes))) {
            return nullptr;
        }
        ++calls->count_;
        calls->memory_ += memory;
        charge->calls_ = calls;
        return charge;
    }

private:
    std::atomic<unsigned> count_ = 0;
    std::atomic<std::size_t> memory_ = 0;
};

}  // namespace typhon
