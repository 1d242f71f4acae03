#pragma once

#include "tools/commands/command.h"

namespace typhon {

/// Declares the commands that change fonts below the command "fonts".
void addFontChangeCommands(CLI::App& fonts, Invocation& invocation);

}  // namespace typhon
