#include "clients/font_change_shares.h"

#include "platform/font_directories.h"
#include "protocol/wire.h"

// Most clients are told the same: enumerating ones of every font that came, all of them of what went, and
// everybody at all of profile fonts. Those messages are made once a change, so that the work for one more
// such client depends neither on the change nor on the registry. What a provider is told of fonts that came
// is its own: its fonts are looked up one by one, never searched for.

namespace typhon {

namespace {

using Fonts = std::vector<const FontChange::Font*>;

Fonts pointersTo(const std::vector<FontChange::Font>& fonts)
{
    Fonts pointers;
    for (const auto& font : fonts) {
        pointers.push_back(&font);
    }
    return pointers;
}

PropertyList urlsOf(const Fonts& fonts)
{
    PropertyList::Array urls;
    for (const auto* font : fonts) {
        urls.emplace_back(font->url);
    }
    return urls;
}

std::set<std::string> pathsOf(const Fonts& fonts)
{
    std::set<std::string> paths;
    for (const auto* font : fonts) {
        paths.insert(font->path);
    }
    return paths;
}

Arguments message(std::optional<PropertyList> info, std::optional<PropertyList> added,
                  std::optional<PropertyList> removed)
{
    Arguments arguments;
    arguments.emplace_back(wire::nullable(std::move(info)));
    arguments.emplace_back(wire::nullable(std::move(added)));
    arguments.emplace_back(wire::nullable(std::move(removed)));
    return arguments;
}

bool isInUserDirectories(const std::string& path)
{
    return path.starts_with(font_directories::fontFiles) || path.starts_with(font_directories::fontAssets);
}

}  // namespace

FontChangeShares::FontChangeShares(Platform& platform, PerClientFontInfo& fontInfo,
                                   const PropertyList& description)
    : platform_(platform), fontInfo_(fontInfo), change_(description), all_(pointersTo(change_.fonts()))
{
    if (change_.leftOut() != 0) {
        TYLog_Error(platform_.log, "a font change names too many fonts; " +
                                       std::to_string(change_.leftOut()) + " are left out");
    }
}

std::optional<Arguments> FontChangeShares::shareOf(const Recipient& recipient)
{
    // Intended: of profile fonts everybody is told, whatever is left of the report.
    return change_.isOfUserFonts() ? shareInUserFonts(recipient) : changedProfileFonts();
}

std::optional<Arguments> FontChangeShares::shareInUserFonts(const Recipient& recipient)
{
    if (!recipient.hasEnumeration && !recipient.isFontProvider) {
        return std::nullopt;
    }
    if (change_.isAdded()) {
        if (fontsInUserDirectories().empty()) {
            return std::nullopt;
        }
        return recipient.hasEnumeration ? addedToEnumerating(recipient) : addedToProvider(recipient);
    }
    if (all_.empty()) {
        return std::nullopt;
    }
    // Intended: of what went away a provider is told too, whoever's it was and wherever it lay.
    if (!removed_) {
        removed_ = message(PropertyList(), std::nullopt, urlsOf(all_));
    }
    return removed_;
}

/// Intended: a font elsewhere is complained of once a change, not once for each client that would have been
/// told.
const Fonts& FontChangeShares::fontsInUserDirectories()
{
    if (!inUserDirectories_) {
        inUserDirectories_.emplace();
        for (const auto* font : all_) {
            if (isInUserDirectories(font->path)) {
                inUserDirectories_->push_back(font);
            } else {
                TYLog_Error(platform_.log, "got invalid font path: " + font->path);
            }
        }
    }
    return *inUserDirectories_;
}

/// An enumerating client's entries carry no extension: they are the same for all such clients.
const Arguments& FontChangeShares::addedToEnumerating(const Recipient& recipient)
{
    if (!forEnumerating_) {
        forEnumerating_ = addedUserFonts(recipient, fontsInUserDirectories());
    }
    return *forEnumerating_;
}

std::optional<Arguments> FontChangeShares::addedToProvider(const Recipient& recipient)
{
    const auto directory = recipient.identifier
                               ? platform_.userFontManager.directoryNameFromIdentifier(*recipient.identifier)
                               : std::nullopt;
    Fonts own;
    for (const auto* font : fontsInUserDirectories()) {
        if (directory && font_directories::nameOfDirectoryHolding(font->path) == *directory) {
            own.push_back(font);
        }
    }
    return own.empty() ? std::nullopt : std::optional(addedUserFonts(recipient, own));
}

Arguments FontChangeShares::addedUserFonts(const Recipient& recipient, const Fonts& fonts)
{
    std::optional<std::string> directory;
    PropertyList::Dictionary info;
    info.emplace("fontsInfo", fontInfo_.fontInfoForAuditToken(recipient.token, recipient.hasEnumeration,
                                                              recipient.isFontProvider, recipient.identifier,
                                                              pathsOf(fonts), &directory));
    if (directory) {
        if (auto extension = fontInfo_.sandboxExtensionForProvider(recipient.token, *directory)) {
            info.emplace("extension.provider", *std::move(extension));
        }
    }
    return message(std::move(info), urlsOf(fonts), std::nullopt);
}

const Arguments& FontChangeShares::changedProfileFonts()
{
    if (!ofProfileFonts_) {
        ofProfileFonts_ = change_.isAdded() ? message(PropertyList::Dictionary{{"fontsInfo", profileFonts()}},
                                                      urlsOf(all_), std::nullopt)
                                            : message(std::nullopt, std::nullopt, urlsOf(all_));
    }
    return *ofProfileFonts_;
}

PropertyList FontChangeShares::profileFonts() const
{
    const auto installed = platform_.userFontManager.profileFontsInfo();
    PropertyList::Dictionary fonts;
    for (const auto* font : all_) {
        if (const auto* entry = installed.find(font->path)) {
            fonts.insert_or_assign(font->path, *entry);
        }
    }
    return fonts;
}

}  // namespace typhon
