#include "platform/linux/connection_accounting.h"

namespace typhon {

ConnectionAccounting::Admission ConnectionAccounting::admit(const AuditToken& token)
{
    const std::lock_guard lock(mutex_);
    auto& process = processes_[{token.processIdentifier, token.processInstance}];
    auto& user = users_[token.effectiveUser];
    auto refusal = refuse(process, perProcess_, "process " + std::to_string(token.processIdentifier));
    if (!refusal) {
        refusal = refuse(user, perUser_, "user " + std::to_string(token.effectiveUser));
    }
    if (refusal) {
        if (process.connections == 0) {
            processes_.erase({token.processIdentifier, token.processInstance});
        }
        return {nullptr, *refusal};
    }
    ++process.connections;
    ++user.connections;
    return {std::make_unique<Charge>(shared_from_this(), token), {}};
    // The analyzer loses sight of the pointer inside the returned aggregate.
    // NOLINTNEXTLINE(clang-analyzer-cplusplus.NewDeleteLeaks)
}

std::optional<std::string> ConnectionAccounting::refuse(Account& account, unsigned limit,
                                                        const std::string& who)
{
    if (account.connections < limit) {
        return std::nullopt;
    }
    if (std::exchange(account.refusalLogged, true)) {
        return std::string();
    }
    return who + " has " + std::to_string(account.connections) + " connections; further ones are refused";
}

void ConnectionAccounting::release(const AuditToken& token)
{
    const std::lock_guard lock(mutex_);
    const auto process = processes_.find({token.processIdentifier, token.processInstance});
    if (--process->second.connections == 0) {
        processes_.erase(process);
    }
    const auto user = users_.find(token.effectiveUser);
    if (--user->second.connections == 0) {
        users_.erase(user);
    }
}

}  // namespace typhon
