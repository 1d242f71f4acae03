#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "platform/property_list.h"

#include <optional>
#include <string>

namespace typhon {

/// The file behind the preferences: its newest contents, read when it was replaced or changed, and its
/// replacement. Not thread-safe.
class PreferencesStore {
public:
    /// `path` is the file's real path.
    explicit PreferencesStore(std::string path);

    /// What the file held when it was last looked at.
    enum class State {
        absent,
        readable,
        /// Something else than a property list whose root is a dictionary, or too large.
        malformed,
        /// Its contents could not be had: it may be perfectly fine.
        unavailable
    };

    /// Looks at the file, and reads it if it is not the one that was read before.
    void refresh();
    State state() const { return state_; }
    /// Empty unless readable.
    const PropertyList::Dictionary& values() const { return values_; }
    /// Why the contents are malformed or unavailable.
    const std::string& error() const { return error_; }
    const std::string& path() const { return path_; }

    struct SetAside {
        std::string path;
        std::optional<std::string> error;
    };
    /// Renames a malformed file to `path` + ".broken-1" to "-9" (the last one is replaced when all are
    /// taken).
    SetAside setAside();
    /// Replaces the file, atomically and flushed. Null, or why it could not.
    std::optional<std::string> replace(const PropertyList::Dictionary& values) const;

private:
    void become(State state, std::string error);
    void parse(const OpenedFile& opened);

    const std::string path_;
    State state_ = State::absent;
    std::string error_;
    PropertyList::Dictionary values_;
    /// The file that was read, held open so that no later one has its inode number.
    FileDescriptor read_;
    FileIdentity identity_;
};

}  // namespace typhon
