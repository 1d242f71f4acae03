#pragma once

#include "platform/sandbox.h"
#include "platform/simulated/simulated_processes.h"

#include <mutex>
#include <vector>

namespace typhon {

/// Confinement as the simulated processes have it. Extensions are readable texts
/// ("extension 2 for process 1003: /a/path"), each issued one different from all others. Any thread.
class SimulatedSandbox : public Sandbox {
public:
    struct IssuedExtension {
        AuditToken token;
        std::string path;
        std::string text;
    };

    /// `processes` outlives this.
    explicit SimulatedSandbox(const SimulatedProcesses& processes) : processes_(processes) {}

    bool isSandboxed(const AuditToken& token) override;
    bool mayRead(const AuditToken& token, const std::string& path) override;
    std::optional<std::string> issueReadExtension(const AuditToken& token, const std::string& path) override;

    /// Every extension issued so far, in order.
    std::vector<IssuedExtension> issued() const;

private:
    const SimulatedProcesses& processes_;
    mutable std::mutex mutex_;
    std::vector<IssuedExtension> issued_;
};

}  // namespace typhon
