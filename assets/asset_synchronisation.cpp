#include "assets/asset_synchronisation.h"

#include "assets/font_asset_paths.h"
#include "platform/font_directories.h"

#include <algorithm>
#include <string_view>
#include <utility>

// The library's registry is asked, not the daemon's copy of it: right after a synchronisation nobody has told
// the daemon yet that fonts changed.

namespace typhon {

namespace {

bool isEntryOf(const std::set<std::string, std::less<>>& names, std::string_view path)
{
    return path.starts_with(font_directories::fontAssets) &&
           names.contains(font_directories::nameOfDirectoryHolding(path));
}

bool contains(const PropertyList::Array& array, const char* text)
{
    return std::ranges::find(array, PropertyList(text)) != array.end();
}

}  // namespace

bool AssetSynchronisation::isAdmitted(const AuditToken& token)
{
    const auto task = platform_.codeSigning.taskFromAuditToken(token);
    const auto entitlement = task ? task->entitlement("com.vorlan.developer.user-fonts") : std::nullopt;
    const auto* strings = entitlement ? entitlement->asArray() : nullptr;
    return strings != nullptr && (contains(*strings, "font-enumeration") || contains(*strings, "app-usage"));
}

Task<void> AssetSynchronisation::synchronizeFontAssets(std::vector<std::string> paths, Reply reply)
{
    const auto token = currentAuditToken();
    if (!isAdmitted(token)) {
        reply(false, std::nullopt);
        co_return;
    }
    const auto names = std::make_shared<const Names>(assetDirectoryNamesOf(paths, platform_.log));
    Task<PropertyList> matching = matchingEntries(names);
    auto entries = co_await std::move(matching);
    // Intended: entries are counted against assets, so that one asset with several fonts can stand for
    // others.
    if (names->size() > entries.asDictionary()->size()) {
        Task<void> synchronizing = synchronize();
        co_await std::move(synchronizing);
        Task<PropertyList> matchingAgain = matchingEntries(names);
        entries = co_await std::move(matchingAgain);
    }
    reply(true, answerWith(std::move(entries), token));
}

Task<PropertyList> AssetSynchronisation::matchingEntries(std::shared_ptr<const Names> names)
{
    std::function<PropertyList()> match = [this, names] {
        PropertyList::Dictionary entries;
        const auto all = platform_.userFontManager.userFontsInfo();
        for (const auto& [path, entry] : *all.asDictionary()) {
            if (isEntryOf(*names, path)) {
                entries.emplace_hint(entries.end(), path, entry);
            }
        }
        return PropertyList(std::move(entries));
    };
    Task<PropertyList> matching = mainHandlerQueue_.perform(std::move(match));
    co_return co_await std::move(matching);
}

/// Ends when the completion has run. How it went is seen in what is registered then.
Task<void> AssetSynchronisation::synchronize()
{
    std::function<void(std::function<void()>)> begin = [this](std::function<void()> done) {
        platform_.userFontManager.synchronizeFontAssets([done = std::move(done)](bool) { done(); });
    };
    co_await awaitCompletion<void>(std::move(begin));
}

PropertyList AssetSynchronisation::answerWith(PropertyList entries, const AuditToken& token)
{
    PropertyList::Dictionary answer{{"fontsInfo", std::move(entries)}};
    if (auto extension = perClientFontInfo_.sandboxExtensionForFontAssets(token)) {
        answer.emplace("extension.fontasset", *std::move(extension));
    }
    return answer;
}

}  // namespace typhon
