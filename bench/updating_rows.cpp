// The smallest call there is, with few and with many connections.

#include "bare_server.h"
#include "idle_clients.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "scratch_daemon.h"

#include <fmt/format.h>

namespace typhon::bench {

void measureUpdating(Report& report)
{
    Report::begin("updatingUserFonts: with 10 and with 10,000 connections");
    const auto connections = affordableConnections(10'000);
    ScratchDaemon few(10, {"font-enumeration"});
    ScratchDaemon many(10, {"font-enumeration"});
    few.start();
    many.start();
    const BareServer fewPeer(few.folder().real("/bare"), 1);
    const BareServer manyPeer(many.folder().real("/bare"), 1);
    const char* member = wire::updatingUserFonts.member;
    const IdleClients fewIdle(few.socketPath(), 9, wire::typhonProtocol, member);
    const IdleClients fewBareIdle(fewPeer.path(), 9, bareInterface, "empty");
    const IdleClients manyIdle(many.socketPath(), connections - 1, wire::typhonProtocol, member);
    const IdleClients manyBareIdle(manyPeer.path(), connections - 1, bareInterface, "empty");
    const RawClient fewClient(few.socketPath());
    const RawClient manyClient(many.socketPath());
    const RawClient fewBare(fewPeer.path());
    const RawClient manyBare(manyPeer.path());

    const auto ours = [&](const RawClient& client) {
        return timed([&client, member] { return client.call(wire::typhonProtocol, member); });
    };
    const auto bare = [](const RawClient& client) {
        return timed([&client] { return client.call(bareInterface, "empty"); });
    };
    const Effort effort{.rounds = 40, .steps = 100, .warmUp = 100};
    report.add({"`updatingUserFonts:`, 10 connections", "bare sd-bus call, 10 connections",
                compare(ours(fewClient), bare(fewBare), effort), 1.5});
    const auto work = fmt::format("`updatingUserFonts:`, {} connections", connections);
    report.add({work, "bare sd-bus call, as many connections",
                compare(ours(manyClient), bare(manyBare), effort), 1.5});
    report.add(
        {work, "the same with 10 connections", compare(ours(manyClient), ours(fewClient), effort), 1.3});
}

}  // namespace typhon::bench
