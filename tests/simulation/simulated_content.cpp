#include "simulation/simulated_content.h"

#include "protocol/wire.h"

namespace typhon::simulation {

SimulatedContent::SimulatedContent(World& world, Receiving receiving)
    : token(world.simulated.processes.add({})), world_(world), receiving_(std::move(receiving)),
      answersPing_(world.simulated.scheduler.pick(4) != 0),
      answersFonts_(world.simulated.scheduler.pick(4) != 0),
      listener_(world.simulated.ipc.process(token)->anonymousListener())
{}

std::shared_ptr<ListenerEndpoint> SimulatedContent::listen()
{
    listener_->setDelegate(weak_from_this());
    listener_->resume();
    return listener_->endpoint();
}

void SimulatedContent::vanish()
{
    world_.simulated.processes.exit(token);
    world_.simulated.ipc.endProcess(token);
}

bool SimulatedContent::listener(Listener& /*listener*/, std::shared_ptr<Connection> shouldAcceptNewConnection)
{
    shouldAcceptNewConnection->setExportedInterfaces(wire::typhonSilkpageSupportServerInterfaces());
    shouldAcceptNewConnection->setExportedObject(shared_from_this());
    shouldAcceptNewConnection->resume();
    return true;
}

Task<void> SimulatedContent::handle(std::shared_ptr<IncomingCall> call)
{
    const bool isPing = call->member() == wire::pingSilkpageProcess.member;
    if (!isPing) {
        receiving_(*this, wire::fromNullable(std::get<PropertyList>(call->arguments().at(0))));
    }
    if (isPing ? answersPing_ : answersFonts_) {
        call->reply({});
        call->reply({});
    }
    co_return;
}

}  // namespace typhon::simulation
