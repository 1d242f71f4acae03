// What clients that mean no good cost an honest one: the slowest of its check-ins, beside each of them and
// without any, over the same connection to the same daemon.

#include "hostile_client.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "scratch_daemon.h"

#include <algorithm>
#include <vector>

#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr std::size_t checkIns = 400;
constexpr std::size_t rounds = 8;
/// Until a hostile client has used up what it is allowed at once.
constexpr unsigned settling = 1'000'000;
/// Between two check-ins: an application does something else in between.
constexpr unsigned pauseMicroseconds = 500;

/// The time that one in a hundred check-ins takes longer than.
double slowCheckIn(const RawClient& client)
{
    const auto checkin = timed([&] { return client.call(wire::typhonProtocol, wire::checkin.member); });
    std::vector<double> measurements;
    for (std::size_t count = 0; count < checkIns; ++count) {
        measurements.push_back(checkin());
        ::usleep(pauseMicroseconds);
    }
    const auto slow = measurements.begin() + checkIns * 99 / 100;
    std::ranges::nth_element(measurements, slow);
    return *slow;
}

Comparison compareBeside(const ScratchDaemon& daemon, const RawClient& client, Hostility hostility)
{
    std::vector<double> beside;
    std::vector<double> undisturbed;
    for (std::size_t round = 0; round < rounds; ++round) {
        undisturbed.push_back(slowCheckIn(client));
        const auto hostile = hostileClient(daemon.socketPath(), hostility);
        ::usleep(settling);
        beside.push_back(slowCheckIn(client));
    }
    return {summaryOf(std::move(beside)), summaryOf(std::move(undisturbed))};
}

struct Case {
    const char* name;
    Hostility hostility;
};

constexpr Case cases[] = {
    {"one that floods", Hostility::floods},
    {"one that never reads", Hostility::neverReads},
    {"one that leaves messages half sent", Hostility::halfMessages},
    {"one that connects and leaves in a loop", Hostility::connects},
    {"one that passes 253 descriptors with every message", Hostility::manyDescriptors},
    {"one that calls what is never answered", Hostility::neverAnswered},
    {"one that sends values of many megabytes", Hostility::largeValues},
};

}  // namespace

void measureHostile(Report& report)
{
    Report::begin("Checking in beside clients that mean no good");
    ScratchDaemon daemon(2'000, {"font-enumeration"});
    daemon.start();
    const RawClient client(daemon.socketPath());
    for (const auto& [name, hostility] : cases) {
        report.add({std::string("99th percentile of check-ins beside ") + name, "the same, undisturbed",
                    compareBeside(daemon, client, hostility), 3.0});
    }
}

}  // namespace typhon::bench
