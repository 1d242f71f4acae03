#include "platform/linux/session_agent_service.h"

#include "platform/linux/bus_message.h"

#include <utility>

namespace typhon {

namespace {

int descriptorOf(const Argument& argument)
{
    const auto* file = std::get_if<std::shared_ptr<TransferredFile>>(&argument);
    const auto* received = file == nullptr ? nullptr : dynamic_cast<const LinuxTransferredFile*>(file->get());
    return received == nullptr ? -1 : received->descriptor.get();
}

std::int64_t integerOf(const Argument& argument)
{
    const auto* value = std::get_if<PropertyList>(&argument);
    const auto* number = value == nullptr ? nullptr : value->asInteger();
    return number == nullptr ? 0 : *number;
}

void answer(IncomingCall& call, SessionAgents::Error error)
{
    if (error) {
        call.fail(*std::move(error));
    } else {
        call.reply({});
    }
}

void answer(IncomingCall& call, SessionAgents::Reported reported)
{
    if (reported.error) {
        call.fail(*std::move(reported.error));
    } else {
        call.reply({PropertyList(reported.number)});
    }
}

class SessionAgentObject : public ExportedObject {
public:
    explicit SessionAgentObject(SessionAgents& agents) : agents_(agents) {}

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        handleNow(*call);
        co_return;
    }

private:
    void handleNow(IncomingCall& call)
    {
        const auto connection = currentConnection();
        const auto& member = call.member();
        if (member == "register") {
            answer(call, agents_.registerAgent(connection));
        } else if (member == "addTerminal") {
            answer(call, agents_.addTerminal(connection.get(), descriptorOf(call.arguments().at(0))));
        } else if (member == "removeTerminal") {
            answer(call, agents_.removeTerminal(connection.get(), integerOf(call.arguments().at(0))));
        } else if (member == "addWindow") {
            answer(call, agents_.addWindow(connection.get(), descriptorOf(call.arguments().at(0))));
        } else {
            answer(call, agents_.removeWindow(connection.get(), integerOf(call.arguments().at(0))));
        }
    }

    SessionAgents& agents_;
};

}  // namespace

bool SessionAgentService::listener(Listener& /*listener*/,
                                   std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    const auto& connection = shouldAcceptNewConnection;
    connection->setExportedInterfaces(interfaces());
    connection->setExportedObject(std::make_shared<SessionAgentObject>(agents_));
    connection->setRemoteObjectInterfaces(SessionAgents::agentInterfaces());
    // Only compared, never followed: the connection may be gone by then.
    connection->setInvalidationHandler(
        [&agents = agents_, ended = connection.get()] { agents.leave(ended); });
    connection->resume();
    return true;
}

InterfaceDescriptions SessionAgentService::interfaces()
{
    static const auto descriptions = std::make_shared<const std::vector<InterfaceDescription>>(
        std::vector<InterfaceDescription>{{interfaceName,
                                           {{"register", "", "", true},
                                            {"addTerminal", "h", "x", true},
                                            {"removeTerminal", "x", "", true},
                                            {"addWindow", "h", "x", true},
                                            {"removeWindow", "x", "", true}}}});
    return descriptions;
}

std::shared_ptr<Listener> startSessionAgentService(Ipc& ipc,
                                                   const std::shared_ptr<SessionAgentService>& service)
{
    auto listener = ipc.listenerForService(SessionAgentService::serviceName);
    listener->setDelegate(service);
    listener->resume();
    return listener;
}

}  // namespace typhon
