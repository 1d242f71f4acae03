#include "platform/simulated/simulated_user_font_manager.h"

#include "platform/file_url.h"
#include "platform/font_directories.h"

#include <algorithm>
#include <cstdio>
#include <set>
#include <string_view>
#include <utility>

// Directory names follow the library's rule, which is small enough to be said again here: this room knows
// nothing of the library's, and the contract suite holds both to the same names.

namespace typhon {

namespace {

constexpr std::size_t longestFileName = 255;
constexpr const char* registryPath = "/var/mobile/Library/UserFonts/UserFonts.plist";
constexpr std::string_view fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";

/// The name of the directory below the font files' that holds the file, or empty.
std::string providerDirectoryOf(std::string_view path)
{
    if (!path.starts_with(fontFiles)) {
        return {};
    }
    path.remove_prefix(fontFiles.size());
    const auto end = path.find('/');
    return std::string(end == std::string_view::npos ? "" : path.substr(0, end));
}

bool standsForItself(char c)
{
    return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '.';
}

std::string escaped(char c)
{
    std::string text(4, '\0');
    std::snprintf(text.data(), text.size(), "%%%02X", static_cast<unsigned>(static_cast<unsigned char>(c)));
    text.pop_back();
    return text;
}

int hexadecimal(char digit)
{
    const auto found = std::string_view("0123456789ABCDEF").find(digit);
    return found == std::string_view::npos ? -1 : static_cast<int>(found);
}

}  // namespace

std::optional<std::string>
SimulatedUserFontManager::directoryNameFromIdentifier(const std::string& identifier)
{
    const bool isDots = identifier == "." || identifier == "..";
    std::string name;
    for (const char c : identifier) {
        name += standsForItself(c) && !isDots ? std::string(1, c) : escaped(c);
    }
    return name.empty() || name.size() > longestFileName ? std::nullopt : std::optional(name);
}

std::optional<std::string>
SimulatedUserFontManager::identifierFromDirectoryName(const std::string& directoryName)
{
    std::string identifier;
    for (std::size_t at = 0; at < directoryName.size(); ++at) {
        if (directoryName[at] != '%') {
            identifier += directoryName[at];
            continue;
        }
        if (directoryName.size() - at < 3) {
            return std::nullopt;
        }
        const int high = hexadecimal(directoryName[at + 1]);
        const int low = hexadecimal(directoryName[at + 2]);
        if (high < 0 || low < 0) {
            return std::nullopt;
        }
        identifier += static_cast<char>(high * 16 + low);
        at += 2;
    }
    return directoryNameFromIdentifier(identifier) == directoryName ? std::optional(identifier)
                                                                    : std::nullopt;
}

PropertyList SimulatedUserFontManager::userFontsInfo()
{
    auto reading = fileSystem_.readPropertyList(registryPath);
    return reading.value && reading.value->asDictionary() ? *std::move(reading.value)
                                                          : PropertyList(PropertyList::Dictionary{});
}

std::vector<std::string> SimulatedUserFontManager::knownFontProviders()
{
    std::set<std::string> providers;
    const auto entries = userFontsInfo();
    for (const auto& [path, entry] : *entries.asDictionary()) {
        if (const auto identifier = identifierFromDirectoryName(providerDirectoryOf(path))) {
            providers.insert(*identifier);
        }
    }
    return {providers.begin(), providers.end()};
}

void SimulatedUserFontManager::enableOrDisablePersistentURLs(std::vector<std::string> urls, bool enabled,
                                                             std::function<void(FontManagerError)> completion)
{
    calls_.push_back("enableOrDisablePersistentURLs " + std::to_string(urls.size()));
    start([this, urls = std::move(urls), enabled, completion = std::move(completion)] {
        const auto error = change([&](PropertyList::Dictionary& entries) -> FontManagerError {
            for (const auto& url : urls) {
                const auto path = pathFromFileUrl(url);
                const auto found = path ? entries.find(*path) : entries.end();
                if (found == entries.end() || found->second.asDictionary() == nullptr) {
                    return url + " is not registered";
                }
                auto entry = *found->second.asDictionary();
                entry.insert_or_assign("disabled", !enabled);
                found->second = std::move(entry);
            }
            return std::nullopt;
        });
        if (completion) {
            completion(error);
        }
    });
}

void SimulatedUserFontManager::unregisterAndRemoveFontFilesForIdentifier(
    std::string identifier, std::function<void(FontManagerError)> completionHandler)
{
    calls_.push_back("unregisterAndRemoveFontFilesForIdentifier " + identifier);
    start([this, identifier = std::move(identifier), completionHandler = std::move(completionHandler)] {
        const auto error = change([&](PropertyList::Dictionary& entries) -> FontManagerError {
            const auto directory = directoryNameFromIdentifier(identifier);
            std::erase_if(entries, [&](const auto& pair) {
                return directory && providerDirectoryOf(pair.first) == *directory;
            });
            return std::nullopt;
        });
        if (completionHandler) {
            completionHandler(error);
        }
    });
}

bool SimulatedUserFontManager::finishNext()
{
    if (held_.empty()) {
        return false;
    }
    const auto operation = std::move(held_.front());
    held_.pop_front();
    operation();
    return true;
}

void SimulatedUserFontManager::start(Operation operation)
{
    if (isHolding_) {
        held_.push_back(std::move(operation));
    } else {
        scheduler_.post(this, std::move(operation));
    }
}

FontManagerError
SimulatedUserFontManager::change(const std::function<FontManagerError(PropertyList::Dictionary&)>& edit)
{
    if (nextError_) {
        return std::exchange(nextError_, std::nullopt);
    }
    const auto before = userFontsInfo();
    auto entries = *before.asDictionary();
    auto error = edit(entries);
    if (!error && PropertyList(entries) != before) {
        fileSystem_.addFile(registryPath, std::move(entries));
    }
    return error;
}

void SimulatedUserFontManager::synchronizeProfileFonts(std::function<void()> completion)
{
    ++profileSynchronizations_;
    pending_.push_back(std::move(completion));
}

void SimulatedUserFontManager::synchronizeFontAssets(std::function<void(bool)> completion)
{
    calls_.push_back("synchronizeFontAssets");
    start([this, completion = std::move(completion)] {
        const auto error = change([&](PropertyList::Dictionary& entries) -> FontManagerError {
            std::erase_if(entries, [](const auto& pair) {
                return std::string_view(pair.first).starts_with(font_directories::fontAssets);
            });
            entries.insert(fontAssets_.begin(), fontAssets_.end());
            return std::nullopt;
        });
        if (completion) {
            completion(!error);
        }
    });
}

void SimulatedUserFontManager::finishProfileSynchronizations()
{
    for (const auto& completion : std::exchange(pending_, {})) {
        if (completion) {
            completion();
        }
    }
}

}  // namespace typhon
