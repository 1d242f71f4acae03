#pragma once

#include <string>

namespace typhon {

/// For a process right after its fork, without threads: gives up everything but reading the one descriptor
/// and writing the other, and writes the files of the archive as frames. An archive of the asset `assetId`
/// holds plain files, by themselves or in a folder of that name. Never returns.
[[noreturn]] void readArchive(int archive, int pipe, const std::string& assetId);

}  // namespace typhon
