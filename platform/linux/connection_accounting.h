#pragma once

#include "platform/audit_token.h"

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <utility>

namespace typhon {

/// Counts the connections of every process and user that it may make us hold: those accepted from it, and
/// those made to its endpoints. Any thread.
class ConnectionAccounting : public std::enable_shared_from_this<ConnectionAccounting> {
public:
    ConnectionAccounting(unsigned perProcess, unsigned perUser) : perProcess_(perProcess), perUser_(perUser)
    {}

    /// Held for as long as the connection is open.
    class Charge {
    public:
        Charge(std::shared_ptr<ConnectionAccounting> accounting, AuditToken token)
            : accounting_(std::move(accounting)), token_(token)
        {}
        ~Charge() { accounting_->release(token_); }
        Charge(const Charge&) = delete;
        Charge& operator=(const Charge&) = delete;

    private:
        const std::shared_ptr<ConnectionAccounting> accounting_;
        const AuditToken token_;
    };

    struct Admission {
        /// Null when the peer has too many connections.
        std::unique_ptr<Charge> charge;
        /// What to log; empty for a refusal that is like the one before.
        std::string refusal;
    };
    Admission admit(const AuditToken& token);

private:
    struct Account {
        unsigned connections = 0;
        bool refusalLogged = false;
    };
    using ProcessKey = std::pair<std::int32_t, std::uint64_t>;

    static std::optional<std::string> refuse(Account& account, unsigned limit, const std::string& who);
    void release(const AuditToken& token);

    const unsigned perProcess_;
    const unsigned perUser_;
    std::mutex mutex_;
    std::map<ProcessKey, Account> processes_;
    std::map<std::uint32_t, Account> users_;
};

}  // namespace typhon
