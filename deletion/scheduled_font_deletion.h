#pragma once

namespace typhon {

/// Deletion of font files on a schedule.
class ScheduledFontDeletion {
public:
    /// `setupForScheduledFontDeletion`. Its place in the start-up; there is no schedule to set up yet.
    void setupForScheduledFontDeletion() {}
};

}  // namespace typhon
