#include "tools/commands/command.h"
#include "tools/sandbox_launcher.h"

#include <utility>
#include <vector>

namespace typhon {

namespace {

struct Options {
    std::vector<std::pair<std::string, std::string>> binds;
};

int run(const Invocation& invocation, const Options& options, std::vector<std::string> words)
{
    if (!words.empty() && words.front() == "--") {
        words.erase(words.begin());
    }
    if (words.empty()) {
        fail("run needs an executable", "typhonctl run [--bind SRC DST]... [--] EXECUTABLE [ARG]...");
        return exitUsage;
    }
    const auto executable = words.front();
    words.erase(words.begin());
    const auto outcome = runInSandbox(invocation.root(), executable, words, options.binds);
    return outcome ? *outcome : fail(outcome.error());
}

}  // namespace

// What follows the first word that is no option of "run" belongs to the program, whatever it looks like.
void addRunCommand(CLI::App& parser, Invocation& invocation)
{
    auto options = std::make_shared<Options>();
    CLI::App& command =
        *parser.add_subcommand("run", "Run a program in a sandbox, under its signed identity");
    command.footer(
        "EXECUTABLE [ARG]... follow, after an optional \"--\". The program sees the host read-only, without "
        "the font files, the network, /run and /tmp, but with typhon's sockets. Standard input and output "
        "are passed through, and so are the exit status and signals.");
    command
        .add_option(
            "--bind", options->binds,
            "Put SRC of the host at DST in the sandbox, which need not exist on the host; the program "
            "may write to it where you may (repeatable)")
        ->allow_extra_args(false)
        ->type_name("SRC DST");
    command.prefix_command();
    command.callback([&invocation, options, &command] {
        invocation.exitCode = run(invocation, *options, command.remaining());
    });
}

}  // namespace typhon
