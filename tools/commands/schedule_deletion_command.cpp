#include "sdk/typhon_client.h"
#include "tools/commands/command.h"

#include <string>
#include <vector>

namespace typhon {

namespace {

struct Options {
    std::vector<std::string> paths;
};

int scheduleDeletion(const Invocation& invocation, const Options& options)
{
    auto client = TyphonClient::connect({invocation.rootOption});
    if (!client) {
        return fail(client.error());
    }
    const auto done = client->scheduleFontFilesDeletion(options.paths);
    if (!done) {
        return fail(done.error());
    }
    return invocation.json ? printJson({{"handedOver", options.paths}})
                           : print("Handed over; typhonctl deletions shows what is scheduled.\n");
}

void declare(CLI::App& command, Options& options)
{
    command
        .add_option("paths", options.paths,
                    "Absolute paths of font files in the two font trees; others are ignored")
        ->required()
        ->type_name("PATH");
}

}  // namespace

void addScheduleDeletionCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "schedule-deletion",
                        "Have font files deleted after the system's delay", scheduleDeletion, declare);
}

}  // namespace typhon
