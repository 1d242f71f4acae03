#pragma once

#include "platform/linux/confinement.h"
#include "platform/linux/extension_tokens.h"
#include "platform/linux/read_access.h"
#include "platform/linux/root_directory.h"
#include "platform/sandbox.h"

namespace typhon {

/// Confinement, file access and read extensions on Linux. Any thread.
class LinuxSandbox : public Sandbox {
public:
    /// All of them outlive this.
    LinuxSandbox(const ConfinementProbe& probe, const ExtensionTokens& tokens, const RootDirectory& root)
        : probe_(probe), tokens_(tokens), root_(root)
    {}

    bool isSandboxed(const AuditToken& token) override;
    bool mayRead(const AuditToken& token, const std::string& path) override;
    std::optional<std::string> issueReadExtension(const AuditToken& token, const std::string& path) override;

private:
    std::optional<bool> reaches(const ProcessInspection& process, const std::string& path);

    const ConfinementProbe& probe_;
    const ExtensionTokens& tokens_;
    const RootDirectory& root_;
    BorrowedCredentials credentials_;
};

}  // namespace typhon
