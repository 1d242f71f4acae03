#pragma once

#include "platform/audit_token.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <utility>

namespace typhon {

/// Counts the memory that peers make this process hold: parts of messages that are not whole yet, arguments
/// of calls that nobody has answered, and what they leave unread. Any thread.
class HeldBytes {
public:
    HeldBytes(std::size_t perProcess, std::size_t perUser) : perProcess_(perProcess), perUser_(perUser) {}

    /// Who makes us hold something, and where that counts.
    struct Peer {
        const std::shared_ptr<HeldBytes>& held;
        const AuditToken& token;
    };

    /// What is held for one connection; given back when it is destroyed.
    class Claim {
    public:
        explicit Claim(const Peer& peer) : held_(peer.held), peer_(peer.token) {}
        ~Claim() { release(); }
        Claim(const Claim&) = delete;
        Claim& operator=(const Claim&) = delete;

        /// False when that is too much, and then nothing changes.
        bool grow(std::size_t bytes)
        {
            const bool granted = held_->take(peer_, bytes);
            bytes_ += granted ? bytes : 0;
            return granted;
        }
        std::size_t bytes() const { return bytes_; }
        void release() { held_->give(peer_, std::exchange(bytes_, 0)); }
        /// Gives back all but `bytes`.
        void shrinkTo(std::size_t bytes)
        {
            if (bytes < bytes_) {
                held_->give(peer_, bytes_ - bytes);
                bytes_ = bytes;
            }
        }

    private:
        const std::shared_ptr<HeldBytes> held_;
        const AuditToken peer_;
        std::size_t bytes_ = 0;
    };

private:
    using ProcessKey = std::pair<std::int32_t, std::uint64_t>;
    static ProcessKey keyOf(const AuditToken& peer) { return {peer.processIdentifier, peer.processInstance}; }

    bool take(const AuditToken& peer, std::size_t bytes)
    {
        if (bytes == 0) {
            return true;
        }
        const std::lock_guard lock(mutex_);
        auto& process = processes_[keyOf(peer)];
        auto& user = users_[peer.effectiveUser];
        const bool granted = process + bytes <= perProcess_ && user + bytes <= perUser_;
        process += granted ? bytes : 0;
        user += granted ? bytes : 0;
        forgetEmpty(peer);
        return granted;
    }
    void give(const AuditToken& peer, std::size_t bytes)
    {
        if (bytes == 0) {
            return;
        }
        const std::lock_guard lock(mutex_);
        processes_[keyOf(peer)] -= bytes;
        users_[peer.effectiveUser] -= bytes;
        forgetEmpty(peer);
    }
    void forgetEmpty(const AuditToken& peer)
    {
        if (processes_[keyOf(peer)] == 0) {
            processes_.erase(keyOf(peer));
        }
        if (users_[peer.effectiveUser] == 0) {
            users_.erase(peer.effectiveUser);
        }
    }

    const std::size_t perProcess_;
    const std::size_t perUser_;
    std::mutex mutex_;
    std::map<ProcessKey, std::size_t> processes_;
    std::map<std::uint32_t, std::size_t> users_;
};

}  // namespace typhon
