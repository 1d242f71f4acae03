#pragma once

#include "platform/property_list.h"

#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The name constant of the system-wide notification that fonts have changed. Its text is its own name.
inline constexpr const char* FontProviderDidChangeDistributedNotification =
    "FontProviderDidChangeDistributedNotification";

/// Null when an operation of the library succeeded, else why it failed, as a text for people.
using FontManagerError = std::optional<std::string>;

/// The font-registry library, as the daemon uses it. Any thread. Operations with a completion return at once
/// and call it exactly once, later, on a thread of the library's own (never one of a work queue), also when
/// the service behind them is not there or dies; an empty completion is allowed. The others read files and
/// may block on the disk, on nothing else.
class TYUserFontManager {
public:
    virtual ~TYUserFontManager() = default;
    /// `directoryNameFromIdentifier:`. The name of the directory that holds a provider's font files, or
    /// null for an identifier that has none (empty, or too long for a file name).
    virtual std::optional<std::string> directoryNameFromIdentifier(const std::string& identifier) = 0;
    /// `identifierFromDirectoryName:`. The inverse; null for a name that is no identifier's.
    virtual std::optional<std::string> identifierFromDirectoryName(const std::string& directoryName) = 0;

    /// `userFontsInfo`. The registry as it stands on disk: path to entry. Empty when it cannot be read.
    virtual PropertyList userFontsInfo() = 0;
    /// `profileFontsInfo`. The same for fonts under /var/mobile/Library/Fonts/Managed/.
    virtual PropertyList profileFontsInfo() = 0;
    /// `knownFontProviders`. The identifiers of the applications that registered fonts, sorted.
    virtual std::vector<std::string> knownFontProviders() = 0;

    /// `enableOrDisablePersistentURLs:enabled:`. Switches the registered files behind these file URLs on or
    /// off, all or none of them.
    virtual void enableOrDisablePersistentURLs(std::vector<std::string> urls, bool enabled,
                                               std::function<void(FontManagerError)> completion) = 0;
    /// `unregisterAndRemoveFontFilesForIdentifier:completionHandler:`. Unregisters all fonts of a provider
    /// and removes their files.
    virtual void
    unregisterAndRemoveFontFilesForIdentifier(std::string identifier,
                                              std::function<void(FontManagerError)> completionHandler) = 0;
    /// `synchronizeFontProviders`. Brings the records of font providers up to date after removals. No result.
    virtual void synchronizeFontProviders() = 0;
    /// `synchronizeProfileFonts:`. Brings profile-installed fonts up to date.
    virtual void synchronizeProfileFonts(std::function<void()> completion) = 0;
    /// `synchronizeFontAssets:`. Brings the font-asset directory and the registry in step with the asset
    /// store; false when that failed. A file that is no good font is left out, which is no failure.
    virtual void synchronizeFontAssets(std::function<void(bool)> completion) = 0;
};

}  // namespace typhon
