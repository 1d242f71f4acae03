#pragma once

#include "fontmanager/font_registration.h"
#include "platform/linux/root_directory.h"

#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// A change of font files and registry that has been decided on.
struct PendingChange {
    /// Copies that take their places and are registered.
    std::vector<StagedFont> placements;
    /// Paths of font files that are unregistered and then removed.
    std::vector<std::string> removals;
};

/// Remembers on disk the change that is under way, so that one that was interrupted is completed by the next
/// run. Whatever it names is left over if the change is not completed; nothing else is. One thread at a time.
class ChangeJournal {
public:
    explicit ChangeJournal(RootDirectory root) : root_(std::move(root)) {}

    /// Null when the change is on the disk, flushed; else why not.
    std::optional<std::string> write(const PendingChange& change);
    /// The change is through.
    std::optional<std::string> erase();

    struct Reading {
        /// Null when no change was interrupted.
        std::optional<PendingChange> change;
        std::optional<std::string> error;
    };
    Reading read() const;

private:
    const RootDirectory root_;
};

}  // namespace typhon
