#pragma once

#include "platform/preferences.h"

#include <cstdint>
#include <mutex>

namespace typhon {

/// How many font requests needed the user, and how many found fonts, in the preferences "missed" and
/// "resolved" until somebody collects them. Any thread; writing blocks on the disk.
class RequestCounters {
public:
    struct Counts {
        std::int64_t missed = 0;
        std::int64_t resolved = 0;
    };

    /// `preferences` outlives this.
    explicit RequestCounters(Preferences& preferences) : preferences_(preferences) {}

    /// `recordRequestFontsResultWihtMissed:andResolved:` (spelled so). Counts one request; touches nothing
    /// when both are false.
    void recordRequestFontsResultWihtMissed(bool missed, bool andResolved);

    /// `extractRequestFontsMissed:andResolved:`. Gives both counts and sets them back to zero.
    Counts extractRequestFontsMissed();

private:
    void increment(const char* key);

    Preferences& preferences_;
    /// Held from reading the counts to having written them.
    std::mutex counting_;
};

}  // namespace typhon
