#pragma once

#include "platform/ipc.h"
#include "platform/linux/session_agents.h"

#include <memory>

namespace typhon {

/// Takes session agents and their reports, at the service "com.vorlan.typhond.session-agent". Any thread.
class SessionAgentService : public ListenerDelegate,
                            public std::enable_shared_from_this<SessionAgentService> {
public:
    static constexpr const char* serviceName = "com.vorlan.typhond.session-agent";
    static constexpr const char* interfaceName = "com.vorlan.typhond.SessionAgents";

    /// `agents` outlives this and every connection to it.
    explicit SessionAgentService(SessionAgents& agents) : agents_(agents) {}

    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override;

    /// What the service exports.
    static InterfaceDescriptions interfaces();

private:
    SessionAgents& agents_;
};

/// Opens the service: a resumed listener that asks `service`, which stays alive as long as somebody holds it.
std::shared_ptr<Listener> startSessionAgentService(Ipc& ipc,
                                                   const std::shared_ptr<SessionAgentService>& service);

}  // namespace typhon
