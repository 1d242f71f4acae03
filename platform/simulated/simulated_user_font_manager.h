#pragma once

#include "platform/simulated/simulated_file_system.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/user_font_manager.h"

#include <cstddef>
#include <deque>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The font-registry library over the simulated file system: real directory names, a real registry file.
/// Profile synchronisations end when the test says so; the other operations change the registry and complete
/// by themselves, unless the test holds them. One thread.
class SimulatedUserFontManager final : public TYUserFontManager {
public:
    SimulatedUserFontManager(SimulatedScheduler& scheduler, SimulatedFileSystem& fileSystem)
        : scheduler_(scheduler), fileSystem_(fileSystem)
    {}

    std::optional<std::string> directoryNameFromIdentifier(const std::string& identifier) override;
    std::optional<std::string> identifierFromDirectoryName(const std::string& directoryName) override;
    PropertyList userFontsInfo() override;
    PropertyList profileFontsInfo() override { return profileFonts_; }
    std::vector<std::string> knownFontProviders() override;
    void enableOrDisablePersistentURLs(std::vector<std::string> urls, bool enabled,
                                       std::function<void(FontManagerError)> completion) override;
    void unregisterAndRemoveFontFilesForIdentifier(
        std::string identifier, std::function<void(FontManagerError)> completionHandler) override;
    void synchronizeFontProviders() override { calls_.push_back("synchronizeFontProviders"); }
    void synchronizeProfileFonts(std::function<void()> completion) override;
    void synchronizeFontAssets(std::function<void(bool)> completion) override;

    /// How often `synchronizeProfileFonts` was called.
    std::size_t profileSynchronizations() const { return profileSynchronizations_; }
    /// Calls the completions of all synchronisations that are under way, in order.
    void finishProfileSynchronizations();

    /// The registry entries, by path, that the next synchronisations of font assets find in the asset store.
    void setFontAssets(PropertyList::Dictionary entries) { fontAssets_ = std::move(entries); }
    void setProfileFontsInfo(PropertyList fonts) { profileFonts_ = std::move(fonts); }
    /// Has the next operation fail with that error, and change nothing.
    void failNext(std::string error) { nextError_ = std::move(error); }
    /// From now on operations wait for `finishNext`; without it they complete by themselves.
    void holdOperations() { isHolding_ = true; }
    /// Lets the oldest held operation happen and complete. False if there is none.
    bool finishNext();
    /// Every call that was made, in order: the operation's name, with its identifier or the number of its
    /// URLs behind a blank where it has some.
    const std::vector<std::string>& calls() const { return calls_; }

private:
    using Operation = std::function<void()>;

    void start(Operation operation);
    /// Changes the registry file; gives the error of a failing operation.
    FontManagerError change(const std::function<FontManagerError(PropertyList::Dictionary&)>& edit);

    SimulatedScheduler& scheduler_;
    SimulatedFileSystem& fileSystem_;
    PropertyList profileFonts_ = PropertyList::Dictionary{};
    PropertyList::Dictionary fontAssets_;
    std::size_t profileSynchronizations_ = 0;
    std::vector<std::function<void()>> pending_;
    std::optional<std::string> nextError_;
    bool isHolding_ = false;
    std::deque<Operation> held_;
    std::vector<std::string> calls_;
};

}  // namespace typhon
