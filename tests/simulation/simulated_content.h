#pragma once

#include "platform/ipc.h"
#include "simulation/world.h"

#include <functional>
#include <memory>
#include <optional>

namespace typhon::simulation {

/// A web-content process of a simulated client: answers what it is asked, twice, late, or not at all.
class SimulatedContent final : public ListenerDelegate,
                               public ExportedObject,
                               public std::enable_shared_from_this<SimulatedContent> {
public:
    using Receiving = std::function<void(const SimulatedContent&, const std::optional<PropertyList>&)>;

    /// `receiving` is called with the fonts that it gets. `world` outlives this.
    SimulatedContent(World& world, Receiving receiving);

    std::shared_ptr<ListenerEndpoint> listen();
    /// It is no more.
    void vanish();
    const AuditToken token;
    /// Whether its host is to be answered.
    bool answers() const { return answersPing_ && answersFonts_; }

    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;
    Task<void> handle(std::shared_ptr<IncomingCall> call) override;

private:
    World& world_;
    Receiving receiving_;
    const bool answersPing_;
    const bool answersFonts_;
    std::shared_ptr<Listener> listener_;
};

}  // namespace typhon::simulation
