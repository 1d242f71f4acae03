#include "tools/agent/agent_session.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/unix_sockets.h"
#include "sdk/client_errors.h"
#include "tools/agent/login_terminals.h"

#include <cerrno>
#include <chrono>
#include <memory>
#include <tuple>
#include <utility>

#include <fcntl.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr const char* service = "com.vorlan.typhond.session-agent";
constexpr const char* agentsInterface = "com.vorlan.typhond.SessionAgents";
constexpr wire::Operation registerAgent{agentsInterface, "register", "", ""};
constexpr wire::Operation addTerminal{agentsInterface, "addTerminal", "h", "x"};
constexpr wire::Operation removeTerminal{agentsInterface, "removeTerminal", "x", ""};
constexpr wire::Operation showAlert{"com.vorlan.typhond.SessionAgent", "showAlert", "ssa{sv}h", ""};

constexpr auto patience = std::chrono::seconds(25);
constexpr std::size_t mostAlerts = 64;

std::optional<ReceivedAlert> alertIn(const PeerCall& call)
{
    const auto arguments = call.argumentsOf(showAlert);
    const auto* file = arguments ? std::get_if<std::shared_ptr<TransferredFile>>(&arguments->at(3)) : nullptr;
    const auto received = file == nullptr ? nullptr : std::dynamic_pointer_cast<LinuxTransferredFile>(*file);
    if (!received) {
        return std::nullopt;
    }
    return ReceivedAlert{std::get<PropertyList>(arguments->at(2)),
                         FileDescriptor(::fcntl(received->descriptor.get(), F_DUPFD_CLOEXEC, 3)),
                         call.laterReply()};
}

}  // namespace

AgentSession::AgentSession(ServiceConnection connection)
    : connection_(std::move(connection)), alerts_(std::make_unique<std::deque<ReceivedAlert>>())
{
    connection_.setCallHandler([alerts = alerts_.get()](const PeerCall& call) {
        auto alert = alertIn(call);
        if (alert && alerts->size() < mostAlerts) {
            alerts->push_back(*std::move(alert));
        } else {
            call.refuse();
        }
    });
}

ClientResult<AgentSession> AgentSession::open(const RootDirectory& root)
{
    auto connection = ServiceConnection::open(root, service);
    if (!connection) {
        return connection.error();
    }
    AgentSession session(std::move(*connection));
    const auto registered = session.connection_.call(registerAgent, {});
    if (!registered) {
        return registered.error();
    }
    return session;
}

ClientResult<Done> AgentSession::reportTerminals()
{
    const auto terminals = loginTerminals(::geteuid());
    for (const auto& [device, path] : terminals) {
        auto opened = reported_.contains(device) ? FileDescriptor() : openTerminal(path);
        if (!opened) {
            continue;
        }
        const std::shared_ptr<TransferredFile> file =
            std::make_shared<LinuxTransferredFile>(std::move(opened));
        const auto outcome = connection_.call(addTerminal, {file}, patience);
        if (!outcome && !connection_.isOpen()) {
            return outcome.error();
        }
        reported_.insert(device);
    }
    for (auto device = reported_.begin(); device != reported_.end();) {
        if (terminals.contains(*device)) {
            ++device;
            continue;
        }
        std::ignore = connection_.call(removeTerminal, {PropertyList(std::int64_t{*device})}, patience);
        device = reported_.erase(device);
    }
    return connection_.isOpen() ? ClientResult<Done>(Done{}) : systemError(ECONNRESET, service);
}

std::optional<ReceivedAlert> AgentSession::takeAlert()
{
    if (alerts_->empty()) {
        return std::nullopt;
    }
    auto alert = std::move(alerts_->front());
    alerts_->pop_front();
    return alert;
}

ClientResult<Done> answerAlert(const ReceivedAlert& alert, const PropertyList::Array& answers)
{
    auto connected = connectToDescriptor(alert.endpoint.get());
    if (!connected.socket) {
        return clientError(client_errors::serviceUnknown,
                           "nobody waits for the answer any more: " + connected.problem);
    }
    auto connection = ServiceConnection::overSocket(std::move(connected.socket), "the daemon");
    if (!connection) {
        return connection.error();
    }
    const auto outcome = connection->call(wire::doneWithMissingFonts, {PropertyList(answers)}, patience);
    return outcome ? ClientResult<Done>(Done{}) : outcome.error();
}

}  // namespace typhon
