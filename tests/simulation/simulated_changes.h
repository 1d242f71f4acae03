#pragma once

#include "platform/ipc.h"
#include "platform/simulated/simulated_sandbox.h"
#include "simulation/world.h"

#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon::simulation {

/// One message about changed fonts, as a client received it.
struct HeardChange {
    std::optional<PropertyList> info;
    std::vector<std::string> added;
    std::vector<std::string> removed;
};

/// What one client may hear of changes.
struct ChangeAllowance {
    AuditToken token = {};
    bool isEnumerating = false;
    /// The directory of a provider.
    std::optional<std::string> ownDirectory = std::nullopt;
    /// The fonts of users whose entries it may get.
    std::set<std::string> paths = {};
};

/// Everything in a message that goes beyond the allowance, or that is not put as agreed. `issued`: every
/// extension that was issued so far. Reports of profile fonts must have named such fonts only.
std::vector<std::string> violations(const HeardChange& change, const ChangeAllowance& allowance,
                                    const std::vector<SimulatedSandbox::IssuedExtension>& issued);

/// A client's ear: what it exports to the daemon.
class ChangeListener final : public ExportedObject {
public:
    using Hearing = std::function<void(const HeardChange&)>;
    explicit ChangeListener(Hearing hearing) : hearing_(std::move(hearing)) {}
    Task<void> handle(std::shared_ptr<IncomingCall> call) override;

private:
    Hearing hearing_;
};

/// Some report of changed fonts, of user or of profile fonts, sensible or not.
PropertyList someReport(World& world);
/// The report that exactly these user fonts came.
PropertyList reportOfAdded(const std::set<std::string>& paths);

}  // namespace typhon::simulation
