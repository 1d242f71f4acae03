#pragma once

#include "platform/linux/audit_tokens.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/unix_sockets.h"

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

namespace typhon {

/// Keeps messages from any thread, and lets a test wait for one.
class AwaitedLog : public Log {
public:
    void write(LogSink, LogLevel, std::string_view message) override
    {
        const std::lock_guard lock(mutex_);
        messages_.emplace_back(message);
        changed_.notify_all();
    }
    std::size_t countContaining(std::string_view part) const
    {
        const std::lock_guard lock(mutex_);
        return count(part);
    }
    bool waitFor(std::string_view part, std::size_t times = 1)
    {
        std::unique_lock lock(mutex_);
        return changed_.wait_for(lock, std::chrono::seconds(20), [&] { return count(part) >= times; });
    }

private:
    std::size_t count(std::string_view part) const
    {
        std::size_t result = 0;
        for (const auto& message : messages_) {
            result += message.find(part) == std::string::npos ? 0 : 1;
        }
        return result;
    }

    mutable std::mutex mutex_;
    std::condition_variable changed_;
    std::vector<std::string> messages_;
};

inline constexpr const char* testedService = "com.vorlan.test";
inline constexpr const char* testedInterface = "com.vorlan.test.Service";

/// Answers what the tests ask; `held` calls are kept unanswered.
class TestedObject : public ExportedObject {
public:
    explicit TestedObject(Log& log) : log_(log) {}

    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        const auto& member = call->member();
        if (member == "echo" || member == "dictionary" || member == "both") {
            call->reply(call->arguments());
        } else if (member == "hold") {
            const std::lock_guard lock(mutex_);
            held_.push_back(call);
            TYLog(log_, "holding a call");
        } else if (member == "releaseAll") {
            release();
            call->reply({});
        } else if (member == "view") {
            call->reply({view});
        } else if (member == "note") {
            TYLog(log_, "noted " + *std::get<PropertyList>(call->arguments().front()).asString());
        }
        co_return;
    }
    void release()
    {
        std::vector<std::shared_ptr<IncomingCall>> held;
        {
            const std::lock_guard lock(mutex_);
            held.swap(held_);
        }
        for (const auto& call : held) {
            call->reply({});
        }
    }

    PropertyList view;

private:
    Log& log_;
    std::mutex mutex_;
    std::vector<std::shared_ptr<IncomingCall>> held_;
};

/// One object for every connection.
class TestedDelegate : public ListenerDelegate {
public:
    explicit TestedDelegate(Log& log) : object(std::make_shared<TestedObject>(log)) {}
    bool listener(Listener&, std::shared_ptr<Connection> connection) override
    {
        static const auto interfaces = std::make_shared<const std::vector<InterfaceDescription>>(
            std::vector<InterfaceDescription>{{testedInterface,
                                               {{"echo", "s", "s"},
                                                {"dictionary", "a{sv}", "a{sv}"},
                                                {"both", "h", "h"},
                                                {"hold", "", ""},
                                                {"never", "", ""},
                                                {"releaseAll", "", ""},
                                                {"view", "", "a{sv}"},
                                                {"note", "s", "", false}}}});
        connection->setExportedInterfaces(interfaces);
        connection->setExportedObject(object);
        connection->resume();
        return true;
    }
    const std::shared_ptr<TestedObject> object;
};

class TestFolder {
public:
    TestFolder()
    {
        std::string pattern = std::filesystem::temp_directory_path() / "typhon-ipc-XXXXXX";
        path = ::mkdtemp(pattern.data());
    }
    ~TestFolder() { std::filesystem::remove_all(path); }
    std::string path;
};

/// A service under a scratch root, with limits of the test's choice.
class TestedService {
public:
    explicit TestedService(IpcLimits limits = {}, std::string below = {},
                           const IdentifyPeer& identify = tokenOfPeer)
        : root(folder.path + below)
    {
        std::filesystem::create_directories(root.directory());
        ipc = std::make_unique<LinuxIpc>(pool, queues, log, root, identify, limits);
        listener = ipc->listenerForService(testedService);
        listener->setDelegate(delegate);
        listener->resume();
    }
    ~TestedService()
    {
        delegate->object->release();
        ipc.reset();
        // A connection that came or ended just now may still be handled.
        pool.stop();
    }
    std::string path() const { return root.real("/run/typhon/") + testedService; }

