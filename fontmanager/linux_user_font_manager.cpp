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

void LinuxUserFontManager::synchronizeProfileFonts(std::function<void()> completion)
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
