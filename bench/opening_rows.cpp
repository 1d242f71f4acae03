// Opening one granted font file through the directory's token.

#include "bare_server.h"
#include "platform/linux/bus_message.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "sample_registry.h"
#include "scratch_daemon.h"

#include <stdexcept>
#include <variant>

namespace typhon::bench {

namespace {

std::vector<unsigned char> enumerationToken(const ScratchDaemon& daemon)
{
    const RawClient client(daemon.socketPath());
    const auto reply = client.call(wire::typhonProtocol, wire::checkin.member);
    const auto results = readArguments(reply.get(), wire::checkin.outTypes);
    const auto checkin =
        results ? wire::fromNullable(std::get<PropertyList>(results->front())) : std::nullopt;
    const auto* token = checkin ? checkin->find("extension") : nullptr;
    if (token == nullptr || token->asData() == nullptr) {
        throw std::runtime_error("the check-in gave no token");
    }
    const auto& bytes = token->asData()->bytes;
    return {bytes.begin(), bytes.end()};
}

}  // namespace

void measureOpening(Report& report)
{
    Report::begin("Opening a granted font");
    ScratchDaemon daemon(5'000, {"font-enumeration"});
    const auto path = sampleFontPath(0);
    daemon.folder().writeFile(path, std::string(100'000, 'f'));
    daemon.start();
    const BareServer peer(daemon.folder().real("/bare"), 1, daemon.folder().path());
    const RawClient broker(daemon.socketPath("com.vorlan.typhond.file-access"));
    const RawClient bare(peer.path());
    const auto token = enumerationToken(daemon);
    const Step ours = timed([&] { return broker.openGranted(token, path); });
    const Step theirs = timed([&] { return bare.openBare(path.substr(1)); });
    report.add({"open of one granted font through its token", "socket, `openat2`, descriptor back, bare",
                compare(ours, theirs, {.rounds = 40, .steps = 50, .warmUp = 50}), 1.5});
}

}  // namespace typhon::bench
