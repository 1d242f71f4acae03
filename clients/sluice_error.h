#pragma once

#include "platform/ipc.h"
#include "platform/log.h"

#include <string>
#include <utility>

namespace typhon {

/// The error handler of a remote proxy: says in the system log what became of a message of that routine.
/// Nothing is retried. `log` outlives it.
inline ErrorHandler sluiceErrorHandler(Log& log, std::string routine)
{
    return [&log, routine = std::move(routine)](const IpcError& error) {
        systemLog(log, "sluice error: " + routine + " - " + error.name + ": " + error.message);
    };
}

}  // namespace typhon
