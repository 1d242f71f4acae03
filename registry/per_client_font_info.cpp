#include "registry/per_client_font_info.h"

#include "platform/font_directories.h"

// What a client sees follows from three questions: may it see everything, which fonts are its own, and which
// were issued to it. Each has an index of the registry snapshot behind it, so that no check-in walks the
// registry: enumerating clients share one value that was built with the snapshot, a provider's fonts come
// from the index by directory, and issued paths are looked up one by one. The general filter remains for
// rules that only their owner knows.

namespace typhon {

namespace {

/// The entries of `view` whose paths are allowed.
PropertyList onlyPaths(const PropertyList& view, const std::set<std::string>& allowed)
{
    PropertyList::Dictionary chosen;
    for (const auto& path : allowed) {
        if (const auto* entry = view.find(path)) {
            chosen.emplace_hint(chosen.end(), path, *entry);
        }
    }
    return chosen;
}

/// The enabled entries in the provider's directory. Its files need no extension of their own: the provider
/// gets one for the directory.
PropertyList fontsOfProvider(const RegistrySnapshot& registry, const std::string& directoryName)
{
    PropertyList::Dictionary fonts;
    for (const auto* item : registry.entriesInDirectoryNamed(directoryName)) {
        const auto& [path, entry] = *item;
        if (!isDisabled(entry)) {
            fonts.emplace_hint(fonts.end(), path, withoutDisabled(entry));
        }
    }
    return fonts;
}

/// The same of the allowed paths only. Each is looked up: the provider may have any number of fonts.
PropertyList fontsOfProvider(const RegistrySnapshot& registry, const std::string& directoryName,
                             const std::set<std::string>& allowed)
{
    PropertyList::Dictionary fonts;
    for (const auto& path : allowed) {
        const auto* entry = registry.entry(path);
        const bool isOwn = font_directories::nameOfDirectoryHolding(path) == directoryName;
        if (entry != nullptr && isOwn && !isDisabled(*entry)) {
            fonts.emplace_hint(fonts.end(), path, withoutDisabled(*entry));
        }
    }
    return fonts;
}

/// Both dictionaries in one; where both have an entry, that of `added`.
PropertyList merged(const PropertyList& base, const PropertyList& added)
{
    auto all = *added.asDictionary();
    all.insert(base.asDictionary()->begin(), base.asDictionary()->end());
    return all;
}

void addIfAdmitted(EntrySharing& sharing, const RegistrySnapshot::Entry& item,
                   const PerClientFontInfo::Filter& filter)
{
    const auto& [path, entry] = item;
    bool noGrant = false;
    if (filter(path, entry, noGrant)) {
        sharing.add(path, entry, noGrant);
    }
}

void set(PropertyList::Dictionary& dictionary, const char* key, std::optional<PropertyList> value)
{
    if (value) {
        dictionary.insert_or_assign(key, *std::move(value));
    }
}

}  // namespace

PerClientFontInfo::PerClientFontInfo(Platform& platform, UserFontRegistry& registry,
                                     WorkQueue& mainHandlerQueue, Needs needs)
    : platform_(platform), registry_(registry), mainHandlerQueue_(mainHandlerQueue), needs_(std::move(needs))
{}

PropertyList PerClientFontInfo::filterUserFontInfoForAuditToken(const AuditToken& token,
                                                                bool withEnumerationCapability,
                                                                const Filter& withFilter)
{
    const auto registry = registry_.userFontsInfo();
    if (!registry) {
        return {};
    }
    auto sharing = sharingWith(token, withEnumerationCapability);
    for (const auto& entry : registry->entries()) {
        addIfAdmitted(sharing, entry, withFilter);
    }
    return sharing.take();
}

PropertyList
PerClientFontInfo::filterUserFontInfoForAuditToken(const AuditToken& token, bool withEnumerationCapability,
                                                   const Filter& withFilter,
                                                   const std::vector<const RegistrySnapshot::Entry*>& among)
{
    auto sharing = sharingWith(token, withEnumerationCapability);
    for (const auto* entry : among) {
        addIfAdmitted(sharing, *entry, withFilter);
    }
    return sharing.take();
}

EntrySharing PerClientFontInfo::sharingWith(const AuditToken& token, bool hasEnumeration)
{
    return {platform_.sandbox, token, hasEnumeration || !needs_.isAuditTokenSandboxed(token)};
}

PropertyList
PerClientFontInfo::fontInfoForAuditToken(const AuditToken& /*token*/, bool withEnumuration, bool installation,
                                         const std::optional<std::string>& identifier,
                                         const std::optional<std::set<std::string>>& andFileFilters,
                                         std::optional<std::string>* foundFontDirectoryName)
{
    const auto registry = registry_.userFontsInfo();
    if (!registry) {
        return {};
    }
    if (withEnumuration) {
        const auto& view = registry->enumerationView();
        return andFileFilters ? onlyPaths(view, *andFileFilters) : view;
    }
    const auto directoryName = installation && identifier
                                   ? platform_.userFontManager.directoryNameFromIdentifier(*identifier)
                                   : std::nullopt;
    if (!directoryName) {
        return {};
    }
    auto fonts = andFileFilters ? fontsOfProvider(*registry, *directoryName, *andFileFilters)
                                : fontsOfProvider(*registry, *directoryName);
    if (foundFontDirectoryName != nullptr && !fonts.asDictionary()->empty()) {
        *foundFontDirectoryName = directoryName;
    }
    return fonts;
}

PropertyList PerClientFontInfo::issuedFontInfo(const AuditToken& token, const std::string& identifier)
{
    const auto registry = registry_.userFontsInfo();
    if (!registry) {
        return {};
    }
    auto sharing = sharingWith(token, false);
    for (const auto& path : needs_.issuedFontFilePathsForIdentifier(identifier)) {
        // A font that was switched off is on nobody's list, not even of an application it was issued to.
        const auto* entry = registry->entry(path);
        if (entry != nullptr && !isDisabled(*entry)) {
            sharing.add(path, *entry, false);
        }
    }
    return sharing.take();
}

std::optional<PropertyList> PerClientFontInfo::extension(const AuditToken& token, const std::string& path)
{
    return issueExtensionData(platform_.sandbox, token, path);
}

std::optional<PropertyList> PerClientFontInfo::extensionIfNeeded(const AuditToken& token,
                                                                 const std::string& path)
{
    return platform_.sandbox.mayRead(token, path) ? std::nullopt : extension(token, path);
}

std::optional<PropertyList> PerClientFontInfo::sandboxExtensionForEnumeration(const AuditToken& token)
{
    auto directory = font_directories::fontFiles;
    directory.remove_suffix(1);
    return extension(token, std::string(directory));
}

std::optional<PropertyList> PerClientFontInfo::sandboxExtensionForFontAssets(const AuditToken& token)
{
    return extensionIfNeeded(token, std::string(font_directories::fontAssets));
}

std::optional<PropertyList>
PerClientFontInfo::sandboxExtensionForProvider(const AuditToken& token, const std::string& withDirectoryName)
{
    return extensionIfNeeded(token, std::string(font_directories::fontFiles) + withDirectoryName);
}

Task<void> PerClientFontInfo::setupUserInstalledFontsFor(AuditToken token, AuditToken /*withCapabilitiesFor*/,
                                                         bool hasEnumeration, bool hasFontAccess,
                                                         bool isFontProvider,
                                                         std::optional<std::string> processIdentifier,
                                                         Reply reply)
{
    if (!hasEnumeration && !hasFontAccess && !isFontProvider) {
        reply(std::nullopt);
        co_return;
    }
    const Client client{token, hasEnumeration, hasFontAccess, isFontProvider, std::move(processIdentifier)};
    std::function<void()> answer = [this, client, reply] { reply(checkinReply(client)); };
    auto answering = mainHandlerQueue_.perform(std::move(answer));
    co_await std::move(answering);
}

PropertyList PerClientFontInfo::visibleFonts(const Client& client,
                                             std::optional<std::string>& foundDirectoryName)
{
    PropertyList fonts;
    if (client.hasEnumeration || client.isFontProvider) {
        fonts = fontInfoForAuditToken(client.token, client.hasEnumeration, client.isFontProvider,
                                      client.identifier, std::nullopt, &foundDirectoryName);
    }
    if (!client.hasEnumeration && client.hasFontAccess && client.identifier) {
        fonts = merged(fonts, issuedFontInfo(client.token, *client.identifier));
    }
    return fonts;
}

PropertyList PerClientFontInfo::checkinReply(const Client& client)
{
    std::optional<std::string> foundDirectoryName;
    PropertyList::Dictionary reply{{"fontsInfo", visibleFonts(client, foundDirectoryName)}};
    if (client.hasEnumeration) {
        set(reply, "extension", sandboxExtensionForEnumeration(client.token));
        set(reply, "extension.fontasset", sandboxExtensionForFontAssets(client.token));
        return reply;
    }
    if (foundDirectoryName) {
        set(reply, "extension.provider", sandboxExtensionForProvider(client.token, *foundDirectoryName));
    }
    if (!client.hasFontAccess) {
        reply.emplace("hide-profilefonts", true);
    }
    return reply;
}

}  // namespace typhon
