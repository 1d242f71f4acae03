#include "tools/commands/command.h"
#include "tools/sandbox_launcher.h"

#include <utility>
#include <vector>

namespace typhon {

namespace {

struct Options {
    std::vector<std::pair<std::string, std::string>> binds;
};

int run(const Invocation& invocation, const Options& options)
{
    if (invocation.program.empty()) {
        fail("run needs an executable", "typhonctl run [--bind SRC DST]... [--] EXECUTABLE [ARG]...");
        return exitUsage;
    }
    const std::vector<std::string> arguments(invocation.program.begin() + 1, invocation.program.end());
    const auto outcome =
        runInSandbox(invocation.root(), invocation.program.front(), arguments, options.binds);
    return outcome ? *outcome : fail(outcome.error());
}

void declare(CLI::App& command, Options& options)
{
    command
        .add_option(
            "--bind", options.binds,
            "Put SRC of the host at DST in the sandbox, which need not exist on the host; the program "
            "may write to it where you may (repeatable)")
        ->allow_extra_args(false)
        ->type_name("SRC DST");
    // Shown by --help only: the words were taken off the command line before it is parsed.
    command.add_option("program", "What to run; all that follows it is its own")
        ->type_name("EXECUTABLE [ARG]...");
    command.footer("The program sees the host read-only, without the font files, the network and /run, "
                   "but with typhon's sockets. Standard input and output are passed through, and so are the "
                   "exit status and signals.");
}

}  // namespace

void addRunCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "run", "Run a program in a sandbox, under its signed identity",
                        run, declare);
}

}  // namespace typhon
