#include "sdk/service_socket.h"
#include "tools/agent/terminal_agent.h"

#include <map>
#include <optional>
#include <string>

#include <CLI/CLI.hpp>

int main(int argumentCount, char** arguments)
{
    CLI::App parser{"Shows the dialog of applications that ask for missing fonts, in this terminal",
                    "typhon-agent"};
    std::optional<std::string> root;
    auto mode = typhon::AnswerMode::ask;
    parser
        .add_option("--root", root, "Folder of a scratch system (default: $TYPHON_ROOT, else this machine)")
        ->type_name("DIR");
    const std::map<std::string, typhon::AnswerMode> modes{{"ask", typhon::AnswerMode::ask},
                                                          {"first", typhon::AnswerMode::first},
                                                          {"none", typhon::AnswerMode::none}};
    parser
        .add_option_function<std::string>(
            "--answer", [&](const std::string& how) { mode = modes.at(how); },
            "ask (the user, the default), first (switch every font on from its first provider) or "
            "none; the last two need no terminal")
        ->type_name("HOW")
        ->check(CLI::IsMember({"ask", "first", "none"}));
    try {
        parser.parse(argumentCount, arguments);
    } catch (const CLI::ParseError& error) {
        return parser.exit(error) == 0 ? 0 : 2;
    }
    return typhon::TerminalAgent(typhon::chosenRoot(root), mode).run();
}
