#pragma once

#include "platform/audit_token.h"
#include "platform/linux/connection_accounting.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/held_bytes.h"
#include "platform/linux/ipc_limits.h"
#include "platform/linux/memory_return.h"
#include "platform/linux/offender_log.h"
#include "platform/linux/peer_pace.h"
#include "platform/linux/root_directory.h"
#include "platform/log.h"
#include "platform/work_queues.h"

#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

namespace typhon {

/// Tells who is at the other end of a connected socket; all zero when nobody can be identified.
using IdentifyPeer = std::function<AuditToken(int socket)>;

/// Who plays the server's part of the D-Bus handshake on a connection to or from an anonymous listener: this
/// process, or the other one. The daemon does always, its clients never do.
enum class EndpointHandshake { server, client };

/// Objects that the transport keeps alive. Any thread.
template <class T>
class LiveObjects {
public:
    void add(std::shared_ptr<T> object)
    {
        const std::lock_guard lock(mutex_);
        const auto* key = object.get();
        objects_.emplace(key, std::move(object));
    }
    /// Gives the reference back, so that it is not dropped under a lock.
    std::shared_ptr<T> remove(const T* object)
    {
        const std::lock_guard lock(mutex_);
        auto node = objects_.extract(object);
        return node.empty() ? nullptr : std::move(node.mapped());
    }
    std::vector<std::shared_ptr<T>> all() const
    {
        const std::lock_guard lock(mutex_);
        std::vector<std::shared_ptr<T>> result;
        for (const auto& [key, object] : objects_) {
            result.push_back(object);
        }
        return result;
    }

private:
    mutable std::mutex mutex_;
    std::unordered_map<const T*, std::shared_ptr<T>> objects_;
};

class LinuxConnection;
class LinuxListener;

/// What all connections and listeners of one transport share.
struct IpcContext {
    EventPool& pool;
    WorkQueues& queues;
    Log& log;
    const RootDirectory root;
    const IdentifyPeer identifyPeer;
    const IpcLimits limits;
    const EndpointHandshake endpointHandshake;
    /// Runs the handlers of timers; the queue of a connection may be held by the very item that waits.
    const std::shared_ptr<WorkQueue> deadlines;
    const std::shared_ptr<ConnectionAccounting> accounting;
    const std::shared_ptr<HeldBytes> heldBytes;
    const std::shared_ptr<MemoryReturn> memoryReturn;
    OffenderLog offenders;
    PeerPace pace;
    /// Where large messages are understood, one after another.
    const std::shared_ptr<WorkQueue> largeMessages;
    LiveObjects<LinuxConnection> connections;
    LiveObjects<LinuxListener> listeners;

    /// Destroys a timer later, since a timer must outlive its own handler.
    void dispose(std::unique_ptr<Timer> timer) const
    {
        if (timer) {
            deadlines->async([keep = std::shared_ptr<Timer>(std::move(timer))] {});
        }
    }
};

}  // namespace typhon
