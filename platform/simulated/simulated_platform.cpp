#include "platform/simulated/simulated_platform.h"

#include <optional>

namespace typhon {

namespace {

/// Accepts whoever comes and keeps the connection.
class AcceptingDelegate final : public ListenerDelegate {
public:
    bool listener(Listener& /*listener*/, std::shared_ptr<Connection> shouldAcceptNewConnection) override
    {
        accepted = std::move(shouldAcceptNewConnection);
        return true;
    }
    std::shared_ptr<Connection> accepted;
};

struct Ending {
    bool hasEnded = false;
    std::exception_ptr exception;
};

Task<void> runToEnding(std::shared_ptr<Ending> ending, Task<void> work)
{
    try {
        co_await std::move(work);
    } catch (...) {
        ending->exception = std::current_exception();
    }
    ending->hasEnded = true;
}

}  // namespace

SimulatedPlatform::~SimulatedPlatform()
{
    ownedIpc_.reset();
    drain();
    queues.close();
}

void SimulatedPlatform::losePower()
{
    queues.close();
    ipc.endAllProcesses();
}

void SimulatedPlatform::runAs(const AuditToken& token, Task<void> work)
{
    const auto pair = connect(token);
    runOn(pair.accepted, std::move(work));
}

void SimulatedPlatform::runAs(const AuditToken& token, std::function<void()> work)
{
    runAs(token, detail::callAsTask(std::move(work)));
}

void SimulatedPlatform::runOn(std::shared_ptr<void> connection, Task<void> work)
{
    const auto queue = queues.createSerialQueue("work of a test");
    const auto ending = std::make_shared<Ending>();
    queue->asyncForConnection(std::move(connection), runToEnding(ending, std::move(work)));
    drain();
    if (!ending->hasEnded) {
        detail::abortWithMessage("the work of a test never ends");
    }
    if (ending->exception) {
        std::rethrow_exception(ending->exception);
    }
}

SimulatedConnectionPair SimulatedPlatform::connect(const AuditToken& token, InterfaceDescriptions clientCalls)
{
    const auto listener = ipc.anonymousListener();
    const auto delegate = std::make_shared<AcceptingDelegate>();
    listener->setDelegate(delegate);
    listener->resume();
    auto client = ipc.process(token)->connectionToEndpoint(listener->endpoint());
    client->setRemoteObjectInterfaces(std::move(clientCalls));
    client->resume();
    drain();
    listener->invalidate();
    return {delegate->accepted, client};
}

}  // namespace typhon
