#include "tools/commands/command.h"

#include "platform/ipc.h"
#include "platform/linux/visible_text.h"
#include "sdk/client_errors.h"
#include "sdk/service_socket.h"
#include "tools/commands/program_words.h"
#include "tools/property_list_json.h"

#include <algorithm>
#include <iostream>

namespace typhon {

RootDirectory Invocation::root() const
{
    return chosenRoot(rootOption);
}

int fail(std::string_view message, std::string_view advice)
{
    std::cerr << "typhonctl: " << visibleText(message) << "\n";
    if (!advice.empty()) {
        std::cerr << "  " << advice << "\n";
    }
    return exitFailure;
}

int fail(const ClientError& error)
{
    const bool saysMore = error.name != ipc_errors::failed && error.name != client_errors::fileNotFound &&
                          error.name != client_errors::serviceUnknown;
    return fail(saysMore ? error.message + " (" + error.name + ")" : error.message, error.advice);
}

int print(std::string_view text)
{
    std::cout << text << std::flush;
    return std::cout ? exitSuccess : fail("cannot write to standard output");
}

int printJson(const nlohmann::json& json)
{
    return print(jsonText(json) + "\n");
}

namespace {

int failToParse(const CLI::App& parser, const CLI::ParseError& error)
{
    if (error.get_exit_code() == 0) {
        return parser.exit(error, std::cout, std::cerr);
    }
    const auto rest = parser.remaining(true);
    const bool isUnknown = !rest.empty() && parser.get_subcommands().empty();
    fail(isUnknown ? "there is no command \"" + rest.front() + "\"" : std::string(error.what()),
         "See typhonctl --help and typhonctl COMMAND --help.");
    return exitUsage;
}

void addCommands(CLI::App& parser, Invocation& invocation)
{
    for (const auto add : {addKeygenCommand,       addTrustCommand,
                           addSignCommand,         addRunCommand,
                           addCheckinCommand,      addOpenCommand,
                           addMonitorCommand,      addLedgerCommand,
                           addDeletionsCommand,    addScheduleDeletionCommand,
                           addKeepProviderCommand, addPreferencesCommand,
                           addPlistCommand,        addFontsCommand,
                           addRequestCommand,      addAgentCommand,
                           addAssetsCommand,       addAnalyticsCommand,
                           addApplicationsCommand, addPostNotificationCommand}) {
        add(parser, invocation);
    }
}

}  // namespace

int runCommandLine(const std::vector<std::string>& words)
{
    CLI::App parser{"Fonts, what programs see of them, signatures, sandboxes and administration",
                    "typhonctl"};
    Invocation invocation;
    parser
        .add_option("--root", invocation.rootOption,
                    "Folder of a scratch system (default: $TYPHON_ROOT, else this machine)")
        ->type_name("DIR");
    parser.add_flag("--json", invocation.json, "Print JSON; data as base64");
    parser.require_subcommand(1);
    addCommands(parser, invocation);
    auto split = splitCommandLine(words);
    invocation.program = std::move(split.program);
    try {
        // The parser takes the last word first.
        std::reverse(split.own.begin(), split.own.end());
        parser.parse(std::move(split.own));
    } catch (const CLI::ParseError& error) {
        return failToParse(parser, error);
    }
    return invocation.exitCode;
}

}  // namespace typhon
