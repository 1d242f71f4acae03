#pragma once

#include "sdk/client_result.h"
#include "tools/host_files.h"

#include <string>
#include <utility>
#include <vector>

namespace typhon {

/// What to run in a sandbox. Paths are absolute.
struct SandboxRequest {
    /// The executable itself, with symbolic links resolved.
    std::string executable;
    /// The name by which it is started, perhaps a link.
    std::string command;
    /// Source on the host, destination in the sandbox.
    std::vector<std::pair<std::string, std::string>> binds;
    /// The folder of a scratch system, or empty.
    std::string root;
};

/// The bubblewrap options that make the sandbox, without the command and its arguments. Only reads `host`.
/// Fails when a bind has no source or no place.
ClientResult<std::vector<std::string>> sandboxArguments(const SandboxRequest& request, const HostFiles& host);

}  // namespace typhon
