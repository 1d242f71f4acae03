#include "registry/entry_sharing.h"

#include "platform/font_directories.h"
#include "registry/registry_snapshot.h"

namespace typhon {

std::optional<PropertyList> issueExtensionData(Sandbox& sandbox, const AuditToken& token,
                                               const std::string& path)
{
    const auto text = sandbox.issueReadExtension(token, path);
    if (!text) {
        return std::nullopt;
    }
    const auto* first = text->c_str();
    return Data{{first, first + text->size() + 1}};
}

// Entries mostly come in the order of their paths, so each belongs at the end.
void EntrySharing::add(const std::string& path, const PropertyList& entry, bool noGrant)
{
    if (isTrusted_ || noGrant || path.starts_with(font_directories::assetStore)) {
        shared_.insert_or_assign(shared_.end(), path, withoutDisabled(entry));
        return;
    }
    // Intended: a confined client is not even told of a file that it can already read by itself.
    if (sandbox_.mayRead(token_, path)) {
        return;
    }
    auto shared = *withoutDisabled(entry).asDictionary();
    if (auto data = issueExtensionData(sandbox_, token_, path)) {
        shared.insert_or_assign("data", *std::move(data));
    }
    shared_.insert_or_assign(shared_.end(), path, std::move(shared));
}

}  // namespace typhon
