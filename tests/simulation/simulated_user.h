#pragma once

#include "platform/ipc.h"
#include "simulation/request_history.h"
#include "simulation/world.h"

#include <cstddef>
#include <map>
#include <memory>
#include <set>
#include <vector>

namespace typhon::simulation {

/// The person before the screen, and the service that shows the dialogs: answers some dialogs, some of them
/// twice or over two connections, and not always with sense.
class SimulatedUser {
public:
    /// Everything given outlives this.
    SimulatedUser(World& world, RequestHistory& history) : world_(world), history_(history) {}

    /// Answers a dialog, or one that was answered before, if there is any.
    void act();
    /// Answers the dialog that is up, if one is.
    void answerWhatIsUp();
    /// Closes all connections.
    void leave();

    std::size_t dialogs() const { return world_.simulated.remoteAlerts.alerts().size(); }
    bool hasAnswered(std::size_t dialog) const { return answered_.contains(dialog); }

private:
    void answer(std::size_t dialog);
    PropertyList someAnswer();
    std::shared_ptr<Connection> connectionTo(std::size_t dialog);
    std::uint64_t pick(std::uint64_t bound) { return world_.simulated.scheduler.pick(bound); }

    World& world_;
    RequestHistory& history_;
    std::set<std::size_t> answered_;
    std::map<std::size_t, std::vector<std::shared_ptr<Connection>>> connections_;
};

}  // namespace typhon::simulation
