#pragma once

#include "platform/audit_token.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <set>
#include <string>

namespace typhon {

/// The endowment namespace of processes that the user can see.
inline constexpr const char* visibilityEndowmentNamespace = "com.vorlan.stagehand.visibility";

/// `LWSProcessIdentifier`. Names one process instance: taken from a token at admission, so that a process
/// identifier that was used again never names another process.
struct LWSProcessIdentifier {
    /// `identifierWithPid:`, of the process that the token names.
    static LWSProcessIdentifier identifierWithPid(const AuditToken& process) { return {process}; }
    AuditToken process;
};

/// The state of a process at one moment.
struct LWSProcessState {
    std::set<std::string> endowmentNamespaces;
};

/// The process-lifecycle service. Any thread; does not block.
class ProcessLifecycle {
public:
    virtual ~ProcessLifecycle() = default;
    /// `handleForIdentifier:error:` and its `currentState`: the present state of that process, or null when
    /// it is not running (any more).
    virtual std::optional<LWSProcessState> currentState(const LWSProcessIdentifier& identifier) = 0;
};

}  // namespace typhon
