#include "deletion/deletion_schedule.h"

#include "deletion/deletion_paths.h"

#include <algorithm>
#include <utility>

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

}  // namespace

bool DeletionSchedule::isEmpty()
{
    const auto entries = preferences_.value(deleteKey);
    return !entries || entries->asDictionary() == nullptr || entries->asDictionary()->empty();
}

std::size_t DeletionSchedule::record(const std::vector<std::string>& paths, Date due)
{
    auto entries = preferences_.dictionary(deleteKey);
    auto bytes = storedBytes(entries);
    const PropertyList date(due);
    std::size_t withoutRoom = 0;
    for (const auto& path : paths) {
        if (!isInFontTree(path)) {
            continue;
        }
        if (const auto known = entries.find(path); known != entries.end()) {
            // Intended: the latest request counts, also when that brings the date forward.
            known->second = date;
            continue;
        }
        const auto more = storedBytes(path);
        if (entries.size() >= mostEntries || bytes + more > mostBytes) {
            ++withoutRoom;
            continue;
        }
        entries.emplace(path, date);
        bytes += more;
    }
    // Intended: also when no path was taken.
    store(std::move(entries));
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
        store(waitingAmong(*entries, now));
    }
    return found;
}

void DeletionSchedule::store(PropertyList::Dictionary entries)
{
    preferences_.setValue(deleteKey, std::move(entries));
    preferences_.synchronize();
}

}  // namespace typhon
