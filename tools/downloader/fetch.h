#pragma once

#include "tools/downloader/url_rules.h"

#include <cstdint>
#include <functional>
#include <string>
#include <vector>

namespace typhon {

/// How to fetch.
struct FetchOptions {
    std::uint64_t mostBytes = 0;
    /// 0 for as fast as it goes.
    std::uint64_t bytesPerSecond = 0;
    std::uint32_t stallSeconds = 0;
    std::uint32_t totalSeconds = 0;
    /// Certificate authorities to believe, as PEM; empty for those of the system.
    std::vector<std::uint8_t> certificates;
    /// Asked about once a second; true to give up.
    std::function<bool()> isUnwanted;
};

/// Fetches over https, or http on this machine, into a file, which then holds exactly what the server gave.
/// Follows a few redirections. Empty, or why it failed, in words that may be the server's.
std::string fetch(const DownloadUrl& url, const FetchOptions& options, int file);

}  // namespace typhon
