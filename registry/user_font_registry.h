#pragma once

#include "platform/file_system.h"
#include "platform/log.h"
#include "registry/registry_snapshot.h"
#include "registry/user_font_updates.h"

#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>

namespace typhon {

/// The registry of user-installed fonts: reads `UserFonts.plist`, which the font-registry library alone
/// writes, and keeps what it read until told that fonts changed. Any thread; a thread that has to load the
/// file blocks on the disk.
class UserFontRegistry {
public:
    static constexpr const char* path = "/var/mobile/Library/UserFonts/UserFonts.plist";

    /// Everything given outlives this.
    UserFontRegistry(FileSystem& fileSystem, Log& log, UserFontUpdates& updates)
        : fileSystem_(fileSystem), log_(log), updates_(updates)
    {}

    /// `isUserFontInstalled`. Loads the registry if needed; true when it holds at least one entry. A missing
    /// or broken file is an empty registry, and not looked for again before `invalidateUserFonts`.
    bool isUserFontInstalled();

    /// `userFontsInfo`. The registry, loaded if needed, or null when it holds no entry.
    std::shared_ptr<const RegistrySnapshot> userFontsInfo();

    /// `invalidateUserFonts`. Forgets what was read; the next access reads the file again. A load that is
    /// under way serves those who wait for it and is not kept.
    void invalidateUserFonts();

    /// `setUserFontsInfo:`. Takes a dictionary for the contents of the registry; null forgets them.
    void setUserFontsInfo(std::optional<PropertyList> root);

    /// `_userFontsInfoFromDisk`. The root dictionary of the file as it is, or null when there is no file or
    /// it cannot be read, which is logged.
    std::optional<PropertyList> _userFontsInfoFromDisk();

private:
    using SnapshotPointer = std::shared_ptr<const RegistrySnapshot>;

    SnapshotPointer loaded();
    SnapshotPointer makeSnapshot(std::optional<PropertyList> root);
    std::optional<PropertyList> readFile();

    FileSystem& fileSystem_;
    Log& log_;
    UserFontUpdates& updates_;

    std::mutex mutex_;
    // Protected by mutex_, which is never held while anything is read or built.
    SnapshotPointer userFontsInfo_;
    std::uint64_t changes_ = 0;
};

}  // namespace typhon
