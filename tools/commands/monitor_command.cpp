#include "platform/linux/file_descriptor.h"
#include "sdk/client_errors.h"
#include "sdk/typhon_client.h"
#include "tools/change_text.h"
#include "tools/commands/command.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <iostream>

#include <poll.h>
#include <sys/signalfd.h>
#include <unistd.h>

// Ends for one of four reasons: it has printed as many changes as it was asked for, the user interrupts it,
// its reader is gone (which it notices without having anything to write), or the daemon is.

namespace typhon {

namespace {

struct Options {
    std::size_t count = 0;
};

/// SIGINT, SIGTERM and SIGHUP as something to poll. They no longer end the process by themselves.
FileDescriptor endingSignals()
{
    sigset_t signals;
    sigemptyset(&signals);
    for (const int number : {SIGINT, SIGTERM, SIGHUP}) {
        sigaddset(&signals, number);
    }
    ::sigprocmask(SIG_BLOCK, &signals, nullptr);
    return FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC));
}

enum class Event { input, end, failure };

Event waitForEvent(const TyphonClient& client, const FileDescriptor& signals)
{
    std::array<pollfd, 3> watched{{{client.descriptor(), POLLIN, 0},
                                   {signals.get(), POLLIN, 0},
                                   // Nothing is waited for but its reader's going.
                                   {STDOUT_FILENO, 0, 0}}};
    while (::poll(watched.data(), watched.size(), -1) < 0) {
        if (errno != EINTR) {
            return Event::failure;
        }
    }
    return watched[1].revents != 0 || watched[2].revents != 0 ? Event::end : Event::input;
}

/// One line; false when nobody reads it.
bool printChange(const Invocation& invocation, const FontChangeNotice& change)
{
    using nlohmann::json;
    std::cout << (invocation.json ? changeJson(change).dump(-1, ' ', false, json::error_handler_t::replace)
                                  : changeText(change))
              << std::endl;
    return static_cast<bool>(std::cout);
}

int printChanges(const Invocation& invocation, const Options& options, TyphonClient& client,
                 const FileDescriptor& signals)
{
    for (std::size_t printed = 0;;) {
        const auto changes = client.processPending();
        if (!changes) {
            return fail(changes.error());
        }
        for (const auto& change : *changes) {
            if (!printChange(invocation, change) || ++printed == options.count) {
                return exitSuccess;
            }
        }
        if (!changes->empty()) {
            continue;
        }
        const auto event = waitForEvent(client, signals);
        if (event != Event::input) {
            return event == Event::end ? exitSuccess : fail(systemError(errno, "cannot wait"));
        }
    }
}

int monitor(const Invocation& invocation, const Options& options)
{
    std::signal(SIGPIPE, SIG_IGN);
    const auto signals = endingSignals();
    auto client = TyphonClient::connect({invocation.rootOption});
    if (!client) {
        return fail(client.error());
    }
    const auto view = client->checkin();
    if (!view) {
        return fail(view.error());
    }
    std::cerr << "typhonctl: checked in" << (*view ? "" : " (without a share in the user's fonts)")
              << "; waiting for changes" << std::endl;
    return printChanges(invocation, options, *client, signals);
}

}  // namespace

void addMonitorCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "monitor",
                        "Check in and print each change of fonts that this program is told of, a line each, "
                        "until interrupted",
                        monitor, [](CLI::App& command, Options& options) {
                            command.add_option("--count", options.count, "End after so many changes")
                                ->type_name("N")
                                ->check(CLI::PositiveNumber);
                        });
}

}  // namespace typhon
