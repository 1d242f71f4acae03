#include "platform/simulated/simulated_processes.h"

namespace typhon {

SimulatedProcesses::Key SimulatedProcesses::keyOf(const AuditToken& token)
{
    return {token.processInstance, token.execGeneration};
}

AuditToken SimulatedProcesses::add(SimulatedProcess process)
{
    const std::lock_guard lock(mutex_);
    ++count_;
    AuditToken token{.version = 1,
                     .processIdentifier = static_cast<std::int32_t>(1000 + count_),
                     .processInstance = count_,
                     .execGeneration = 1,
                     .effectiveUser = 501,
                     .bootEpoch = 1};
    byInstance_[keyOf(token)] = {token, std::move(process)};
    return token;
}

void SimulatedProcesses::set(const AuditToken& token, SimulatedProcess process)
{
    const std::lock_guard lock(mutex_);
    byInstance_[keyOf(token)] = {token, std::move(process)};
}

void SimulatedProcesses::exit(const AuditToken& token)
{
    const std::lock_guard lock(mutex_);
    byInstance_.erase(keyOf(token));
}

AuditToken SimulatedProcesses::exec(const AuditToken& token, SimulatedProcess process)
{
    const std::lock_guard lock(mutex_);
    byInstance_.erase(keyOf(token));
    AuditToken next = token;
    ++next.execGeneration;
    byInstance_[keyOf(next)] = {next, std::move(process)};
    return next;
}

std::optional<SimulatedProcess> SimulatedProcesses::find(const AuditToken& token) const
{
    const std::lock_guard lock(mutex_);
    const auto found = byInstance_.find(keyOf(token));
    if (found == byInstance_.end() || found->second.token != token) {
        return std::nullopt;
    }
    return found->second.process;
}

}  // namespace typhon
