#pragma once

#include "platform/user_font_manager.h"

#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

namespace typhon {

/// The font-registry library over the files of this machine. Waits, when destroyed, for the completions
/// that are under way; so it is not destroyed by one of them.
class LinuxUserFontManager final : public TYUserFontManager {
public:
    std::optional<std::string> directoryNameFromIdentifier(const std::string& identifier) override;
    std::optional<std::string> identifierFromDirectoryName(const std::string& directoryName) override;
    PropertyList userFontsInfo() override;
    PropertyList profileFontsInfo() override;
    std::vector<std::string> knownFontProviders() override;
    void enableOrDisablePersistentURLs(std::vector<std::string> urls, bool enabled,
                                       std::function<void(FontManagerError)> completion) override;
    void unregisterAndRemoveFontFilesForIdentifier(
        std::string identifier, std::function<void(FontManagerError)> completionHandler) override;
    void synchronizeFontProviders() override {}
    /// No profile fonts can be registered yet, so there is nothing to bring up to date: this only keeps the
    /// promise that the completion comes later and on another thread. Completions come in order.
    void synchronizeProfileFonts(std::function<void()> completion) override;

private:
    void completeLater(std::function<void()> completion);

    std::mutex mutex_;
    /// Runs the newest completion; owns the thread before it. Under `mutex_`.
    std::jthread newest_;
};

}  // namespace typhon
