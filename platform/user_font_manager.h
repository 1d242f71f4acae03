#pragma once

#include <functional>
#include <optional>
#include <string>

namespace typhon {

/// The font-registry library, as the daemon uses it. Any thread.
class TYUserFontManager {
public:
    virtual ~TYUserFontManager() = default;
    /// `directoryNameFromIdentifier:`. The name of the directory that holds a provider's font files, or
    /// null for an identifier that has none (empty, or too long for a file name).
    virtual std::optional<std::string> directoryNameFromIdentifier(const std::string& identifier) = 0;
    /// `identifierFromDirectoryName:`. The inverse; null for a name that is no identifier's.
    virtual std::optional<std::string> identifierFromDirectoryName(const std::string& directoryName) = 0;
    /// `synchronizeProfileFonts:`. Brings profile-installed fonts up to date, then calls `completion` on a
    /// thread of the library's own. Returns at once.
    virtual void synchronizeProfileFonts(std::function<void()> completion) = 0;
};

}  // namespace typhon
