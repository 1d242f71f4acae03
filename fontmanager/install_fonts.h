#pragma once

#include "platform/linux/root_directory.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// What an installation did.
struct FontInstallation {
    /// The logical paths of the installed font files, in the order of the files given.
    std::vector<std::string> paths;
    /// Null when all files are installed; else why none of them is registered anew.
    std::optional<std::string> error;
};

/// The logical path of the directory that holds the font files of the application with that identifier, or
/// null when the identifier has none.
std::optional<std::string> fontDirectoryOfProvider(const std::string& identifier);

/// Installs font files for the provider with that identifier: copies them, flushed to disk, into its
/// directory under /var/mobile/Library/UserFonts/FontFiles/ under their own file names, reads their names
/// from the copies, and registers all of them in one step, switched on when `enabled`. A file of the same
/// name is replaced. `files` are real paths of this machine. Blocks on the disk; any thread.
FontInstallation installFontFiles(const RootDirectory& root, const std::string& identifier,
                                  const std::vector<std::string>& files, bool enabled);

}  // namespace typhon
