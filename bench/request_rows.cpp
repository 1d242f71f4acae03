// A document's request for fonts that are all there.

#include "bare_server.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "requests/font_name_resolution.h"
#include "rows.h"
#include "sample_registry.h"
#include "scratch_daemon.h"

#include <stdexcept>
#include <vector>

#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr int fonts = 5'000;
constexpr int names = 10;
constexpr int facesOfFamily = 4;

/// Families all of whose fonts are switched on, spread over the registry.
std::vector<int> chosenFamilies()
{
    std::vector<int> families;
    for (int family = 0; static_cast<int>(families.size()) < names; family += 70) {
        // Every seventh font is switched off, beginning with number 6.
        families.push_back(family);
    }
    return families;
}

RawClient::Message requestCall(const RawClient& client, const char* interface, const char* member)
{
    auto call = client.newCall(interface, member);
    auto* message = call.get();
    sd_bus_message_open_container(message, 'a', "a{sv}");
    for (const int family : chosenFamilies()) {
        sd_bus_message_append(message, "a{sv}", 1, kLFFontFamilyNameAttribute, "s",
                              sampleFamilyName(family * facesOfFamily).c_str());
    }
    sd_bus_message_close_container(message);
    return call;
}

/// The same reply, straight into the message.
int answerBare(sd_bus_message* call)
{
    sd_bus_message* reply = nullptr;
    sd_bus_message_new_method_return(call, &reply);
    sd_bus_message_open_container(reply, 'a', "{sv}");
    for (const int family : chosenFamilies()) {
        for (int index = family * facesOfFamily; index < (family + 1) * facesOfFamily; ++index) {
            sd_bus_message_append(
                reply, "{sv}", sampleFontPath(index).c_str(), "a{sv}", 3, "familyName", "a{sv}", 1,
                samplePostScriptName(index).c_str(), "s", sampleFamilyName(index).c_str(), "registeredBy",
                "s", sampleProvider(index % sampleProviders).c_str(), "scope", "x", std::int64_t(2));
        }
    }
    sd_bus_message_close_container(reply);
    const int outcome = sd_bus_send(nullptr, reply, nullptr);
    sd_bus_message_unref(reply);
    return outcome < 0 ? outcome : 1;
}

int entriesIn(sd_bus_message* reply)
{
    int entries = 0;
    sd_bus_message_enter_container(reply, 'a', "{sv}");
    while (sd_bus_message_skip(reply, "{sv}") > 0) {
        ++entries;
    }
    return entries;
}

/// Seconds from the call to its reply. The daemon pauses for a second after each reply before it takes the
/// next request, so both sides rest for longer than that before each call, and are woken by some others.
Step request(const RawClient& client, const wire::Operation& operation, const char* wakingMember)
{
    return [&client, interface = operation.interface, member = operation.member, wakingMember] {
        ::usleep(1'200'000);
        for (int call = 0; call < 20; ++call) {
            client.call(interface, wakingMember);
        }
        const auto call = requestCall(client, interface, member);
        const auto begin = secondsNow();
        const auto reply = client.send(call);
        const auto seconds = secondsNow() - begin;
        if (entriesIn(reply.get()) != names * facesOfFamily) {
            throw std::runtime_error("the reply is another one");
        }
        return seconds;
    };
}

}  // namespace

void measureRequest(Report& report)
{
    Report::begin("A satisfied request");
    ScratchDaemon daemon(fonts, {"app-usage"});
    daemon.start();
    const BareServer peer(daemon.folder().real("/bare"), 1, "/", {{"request", answerBare}});
    const RawClient client(daemon.socketPath());
    const RawClient bare(peer.path());
    const wire::Operation bareRequest{bareInterface, "request", "aa{sv}", "a{sv}"};
    report.add({"a satisfied request of 10 names, 5,000 faces, until the reply is received",
                "bare sd-bus call that builds the same reply",
                compare(request(client, wire::requestFonts, wire::checkin.member),
                        request(bare, bareRequest, "view"), {.rounds = 8, .steps = 1, .warmUp = 1}),
                2});
}

}  // namespace typhon::bench
