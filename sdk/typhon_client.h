#pragma once

#include "platform/ipc.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/root_directory.h"
#include "protocol/wire.h"
#include "sdk/client_result.h"
#include "sdk/font_change_notice.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

class FontOpener;
class ReceivedChanges;
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
    /// `scheduleFontFilesDeletion:`. Has font files deleted after the system's delay; paths outside the two
    /// font trees are ignored. Returns when the daemon has taken the paths over, not when they are recorded.
    ClientResult<Done> scheduleFontFilesDeletion(const std::vector<std::string>& paths);
    /// `resetIssuedFontsFor:reply:`. Forgets the fonts issued to an application. The answer does not tell
    /// whether this process was entitled to that.
    ClientResult<Done> resetIssuedFontsFor(const std::string& identifier);

    /// `fontChanged:reply:`. Reports that fonts came (`added`) or went, by their file URLs; `kind` is 0 for
    /// user-installed fonts, else profile fonts. Answered before anybody is told.
    ClientResult<Done> fontChanged(const std::vector<std::string>& urls, bool added, int kind = 0);

    /// The next change of fonts that the daemon told of since the first check-in, oldest first. Waits for
    /// one, if need be for so long (null: without limit); null when the time is over, or a signal handler
    /// ran.
    ClientResult<std::optional<FontChangeNotice>>
    waitForChange(std::optional<std::chrono::milliseconds> timeout = std::nullopt);
    /// All changes that have arrived, oldest first, without waiting.
    ClientResult<std::vector<FontChangeNotice>> processPending();
    /// Becomes readable when something arrives, or the connection ends. For the program's own poll, once
    /// `processPending` has been called after the last other call of this object. Owned by this object.
    int descriptor() const;
    /// How many changes went unread: 1,024 are kept for a program that does not ask for them.
    std::size_t lostChanges() const;

    /// `checkinForSilkpageProcess:reply:`. Has the daemon pass this application's fonts on to the web-content
    /// process behind that endpoint (see sdk/web_content_process.h). Answered when that process has them, so
    /// never when it is silent: fails with `timeout` after so long, if given.
    ClientResult<Done>
    checkinForSilkpageProcess(const FileDescriptor& endpoint,
                              std::optional<std::chrono::milliseconds> timeout = std::nullopt);

    /// `requestFonts:reply:`. Asks for the fonts of these names; the answer holds those that this process may
    /// use, by path, and `openFont` opens them. The user may be asked, so it can take as long as that takes.
    ClientResult<PropertyList> requestFonts(const std::vector<std::string>& families,
                                            const std::vector<std::string>& postScriptNames);
    /// `requestFonts:forClient:reply:`. For the font picker: has the daemon hand the fonts of a PostScript
    /// name to the application behind that endpoint (see sdk/font_picker_client.h). True when the
    /// application says that it uses them.
    ClientResult<bool> requestFontsForClient(const std::string& postScriptName,
                                             const FileDescriptor& endpoint);

    /// A read-only descriptor of the font file at the logical `path`, through the grant that the last
    /// check-in, or a change or a request since, gave. Fails with `accessDenied` for a file that was not
    /// granted, and with `client_errors::expired` when the daemon was restarted since: check in again with a
    /// new client.
    ClientResult<FileDescriptor> openFont(const std::string& path);
    /// The same with a token of the caller's choice, empty for a file that needs none.
    ClientResult<FileDescriptor> redeem(const Data& token, const std::string& path);

    /// Any other operation (see protocol/wire.h, or describe your own).
    ClientResult<Arguments> call(const wire::Operation& operation, const Arguments& arguments);

    /// The dictionary of the last successful check-in; null before it, or when it was null.
    const std::optional<PropertyList>& lastCheckin() const { return lastCheckin_; }
    const RootDirectory& root() const;

private:
    TyphonClient(RootDirectory root, ServiceConnection daemon);
    ClientResult<std::optional<PropertyList>> checkinWith(const wire::Operation& operation);

    std::unique_ptr<ServiceConnection> daemon_;
    std::unique_ptr<FontOpener> opener_;
    std::unique_ptr<ReceivedChanges> changes_;
    std::optional<PropertyList> lastCheckin_;
};

}  // namespace typhon
