#pragma once

#include "platform/linux/root_directory.h"
#include "sdk/client_result.h"
#include "sdk/service_connection.h"

#include <optional>
#include <string>

namespace typhon {

/// Where the helper's program is looked for: beside the running executable, else among the system's.
std::optional<std::string> helperProgram();

/// A connection to the helper. Where no service manager keeps its socket and it does not run, it is started
/// first, detached from this process, once also if several ask for it at the same time; that needs write
/// access to /run/typhon, which programs in sandboxes do not have. `program` is its executable (null: the one
/// that is found). Blocks until the helper answers.
ClientResult<ServiceConnection> connectToHelper(const RootDirectory& root,
                                                const std::optional<std::string>& program);

}  // namespace typhon
