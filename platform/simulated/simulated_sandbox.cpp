#include "platform/simulated/simulated_sandbox.h"

namespace typhon {

bool SimulatedSandbox::isSandboxed(const AuditToken& token)
{
    const auto process = processes_.find(token);
    return !process || process->isSandboxed;
}

bool SimulatedSandbox::mayRead(const AuditToken& token, const std::string& path)
{
    const auto process = processes_.find(token);
    return process && process->readablePaths.contains(path);
}

std::optional<std::string> SimulatedSandbox::issueReadExtension(const AuditToken& token,
                                                                const std::string& path)
{
    const auto process = processes_.find(token);
    if (!process || !process->acceptsExtensions) {
        return std::nullopt;
    }
    const std::lock_guard lock(mutex_);
    auto text = "extension " + std::to_string(issued_.size() + 1) + " for process " +
                std::to_string(token.processIdentifier) + ": " + path;
    issued_.push_back({token, path, text});
    return text;
}

std::vector<SimulatedSandbox::IssuedExtension> SimulatedSandbox::issued() const
{
    const std::lock_guard lock(mutex_);
    return issued_;
}

}  // namespace typhon
