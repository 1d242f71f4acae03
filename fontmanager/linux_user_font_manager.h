#pragma once

#include "platform/user_font_manager.h"

#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>

namespace typhon {

/// The font-registry library over the files of this machine. Waits, when destroyed, for the completions
/// that are under way; so it is not destroyed by one of them.
class LinuxUserFontManager final : public TYUserFontManager {
public:
    std::optional<std::string> directoryNameFromIdentifier(const std::string& identifier) override;
    std::optional<std::string> identifierFromDirectoryName(const std::string& directoryName) override;
    /// No profile fonts can be registered yet, so there is nothing to bring up to date: this only keeps the
    /// promise that the completion comes later and on another thread. Completions come in order.
    void synchronizeProfileFonts(std::function<void()> completion) override;

private:
    std::mutex mutex_;
    /// Runs the newest completion; owns the thread before it. Under `mutex_`.
    std::jthread newest_;
};

}  // namespace typhon
