#include "platform/linux/connection_accounting.h"

namespace typhon {

ConnectionAccounting::Admission ConnectionAccounting::admit(const AuditToken& token)
{
    const std::lock_guard lock(mutex_);
    const ProcessKey key{token.processIdentifier, token.processInstance};
    const auto process = processes_.try_emplace(key).first;
    const auto user = users_.try_emplace(token.effectiveUser).first;
    auto refusal = refuse(process->second, perProcess_, "process " + std::to_string(token.processIdentifier));
    if (!refusal) {
        refusal = refuse(user->second, perUser_, "user " + std::to_string(token.effectiveUser));
    }
    if (refusal) {
        if (process->second.connections == 0) {
            processes_.erase(process);
        }
        return {{}, *refusal};
    }
    ++process->second.connections;
    ++user->second.connections;
    return {Charge(shared_from_this(), process, user), {}};
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

void ConnectionAccounting::release(Processes::iterator process, Users::iterator user)
{
    const std::lock_guard lock(mutex_);
    if (--process->second.connections == 0) {
        processes_.erase(process);
    }
    if (--user->second.connections == 0) {
        users_.erase(user);
    }
}

}  // namespace typhon
