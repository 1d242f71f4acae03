#include "sdk/client_errors.h"
#include "tools/commands/command.h"

#include <cerrno>
#include <filesystem>
#include <system_error>

#include <unistd.h>

namespace typhon {

namespace {

struct Options {
    std::string answer = "ask";
};

/// The agent is a program of its own, with a signature of its own; it lies beside this one.
std::string agentProgram()
{
    std::error_code error;
    const auto own = std::filesystem::read_symlink("/proc/self/exe", error);
    return error ? "typhon-agent" : (own.parent_path() / "typhon-agent").string();
}

int becomeAgent(const Invocation& invocation, const Options& options)
{
    const auto program = agentProgram();
    std::vector<std::string> words{program, "--answer", options.answer};
    if (invocation.root().isScratch()) {
        words.insert(words.end(), {"--root", invocation.root().directory()});
    }
    std::vector<char*> arguments;
    arguments.reserve(words.size() + 1);
    for (auto& word : words) {
        arguments.push_back(word.data());
    }
    arguments.push_back(nullptr);
    ::execv(program.c_str(), arguments.data());
    return fail(systemError(errno, "cannot start " + program));
}

}  // namespace

void addAgentCommand(CLI::App& parser, Invocation& invocation)
{
    addCommand<Options>(parser, invocation, "agent",
                        "Show the dialog of applications that ask for missing fonts, in this terminal",
                        becomeAgent, [](CLI::App& command, Options& options) {
                            command
                                .add_option("--answer", options.answer,
                                            "ask (the default), or answer by itself: first (switch every "
                                            "font on from its first provider) or none")
                                ->check(CLI::IsMember({"ask", "first", "none"}))
                                ->type_name("HOW");
                        });
}

}  // namespace typhon
