#pragma once

#include "platform/linux/root_directory.h"
#include "sdk/client_result.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <CLI/CLI.hpp>
#include <nlohmann/json.hpp>

namespace typhon {

inline constexpr int exitSuccess = 0;
inline constexpr int exitFailure = 1;
inline constexpr int exitUsage = 2;

/// What a command gets from the command line beside its own options, and its outcome.
struct Invocation {
    std::optional<std::string> rootOption;
    bool json = false;
    /// The program that "run" starts, and its arguments.
    std::vector<std::string> program;
    int exitCode = exitSuccess;

    RootDirectory root() const;
};

/// Says on standard error what went wrong and what to do about it, and gives the exit code for it.
int fail(std::string_view message, std::string_view advice = {});
int fail(const ClientError& error);

/// Writes to standard output and gives the exit code.
int print(std::string_view text);
int printJson(const nlohmann::json& json);

/// Adds a command that runs `body` when it is the one given. `Options` live as long as the command does.
template <class Options>
CLI::App& addCommand(CLI::App& parent, Invocation& invocation, const std::string& name,
                     const std::string& description,
                     std::function<int(const Invocation&, const Options&)> body,
                     const std::function<void(CLI::App&, Options&)>& declare)
{
    auto options = std::make_shared<Options>();
    CLI::App& command = *parent.add_subcommand(name, description);
    declare(command, *options);
    command.fallthrough();
    command.callback([&invocation, options, body] { invocation.exitCode = body(invocation, *options); });
    return command;
}

/// Each declares one command; `invocation` outlives the parser.
void addKeygenCommand(CLI::App& parser, Invocation& invocation);
void addTrustCommand(CLI::App& parser, Invocation& invocation);
void addSignCommand(CLI::App& parser, Invocation& invocation);
void addRunCommand(CLI::App& parser, Invocation& invocation);
void addCheckinCommand(CLI::App& parser, Invocation& invocation);
void addOpenCommand(CLI::App& parser, Invocation& invocation);
void addMonitorCommand(CLI::App& parser, Invocation& invocation);
void addLedgerCommand(CLI::App& parser, Invocation& invocation);
void addDeletionsCommand(CLI::App& parser, Invocation& invocation);
void addScheduleDeletionCommand(CLI::App& parser, Invocation& invocation);
void addKeepProviderCommand(CLI::App& parser, Invocation& invocation);
void addPreferencesCommand(CLI::App& parser, Invocation& invocation);
void addPlistCommand(CLI::App& parser, Invocation& invocation);
void addFontsCommand(CLI::App& parser, Invocation& invocation);
void addRequestCommand(CLI::App& parser, Invocation& invocation);
void addAgentCommand(CLI::App& parser, Invocation& invocation);
void addAssetsCommand(CLI::App& parser, Invocation& invocation);
void addAnalyticsCommand(CLI::App& parser, Invocation& invocation);
void addApplicationsCommand(CLI::App& parser, Invocation& invocation);
void addPostNotificationCommand(CLI::App& parser, Invocation& invocation);

/// Parses a command line (without the program's own name), runs its command and gives the program's exit
/// code.
int runCommandLine(const std::vector<std::string>& words);

}  // namespace typhon
