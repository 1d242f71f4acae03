#pragma once

#include "clients/font_change_shares.h"
#include "clients/notification_center.h"
#include "platform/platform.h"
#include "platform/task.h"
#include "platform/work_queue.h"
#include "protocol/replies.h"
#include "registry/per_client_font_info.h"
#include "registry/user_font_registry.h"

#include <memory>

namespace typhon {

/// Tells everybody of the changes of fonts that clients report: forgets the registry, posts the notification
/// "fontChanged" to the checked-in clients' handlers and `FontProviderDidChangeDistributedNotification` to
/// the system, all of it on `mainHandlerQueue`.
class FontChangeBroadcast {
public:
    /// Everything given outlives this.
    FontChangeBroadcast(Platform& platform, UserFontRegistry& registry, PerClientFontInfo& fontInfo,
                        NotificationCenter& notificationCenter, WorkQueue& mainHandlerQueue)
        : platform_(platform), registry_(registry), fontInfo_(fontInfo),
          notificationCenter_(notificationCenter), mainHandlerQueue_(mainHandlerQueue)
    {}

    /// `fontChanged:reply:`. Answers at once; the task ends when the change has been broadcast. From any
    /// thread.
    Task<void> fontChanged(PropertyList change, EmptyReply reply);

    /// The shares in the change that a notification is about. On `mainHandlerQueue`; during a broadcast all
    /// handlers get the same object.
    std::shared_ptr<FontChangeShares> sharesIn(const PropertyList& notification);

private:
    void broadcast(const PropertyList& change);

    Platform& platform_;
    UserFontRegistry& registry_;
    PerClientFontInfo& fontInfo_;
    NotificationCenter& notificationCenter_;
    WorkQueue& mainHandlerQueue_;

    // Used on `mainHandlerQueue`.
    /// Those of the change that is being broadcast, else null.
    std::shared_ptr<FontChangeShares> current_;
};

}  // namespace typhon
