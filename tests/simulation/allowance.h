#pragma once

#include "platform/property_list.h"
#include "platform/simulated/simulated_sandbox.h"

#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon::simulation {

/// What one client may be told when it checks in.
struct Allowance {
    AuditToken token = {};
    bool isAnswered = false;
    bool isEnumerating = false;
    bool hasFontAccess = false;
    bool isSandboxed = true;
    /// Paths that may be listed.
    std::set<std::string> paths = {};
    /// The directory of which a provider may get the extension.
    std::optional<std::string> ownDirectory = std::nullopt;
};

/// Everything in the reply to a check-in that goes beyond the allowance, or that is not put as agreed.
/// `issued`: every extension that was issued so far.
std::vector<std::string> violations(const std::optional<PropertyList>& reply, const Allowance& allowance,
                                    const std::vector<SimulatedSandbox::IssuedExtension>& issued);

}  // namespace typhon::simulation
