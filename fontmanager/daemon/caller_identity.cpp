#include "fontmanager/daemon/caller_identity.h"

#include <algorithm>

namespace typhon {

bool isFontProvider(const CallerIdentity& caller)
{
    const auto capabilities = caller.signature.entitlement("com.vorlan.developer.user-fonts");
    const auto* list = capabilities ? capabilities->asArray() : nullptr;
    return caller.signature.signingIdentifier && list != nullptr &&
           std::ranges::find(*list, PropertyList("system-installation")) != list->end();
}

bool isAdministrator(const CallerIdentity& caller, const OwnUser& own)
{
    if (own.isServiceUser && caller.user == own.user) {
        return true;
    }
    const auto& identifier = caller.signature.signingIdentifier;
    return !caller.isSandboxed && (caller.user == 0 || caller.user == own.user) &&
           (!identifier || identifier->starts_with("com.vorlan."));
}

}  // namespace typhon
