#pragma once

#include "platform/linux/root_directory.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <optional>
#include <string>

#include <sys/stat.h>

namespace typhon {

/// Decides when the helper has nothing left to live for. One that the service manager starts when it is
/// needed ends after a while without connections. One that the library started ends, too, when its socket is
/// gone, with the folder of its scratch system say, and lives on while a font daemon serves beside it. Any
/// one thread.
class HelperLife {
public:
    struct Options {
        std::chrono::seconds idle = std::chrono::seconds(60);
        /// The service manager holds the socket.
        bool isSocketActivated = false;
    };
    /// The socket is there already.
    HelperLife(RootDirectory root, Options options);

    /// True when no other helper holds the name of the service, or as soon as that is so: the one before this
    /// may have been killed just now.
    static bool awaitName(const RootDirectory& root,
                          std::chrono::milliseconds patience = std::chrono::seconds(10));

    /// Writes the file that tells the process identifier, before there is a socket, so that whoever can
    /// connect can read it. Null, or why it cannot.
    static std::optional<std::string> announce(const RootDirectory& root);
    static void withdraw(const RootDirectory& root);

    /// Why it is time to end, or null. `connections` are those open now.
    std::optional<std::string> reasonToEnd(std::size_t connections,
                                           std::chrono::steady_clock::time_point now);

private:
    bool isSocketMine() const;
    bool isDaemonRunning() const;

    const RootDirectory root_;
    const Options options_;
    std::optional<ino_t> socket_;
    std::optional<std::chrono::steady_clock::time_point> idleSince_;
};

}  // namespace typhon
