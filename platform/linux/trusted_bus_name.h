#pragma once

#include "platform/linux/trusted_users.h"

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include <systemd/sd-bus.h>

namespace typhon {

/// Follows who owns a well-known name on a bus, and whether that owner runs as a user it may run as. On the
/// bus's queue only.
class TrustedBusName : public std::enable_shared_from_this<TrustedBusName> {
public:
    enum class Standing {
        /// Is not the owner, or may not be.
        stranger,
        /// Is the owner; who it runs as is being asked.
        undecided,
        trusted
    };

    /// `decided` is called whenever the standing of the present owner has become known, or it has gone.
    TrustedBusName(std::string name, TrustsUser trusts, std::function<void()> decided);

    /// Begins anew on a fresh connection: has the bus report changes of the owner, and asks for the present
    /// one.
    void follow(sd_bus* bus);
    /// Nobody is the owner.
    void forget();
    /// To be shown every message of the connection, before anybody asks about its sender.
    void sawMessage(sd_bus* bus, sd_bus_message* message);

    /// The standing of the present owner; `stranger` when there is none.
    Standing standing() const { return ownersStanding_; }
    /// The standing of that sender of a message, a unique name; null for one without a sender.
    Standing standingOf(const char* sender) const;

private:
    void setOwner(sd_bus* bus, std::string_view owner);
    void decide(const std::string& asked, bool isTrustedOwner);

    const std::string name_;
    const TrustsUser trusts_;
    const std::function<void()> decided_;
    /// The owner's unique name; empty for none.
    std::string owner_;
    Standing ownersStanding_ = Standing::stranger;
};

}  // namespace typhon
