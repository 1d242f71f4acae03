#include "tools/deletions_text.h"

#include "tools/date_text.h"
#include "tools/table.h"

#include <algorithm>
#include <cmath>
#include <utility>
#include <vector>

#include <fmt/format.h>

namespace typhon {

namespace {

std::string remainingText(double seconds)
{
    if (seconds <= 0) {
        return "overdue";
    }
    constexpr double most = 1e9;
    const auto whole = static_cast<long>(std::min(seconds, most));
    return fmt::format("{}:{:02}:{:02}", whole / 3600, whole / 60 % 60, whole % 60);
}

}  // namespace

PropertyList plainSchedule(const PropertyList& schedule)
{
    PropertyList::Dictionary entries;
    if (const auto* all = schedule.asDictionary()) {
        for (const auto& [path, due] : *all) {
            if (due.asDate() != nullptr && !std::isnan(due.asDate()->seconds)) {
                entries.emplace(path, due);
            }
        }
    }
    return entries;
}

std::string deletionsText(const PropertyList& schedule, double now)
{
    std::vector<std::pair<Date, std::string>> byDate;
    for (const auto& [path, due] : *schedule.asDictionary()) {
        byDate.emplace_back(*due.asDate(), path);
    }
    if (byDate.empty()) {
        return "Nothing is scheduled for deletion.\n";
    }
    std::ranges::sort(byDate);
    Table table({"Due", "In", "File"});
    for (const auto& [due, path] : byDate) {
        table.addRow({dateText(due), remainingText(due.seconds - now), path});
    }
    return table.text() +
           fmt::format("{} file{}; those that are due go at the next pass, which the start of the "
                       "daemon brings about in any case\n",
                       byDate.size(), byDate.size() == 1 ? "" : "s");
}

}  // namespace typhon
