#pragma once

#include "platform/audit_token.h"
#include "platform/property_list.h"

#include <optional>
#include <string>
#include <string_view>

namespace typhon {

/// What the code signature of a running process says. Without a valid signature: no identifier and no
/// entitlements.
struct CodeSigningTask {
    std::optional<std::string> signingIdentifier;
    /// Key to value.
    PropertyList::Dictionary entitlements;

    std::optional<PropertyList> entitlement(std::string_view key) const
    {
        const auto found = entitlements.find(key);
        return found == entitlements.end() ? std::nullopt : std::optional(found->second);
    }
};

/// Code-signing queries. Any thread; may read files of the caller's process.
class CodeSigning {
public:
    virtual ~CodeSigning() = default;
    /// The signature of the process, or null when there is no such process (any more).
    virtual std::optional<CodeSigningTask> taskFromAuditToken(const AuditToken& token) = 0;
};

}  // namespace typhon
