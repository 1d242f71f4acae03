// From starting the daemon to its first answered check-in.

#include "bare_server.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/linux_file_system.h"
#include "platform/linux/signing.h"
#include "protocol/wire.h"
#include "raw_client.h"
#include "rows.h"
#include "scratch_daemon.h"

#include <fcntl.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

/// What any such daemon must do: read the registry, hash the client's program, listen, answer.
double secondsOfBareStart(const ScratchDaemon& system, const std::string& path)
{
    ::unlink(path.c_str());
    const auto begin = secondsNow();
    const LinuxFileSystem files(system.root());
    LinuxFileSystem(system.root()).readPropertyList("/var/mobile/Library/UserFonts/UserFonts.plist");
    const FileDescriptor program(::open("/proc/self/exe", O_RDONLY | O_CLOEXEC));
    sha256OfFile(program.get());
    const BareServer server(path, 1);
    const RawClient client(server.path());
    client.call(bareInterface, "empty");
    return secondsNow() - begin;
}

}  // namespace

void measureStart(Report& report)
{
    Report::begin("Starting");
    ScratchDaemon daemon(5'000, {"font-enumeration"});
    const Step ours = [&] {
        daemon.stop();
        const auto begin = secondsNow();
        daemon.start();
        return secondsNow() - begin;
    };
    const Step peer = [&] { return secondsOfBareStart(daemon, daemon.folder().real("/bare")); };
    report.add({"start to first answered check-in, 5,000 fonts",
                "a process that reads the registry, hashes the client's program and listens",
                compare(ours, peer, {.rounds = 15, .steps = 1, .warmUp = 1}), 2});
}

}  // namespace typhon::bench
