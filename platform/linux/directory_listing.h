#pragma once

#include "platform/linux/regular_file.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon {

/// The names in a directory, each sorted.
struct DirectoryListing {
    FileIdentity identity;
    /// True when every later change of the directory will change `identity`.
    bool isSettled = false;
    /// Everything that is no directory; symbolic links are here, wherever they lead.
    std::vector<std::string> files;
    std::vector<std::string> directories;
    /// True when there were more names than `limit`, of which the rest is missing.
    bool isCut = false;
    /// An errno; 0 when the listing is complete.
    int error = 0;
};

/// Lists an open directory from its beginning; the descriptor stays the caller's, who reads nothing else from
/// it meanwhile.
DirectoryListing listDirectory(int directory, std::size_t limit);

}  // namespace typhon
