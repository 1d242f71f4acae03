#include "clients/font_change_broadcast.h"

namespace typhon {

Task<void> FontChangeBroadcast::fontChanged(PropertyList change, EmptyReply reply)
{
    TYLog_Debug(platform_.log, "received fontChanged notification.");
    // Answered before anything is done. Only the client's next message waits until the broadcast is out,
    // which keeps a client that reports without end from piling up work here.
    reply();
    std::function<void()> work = [this, change] { broadcast(change); };
    auto broadcasting = mainHandlerQueue_.perform(std::move(work));
    co_await std::move(broadcasting);
}

void FontChangeBroadcast::broadcast(const PropertyList& change)
{
    registry_.invalidateUserFonts();
    current_ = std::make_shared<FontChangeShares>(platform_, fontInfo_, change);
    notificationCenter_.post("fontChanged", change);
    current_.reset();
    platform_.notifications.postNotifyCentreNotification(FontProviderDidChangeDistributedNotification);
}

std::shared_ptr<FontChangeShares> FontChangeBroadcast::sharesIn(const PropertyList& notification)
{
    return current_ ? current_ : std::make_shared<FontChangeShares>(platform_, fontInfo_, notification);
}

}  // namespace typhon
