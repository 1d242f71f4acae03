#pragma once

#include "platform/linux/bus_message_codec.h"

#include <cstddef>

namespace typhon {

/// One of the two services that announce notifications on the system bus. Its interface has the same name.
struct NotificationService {
    const char* name;
    const char* path;
    /// The types of its signal and of `Post`.
    const char* types;
};

/// Notify-centre notifications: a name.
inline constexpr NotificationService pingService{"com.vorlan.pingd", "/com/vorlan/pingd", "s"};
/// Distributed notifications: a name and a dictionary.
inline constexpr NotificationService relayService{"com.vorlan.relayd", "/com/vorlan/relayd", "sa{sv}"};

inline constexpr const char* notificationSignal = "Notification";
inline constexpr const char* postMethod = "Post";

/// What one notification may hold: they are words and short lists.
inline constexpr MessageLimits notificationLimits{.values = 1U << 14,
                                                  .depth = 32,
                                                  .bytes = 1U << 20,
                                                  .descriptors = 0,
                                                  .memoryFileBytes = 0,
                                                  .memoryFileValues = 0};
/// Bytes of a notification's name.
inline constexpr std::size_t longestNotificationName = 1024;

}  // namespace typhon
