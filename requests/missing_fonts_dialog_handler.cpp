#include "requests/missing_fonts_dialog_handler.h"

#include "protocol/wire.h"

namespace typhon {

namespace {

const HWSRemoteAlertDefinition alertDefinition{"com.vorlan.FontInstallViewService",
                                               "FontInstallMissingController"};

}  // namespace

MissingFontsDialogHandler::MissingFontsDialogHandler(Platform& platform, std::weak_ptr<void> typhonDaemon,
                                                     CompletionHandler completionHandler)
    : platform_(platform), daemon_(std::move(typhonDaemon)), completionHandler_(std::move(completionHandler))
{}

MissingFontsDialogHandler::~MissingFontsDialogHandler()
{
    closeListener();
}

void MissingFontsDialogHandler::showDialogWithUserInfo(PropertyList userInfo)
{
    auto answers = platform_.ipc.anonymousListener();
    answers->setDelegate(weak_from_this());
    // The handle is let go of, which leaves the alert up.
    const auto handle = platform_.remoteAlerts.newHandle(alertDefinition, {answers->endpoint()});
    setListener(answers);
    answers->resume();
    handle->activateWithContext({std::move(userInfo)});
}

bool MissingFontsDialogHandler::listener(Listener& /*listener*/,
                                         std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    shouldAcceptNewConnection->setExportedInterfaces(wire::fontInstallViewServiceInterfaces());
    shouldAcceptNewConnection->setExportedObject(shared_from_this());
    shouldAcceptNewConnection->resume();
    return true;
}

Task<void> MissingFontsDialogHandler::doneWithMissingFonts(PropertyList::Array answers)
{
    const auto self = shared_from_this();
    const auto daemon = daemon_.lock();
    if (daemon && completionHandler_) {
        auto handling = completionHandler_(std::move(answers));
        co_await std::move(handling);
    }
    closeListener();
}

Task<void> MissingFontsDialogHandler::handle(std::shared_ptr<IncomingCall> call)
{
    auto answering = doneWithMissingFonts(*std::get<PropertyList>(call->arguments().at(0)).asArray());
    co_await std::move(answering);
    // The operation has no reply block; a caller that expects a reply gets an empty one.
    call->reply({});
}

std::shared_ptr<Listener> MissingFontsDialogHandler::listener() const
{
    const std::lock_guard lock(mutex_);
    return listener_;
}

void MissingFontsDialogHandler::setListener(std::shared_ptr<Listener> listener)
{
    const std::lock_guard lock(mutex_);
    listener_.swap(listener);
}

void MissingFontsDialogHandler::closeListener()
{
    const auto closing = listener();
    setListener(nullptr);
    if (closing) {
        closing->invalidate();
    }
}

}  // namespace typhon
