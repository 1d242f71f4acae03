#pragma once

#include "fontmanager/font_registration.h"
#include "fontmanager/font_store.h"
#include "fontmanager/registry_writer.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"

#include <map>
#include <mutex>
#include <set>
#include <string>

namespace typhon {

/// The fonts of downloaded assets: keeps a directory below /var/mobile/Library/UserFonts/FontAssets/ for
/// every asset of the store, with its font files, and their entries in the registry. Files are hard links to
/// those of the store where the file system allows that, else copies. Any thread; blocks on the disk.
class FontAssets {
public:
    /// `log` outlives this.
    FontAssets(RootDirectory root, ReadFontNames readNames, Log& log)
        : root_(root), readNames_(std::move(readNames)), log_(log), registry_(std::move(root))
    {}

    /// Brings directories and registry in step with the store: new files take their places first, then the
    /// registry changes, then files that are no longer wanted go; killed in between, the next run completes
    /// it. A file that is no good font is logged and left out, and keeps nothing else out; an asset that the
    /// disk fails for stays as it is, and is tried again by the next run.
    RegistryChangeOutcome synchronize();

private:
    /// File names by asset directory name.
    using Files = std::map<std::string, std::set<std::string>>;
    struct Plan {
        /// Logical paths of files that are in their places and registered.
        std::set<std::string> kept;
        /// Fonts whose files are in their places and that are to be registered.
        std::vector<RegisteredFont> placed;
        Files wanted;
    };

    bool synchronizeOnce(RegistryChangeOutcome& outcome);
    /// Both open.
    struct Directories {
        int store;
        /// Of the directories of font files that are registered.
        int placed;
    };
    std::optional<std::string> planAsset(Directories directories, const std::string& asset,
                                         const PropertyList::Dictionary& before, Plan& plan);
    static void keepAsItIs(const std::string& asset, const PropertyList::Dictionary& before, Plan& plan);
    std::optional<std::string> register_(const Plan& plan, RegistryChange& change);
    static void removeUnwanted(int placed, const Files& wanted);

    const RootDirectory root_;
    const ReadFontNames readNames_;
    Log& log_;
    RegistryWriter registry_;
    /// One synchronisation at a time.
    std::mutex mutex_;
};

}  // namespace typhon
