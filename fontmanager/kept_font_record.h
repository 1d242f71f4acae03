#pragma once

#include "platform/linux/regular_file.h"
#include "platform/linux/root_directory.h"
#include "platform/property_list.h"

#include <mutex>
#include <string>

namespace typhon {

/// A property list of entries by path, read again only when its file is another one or was changed. Any
/// thread; blocks on the disk.
class KeptFontRecord {
public:
    KeptFontRecord(const RootDirectory& root, const char* logicalPath) : path_(root.real(logicalPath)) {}

    /// As it stands on disk; empty when it cannot be read.
    PropertyList read();

private:
    const std::string path_;
    std::mutex mutex_;
    // Below: protected by the mutex.
    /// What was read, and its file, held open so that no later one has its inode number.
    FileDescriptor file_;
    FileIdentity identity_;
    PropertyList record_;
};

}  // namespace typhon
