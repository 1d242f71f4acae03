#pragma once

#include "platform/linux/event_pool.h"
#include "platform/linux/file_descriptor.h"
#include "platform/log.h"
#include "platform/work_queues.h"

#include <chrono>
#include <functional>
#include <memory>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon {

/// Where the system bus listens, as a logical path.
inline constexpr const char* systemBusSocket = "/run/dbus/system_bus_socket";

/// What uses a connection to the bus. Every call comes on the connection's queue.
class SystemBusUser {
public:
    virtual ~SystemBusUser() = default;
    /// A new connection is there, with nothing on it yet: the moment to add filters, matches and objects, and
    /// to ask for names. `bus` may be used on the connection's queue until `busLost`.
    virtual void busConnected(sd_bus* bus) = 0;
    /// The connection is gone, and with it all that was added.
    virtual void busLost() = 0;
};

/// A connection to the system bus that lasts longer than the bus does: it is made when the bus is there, and
/// again after every loss, with pauses that grow from a tenth of a second to five. Each absence is logged
/// once. Hold it by a shared pointer; dropping that ends it. Any thread.
class SystemBus : public std::enable_shared_from_this<SystemBus> {
public:
    /// `socketPath` is a real path. The services outlive the connection and everything on its queue.
    SystemBus(EventPool& pool, WorkQueues& queues, Log& log, std::string socketPath);
    SystemBus(const SystemBus&) = delete;
    SystemBus& operator=(const SystemBus&) = delete;
    ~SystemBus();

    /// Begins to connect. Once.
    void start(std::weak_ptr<SystemBusUser> user);

    /// Where everything about the connection happens.
    const std::shared_ptr<WorkQueue>& queue() const { return queue_; }

    /// Runs `work` on the connection's queue if there is a connection, also while its handshake goes on; else
    /// drops it.
    void withBus(std::function<void(sd_bus* bus)> work);

private:
    using Clock = std::chrono::steady_clock;

    // All on the queue.
    void connect();
    int open(FileDescriptor socket);
    void process();
    void announce(SystemBusUser& user);
    void arm();
    void timerFired();
    void lose(const std::string& reason);
    void closeBus();
    void retryLater();
    void onQueue(void (SystemBus::*step)());

    EventPool& pool_;
    WorkQueues& queues_;
    Log& log_;
    const std::string socketPath_;
    const std::shared_ptr<WorkQueue> queue_;

    // Owned by the queue.
    std::unique_ptr<Timer> timer_;
    std::weak_ptr<SystemBusUser> user_;
    sd_bus* bus_ = nullptr;
    std::unique_ptr<EventPool::Watch> watch_;
    bool isReady_ = false;
    bool absenceIsLogged_ = false;
    Clock::time_point connectedAt_;
    std::chrono::nanoseconds delay_;
};

}  // namespace typhon
