#include "tools/commands/command.h"

#include "platform/linux/visible_text.h"
#include "sdk/service_socket.h"
#include "tools/property_list_json.h"

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
    return fail(error.message + " (" + error.name + ")", error.advice);
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

int runCommandLine(int argumentCount, const char* const* arguments)
{
    CLI::App parser{"Keys, signatures, sandboxes, check-ins and preferences of typhond", "typhonctl"};
    Invocation invocation;
    parser
        .add_option("--root", invocation.rootOption,
                    "Folder of a scratch system (default: $TYPHON_ROOT, else this machine)")
        ->type_name("DIR");
    parser.add_flag("--json", invocation.json, "Print JSON; data as base64");
    parser.require_subcommand(1);
    for (const auto add :
         {addKeygenCommand, addTrustCommand, addSignCommand, addRunCommand, addCheckinCommand, addOpenCommand,
          addLedgerCommand, addPreferencesCommand, addPlistCommand, addFontsCommand}) {
        add(parser, invocation);
    }
    try {
        parser.parse(argumentCount, arguments);
    } catch (const CLI::ParseError& error) {
        return parser.exit(error, std::cout, std::cerr) == 0 ? exitSuccess : exitUsage;
    }
    return invocation.exitCode;
}

}  // namespace typhon
