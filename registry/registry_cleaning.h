#pragma once

#include "platform/property_list.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon {

/// Entries of one kind that cannot be served.
struct EntriesLeftOut {
    /// What is wrong with them, to follow "that " ("are not dictionaries").
    std::string reason;
    std::size_t count = 0;
    std::string firstPath;
};

/// A registry whose entries are what the rest of the system takes them for: under an absolute path without
/// ".", ".." or control characters, a dictionary; its "familyName", if any, a dictionary of strings; its
/// "disabled", if any, a boolean.
struct CleanedRegistry {
    PropertyList root;
    std::vector<EntriesLeftOut> leftOut;
};

/// Leaves out the entries that are malformed and keeps the others as they are. `root` is a dictionary. An
/// entry with several faults counts once.
CleanedRegistry cleanRegistry(PropertyList root);

}  // namespace typhon
