#include "platform/linux/subscribed_notifications.h"

#include "platform/linux/property_list_reader.h"
#include "platform/linux/regular_file.h"

namespace typhon {

namespace {

constexpr PropertyListLimits fileLimits{.bytes = 64 * 1024, .depth = 3, .values = 4096};

}  // namespace

std::optional<std::set<std::string>> subscribedNotifications(const RootDirectory& root,
                                                             const std::string& stream)
{
    const auto opened = openRegularFile(root.real(subscriptionsFile));
    const auto reading = opened.error == 0 ? readPropertyListFromDescriptor(opened.file.get(), fileLimits)
                                           : PropertyListReading{};
    const auto* names = reading.value ? reading.value->find(stream) : nullptr;
    if (names == nullptr || names->asArray() == nullptr) {
        return std::nullopt;
    }
    std::set<std::string> subscribed;
    for (const auto& name : *names->asArray()) {
        if (name.asString() != nullptr) {
            subscribed.insert(*name.asString());
        }
    }
    return subscribed;
}

}  // namespace typhon
