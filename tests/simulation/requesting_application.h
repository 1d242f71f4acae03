#pragma once

#include "protocol/wire.h"
#include "simulation/request_history.h"
#include "simulation/simulated_clients.h"
#include "simulation/world.h"

#include <memory>
#include <set>
#include <string>
#include <vector>

namespace typhon::simulation {

/// A process that asks for fonts, checks in, disconnects and vanishes as it likes, and judges every answer.
class RequestingApplication {
public:
    /// Everything given outlives this.
    RequestingApplication(World& world, RequestHistory& history, const ClientKind& kind);

    void act();
    /// Reports requests without their one outcome. Nothing else may be going on.
    void judgeOutcomes();
    void disconnect();

private:
    struct Call {
        std::shared_ptr<Connection> connection;
        std::set<std::string> families;
        bool isCheckin = false;
        int outcomes = 0;
    };

    void connect();
    void request();
    void checkIn();
    void vanish();
    void becomeNobody();
    std::string someName(std::set<std::string>& families, bool isFamily);
    PropertyList someRequest(std::set<std::string>& families);
    void start(const wire::Operation& operation, Arguments arguments, std::shared_ptr<Call> call);
    static Task<void> judge(RequestingApplication* self, std::shared_ptr<Call> call, Arguments results);
    void judgeRequest(const Call& call, const PropertyList& fonts);
    void judgeCheckIn(const std::optional<PropertyList>& reply);
    void judgeFonts(const PropertyList& fonts, const std::set<std::string>& families, bool isEnumerating);
    bool holds(const std::string& entitlement) const;
    std::uint64_t pick(std::uint64_t bound) { return world_.simulated.scheduler.pick(bound); }

    World& world_;
    RequestHistory& history_;
    const ClientKind& kind_;
    SimulatedProcess process_;
    AuditToken token_;
    std::string name_;
    bool isGone_ = false;
    std::shared_ptr<Connection> connection_;
    std::vector<std::shared_ptr<Call>> calls_;
};

}  // namespace typhon::simulation
