#pragma once

#include "platform/user_font_manager.h"

#include <cstddef>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The font-registry library without its files: real directory names, and profile synchronisations that
/// end when the test says so. One thread.
class SimulatedUserFontManager final : public TYUserFontManager {
public:
    std::optional<std::string> directoryNameFromIdentifier(const std::string& identifier) override;
    std::optional<std::string> identifierFromDirectoryName(const std::string& directoryName) override;
    void synchronizeProfileFonts(std::function<void()> completion) override;

    /// How often `synchronizeProfileFonts` was called.
    std::size_t profileSynchronizations() const { return profileSynchronizations_; }
    /// Calls the completions of all synchronisations that are under way, in order.
    void finishProfileSynchronizations();

private:
    std::size_t profileSynchronizations_ = 0;
    std::vector<std::function<void()>> pending_;
};

}  // namespace typhon
