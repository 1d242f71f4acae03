#pragma once

#include "platform/linux/held_bytes.h"

#include <cstddef>
#include <memory>
#include <mutex>
#include <utility>

namespace typhon {

/// Counts the calls of one connection that somebody may still answer, and the memory they hold. Any thread.
class UnansweredCalls : public std::enable_shared_from_this<UnansweredCalls> {
public:
    UnansweredCalls(unsigned maximumCount, std::size_t maximumMemory)
        : maximumCount_(maximumCount), maximumMemory_(maximumMemory)
    {}

    /// Given back when the call is answered or dropped, whichever comes first.
    class Charge {
    public:
        Charge(std::shared_ptr<UnansweredCalls> calls, std::size_t memory,
               std::unique_ptr<HeldBytes::Claim> held)
            : calls_(std::move(calls)), memory_(memory), held_(std::move(held))
        {}
        ~Charge() { calls_->release(memory_); }
        Charge(const Charge&) = delete;
        Charge& operator=(const Charge&) = delete;

    private:
        const std::shared_ptr<UnansweredCalls> calls_;
        const std::size_t memory_;
        const std::unique_ptr<HeldBytes::Claim> held_;
    };

    /// Null when that is too much, for this connection or for its process or user, which `held` is a claim
    /// of. As far as the connection is concerned a lone call may be as large as a message may.
    std::unique_ptr<Charge> charge(std::size_t memory, std::unique_ptr<HeldBytes::Claim> held)
    {
        if (!held->grow(memory)) {
            return nullptr;
        }
        const std::lock_guard lock(mutex_);
        if (count_ > 0 && (count_ >= maximumCount_ || memory_ + memory > maximumMemory_)) {
            return nullptr;
        }
        ++count_;
        memory_ += memory;
        return std::make_unique<Charge>(shared_from_this(), memory, std::move(held));
    }

private:
    void release(std::size_t memory)
    {
        const std::lock_guard lock(mutex_);
        --count_;
        memory_ -= memory;
    }

    const unsigned maximumCount_;
    const std::size_t maximumMemory_;
    std::mutex mutex_;
    unsigned count_ = 0;
    std::size_t memory_ = 0;
};

}  // namespace typhon
