#include "requests/request_counters.h"

#include <limits>

namespace typhon {

namespace {

constexpr const char* missedKey = "missed";
constexpr const char* resolvedKey = "resolved";

}  // namespace

void RequestCounters::recordRequestFontsResultWihtMissed(bool missed, bool andResolved)
{
    if (!missed && !andResolved) {
        return;
    }
    const std::lock_guard lock(counting_);
    if (missed) {
        increment(missedKey);
    }
    if (andResolved) {
        increment(resolvedKey);
    }
    preferences_.synchronize();
}

RequestCounters::Counts RequestCounters::extractRequestFontsMissed()
{
    const std::lock_guard lock(counting_);
    const Counts counts{preferences_.integer(missedKey), preferences_.integer(resolvedKey)};
    if (counts.missed != 0 || counts.resolved != 0) {
        preferences_.setValue(missedKey, 0);
        preferences_.setValue(resolvedKey, 0);
        preferences_.synchronize();
    }
    return counts;
}

void RequestCounters::increment(const char* key)
{
    // Anybody may have written anything into the preferences.
    const auto count = preferences_.integer(key);
    preferences_.setValue(key, count == std::numeric_limits<std::int64_t>::max() ? count : count + 1);
}

}  // namespace typhon
