#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/property_list.h"
#include "sdk/client_result.h"

#include <chrono>
#include <memory>
#include <optional>
#include <string>

namespace typhon {

/// The part of a process that shows web content for an application: it listens at an endpoint, which it hands
/// to the application, and receives that application's fonts there, with grants of its own. The process that
/// calls `listen` is the one that the grants are for. One thread at a time.
class WebContentProcess {
public:
    struct Options {
        /// Folder of a scratch system. Null: the environment's TYPHON_ROOT, else the machine itself.
        std::optional<std::string> root;
    };

    /// What the daemon passed on: the dictionary of a check-in, or null when the application has no share in
    /// the fonts.
    struct Fonts {
        std::optional<PropertyList> info;
    };

    /// Makes the endpoint, in /run/typhon, the user's runtime directory, /tmp or /dev/shm.
    static ClientResult<WebContentProcess> listen(const Options& options);
    static ClientResult<WebContentProcess> listen() { return listen(Options{}); }

    WebContentProcess(WebContentProcess&&) noexcept;
    WebContentProcess& operator=(WebContentProcess&&) noexcept;
    ~WebContentProcess();

    /// The endpoint, to be sent to the application (as a message's ancillary data, or by inheritance), which
    /// passes it to `TyphonClient::checkinForSilkpageProcess`. Owned by this object. Whoever holds it can
    /// talk to this process.
    const FileDescriptor& endpoint() const;

    /// Answers the daemon until it has passed on fonts, and keeps them for `openFont`. Waits for so long
    /// (null: without limit); null when the time is over, or a signal handler ran.
    ClientResult<std::optional<Fonts>>
    waitForFonts(std::optional<std::chrono::milliseconds> timeout = std::nullopt);

    /// A read-only descriptor of the font file at the logical `path`, through the grant that was passed on.
    ClientResult<FileDescriptor> openFont(const std::string& path);

private:
    struct Parts;
    explicit WebContentProcess(std::unique_ptr<Parts> parts);
    std::unique_ptr<Parts> parts_;
};

}  // namespace typhon
