#pragma once

#include "protocol/wire.h"
#include "simulation/allowance.h"
#include "simulation/simulated_changes.h"
#include "simulation/simulated_content.h"
#include "simulation/world.h"

#include <memory>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace typhon::simulation {

/// A sort of client, by what its signature says and what that must come to.
struct ClientKind {
    std::string name;
    std::optional<std::string> identifier;
    PropertyList::Dictionary entitlements;
    bool mayEnumerate = false;
    bool hasFontAccess = false;
    bool isProvider = false;
    bool isFontPicker = false;
};

const std::vector<ClientKind>& clientKinds();

/// One client process that calls the daemon as it likes, and judges every answer.
class SimulatedClient {
public:
    /// Adds the process to the world, which outlives this.
    SimulatedClient(World& world, const ClientKind& kind);

    /// Does something that the world's scheduler chooses: calls the daemon, sensibly or not, disconnects,
    /// becomes another program, or vanishes.
    void act();
    /// Checks in once more and expects exactly what the device holds now. Nothing else may be going on.
    void checkInQuietly();
    /// Reports calls without their one outcome. Nothing else may be going on.
    void judgeOutcomes();
    /// From here on what the client hears of changes is kept for `judgeHearing`.
    void listenClosely() { heard_.clear(); }
    /// Expects to have heard exactly its share of the report that the device's enabled fonts came, once. It
    /// checked in before; nothing else may be going on.
    void judgeHearing();
    void disconnect();

private:
    struct Call {
        std::string member;
        std::shared_ptr<Connection> connection;
        int outcomes = 0;
        bool isNeverAnswered = false;
    };
    using Judge = void (SimulatedClient::*)(const Arguments& results);

    void connect();
    void callSomething();
    void hear(const HeardChange& change);
    void checkInContent();
    void judgeContent(const SimulatedContent& content, const std::optional<PropertyList>& info);
    std::shared_ptr<Call> call(const wire::Operation& operation, Arguments arguments = {},
                               Judge judge = nullptr,
                               std::optional<std::string> expectedError = std::nullopt);
    static Task<void> judgeReply(SimulatedClient* self, std::shared_ptr<Call> call, Judge judge,
                                 bool isErrorExpected, Arguments results);
    void judgeCheckIn(const Arguments& results);
    void judgePickerCheckIn(const Arguments& results);
    void judgeExactly(const Arguments& results);
    void judgeReplyBy(const Arguments& results, bool isEnumerating, bool isAnswered);
    bool seesOwn(const std::string& path) const;
    Allowance allowance(bool isEnumerating, bool isAnswered) const;
    std::set<std::string> exactPaths() const;
    void becomeNobody();
    void vanish();
    std::uint64_t pick(std::uint64_t bound) { return world_.simulated.scheduler.pick(bound); }

    World& world_;
    const ClientKind& kind_;
    std::string name_;
    SimulatedProcess process_;
    AuditToken token_;
    /// No longer the program that it was: it gets nothing more, whatever it may still have been told.
    bool isGone_ = false;
    /// Sends what the daemon's protocols do not allow.
    bool isHostile_ = false;
    std::shared_ptr<Connection> connection_;
    std::vector<std::shared_ptr<Call>> calls_;
    std::vector<HeardChange> heard_;
    std::vector<std::shared_ptr<SimulatedContent>> contents_;
};

}  // namespace typhon::simulation
