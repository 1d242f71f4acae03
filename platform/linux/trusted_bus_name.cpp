// A signal's sender is a unique name, put there by the bus, which never gives the same one twice. Matches on
// the well-known name are not enough: a signal can be addressed to us directly, and then no match is asked.
// So the owner is followed, in the order in which the bus tells of it, and compared.

#include "platform/linux/trusted_bus_name.h"

#include "platform/linux/bus_calls.h"

#include <cstdint>
#include <utility>

namespace typhon {

namespace {

constexpr const char* busDriver = "org.freedesktop.DBus";

/// False also when the bus does not know the user.
bool isTrusted(sd_bus_message* reply, const TrustsUser& trusts)
{
    std::uint32_t user = 0;
    return sd_bus_message_is_method_error(reply, nullptr) <= 0 &&
           sd_bus_message_read(reply, "u", &user) >= 0 && trusts(user);
}

}  // namespace

TrustedBusName::TrustedBusName(std::string name, TrustsUser trusts, std::function<void()> decided)
    : name_(std::move(name)), trusts_(std::move(trusts)), decided_(std::move(decided))
{}

void TrustedBusName::follow(sd_bus* bus)
{
    forget();
    const auto changes = std::string("type='signal',sender='") + busDriver + "',interface='" + busDriver +
                         "',member='NameOwnerChanged',arg0='" + name_ + "'";
    callBusDriver(bus, "AddMatch", changes, [](sd_bus_message*) {});
    callBusDriver(bus, "GetNameOwner", name_, [weak = weak_from_this(), bus](sd_bus_message* reply) {
        const char* owner = nullptr;
        const auto self = weak.lock();
        if (self && sd_bus_message_is_method_error(reply, nullptr) <= 0 &&
            sd_bus_message_read(reply, "s", &owner) >= 0) {
            self->setOwner(bus, owner);
        }
    });
}

void TrustedBusName::forget()
{
    owner_.clear();
    ownersStanding_ = Standing::stranger;
    decided_();
}

void TrustedBusName::sawMessage(sd_bus* bus, sd_bus_message* message)
{
    const char* sender = sd_bus_message_get_sender(message);
    if (sender == nullptr || std::string_view(sender) != busDriver ||
        sd_bus_message_is_signal(message, busDriver, "NameOwnerChanged") <= 0) {
        return;
    }
    const char* name = nullptr;
    const char* before = nullptr;
    const char* owner = nullptr;
    if (sd_bus_message_read(message, "sss", &name, &before, &owner) >= 0 && name_ == name) {
        setOwner(bus, owner);
    }
    sd_bus_message_rewind(message, 1);
}

void TrustedBusName::setOwner(sd_bus* bus, std::string_view owner)
{
    if (owner_ == owner) {
        return;
    }
    forget();
    if (owner.empty()) {
        return;
    }
    owner_ = owner;
    ownersStanding_ = Standing::undecided;
    callBusDriver(bus, "GetConnectionUnixUser", owner_,
                  [weak = weak_from_this(), asked = owner_](sd_bus_message* reply) {
                      if (const auto self = weak.lock()) {
                          self->decide(asked, isTrusted(reply, self->trusts_));
                      }
                  });
}

void TrustedBusName::decide(const std::string& asked, bool isTrustedOwner)
{
    if (asked == owner_) {
        ownersStanding_ = isTrustedOwner ? Standing::trusted : Standing::stranger;
        decided_();
    }
}

TrustedBusName::Standing TrustedBusName::standingOf(const char* sender) const
{
    return sender != nullptr && !owner_.empty() && owner_ == sender ? ownersStanding_ : Standing::stranger;
}

}  // namespace typhon
