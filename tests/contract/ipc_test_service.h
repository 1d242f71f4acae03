#pragma once

#include "ipc_world.h"

#include <memory>
#include <stdexcept>
#include <string>
#include <utility>

namespace typhon {

inline constexpr const char* serviceInterface = "com.vorlan.test.Service";
inline constexpr const char* clientInterface = "com.vorlan.test.Client";

inline InterfaceDescriptions serviceInterfaces()
{
    static const auto interfaces = std::make_shared<const std::vector<InterfaceDescription>>(
        std::vector<InterfaceDescription>{{serviceInterface,
                                           {{"echo", "s", "s"},
                                            {"note", "s", "", false},
                                            {"hold", "s", "s"},
                                            {"relay", "s", "s"},
                                            {"never", "", "s"},
                                            {"twice", "", "s"},
                                            {"fail", "", "s"},
                                            {"refuse", "", "s"},
                                            {"misfit", "", "s"},
                                            {"all", "bxsasa{sv}aa{sv}aas", "bxsasa{sv}aa{sv}aas"},
                                            {"callBack", "s", "s"},
                                            {"ping", "h", "s"},
                                            {"askBack", "", "s"}}}});
    return interfaces;
}

inline InterfaceDescriptions clientInterfaces()
{
    static const auto interfaces =
        std::make_shared<const std::vector<InterfaceDescription>>(std::vector<InterfaceDescription>{
            {clientInterface, {{"told", "s", "", false}, {"ask", "s", "s"}, {"silence", "", "s"}}}});
    return interfaces;
}

inline std::string textOf(const Arguments& arguments)
{
    const auto* list = arguments.empty() ? nullptr : std::get_if<PropertyList>(&arguments.front());
    const auto* text = list == nullptr ? nullptr : list->asString();
    return text == nullptr ? "?" : *text;
}

/// What a test shares with the objects it exports.
struct ServiceState {
    Notes& notes;
    IpcWorld& world;
    std::shared_ptr<Semaphore> release;
    std::shared_ptr<WorkQueue> other;
};

inline std::string whoIsCurrent()
{
    const auto connection = currentConnection();
    return connection ? std::to_string(connection->processIdentifier()) : "nobody";
}

/// Exported by the service: does what the member's name says.
class TestService : public ExportedObject {
public:
    TestService(ServiceState& state, std::weak_ptr<Connection> connection)
        : state_(state), connection_(std::move(connection))
    {}
    ~TestService() override { state_.notes.add("service gone"); }

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        return serve(state_, connection_, call);
    }

private:
    static Task<void> relay(ServiceState& state, std::shared_ptr<IncomingCall> call)
    {
        // Inherited by awaited work, not by posted work, which may answer all the same.
        std::function<std::string()> whoAwaited = whoIsCurrent;
        Task<std::string> awaited = state.other->perform(std::move(whoAwaited));
        const std::string during = co_await std::move(awaited);
        state.notes.add("awaited: " + during);
        ServiceState* shared = &state;
        state.other->async([shared, call] {
            shared->notes.add("posted: " + whoIsCurrent());
            call->reply({PropertyList(textOf(call->arguments()) + " relayed")});
        });
    }

    static Task<void> ping(ServiceState& state, std::shared_ptr<IncomingCall> call)
    {
        const auto* endpoint = std::get_if<std::shared_ptr<TransferredFile>>(&call->arguments().front());
        auto connection = state.world.server().connectionToEndpoint(*endpoint);
        Notes* notes = &state.notes;
        connection->setInvalidationHandler([notes] { notes->add("endpoint connection invalid"); });
        connection->setRemoteObjectInterfaces(clientInterfaces());
        connection->resume();
        Arguments question{PropertyList("who")};
        Task<CallResult> asking = connection->callAndWait(clientInterface, "ask", std::move(question), 0);
        CallResult result = co_await std::move(asking);
        if (result.results) {
            state.notes.add("endpoint peer: " + std::to_string(connection->processIdentifier()));
            call->reply(std::move(*result.results));
        } else {
            call->fail(std::move(result.error));
        }
        connection->invalidate();
    }

