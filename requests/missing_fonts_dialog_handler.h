#pragma once

#include "platform/ipc.h"
#include "platform/platform.h"
#include "protocol/font_install_view_service_protocol.h"

#include <functional>
#include <memory>
#include <mutex>

namespace typhon {

/// Stands between the daemon and the service that shows one missing-fonts dialog: makes the listener through
/// which the service answers, has the alert shown, and passes the answer on. Made with `make_shared`. Goes
/// when the daemon has made another one and nobody is connected any more, and its listener with it.
class MissingFontsDialogHandler final : public FontInstallViewServiceProtocol,
                                        public ListenerDelegate,
                                        public ExportedObject,
                                        public std::enable_shared_from_this<MissingFontsDialogHandler> {
public:
    /// Gets the answer, one dictionary for each font the user decided about.
    using CompletionHandler = std::function<Task<void>(PropertyList::Array answers)>;

    /// `initWithTyphonDaemon:completionHandler:`. The daemon, which holds its current handler, is held while
    /// an answer is dealt with; answers that come after its end are ignored. `platform` outlives this.
    MissingFontsDialogHandler(Platform& platform, std::weak_ptr<void> typhonDaemon,
                              CompletionHandler completionHandler);
    ~MissingFontsDialogHandler() override;
    MissingFontsDialogHandler(const MissingFontsDialogHandler&) = delete;
    MissingFontsDialogHandler& operator=(const MissingFontsDialogHandler&) = delete;

    /// `showDialogWithUserInfo:`. Starts the alert and returns at once.
    void showDialogWithUserInfo(PropertyList userInfo);

    /// `listener:shouldAcceptNewConnection:`. Accepts everybody: only the alert was told of the listener.
    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;

    /// `doneWithMissingFonts:`. On the queue of the service's connection, which is held until the answer is
    /// dealt with. Closes the listener; a connection that is open stays, and may answer again.
    Task<void> doneWithMissingFonts(PropertyList::Array answers) override;

    /// Calls of the dialog service.
    Task<void> handle(std::shared_ptr<IncomingCall> call) override;

    std::shared_ptr<void> daemon() const { return daemon_.lock(); }
    const CompletionHandler& completionHandler() const { return completionHandler_; }
    /// Null before the dialog is shown and after it was answered. Any thread.
    std::shared_ptr<Listener> listener() const;
    void setListener(std::shared_ptr<Listener> listener);

private:
    void closeListener();

    Platform& platform_;
    const std::weak_ptr<void> daemon_;
    const CompletionHandler completionHandler_;

    mutable std::mutex mutex_;
    // Protected by mutex_: set on `mainHandlerQueue`, cleared on the queue of the service's connection.
    std::shared_ptr<Listener> listener_;
};

}  // namespace typhon
