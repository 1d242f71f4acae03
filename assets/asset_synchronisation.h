#pragma once

#include "platform/platform.h"
#include "registry/per_client_font_info.h"

#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon {

/// Answers clients that have found downloaded fonts in the asset store with the registry entries of those
/// assets, after the font-registry library has registered them if need be. Any thread.
class AssetSynchronisation {
public:
    using Reply = std::function<void(bool success, std::optional<PropertyList> answer)>;

    /// Everything given outlives this.
    AssetSynchronisation(Platform& platform, PerClientFontInfo& perClientFontInfo,
                         WorkQueue& mainHandlerQueue)
        : platform_(platform), perClientFontInfo_(perClientFontInfo), mainHandlerQueue_(mainHandlerQueue)
    {}

    /// `synchronizeFontAssets:reply:`. Replies exactly once, before it ends; false and null to a client that
    /// may neither enumerate fonts nor use them. Waits without limit for the library, suspended. Not to be
    /// called on `mainHandlerQueue`.
    Task<void> synchronizeFontAssets(std::vector<std::string> paths, Reply reply);

private:
    using Names = std::set<std::string, std::less<>>;

    /// What was matched last, and against what.
    struct Matched {
        std::weak_ptr<const void> registry;
        std::shared_ptr<const Names> names;
        PropertyList entries;
    };

    bool isAdmitted(const AuditToken& token);
    Task<PropertyList> matchingEntries(std::shared_ptr<const Names> names);
    PropertyList entriesOf(const std::shared_ptr<const Names>& names);
    Task<void> synchronize();
    PropertyList answerWith(PropertyList entries, const AuditToken& token);

    Platform& platform_;
    PerClientFontInfo& perClientFontInfo_;
    WorkQueue& mainHandlerQueue_;
    // Owned by mainHandlerQueue.
    Matched last_;
};

}  // namespace typhon
