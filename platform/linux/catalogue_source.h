#pragma once

#include "platform/linux/root_directory.h"
#include "platform/linux/signing.h"

#include <cstdint>
#include <string>

namespace typhon {

/// Where catalogues come from; a logical path. One file a type, "<type>.plist".
inline constexpr const char* catalogueSourcesDirectory = "/etc/typhon/catalogue-sources.d";

/// Where the catalogue of a type comes from. The file has "URL" and may have the others.
struct CatalogueSource {
    /// https, http on the loopback, or file.
    std::string url;
    /// "Certificates": a file with the certificate authorities to believe; empty for those of the system.
    std::string certificates;
    /// "StallSeconds": 1 to 3,600.
    std::uint32_t stallSeconds = 30;
    /// "TotalSeconds": 1 to 86,400.
    std::uint32_t totalSeconds = 900;
};

/// A source, or why there is none.
struct CatalogueSourceReading {
    Result<CatalogueSource> source;
    /// False when nobody has named one.
    bool isConfigured = true;
};

/// Reads the disk.
CatalogueSourceReading catalogueSourceOf(const RootDirectory& root, const std::string& assetType);

}  // namespace typhon
