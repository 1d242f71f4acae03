#pragma once

#include "platform/property_list.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// A parsed property list, or why there is none.
struct PropertyListReading {
    std::optional<PropertyList> value;
    /// Set exactly when `value` is null.
    std::string error;
};

/// Files by logical path. Any thread; blocks on the disk.
class FileSystem {
public:
    virtual ~FileSystem() = default;
    virtual bool exists(const std::string& path) = 0;
    /// Streams the file through the property-list reader (XML or binary), within the reader's limits. A
    /// directory, a device or a socket is an error.
    virtual PropertyListReading readPropertyList(const std::string& path) = 0;
    /// The names in a directory, sorted, or null when it cannot be listed.
    virtual std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path) = 0;
};

}  // namespace typhon
