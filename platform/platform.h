#pragma once

#include "platform/analytics.h"
#include "platform/application_registry.h"
#include "platform/asset_service.h"
#include "platform/background_activity.h"
#include "platform/clock.h"
#include "platform/code_signing.h"
#include "platform/file_events.h"
#include "platform/file_system.h"
#include "platform/ipc.h"
#include "platform/log.h"
#include "platform/notifications.h"
#include "platform/preferences.h"
#include "platform/process_lifecycle.h"
#include "platform/remote_alert.h"
#include "platform/sandbox.h"
#include "platform/user_font_manager.h"
#include "platform/work_queues.h"

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>

namespace typhon {

/// Serial queues that belong to the process rather than to one daemon object, each created on first use
/// and kept. Any thread.
class ProcessWideQueues {
public:
    explicit ProcessWideQueues(WorkQueues& queues) : queues_(queues) {}

    WorkQueue& serialQueue(const std::string& label)
    {
        const std::lock_guard lock(mutex_);
        auto& queue = byLabel_[label];
        if (!queue) {
            queue = queues_.createSerialQueue(label);
        }
        return *queue;
    }

private:
    WorkQueues& queues_;
    std::mutex mutex_;
    std::map<std::string, std::shared_ptr<WorkQueue>> byLabel_;
};

/// The state of the gate that lets one font request at a time through. Any thread.
class ProcessWideGate {
public:
    explicit ProcessWideGate(WorkQueues& queues) : queues_(queues) {}

    /// Of initial count one, created on first use.
    Semaphore& semaphore()
    {
        std::call_once(once_, [this] { semaphore_ = queues_.createSemaphore(1); });
        return *semaphore_;
    }

    /// Requests that were admitted or wait.
    std::atomic<std::int32_t> inFlight{0};

private:
    WorkQueues& queues_;
    std::once_flag once_;
    std::shared_ptr<Semaphore> semaphore_;
};

/// Every service the daemon stands on, and what is process-wide. Built by `main` (or by a test), which
/// keeps the services alive for as long as anything uses them.
struct Platform {
    WorkQueues& queues;
    Clock& clock;
    Ipc& ipc;
    CodeSigning& codeSigning;
    Sandbox& sandbox;
    Preferences& preferences;
    FileSystem& fileSystem;
    Log& log;
    ApplicationRegistry& applicationRegistry;
    TYUserFontManager& userFontManager;
    ProcessLifecycle& processLifecycle;
    RemoteAlerts& remoteAlerts;
    Analytics& analytics;
    Notifications& notifications;
    AssetService& assetService;
    FileEvents& fileEvents;
    BackgroundActivities& backgroundActivities;
    /// The internal-build query: whether this is an internal build of the system.
    bool isInternalBuild = false;

    ProcessWideQueues processWideQueues{queues};
    ProcessWideGate requestGate{queues};
};

}  // namespace typhon
