#pragma once

#include "child.h"

#include <cstddef>
#include <functional>
#include <map>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon::bench {

/// What the system stands on and nothing more: a process that serves plain sd-bus connections from one epoll
/// loop. It answers "empty" with nothing, "view" with a sealed memory file opened anew, and "open" (a path
/// below its folder) with a descriptor from `openat2`.
class BareServer {
public:
    /// Answers a call, and gives what sd-bus gave.
    using Answer = std::function<int(sd_bus_message* call)>;
    /// By member.
    using Answers = std::map<std::string, Answer>;

    /// Listens at `path`. The memory file has `viewBytes`; "open" works in `folder`. `more` is what it
    /// answers besides.
    BareServer(std::string path, std::size_t viewBytes, const std::string& folder = "/", Answers more = {});

    const std::string& path() const { return path_; }
    pid_t pid() const { return process_.pid(); }

private:
    std::string path_;
    Child process_;
};

/// A listening stream socket at `path`, which must fit an address.
int listenAt(const std::string& path);

}  // namespace typhon::bench
