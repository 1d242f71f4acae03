#pragma once

#include "platform/property_list.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

namespace typhon {

/// Notifications within the daemon, by name. Observers are not kept alive. Any thread; a posting is
/// delivered on the thread that posts.
class NotificationCenter {
public:
    /// Has `operation` of `observer` called with the payload of every notification of that name. Adding an
    /// observer again for the same name changes nothing.
    template <class Observer>
    void addObserver(const std::shared_ptr<Observer>& observer, std::string name,
                     void (Observer::*operation)(const PropertyList&))
    {
        const std::weak_ptr<Observer> weak = observer;
        add(observer, std::move(name), [weak, operation](const PropertyList& payload) {
            if (const auto present = weak.lock()) {
                ((*present).*operation)(payload);
            }
        });
    }

    /// Removes an observer from all names. It may be about to be destroyed.
    void removeObserver(const void* observer);

    /// Calls the observers of that name, in the order in which they were added, and returns when all have
    /// returned. No lock is held meanwhile.
    void post(std::string_view name, const PropertyList& payload);

    bool hasObserver(const void* observer, std::string_view name) const;
    std::size_t observerCount(std::string_view name) const;

private:
    using Delivery = std::function<void(const PropertyList&)>;
    struct Place {
        std::uint64_t number = 0;
        /// Tells one that is gone from another one at the same address.
        std::weak_ptr<const void> observer;
    };
    /// The observers of one name, by the order in which they came.
    struct Observers {
        std::map<std::uint64_t, Delivery> deliveries;
        std::unordered_map<const void*, Place> places;
    };

    void add(const std::shared_ptr<const void>& observer, std::string name, Delivery delivery);
    std::vector<Delivery> deliveriesFor(std::string_view name) const;

    mutable std::mutex mutex_;
    // Protected by mutex_.
    std::map<std::string, Observers, std::less<>> byName_;
    std::uint64_t count_ = 0;
};

}  // namespace typhon
