#pragma once

#include "platform/property_list.h"

#include <functional>
#include <string>
#include <vector>

namespace typhon {

/// One face of a font file.
struct ListedFace {
    std::string family;
    std::string postScriptName;
    std::string path;
    /// The registry entry of its file.
    PropertyList entry;
};

/// The faces in a dictionary of path to font entry, by family, PostScript name and path. A file without names
/// counts as one face without any; what is malformed is taken for nameless.
std::vector<ListedFace> facesIn(const PropertyList& fonts);

/// A check-in's dictionary for people: the fonts with how each may be opened, then the extensions that came
/// with them.
std::string checkinText(const PropertyList& checkin);

/// The registry for people.
std::string registryText(const PropertyList& registry);

}  // namespace typhon
