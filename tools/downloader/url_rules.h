#pragma once

#include <optional>
#include <string>

namespace typhon {

/// A URL that something may be downloaded from.
struct DownloadUrl {
    enum class Kind { https, loopbackHttp, file } kind = Kind::https;
    std::string text;
    /// The path of a file; empty otherwise.
    std::string path;
};

/// A URL, or why nothing is downloaded from it.
struct UrlReading {
    std::optional<DownloadUrl> url;
    std::string error;
};

/// Allows https, http to this machine (localhost and the loopback addresses), and files of it. No names or
/// passwords in it.
UrlReading readUrl(const std::string& text);

/// The same for where a server of `from` sends to: nothing but https behind https, and never a file.
UrlReading readRedirection(const DownloadUrl& from, const std::string& text);

}  // namespace typhon
