#include "fontmanager/linux_user_font_manager.h"

#include "fontmanager/directory_names.h"

#include <utility>

namespace typhon {

std::optional<std::string> LinuxUserFontManager::directoryNameFromIdentifier(const std::string& identifier)
{
    return typhon::directoryNameFromIdentifier(identifier);
}

std::optional<std::string> LinuxUserFontManager::identifierFromDirectoryName(const std::string& directoryName)
{
    return typhon::identifierFromDirectoryName(directoryName);
}

PropertyList LinuxUserFontManager::userFontsInfo()
{
    return PropertyList::Dictionary{};
}

PropertyList LinuxUserFontManager::profileFontsInfo()
{
    return PropertyList::Dictionary{};
}

std::vector<std::string> LinuxUserFontManager::knownFontProviders()
{
    return {};
}

void LinuxUserFontManager::enableOrDisablePersistentURLs(std::vector<std::string> /*urls*/, bool /*enabled*/,
                                                         std::function<void(FontManagerError)> completion)
{
    completeLater([completion = std::move(completion)] {
        if (completion) {
            completion("the helper of the font registry is not there");
        }
    });
}

void LinuxUserFontManager::unregisterAndRemoveFontFilesForIdentifier(
    std::string /*identifier*/, std::function<void(FontManagerError)> completionHandler)
{
    completeLater([completion = std::move(completionHandler)] {
        if (completion) {
            completion("the helper of the font registry is not there");
        }
    });
}

void LinuxUserFontManager::synchronizeProfileFonts(std::function<void()> completion)
{
    completeLater(std::move(completion));
}

void LinuxUserFontManager::completeLater(std::function<void()> completion)
{
    const std::lock_guard lock(mutex_);
    newest_ = std::jthread(
        [](std::jthread before, std::function<void()> complete) {
            if (before.joinable()) {
                before.join();
            }
            if (complete) {
                complete();
            }
        },
        std::move(newest_), std::move(completion));
}

}  // namespace typhon
