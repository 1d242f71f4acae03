#pragma once

#include "platform/preferences.h"
#include "platform/property_list.h"

#include <cstddef>
#include <cstdint>
#include <limits>
#include <string>
#include <vector>

namespace typhon {

/// What a look at the schedule found.
struct DueFiles {
    /// No longer scheduled.
    std::vector<std::string> paths;
    /// Whole seconds until the first of the others is due; `none` when nothing waits.
    static constexpr std::uint32_t none = std::numeric_limits<std::uint32_t>::max();
    std::uint32_t earliestRemaining = none;
    /// True when nothing was scheduled in the first place.
    bool wasEmpty = false;
};

/// Which font file is to be deleted when: the preference "delete", path to date. For one queue; blocks on
/// the disk.
class DeletionSchedule {
public:
    /// A path is due once its date is less than this many seconds away.
    static constexpr double tolerance = 180.0;
    /// What clients may fill the preferences with, which other things have to fit into as well: so many
    /// paths, and so many bytes for them.
    static constexpr std::size_t mostEntries = 150'000;
    static constexpr std::size_t mostBytes = 8u << 20;

    /// `preferences` outlives this.
    explicit DeletionSchedule(Preferences& preferences) : preferences_(preferences) {}

    bool isEmpty();
    /// Sets the date of every path in the font trees, whatever it was before, and writes, even when there was
    /// none. Gives the number of paths that found no room.
    std::size_t record(const std::vector<std::string>& paths, Date due);
    /// Takes out everything that is due, and what is no entry, and writes if that was anything.
    DueFiles takeDue(double now);

private:
    Preferences& preferences_;
};

}  // namespace typhon
