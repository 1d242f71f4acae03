#pragma once

#include "platform/linux/root_directory.h"
#include "sdk/client_result.h"

#include <string>
#include <utility>
#include <vector>

namespace typhon {

/// Runs `executable` (a path, or a name looked up in PATH) in a sandbox that carries its identity: typhond is
/// told of the sandbox's first process and the executable before the program starts. Gives the program's
/// exit status. Writes a note to stderr when the executable has no signature on this system, and so no
/// identity.
ClientResult<int> runInSandbox(const RootDirectory& root, const std::string& executable,
                               const std::vector<std::string>& arguments,
                               const std::vector<std::pair<std::string, std::string>>& binds);

}  // namespace typhon
