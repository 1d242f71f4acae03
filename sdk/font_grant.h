#pragma once

#include "platform/property_list.h"

#include <string>
#include <string_view>

namespace typhon {

/// How a client gets at a font file.
struct FontGrant {
    enum class Way {
        /// The broker opens the file for `token`, which is empty for a file that needs no grant.
        broker,
        /// The daemon listed the file without a token because this process can open it by itself.
        ownAccess,
    };
    Way way = Way::broker;
    Data token;
    /// The key under which the token stood: "data", "extension.provider", "extension" or
    /// "extension.fontasset"; empty without one.
    std::string_view source;
};

/// The grant that the dictionary of a check-in (the empty dictionary for a null one) holds for the file at
/// the logical `path`: its own token, else that of the directory it lies in, else none where none is
/// needed, else, when the file was listed at all, the process's own access. A file that was not granted
/// yields an empty token, which the broker refuses.
FontGrant fontGrantFor(const PropertyList& checkin, const std::string& path);

}  // namespace typhon
