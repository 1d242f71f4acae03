// What a connection costs that does nothing.

#include "bare_server.h"
#include "idle_clients.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "scratch_daemon.h"

namespace typhon::bench {

namespace {

constexpr std::size_t connections = 2'000;

/// Bytes a connection: what the server has grown by, once the first few have made it allocate its basis.
template <class Connect>
double bytesEach(pid_t server, Connect connect)
{
    const auto first = connect(200);
    const double before = privateBytesOf(server);
    const auto idle = connect(connections);
    return (privateBytesOf(server) - before) / static_cast<double>(connections);
}

}  // namespace

void measureIdleConnections(Report& report)
{
    Report::begin("Idle connections");
    const Step ours = [] {
        ScratchDaemon daemon(10, {"font-enumeration"});
        daemon.start();
        return bytesEach(daemon.pid(), [&](std::size_t count) {
            return IdleClients(daemon.socketPath(), count, wire::typhonProtocol,
                               wire::updatingUserFonts.member);
        });
    };
    const Step peer = [] {
        const ScratchDirectory folder;
        const BareServer server(folder.real("/bare"), 1);
        return bytesEach(server.pid(), [&](std::size_t count) {
            return IdleClients(server.path(), count, bareInterface, "empty");
        });
    };
    const Effort effort{.rounds = 3, .steps = 1, .warmUp = 0};
    report.add({"memory of an idle connection", "bare sd-bus server with its own epoll",
                compare(ours, peer, effort), 1.5, Unit::bytes});
}

}  // namespace typhon::bench
