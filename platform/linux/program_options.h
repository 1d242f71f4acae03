#pragma once

#include "platform/linux/linux_log.h"

#include <cstdlib>
#include <filesystem>
#include <string>

#include <CLI/CLI.hpp>

namespace typhon {

/// What every program that serves the system accepts.
struct ProgramOptions {
    /// Absolute once it is parsed; empty for the system itself.
    std::string root;
    LogLevel logLevel = LogLevel::defaultLevel;
};

/// Adds `--root` and `--log-level`. `options` outlives the parsing.
inline void addProgramOptions(CLI::App& app, ProgramOptions& options)
{
    app.add_option("--root", options.root, "Put every path of the system under this folder")
        ->type_name("DIR");
    app.add_option_function<std::string>(
           "--log-level",
           [&options](const std::string& level) { options.logLevel = *logLevelFromName(level); },
           "Least level that is logged")
        ->type_name("LEVEL")
        ->check(CLI::IsMember({"debug", "default", "error"}));
}

/// Reads the command line. Ends the process after `--help`, and with status 2 when it cannot be understood.
inline void parseProgramOptions(CLI::App& app, int argc, char** argv, ProgramOptions& options)
{
    try {
        app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
        std::exit(app.exit(error) == 0 ? 0 : 2);
    }
    if (!options.root.empty()) {
        options.root = std::filesystem::absolute(options.root).lexically_normal().string();
    }
}

}  // namespace typhon
