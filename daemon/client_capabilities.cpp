#include "daemon/client_capabilities.h"

#include <algorithm>
#include <string_view>

namespace typhon {

namespace {

bool contains(const std::optional<PropertyList>& array, std::string_view text)
{
    const auto* members = array ? array->asArray() : nullptr;
    return members != nullptr && std::ranges::any_of(*members, [&](const PropertyList& member) {
               const auto* string = member.asString();
               return string != nullptr && *string == text;
           });
}

}  // namespace

Capabilities ClientCapabilities::capabilitiesFor(const AuditToken& token)
{
    const auto task = platform_.codeSigning.taskFromAuditToken(token);
    if (!task) {
        return {};
    }
    const auto userFonts = task->entitlement("com.vorlan.developer.user-fonts");
    Capabilities capabilities;
    capabilities.identifier = task->signingIdentifier;
    capabilities.allowUserFonts = contains(userFonts, "app-usage");
    capabilities.allowInstallation = contains(userFonts, "system-installation");
    capabilities.allowEnumerate = contains(userFonts, "font-enumeration") && task->signingIdentifier &&
                                  isIdentifierAllowedForFontEnumeration(*task->signingIdentifier);
    return capabilities;
}

bool ClientCapabilities::isIdentifierAllowedForFontEnumeration(const std::string& identifier)
{
    const auto list = fontEnumerationProhibitedInfo();
    const auto* prohibitions = list ? list->asArray() : nullptr;
    if (prohibitions == nullptr) {
        return true;
    }
    return std::ranges::none_of(*prohibitions,
                                [&](const PropertyList& entry) { return isBarredBy(entry, identifier); });
}

bool ClientCapabilities::isBarredBy(const PropertyList& prohibitions, const std::string& identifier)
{
    const auto* versions = prohibitions.find(identifier);
    if (versions == nullptr) {
        return false;
    }
    const auto application = platform_.applicationRegistry.record(identifier, false);
    if (!application || !application->shortVersionString ||
        !contains(*versions, *application->shortVersionString)) {
        return false;
    }
    systemLog(platform_.log, "This process is not allowed to enumerate fonts - " + identifier);
    return true;
}

bool ClientCapabilities::isCurrentConnectionFontPicker()
{
    const auto task = platform_.codeSigning.taskFromAuditToken(currentAuditToken());
    return task && (task->signingIdentifier == "com.vorlan.Panekit.FontPickerUIService" ||
                    task->signingIdentifier == "com.vorlan.Panekit.FontPicker");
}

std::optional<PropertyList> ClientCapabilities::fontEnumerationProhibitedInfo() const
{
    const std::lock_guard lock(mutex_);
    return fontEnumerationProhibitedInfo_;
}

void ClientCapabilities::setFontEnumerationProhibitedInfo(std::optional<PropertyList> list)
{
    const std::lock_guard lock(mutex_);
    fontEnumerationProhibitedInfo_.swap(list);
}

}  // namespace typhon