    TestFolder folder;
    const RootDirectory root;
    AwaitedLog log;
    EventPool pool;
    LinuxWorkQueues queues{pool};
    std::shared_ptr<TestedDelegate> delegate = std::make_shared<TestedDelegate>(log);
    std::unique_ptr<LinuxIpc> ipc;
    std::shared_ptr<Listener> listener;
};

/// A client that knows nothing of us: plain blocking sd-bus.
class ForeignClient {
public:
    explicit ForeignClient(const std::string& path, bool takesDescriptors = true)
    {
        sd_bus_new(&bus);
        sd_bus_set_address(bus, ("unix:path=" + path).c_str());
        sd_bus_negotiate_fds(bus, takesDescriptors ? 1 : 0);
        sd_bus_set_method_call_timeout(bus, 20'000'000);
        started = sd_bus_start(bus) >= 0;
    }
    ~ForeignClient()
    {
        sd_bus_message_unref(reply);
        sd_bus_flush_close_unref(bus);
    }
    ForeignClient(const ForeignClient&) = delete;
    ForeignClient& operator=(const ForeignClient&) = delete;

    sd_bus_message* newCall(const char* member, const char* interface = testedInterface,
                            const char* path = "/com/vorlan/typhond")
    {
        sd_bus_message* call = nullptr;
        sd_bus_message_new_method_call(bus, &call, nullptr, path, interface, member);
        return call;
    }
    /// Sends the call and waits for its reply; the name of the error, or empty.
    std::string finish(sd_bus_message* call)
    {
        sd_bus_error error = SD_BUS_ERROR_NULL;
        sd_bus_message_unref(reply);
        reply = nullptr;
        const int result = sd_bus_call(bus, call, 0, &error, &reply);
        sd_bus_message_unref(call);
        std::string name = error.name == nullptr ? "" : error.name;
        sd_bus_error_free(&error);
        return result < 0 && name.empty() ? "failed " + std::to_string(result) : name;
    }
    /// Sends a call and does not wait for its reply.
    void start(const char* member)
    {
        std::uint64_t cookie = 0;
        auto* message = newCall(member);
        sd_bus_send(bus, message, &cookie);
        sd_bus_message_unref(message);
    }
    std::string call(const char* member) { return finish(newCall(member)); }
    std::string callText(const char* member, const std::string& text)
    {
        auto* message = newCall(member);
        sd_bus_message_append(message, "s", text.c_str());
        return finish(message);
    }
    /// The reply's only argument, a string.
    std::string text()
    {
        const char* result = nullptr;
        return reply != nullptr && sd_bus_message_rewind(reply, 1) >= 0 &&
                       sd_bus_message_read(reply, "s", &result) > 0
                   ? result
                   : "?";
    }
    bool isAlive() { return callText("echo", "alive").empty(); }

    sd_bus* bus = nullptr;
    sd_bus_message* reply = nullptr;
    bool started = false;
};

/// A connected, blocking socket that speaks nothing by itself.
inline FileDescriptor rawConnection(const std::string& path)
{
    auto connected = connectToPath(path);
    EXPECT_TRUE(connected.socket) << connected.problem;
    ::fcntl(connected.socket.get(), F_SETFL, 0);
    return std::move(connected.socket);
}

/// False when the peer closes the socket before all of it is sent.
inline bool wasSent(const FileDescriptor& socket, std::string_view bytes)
{
    return ::send(socket.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL) ==
           static_cast<ssize_t>(bytes.size());
}

inline void write(const FileDescriptor& socket, std::string_view bytes)
{
    ASSERT_TRUE(wasSent(socket, bytes));
}

/// True when the peer closes the socket (what it sends before is read and dropped).
inline bool isClosedByPeer(int socket)
{
    for (;;) {
        pollfd waiting{socket, POLLIN, 0};
        char buffer[4096];
        if (::poll(&waiting, 1, 20'000) != 1) {
            return false;
        }
        const auto got = ::read(socket, buffer, sizeof buffer);
        if (got <= 0) {
            return true;
        }
    }
}

}  // namespace typhon
