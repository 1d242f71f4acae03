#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/property_list.h"
#include "sdk/client_result.h"

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <string>

namespace typhon {

/// An application's side of the system font picker: it listens at an endpoint, which it hands to the picker,
/// and receives there the fonts that the user picked, with grants of its own. One thread at a time.
class FontPickerClient {
public:
    struct Options {
        /// Folder of a scratch system. Null: the environment's TYPHON_ROOT, else the machine itself.
        std::optional<std::string> root;
    };
    /// Gets fonts by path, and says whether the application uses them.
    using Activate = std::function<bool(const PropertyList& fonts)>;

    /// Makes the endpoint, in /run/typhon, the user's runtime directory, /tmp or /dev/shm.
    static ClientResult<FontPickerClient> listen(const Options& options);
    static ClientResult<FontPickerClient> listen() { return listen(Options{}); }

    FontPickerClient(FontPickerClient&&) noexcept;
    FontPickerClient& operator=(FontPickerClient&&) noexcept;
    ~FontPickerClient();

    /// The endpoint, to be sent to the picker, which passes it to `TyphonClient::requestFontsForClient`.
    /// Owned by this object. Whoever holds it can talk to this process.
    const FileDescriptor& endpoint() const;

    /// Answers the daemon until fonts were picked and `activate` was asked about them. Waits for so long
    /// (null: without limit); false when the time is over, or a signal handler ran.
    ClientResult<bool> waitForFonts(const Activate& activate,
                                    std::optional<std::chrono::milliseconds> timeout = std::nullopt);

    /// A read-only descriptor of the font file at the logical `path`, through the grants of the latest fonts.
    ClientResult<FileDescriptor> openFont(const std::string& path);

private:
    struct Parts;
    explicit FontPickerClient(std::unique_ptr<Parts> parts);
    std::unique_ptr<Parts> parts_;
};

}  // namespace typhon
