// Measures the system beside bare peers, both in the same run, and prints one table. Ratios are what counts:
// absolute times belong to the machine and its moment.

#include "platform/linux/process_limits.h"
#include "rows.h"

#include <algorithm>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>
#include <fmt/format.h>
#include <sched.h>

namespace typhon::bench {

namespace {

struct Part {
    const char* name;
    void (*measure)(Report&);
};

constexpr Part parts[] = {
    {"checkin", measureCheckIn},       {"updating", measureUpdating},   {"opening", measureOpening},
    {"idle", measureIdleConnections},  {"loading", measureLoading},     {"start", measureStart},
    {"ledger", measureLedger},         {"names", measureNames},         {"shares", measureShares},
    {"deletion", measureDeletion},     {"broadcast", measureBroadcast}, {"request", measureRequest},
    {"installing", measureInstalling}, {"assets", measureAssets},       {"watch", measureWatch},
    {"hostile", measureHostile},
};

std::vector<std::string> names()
{
    std::vector<std::string> all;
    for (const auto& part : parts) {
        all.emplace_back(part.name);
    }
    return all;
}

/// Keeps this program and all that it starts on one processor. Otherwise a figure says mostly whether the
/// scheduler happened to put both ends of a call on the same one: a wake-up across costs as much as ten
/// calls.
void stayOnOneProcessor()
{
    cpu_set_t processors;
    CPU_ZERO(&processors);
    CPU_SET(0, &processors);
    ::sched_setaffinity(0, sizeof processors, &processors);
}

int run(const std::vector<std::string>& chosen)
{
    Report report;
    int failures = 0;
    for (const auto& part : parts) {
        if (std::ranges::find(chosen, part.name) == chosen.end()) {
            continue;
        }
        try {
            part.measure(report);
        } catch (const std::exception& failure) {
            fmt::print(stderr, "{} cannot be measured: {}\n", part.name, failure.what());
            ++failures;
        }
    }
    report.print();
    return failures == 0 ? 0 : 1;
}

}  // namespace

}  // namespace typhon::bench

int main(int argc, char** argv)
{
    CLI::App app{"Measures typhond beside bare peers and prints the table."};
    auto chosen = typhon::bench::names();
    app.add_option("PART", chosen, "What to measure; without any, everything")
        ->check(CLI::IsMember(typhon::bench::names()));
    bool isSpread = false;
    app.add_flag("--spread", isSpread, "Use all processors, not only one");
    CLI11_PARSE(app, argc, argv);
    if (!isSpread) {
        typhon::bench::stayOnOneProcessor();
    }
    typhon::prepareProcess();
    return typhon::bench::run(chosen);
}
