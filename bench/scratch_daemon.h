#pragma once

#include "child.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/scratch_directory.h"
#include "platform/property_list.h"

#include <cstddef>
#include <string>
#include <vector>

namespace typhon::bench {

/// A typhond in a scratch system of its own, in which this program is signed as an application with the
/// given capabilities.
class ScratchDaemon {
public:
    /// Not started yet. `fonts` is the number of registered font files, which are not on disk.
    ScratchDaemon(int fonts, const std::vector<std::string>& capabilities);

    /// Starts it and waits until it answers a check-in.
    void start();
    void stop() { process_.kill(); }

    std::string socketPath(const std::string& service = "com.vorlan.typhond") const;
    pid_t pid() const { return process_.pid(); }
    const ScratchDirectory& folder() const { return folder_; }
    const RootDirectory& root() const { return root_; }

private:
    ScratchDirectory folder_;
    RootDirectory root_{folder_.path()};
    Child process_;
};

/// That many connections, or as many as a daemon can have under this process's limit on descriptors.
std::size_t affordableConnections(std::size_t wanted);

/// The identifier that this program is signed with.
inline constexpr const char* benchIdentifier = "org.example.bench";

}  // namespace typhon::bench
