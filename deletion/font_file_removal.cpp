#include "deletion/font_file_removal.h"

#include "deletion/deletion_paths.h"

#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string_view>

// Whatever a path says, it is given to a deletion that is confined to its tree. Folders go in the order of
// their names backwards, so that one goes after those in it.

namespace typhon {

namespace {

class Removal {
public:
    Removal(FileSystem& files, Log& log)
        : files_(files), log_(log), fontFiles_(files.deletionBelow(std::string(font_directories::fontFiles))),
          fontAssets_(files.deletionBelow(std::string(font_directories::fontAssets)))
    {}

    void removeFile(const std::string& path)
    {
        if (isStillInAssetStore(path)) {
            return;
        }
        if (const auto error = treeOf(path).removeItem(path)) {
            TYLog_Error(log_, "scheduled deletion failed: \"" + path + "\" - " + *error);
        }
    }

    void removeFolderIfEmpty(const std::string& folder) { treeOf(folder + "/").removeEmptyDirectory(folder); }

private:
    ConfinedDeletion& treeOf(std::string_view path)
    {
        return path.starts_with(font_directories::fontAssets) ? *fontAssets_ : *fontFiles_;
    }

    /// The store names an asset's folder as the tree of the users' font assets does.
    bool isStillInAssetStore(const std::string& path)
    {
        if (!path.starts_with(font_directories::fontAssets)) {
            return false;
        }
        const auto folder = parentOf(path);
        const auto name = folder.substr(folder.rfind('/') + 1);
        return files_.exists(std::string(font_directories::assetStore) + std::string(name));
    }

    FileSystem& files_;
    Log& log_;
    const std::unique_ptr<ConfinedDeletion> fontFiles_;
    const std::unique_ptr<ConfinedDeletion> fontAssets_;
};

}  // namespace

void removeFontFiles(FileSystem& files, Log& log, const std::vector<std::string>& paths)
{
    Removal removal(files, log);
    std::set<std::string, std::greater<>> folders;
    for (const auto& path : paths) {
        removal.removeFile(path);
        const auto folder = parentOf(path);
        if (folders.empty() || *folders.begin() != folder) {
            // Intended: also of files that were kept or could not be deleted.
            folders.emplace(folder);
        }
    }
    for (const auto& folder : folders) {
        removal.removeFolderIfEmpty(folder);
    }
}

}  // namespace typhon
