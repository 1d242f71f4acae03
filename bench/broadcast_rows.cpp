// One change of fonts, told to many clients that may enumerate.

#include "bare_server.h"
#include "platform/file_url.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "receivers.h"
#include "rows.h"
#include "sample_registry.h"
#include "scratch_daemon.h"

#include <memory>
#include <string>
#include <vector>

#include <fmt/format.h>

namespace typhon::bench {

namespace {

constexpr int registeredFonts = 100;

/// Tells a peer what the daemon tells its clients, straight into the message.
void tell(sd_bus* peer)
{
    const auto path = sampleFontPath(0);
    const auto url = fileUrlFromPath(path);
    sd_bus_message* message = nullptr;
    sd_bus_message_new_method_call(peer, &message, nullptr, "/com/vorlan/typhond",
                                   wire::fontAddedInfo.interface, wire::fontAddedInfo.member);
    sd_bus_message_append(message, wire::fontAddedInfo.inTypes, 1, 1, "fontsInfo", "a{sv}", 1, path.c_str(),
                          "a{sv}", 3, "familyName", "a{sv}", 1, samplePostScriptName(0).c_str(), "s",
                          sampleFamilyName(0).c_str(), "registeredBy", "s", sampleProvider(0).c_str(),
                          "scope", "x", std::int64_t(2), 1, 1, url.c_str(), 0);
    sd_bus_message_set_expect_reply(message, 0);
    sd_bus_send(peer, message, nullptr);
    sd_bus_message_unref(message);
}

/// "join" makes a peer one of those that "broadcast" tells.
BareServer::Answers broadcasting()
{
    const auto peers = std::make_shared<std::vector<sd_bus*>>();
    return {{"join",
             [peers](sd_bus_message* call) {
                 peers->push_back(sd_bus_message_get_bus(call));
                 return sd_bus_reply_method_return(call, nullptr);
             }},
            {"broadcast", [peers](sd_bus_message* call) {
                 const int outcome = sd_bus_reply_method_return(call, nullptr);
                 for (auto* peer : *peers) {
                     tell(peer);
                 }
                 return outcome;
             }}};
}

Step changeReport(const RawClient& reporter, const Receivers& receivers)
{
    return timed([&] {
        const auto call = reporter.newCall(wire::fontChanged.interface, wire::fontChanged.member);
        sd_bus_message_append(call.get(), "a{sv}", 3, "urls", "as", 1,
                              fileUrlFromPath(sampleFontPath(0)).c_str(), "added", "b", 1, "kind", "x",
                              std::int64_t(0));
        reporter.send(call);
        receivers.awaitOneEach();
        return 0;
    });
}

Step reportBare(const RawClient& reporter, const Receivers& receivers)
{
    return timed([&] {
        reporter.call(bareInterface, "broadcast");
        receivers.awaitOneEach();
        return 0;
    });
}

void measure(Report& report, std::size_t clients)
{
    ScratchDaemon daemon(registeredFonts, {"font-enumeration"});
    daemon.start();
    const BareServer peer(daemon.folder().real("/bare"), 1, "/", broadcasting());
    const Receivers receivers(daemon.socketPath(), clients, wire::checkin.interface, wire::checkin.member);
    const Receivers bareReceivers(peer.path(), clients, bareInterface, "join");
    const RawClient reporter(daemon.socketPath());
    const RawClient bareReporter(peer.path());
    report.add({fmt::format("one change until the last of {} enumerating clients has it", clients),
                "the same bytes written to as many bare sd-bus peers",
                compare(changeReport(reporter, receivers), reportBare(bareReporter, bareReceivers),
                        {.rounds = 10, .steps = 1, .warmUp = 1}),
                2});
}

}  // namespace

void measureBroadcast(Report& report)
{
    Report::begin("Broadcasting a change");
    measure(report, 1'000);
    measure(report, affordableConnections(10'000));
}

}  // namespace typhon::bench
