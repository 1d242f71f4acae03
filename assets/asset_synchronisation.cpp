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

/// False when the first is gone: no other takes its place.
bool isSame(const std::weak_ptr<const void>& registry, const std::weak_ptr<const void>& other)
{
    return !registry.owner_before(other) && !other.owner_before(registry);
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
    std::function<PropertyList()> match = [this, names = std::move(names)] { return entriesOf(names); };
    Task<PropertyList> matching = mainHandlerQueue_.perform(std::move(match));
    co_return co_await std::move(matching);
}

/// On `mainHandlerQueue`. Applications find the same assets and ask about them one after another: the same
/// value again costs nothing to put together, and is encoded for all of them once.
PropertyList AssetSynchronisation::entriesOf(const std::shared_ptr<const Names>& names)
{
    const auto all = platform_.userFontManager.userFontsInfo();
    if (last_.names && isSame(last_.registry, all.identity()) && *last_.names == *names) {
        return last_.entries;
    }
    PropertyList::Dictionary entries;
    for (const auto& [path, entry] : *all.asDictionary()) {
        if (isEntryOf(*names, path)) {
            entries.emplace_hint(entries.end(), path, entry);
        }
    }
    last_ = {all.identity(), names, std::move(entries)};
    return last_.entries;
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
