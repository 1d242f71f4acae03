#pragma once

#include <optional>
#include <string>

#include <sys/types.h>

namespace typhon {

/// Starts the program with `control` as its standard input and nothing else of this process; its process,
/// which the caller waits for, or the negative errno.
pid_t startProgram(const std::string& program, int control);

/// The program of that name that belongs to this one, which is to be executed as it stands: beside the
/// running executable, in the folder of the services beside that one, else among the system's.
std::optional<std::string> installedProgram(const std::string& name);

}  // namespace typhon
