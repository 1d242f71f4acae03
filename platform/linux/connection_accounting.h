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
    struct Account {
        unsigned connections = 0;
        bool refusalLogged = false;
    };
    using ProcessKey = std::pair<std::int32_t, std::uint64_t>;
    using Processes = std::map<ProcessKey, Account>;
    using Users = std::map<std::uint32_t, Account>;

public:
    ConnectionAccounting(unsigned perProcess, unsigned perUser) : perProcess_(perProcess), perUser_(perUser)
    {}

    /// Held for as long as the connection is open. One that is empty charges nobody.
    class Charge {
    public:
        Charge() = default;
        Charge(Charge&& other) noexcept = default;
        Charge& operator=(Charge&& other) noexcept
        {
            std::swap(accounting_, other.accounting_);
            std::swap(process_, other.process_);
            std::swap(user_, other.user_);
            return *this;
        }
        ~Charge()
        {
            if (accounting_) {
                accounting_->release(process_, user_);
            }
        }
        explicit operator bool() const { return accounting_ != nullptr; }

    private:
        friend ConnectionAccounting;
        Charge(std::shared_ptr<ConnectionAccounting> accounting, Processes::iterator process,
               Users::iterator user)
            : accounting_(std::move(accounting)), process_(process), user_(user)
        {}

        std::shared_ptr<ConnectionAccounting> accounting_;
        /// An account is there for as long as it has connections.
        Processes::iterator process_;
        Users::iterator user_;
    };

    struct Admission {
        /// Empty when the peer has too many connections.
        Charge charge;
        /// What to log; empty for a refusal that is like the one before.
        std::string refusal;
    };
    Admission admit(const AuditToken& token);

private:
    static std::optional<std::string> refuse(Account& account, unsigned limit, const std::string& who);
    void release(Processes::iterator process, Users::iterator user);

    const unsigned perProcess_;
    const unsigned perUser_;
    std::mutex mutex_;
    Processes processes_;
    Users users_;
};

}  // namespace typhon
