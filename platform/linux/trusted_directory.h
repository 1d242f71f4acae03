#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/signing.h"

#include <cstddef>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// A directory whose files the daemon believes. It, every directory above it (from the scratch folder down,
/// if there is one) and each of its files must belong to root or to the daemon's user, be writable by nobody
/// else, and be no symbolic link.
class TrustedDirectory {
public:
    /// Fails with a text for the log; a directory that does not exist opens as an empty one.
    static Result<TrustedDirectory> open(const RootDirectory& root, const std::string& logicalPath);

    /// The names that end in ".plist", sorted.
    std::vector<std::string> propertyLists() const;

    /// The contents of a file of at most `limit` bytes.
    Result<Bytes> read(const std::string& name, std::size_t limit) const;

private:
    explicit TrustedDirectory(FileDescriptor directory) : directory_(std::move(directory)) {}
    FileDescriptor directory_;
};

}  // namespace typhon
