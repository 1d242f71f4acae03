#include "deletion/deletion_schedule.h"

#include "deletion/deletion_paths.h"

#include <algorithm>

namespace typhon {

namespace {

constexpr const char* deleteKey = "delete";

/// An upper bound: text that is not ASCII is stored in two bytes a character.
std::size_t storedBytes(std::string_view path)
{
    const bool isAscii = std::ranges::all_of(path, [](char c) { return static_cast<signed char>(c) >= 0; });
    return isAscii ? path.size() : 2 * path.size();
}

std::size_t storedBytes(const PropertyList::Dictionary& entries)
{
    std::size_t bytes = 0;
    for (const auto& [path, due] : entries) {
        bytes += storedBytes(path);
    }
    return bytes;
}

enum class State { due, waiting, malformed };

/// What an entry is at that moment, and for how many seconds it still waits.
struct Judgement {
    State state;
    double remaining;
};

Judgement judge(const std::string& path, const PropertyList& value, double now)
{
    const auto* due = value.asDate();
    if (due == nullptr || !isInFontTree(path)) {
        return {State::malformed, 0};
    }
    const double remaining = due->seconds - now;
    return {remaining < DeletionSchedule::tolerance ? State::due : State::waiting, remaining};
}

PropertyList::Dictionary waitingAmong(const PropertyList::Dictionary& entries, double now)
{
    PropertyList::Dictionary waiting;
    for (const auto& [path, value] : entries) {
        if (judge(path, value, now).state == State::waiting) {
            waiting.emplace_hint(waiting.end(), path, value);
        }
    }
    return waiting;
}

/// Gives the number of paths that found no room.
std::size_t recordIn(PropertyList::Dictionary& entries, const std::vector<std::string>& paths,
                     const PropertyList& due)
{
    auto bytes = storedBytes(entries);
    std::size_t withoutRoom = 0;
    for (const auto& path : paths) {
        if (!isInFontTree(path)) {
            continue;
        }
        if (const auto known = entries.find(path); known != entries.end()) {
            // Intended: the latest request counts, also when that brings the date forward.
            known->second = due;
            continue;
        }
        const auto more = storedBytes(path);
        if (entries.size() >= DeletionSchedule::mostEntries || bytes + more > DeletionSchedule::mostBytes) {
            ++withoutRoom;
            continue;
        }
        entries.emplace(path, due);
        bytes += more;
    }
    return withoutRoom;
}

}  // namespace

bool DeletionSchedule::isEmpty()
{
    const auto entries = preferences_.value(deleteKey);
    return !entries || entries->asDictionary() == nullptr || entries->asDictionary()->empty();
}

std::size_t DeletionSchedule::record(const std::vector<std::string>& paths, Date due)
{
    std::size_t withoutRoom = 0;
    preferences_.changeDictionary(
        deleteKey, [&](PropertyList::Dictionary& entries) { withoutRoom = recordIn(entries, paths, due); });
    // Intended: also when no path was taken.
    preferences_.synchronize();
    return withoutRoom;
}

DueFiles DeletionSchedule::takeDue(double now)
{
    DueFiles found;
    const auto value = preferences_.value(deleteKey);
    const auto* entries = value ? value->asDictionary() : nullptr;
    if (entries == nullptr || entries->empty()) {
        found.wasEmpty = true;
        return found;
    }
    bool isChanged = false;
    for (const auto& [path, due] : *entries) {
        const auto [state, remaining] = judge(path, due, now);
        isChanged = isChanged || state != State::waiting;
        if (state == State::due) {
            found.paths.push_back(path);
        } else if (state == State::waiting && remaining < found.earliestRemaining) {
            found.earliestRemaining = static_cast<std::uint32_t>(remaining);
        }
    }
    if (isChanged) {
        preferences_.setValue(deleteKey, waitingAmong(*entries, now));
        preferences_.synchronize();
    }
    return found;
}

}  // namespace typhon
