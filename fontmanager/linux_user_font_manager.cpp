#include "fontmanager/linux_user_font_manager.h"

#include "fontmanager/directory_names.h"
#include "fontmanager/font_paths.h"
#include "fontmanager/font_registry_client.h"
#include "fontmanager/profile_fonts.h"

#include <set>
#include <utility>

namespace typhon {

namespace {

template <class T>
FontManagerError errorOf(const ClientResult<T>& result)
{
    return result ? std::nullopt : FontManagerError(result.error().message);
}

}  // namespace

LinuxUserFontManager::LinuxUserFontManager(RootDirectory root, Log& log, std::optional<std::string> helper)
    : root_(std::move(root)), log_(log), helper_(std::move(helper)), registry_(root_, font_paths::registry)
{}

LinuxUserFontManager::~LinuxUserFontManager()
{
    {
        const std::lock_guard lock(mutex_);
        isEnding_ = true;
    }
    changed_.notify_all();
    if (worker_.joinable()) {
        worker_.join();
    }
}

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
    return registry_.read();
}

PropertyList LinuxUserFontManager::profileFontsInfo()
{
    return readFontRecord(root_, font_paths::profileFonts);
}

std::vector<std::string> LinuxUserFontManager::knownFontProviders()
{
    std::set<std::string> providers;
    const auto entries = userFontsInfo();
    for (const auto& [path, entry] : *entries.asDictionary()) {
        const auto place = font_paths::placeOfFontFile(path);
        const auto identifier = place ? typhon::identifierFromDirectoryName(place->directory) : std::nullopt;
        if (identifier) {
            providers.insert(*identifier);
        }
    }
    return {providers.begin(), providers.end()};
}

void LinuxUserFontManager::enableOrDisablePersistentURLs(std::vector<std::string> urls, bool enabled,
                                                         std::function<void(FontManagerError)> completion)
{
    start([urls = std::move(urls),
           enabled](FontRegistryClient& client) { return errorOf(client.enableOrDisable(urls, enabled)); },
          std::move(completion));
}

void LinuxUserFontManager::unregisterAndRemoveFontFilesForIdentifier(
    std::string identifier, std::function<void(FontManagerError)> completionHandler)
{
    if (!typhon::directoryNameFromIdentifier(identifier)) {
        // Nobody has fonts under such an identifier.
        start({}, std::move(completionHandler));
        return;
    }
    start([identifier = std::move(identifier)](
              FontRegistryClient& client) { return errorOf(client.unregisterAllFonts(identifier)); },
          std::move(completionHandler));
}

void LinuxUserFontManager::synchronizeFontProviders()
{
    start([](FontRegistryClient& client) { return errorOf(client.synchronizeFontProviders()); },
          [this](const FontManagerError& error) {
              if (error) {
                  TYLog_Error(log_, "font providers were not synchronised: " + *error);
              }
          });
}

void LinuxUserFontManager::synchronizeProfileFonts(std::function<void()> completion)
{
    start([](FontRegistryClient& client) { return errorOf(client.synchronizeProfileFonts()); },
          [this, completion = std::move(completion)](const FontManagerError& error) {
              if (error) {
                  TYLog_Error(log_, "profile fonts were not synchronised: " + *error);
              }
              if (completion) {
                  completion();
              }
          });
}

void LinuxUserFontManager::synchronizeFontAssets(std::function<void(bool)> completion)
{
    {
        const std::lock_guard lock(mutex_);
        assetCompletions_.push_back(std::move(completion));
        if (assetCompletions_.size() > 1) {
            return;
        }
        enqueue([this] { runAssetSynchronization(); });
    }
    changed_.notify_one();
}

/// Whoever asks from now on wants to see what has changed since, and so gets another one.
void LinuxUserFontManager::runAssetSynchronization()
{
    std::vector<std::function<void(bool)>> completions;
    {
        const std::lock_guard lock(mutex_);
        completions.swap(assetCompletions_);
    }
    const auto error =
        perform([](FontRegistryClient& client) { return errorOf(client.synchronizeFontAssets()); });
    if (error) {
        TYLog_Error(log_, "font assets were not synchronised: " + *error);
    }
    for (const auto& completion : completions) {
        if (completion) {
            completion(!error);
        }
    }
}

FontManagerError LinuxUserFontManager::perform(const Operation& operation) const
{
    if (!operation) {
        return std::nullopt;
    }
    // An empty root would be the environment's.
    auto client = FontRegistryClient::connect(
        {.root = root_.isScratch() ? root_.directory() : std::string("/"), .helper = helper_});
    return client ? operation(*client) : FontManagerError(client.error().message);
}

void LinuxUserFontManager::start(Operation operation, std::function<void(FontManagerError)> completion)
{
    {
        const std::lock_guard lock(mutex_);
        enqueue([this, operation = std::move(operation), completion = std::move(completion)] {
            auto error = perform(operation);
            if (completion) {
                completion(std::move(error));
            }
        });
    }
    changed_.notify_one();
}

/// Under the mutex.
void LinuxUserFontManager::enqueue(std::function<void()> work)
{
    pending_.push_back(std::move(work));
    if (!worker_.joinable()) {
        worker_ = std::thread([this] { this->work(); });
    }
}

void LinuxUserFontManager::work()
{
    std::unique_lock lock(mutex_);
    while (true) {
        changed_.wait(lock, [this] { return isEnding_ || !pending_.empty(); });
        if (pending_.empty()) {
            return;
        }
        const auto next = std::move(pending_.front());
        pending_.pop_front();
        lock.unlock();
        next();
        lock.lock();
    }
}

}  // namespace typhon
