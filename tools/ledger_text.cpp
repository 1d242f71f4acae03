#include "tools/ledger_text.h"

#include "platform/linux/visible_text.h"

#include <fmt/format.h>

namespace typhon {

namespace {

std::string expandedPath(const std::string& stored)
{
    if (stored.starts_with("U/")) {
        return "/var/mobile/Library/UserFonts/FontFiles/" + stored.substr(2);
    }
    if (stored.starts_with("A/")) {
        return "/var/mobile/Library/UserFonts/FontAssets/" + stored.substr(2);
    }
    return stored;
}

}  // namespace

PropertyList expandedLedger(const PropertyList& issues)
{
    PropertyList::Dictionary ledger;
    const auto* entries = issues.asDictionary();
    if (entries == nullptr) {
        return ledger;
    }
    for (const auto& [identifier, paths] : *entries) {
        if (paths.asArray() == nullptr) {
            continue;
        }
        auto expanded = stringsOf(paths);
        for (auto& path : expanded) {
            path = expandedPath(path);
        }
        ledger.emplace(identifier, arrayOfStrings(expanded));
    }
    return ledger;
}

std::string ledgerText(const PropertyList& ledger)
{
    const auto* entries = ledger.asDictionary();
    if (entries == nullptr || entries->empty()) {
        return "No fonts were issued to any application.\n";
    }
    std::string text;
    for (const auto& [identifier, paths] : *entries) {
        const auto issued = stringsOf(paths);
        text += fmt::format("{}: {} file{}\n", visibleText(identifier), issued.size(),
                            issued.size() == 1 ? "" : "s");
        for (const auto& path : issued) {
            text += "  " + visibleText(path) + "\n";
        }
    }
    return text;
}

}  // namespace typhon