    static Task<void> askBack(std::shared_ptr<Connection> connection, std::shared_ptr<IncomingCall> call,
                              std::int64_t timeout)
    {
        Task<CallResult> asking = connection->callAndWait(clientInterface, "silence", {}, timeout);
        CallResult result = co_await std::move(asking);
        call->fail(std::move(result.error));
    }

    static Task<void> serve(ServiceState& state, std::weak_ptr<Connection> weak,
                            std::shared_ptr<IncomingCall> call)
    {
        const auto text = textOf(call->arguments());
        const auto& member = call->member();
        if (member == "echo") {
            state.notes.add("echo from " + whoIsCurrent());
            call->reply({PropertyList(text)});
        } else if (member == "note") {
            state.notes.add(text);
        } else if (member == "hold") {
            state.notes.add("holding " + text);
            Task<void> waiting = state.release->wait();
            co_await std::move(waiting);
            state.notes.add("released " + text);
            call->reply({PropertyList(text)});
        } else if (member == "relay") {
            Task<void> relaying = relay(state, call);
            co_await std::move(relaying);
        } else if (member == "twice") {
            call->reply({PropertyList("first")});
            call->reply({PropertyList("second")});
            call->fail({ipc_errors::failed, "third"});
        } else if (member == "fail") {
            throw std::runtime_error("intended");
        } else if (member == "refuse") {
            call->fail({ipc_errors::accessDenied, "not you"});
        } else if (member == "misfit") {
            call->reply({PropertyList(5)});
        } else if (member == "all") {
            call->reply(call->arguments());
        } else if (member == "callBack") {
            if (const auto connection = weak.lock()) {
                connection->send(clientInterface, "told", {PropertyList(text)}, nullptr);
            }
            call->reply({PropertyList("told")});
        } else if (member == "ping") {
            Task<void> pinging = ping(state, call);
            co_await std::move(pinging);
        } else if (member == "askBack") {
            constexpr std::int64_t fiftyMilliseconds = 50'000'000;
            Task<void> asking = askBack(weak.lock(), call, fiftyMilliseconds);
            co_await std::move(asking);
        }
    }

    ServiceState& state_;
    const std::weak_ptr<Connection> connection_;
};

/// Exported by the client.
class TestClient : public ExportedObject {
public:
    explicit TestClient(Notes& notes) : notes_(notes) {}

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        if (call->member() == "told") {
            notes_.add("told " + textOf(call->arguments()));
        } else if (call->member() == "ask") {
            call->reply({PropertyList(textOf(call->arguments()) + "? me")});
        }
        co_return;
    }

private:
    Notes& notes_;
};

/// Accepts every connection (or none) and exports a service on it.
class TestDelegate : public ListenerDelegate {
public:
    explicit TestDelegate(ServiceState& state) : state_(state) {}

    bool listener(Listener&, std::shared_ptr<Connection> connection) override
    {
        if (refuses) {
            state_.notes.add("refused");
            return false;
        }
        connection->setExportedInterfaces(serviceInterfaces());
        connection->setExportedObject(std::make_shared<TestService>(state_, connection));
        connection->setRemoteObjectInterfaces(clientInterfaces());
        Notes* notes = &state_.notes;
        connection->setInvalidationHandler([notes] { notes->add("server connection invalid"); });
        latest = connection;
        state_.notes.add("accepted " + std::to_string(connection->processIdentifier()));
        connection->resume();
        return true;
    }

    bool refuses = false;
    std::weak_ptr<Connection> latest;

private:
    ServiceState& state_;
};

/// Accepts connections on a client's own listener.
class TestClientDelegate : public ListenerDelegate {
public:
    explicit TestClientDelegate(Notes& notes) : notes_(notes) {}
    bool listener(Listener&, std::shared_ptr<Connection> connection) override
    {
        connection->setExportedInterfaces(clientInterfaces());
        connection->setExportedObject(std::make_shared<TestClient>(notes_));
        connection->resume();
        return true;
    }

private:
    Notes& notes_;
};

}  // namespace typhon
