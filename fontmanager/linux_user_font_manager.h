#pragma once

#include "fontmanager/kept_font_record.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"
#include "platform/user_font_manager.h"

#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>
#include <optional>
#include <string>
#include <thread>
#include <vector>

namespace typhon {

class FontRegistryClient;

/// The font-registry library over the files of this machine and, for whatever changes them, its helper, which
/// it starts where no service manager does. Operations run one after another, and their completions come in
/// order; but synchronisations of font assets that are asked for while one waits to begin are that one, so
/// that there are two of them at most, however many ask. Waits, when destroyed, for those that are under way;
/// so it is not destroyed by a completion.
class LinuxUserFontManager final : public TYUserFontManager {
public:
    /// `log` outlives this. `helper` is the helper's executable; null for the one that is found.
    LinuxUserFontManager(RootDirectory root, Log& log, std::optional<std::string> helper = std::nullopt);
    ~LinuxUserFontManager() override;

    std::optional<std::string> directoryNameFromIdentifier(const std::string& identifier) override;
    std::optional<std::string> identifierFromDirectoryName(const std::string& directoryName) override;
    PropertyList userFontsInfo() override;
    PropertyList profileFontsInfo() override;
    std::vector<std::string> knownFontProviders() override;
    void enableOrDisablePersistentURLs(std::vector<std::string> urls, bool enabled,
                                       std::function<void(FontManagerError)> completion) override;
    void unregisterAndRemoveFontFilesForIdentifier(
        std::string identifier, std::function<void(FontManagerError)> completionHandler) override;
    void synchronizeFontProviders() override;
    void synchronizeProfileFonts(std::function<void()> completion) override;
    void synchronizeFontAssets(std::function<void(bool)> completion) override;

private:
    /// An operation at the helper; null when it succeeded.
    using Operation = std::function<FontManagerError(FontRegistryClient&)>;
    void start(Operation operation, std::function<void(FontManagerError)> completion);
    void enqueue(std::function<void()> work);
    void runAssetSynchronization();
    FontManagerError perform(const Operation& operation) const;
    void work();

    const RootDirectory root_;
    Log& log_;
    const std::optional<std::string> helper_;
    /// What changes it puts another file in its place.
    KeptFontRecord registry_;

    std::mutex mutex_;
    std::condition_variable changed_;
    // Below: protected by the mutex.
    std::deque<std::function<void()>> pending_;
    /// Of the synchronisation of font assets that is among these; empty when there is none.
    std::vector<std::function<void(bool)>> assetCompletions_;
    bool isEnding_ = false;
    /// Runs operations and completions. Started with the first; last, so that all it uses is there.
    std::thread worker_;
};

}  // namespace typhon
