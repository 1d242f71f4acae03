#pragma once

#include "platform/ipc.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "protocol/wire.h"
#include "sdk/client_result.h"

#include <memory>
#include <optional>
#include <string>

namespace typhon {

class ServiceConnection;

/// An application's connection to the font daemon. Every call blocks until the daemon has answered, without
/// limit, and fails at once when the connection ends; then make a new client and check in again. One thread
/// at a time may use an object; different objects are independent.
class TyphonClient {
public:
    struct Options {
        /// Folder of a scratch system. Null: the environment's TYPHON_ROOT, else the machine itself.
        std::optional<std::string> root;
    };

    /// Connects to the daemon. What this process may do is decided when it checks in.
    static ClientResult<TyphonClient> connect(const Options& options);
    static ClientResult<TyphonClient> connect() { return connect(Options{}); }

    TyphonClient(TyphonClient&&) noexcept;
    TyphonClient& operator=(TyphonClient&&) noexcept;
    ~TyphonClient();

    /// `checkin:`. The fonts that this process may see ("fontsInfo": path to entry) and its file-access
    /// tokens, or null when it has no share in the fonts. Kept for `openFont`.
    ClientResult<std::optional<PropertyList>> checkin();
    /// `checkinForFontPicker:`. The same for the system font picker; null for any other program.
    ClientResult<std::optional<PropertyList>> checkinForFontPicker();
    /// `updatingUserFonts:`. Returns when the daemon reads no registry any more: fonts may now be changed.
    ClientResult<Done> updatingUserFonts();
    /// `resetIssuedFontsFor:reply:`. Forgets the fonts issued to an application. The answer does not tell
    /// whether this process was entitled to that.
    ClientResult<Done> resetIssuedFontsFor(const std::string& identifier);

    /// A read-only descriptor of the font file at the logical `path`, through the grant that the last
    /// check-in gave. Fails with `accessDenied` for a file that was not granted, and with
    /// `client_errors::expired` when the daemon was restarted since: check in again with a new client.
    ClientResult<FileDescriptor> openFont(const std::string& path);
    /// The same with a token of the caller's choice, empty for a file that needs none.
    ClientResult<FileDescriptor> redeem(const Data& token, const std::string& path);

    /// Any other operation (see protocol/wire.h, or describe your own).
    ClientResult<Arguments> call(const wire::Operation& operation, const Arguments& arguments);

    /// The dictionary of the last successful check-in; null before it, or when it was null.
    const std::optional<PropertyList>& lastCheckin() const { return lastCheckin_; }
    const RootDirectory& root() const { return root_; }

private:
    TyphonClient(RootDirectory root, ServiceConnection daemon);
    ClientResult<std::optional<PropertyList>> checkinWith(const wire::Operation& operation);
    ClientResult<FileDescriptor> openWithOwnAccess(const std::string& path) const;
    ClientResult<ServiceConnection*> broker();

    RootDirectory root_;
    std::unique_ptr<ServiceConnection> daemon_;
    /// Made when the first file is opened.
    std::unique_ptr<ServiceConnection> broker_;
    std::optional<PropertyList> lastCheckin_;
};

}  // namespace typhon
