#pragma once

// The worlds in which every transport is tested.

#include "ipc_world.h"
#include "platform/linux/audit_tokens.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/simulated/simulated_ipc.h"
#include "platform/simulated/simulated_log.h"
#include "platform/simulated/simulated_scheduler.h"
#include "platform/simulated/simulated_work_queues.h"

#include <array>
#include <filesystem>

#include <gtest/gtest.h>
#include <sys/socket.h>

namespace typhon {

/// Both ends on one simulated machine, with that seed; they are two processes.
template <std::uint64_t Seed>
class SimulatedWorld : public IpcWorld {
public:
    Ipc& server() override { return machine_; }
    Ipc& client() override { return *client_; }
    WorkQueues& queues() override { return queues_; }
    AuditToken serverToken() const override { return {1, 10, 100, 1, 0, 1}; }
    AuditToken clientToken() const override { return {1, 20, 200, 1, 1000, 1}; }
    bool waitUntil(Notes& notes, const Notes::Predicate& predicate) override
    {
        scheduler_.runUntilIdle();
        return notes.holds(predicate);
    }
    void passTime(std::chrono::nanoseconds duration) override { scheduler_.advance(duration); }

private:
    SimulatedScheduler scheduler_{Seed};
    SimulatedWorkQueues queues_{scheduler_};
    SimulatedLog log_;
    SimulatedIpc machine_{queues_, log_, AuditToken{1, 10, 100, 1, 0, 1}};
    std::shared_ptr<Ipc> client_ = machine_.process({1, 20, 200, 1, 1000, 1});
};

class SilentLog : public Log {
public:
    void write(LogSink, LogLevel, std::string_view) override {}
};

class TemporaryFolder {
public:
    TemporaryFolder()
    {
        std::string pattern = std::filesystem::temp_directory_path() / "typhon-ipc-XXXXXX";
        path = ::mkdtemp(pattern.data());
    }
    ~TemporaryFolder() { std::filesystem::remove_all(path); }
    std::string path;
};

/// Both ends in this process, over real sockets in a folder of their own.
class LinuxWorld : public IpcWorld {
public:
    ~LinuxWorld() override
    {
        client_.reset();
        server_.reset();
        // The end of a connection may still be handled.
        pool_.stop();
    }
    Ipc& server() override { return *server_; }
    Ipc& client() override { return *client_; }
    WorkQueues& queues() override { return queues_; }
    AuditToken serverToken() const override { return ownToken(); }
    AuditToken clientToken() const override { return ownToken(); }
    bool waitUntil(Notes& notes, const Notes::Predicate& predicate) override
    {
        return notes.waitFor(predicate, std::chrono::seconds(20));
    }
    void passTime(std::chrono::nanoseconds) override {}

private:
    static AuditToken ownToken()
    {
        std::array<int, 2> pair{};
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair.data()), 0);
        const FileDescriptor one(pair[0]);
        const FileDescriptor other(pair[1]);
        return tokenOfPeer(one.get());
    }

    TemporaryFolder folder_;
    SilentLog log_;
    EventPool pool_;
    LinuxWorkQueues queues_{pool_};
    std::unique_ptr<LinuxIpc> server_ =
        std::make_unique<LinuxIpc>(pool_, queues_, log_, RootDirectory(folder_.path), tokenOfPeer);
    std::unique_ptr<LinuxIpc> client_ =
        std::make_unique<LinuxIpc>(pool_, queues_, log_, RootDirectory(folder_.path), tokenOfPeer,
                                   IpcLimits{}, EndpointHandshake::client);
};

}  // namespace typhon
