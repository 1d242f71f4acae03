#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "platform/property_list.h"

#include <optional>
#include <string>

namespace typhon {

/// The file behind the preferences: its newest contents, read when somebody else replaced or changed it, and
/// its replacement. Not thread-safe.
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
    /// Takes a value out of what was read, so that nothing here shares it. For one that is about to be
    /// replaced.
    std::optional<PropertyList> take(const std::string& key);
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

    /// A new file under the path, held open, unless its contents might still change unnoticed.
    struct Replacement {
        std::optional<std::string> error;
        FileDescriptor file;
        FileIdentity identity;
    };
    /// Replaces the file, atomically and flushed; or says why it could not. Uses nothing but the path, so it
    /// may run beside the other operations.
    Replacement replace(const PropertyList::Dictionary& values) const;
    /// Takes what was just written for what was read, for as long as that file stays as it is.
    void adopt(Replacement replacement, PropertyList::Dictionary values);

private:
    void become(State state, std::string error);
    void parse(const OpenedFile& opened);

    const std::string path_;
    State state_ = State::absent;
    std::string error_;
    PropertyList::Dictionary values_;
    /// The file that was read or written, held open so that no later one has its inode number.
    FileDescriptor read_;
    FileIdentity identity_;
};

}  // namespace typhon
