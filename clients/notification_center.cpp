#include "clients/notification_center.h"

namespace typhon {

void NotificationCenter::add(const std::shared_ptr<const void>& observer, std::string name, Delivery delivery)
{
    const std::lock_guard lock(mutex_);
    auto& observers = byName_[std::move(name)];
    auto& place = observers.places[observer.get()];
    if (place.observer.expired()) {
        observers.deliveries.erase(place.number);
        place = {++count_, observer};
        observers.deliveries.emplace(place.number, std::move(delivery));
    }
}

void NotificationCenter::removeObserver(const void* observer)
{
    const std::lock_guard lock(mutex_);
    for (auto& [name, observers] : byName_) {
        const auto place = observers.places.find(observer);
        if (place != observers.places.end()) {
            observers.deliveries.erase(place->second.number);
            observers.places.erase(place);
        }
    }
}

std::vector<NotificationCenter::Delivery> NotificationCenter::deliveriesFor(std::string_view name) const
{
    std::vector<Delivery> deliveries;
    const std::lock_guard lock(mutex_);
    const auto found = byName_.find(name);
    if (found != byName_.end()) {
        for (const auto& [place, delivery] : found->second.deliveries) {
            deliveries.push_back(delivery);
        }
    }
    return deliveries;
}

void NotificationCenter::post(std::string_view name, const PropertyList& payload)
{
    for (const auto& delivery : deliveriesFor(name)) {
        delivery(payload);
    }
}

bool NotificationCenter::hasObserver(const void* observer, std::string_view name) const
{
    const std::lock_guard lock(mutex_);
    const auto found = byName_.find(name);
    return found != byName_.end() && found->second.places.contains(observer);
}

std::size_t NotificationCenter::observerCount(std::string_view name) const
{
    const std::lock_guard lock(mutex_);
    const auto found = byName_.find(name);
    return found == byName_.end() ? 0 : found->second.places.size();
}

}  // namespace typhon
