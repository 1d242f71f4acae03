// A check-in of an application that may enumerate: known, warm, again and again over one connection.

#include "bare_server.h"
#include "platform/linux/audit_tokens.h"
#include "platform/linux/pidfd.h"
#include "platform/linux/process_inspection.h"
#include "platform/linux/property_list_writer.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "sample_registry.h"
#include "scratch_daemon.h"

#include <unistd.h>

namespace typhon::bench {

namespace {

/// The size of what the daemon sends: the entries that are switched on.
std::size_t viewBytes(int fonts)
{
    const auto registry = sampleRegistry(fonts);
    PropertyList::Dictionary view;
    for (const auto& [path, entry] : *registry.asDictionary()) {
        auto copy = *entry.asDictionary();
        if (!copy.at("disabled").isTrue()) {
            copy.erase("disabled");
            view.emplace(path, std::move(copy));
        }
    }
    return writeBinaryPropertyList(view).size();
}

Step checkin(const RawClient& client)
{
    return timed([&] { return client.call(wire::typhonProtocol, wire::checkin.member); });
}

void measureIdentity(Report& report)
{
    const auto token = tokenOfProcess(openPidfd(::getpid()).get());
    std::vector<double> measurements;
    for (int round = 0; round < 2'000; ++round) {
        measurements.push_back(timed([&] { return isSameProcess(token); })());
    }
    report.addFigure("Looking again whether a token's process is still the same, by itself",
                     summaryOf(std::move(measurements)));
}

}  // namespace

void measureCheckIn(Report& report)
{
    Report::begin("Checking in");
    ScratchDaemon small(5'000, {"font-enumeration"});
    ScratchDaemon large(50'000, {"font-enumeration"});
    small.start();
    large.start();
    const RawClient smallClient(small.socketPath());
    const RawClient largeClient(large.socketPath());
    const BareServer smallPeer(small.folder().real("/bare"), viewBytes(5'000));
    const BareServer largePeer(large.folder().real("/bare"), viewBytes(50'000));
    const RawClient smallBare(smallPeer.path());
    const RawClient largeBare(largePeer.path());
    const auto bareView = [](const RawClient& client) {
        return timed([&] { return client.call(bareInterface, "view"); });
    };

    const char* peer = "bare sd-bus call that returns a sealed memory file of that size, opened anew";
    const Effort effort{.rounds = 40, .steps = 50, .warmUp = 50};
    report.add({"check-in, enumerating, 5,000 fonts", peer,
                compare(checkin(smallClient), bareView(smallBare), effort), 1.5});
    report.add({"check-in, enumerating, 50,000 fonts", peer,
                compare(checkin(largeClient), bareView(largeBare), effort), 1.5});
    report.add({"check-in at 50,000 fonts", "check-in at 5,000 fonts",
                compare(checkin(largeClient), checkin(smallClient), effort), 1.2});
    measureIdentity(report);
}

}  // namespace typhon::bench
