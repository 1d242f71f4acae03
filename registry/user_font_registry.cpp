#include "registry/user_font_registry.h"

#include "registry/registry_cleaning.h"

#include <string>

namespace typhon {

bool UserFontRegistry::isUserFontInstalled()
{
    return loaded()->count() != 0;
}

std::shared_ptr<const RegistrySnapshot> UserFontRegistry::userFontsInfo()
{
    auto snapshot = loaded();
    return snapshot->count() == 0 ? nullptr : snapshot;
}

void UserFontRegistry::invalidateUserFonts()
{
    setUserFontsInfo(std::nullopt);
}

void UserFontRegistry::setUserFontsInfo(std::optional<PropertyList> root)
{
    auto snapshot = root ? makeSnapshot(std::move(root)) : nullptr;
    const std::lock_guard lock(mutex_);
    userFontsInfo_.swap(snapshot);
    ++changes_;
}

UserFontRegistry::SnapshotPointer UserFontRegistry::loaded()
{
    std::uint64_t changesBefore = 0;
    {
        const std::lock_guard lock(mutex_);
        if (userFontsInfo_) {
            return userFontsInfo_;
        }
        changesBefore = changes_;
    }
    auto snapshot = makeSnapshot(_userFontsInfoFromDisk());
    const std::lock_guard lock(mutex_);
    if (changes_ == changesBefore) {
        userFontsInfo_ = snapshot;
    }
    return snapshot;
}

UserFontRegistry::SnapshotPointer UserFontRegistry::makeSnapshot(std::optional<PropertyList> root)
{
    auto cleaned = cleanRegistry(root ? *std::move(root) : PropertyList());
    for (const auto& entries : cleaned.leftOut) {
        TYLog_Error(log_, std::string(path) + ": entries left out that " + entries.reason + ": " +
                              std::to_string(entries.count) + ", the first: " + entries.firstPath);
    }
    return std::make_shared<const RegistrySnapshot>(std::move(cleaned.root));
}

std::optional<PropertyList> UserFontRegistry::_userFontsInfoFromDisk()
{
    std::optional<PropertyList> root;
    updates_.updatingUserFontsAndWait([this, &root] { root = readFile(); });
    return root;
}

std::optional<PropertyList> UserFontRegistry::readFile()
{
    if (!fileSystem_.exists(path)) {
        return std::nullopt;
    }
    auto reading = fileSystem_.readPropertyList(path);
    if (!reading.value || reading.value->asDictionary() == nullptr) {
        TYLog_Error(log_, std::string("error reading ") + path);
        return std::nullopt;
    }
    return std::move(reading.value);
}

}  // namespace typhon
