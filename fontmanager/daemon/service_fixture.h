#pragma once

// The helper's service in this process, with callers whose identity the test decides.

#include "fontmanager/daemon/font_registry_service.h"
#include "fontmanager/daemon/peer_process.h"
#include "fontmanager/font_paths.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/linux_ipc.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/linux_work_queues.h"
#include "platform/linux/scratch_directory.h"

#include <condition_variable>
#include <filesystem>
#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include <unistd.h>

namespace typhon::test_service {

/// Gives every caller the same identity, or an error.
class DecidedIdentities final : public CallerIdentities {
public:
    Task<Answer> identityOf(AuditToken caller) override
    {
        Answer answer;
        {
            const std::lock_guard lock(mutex_);
            answer = answer_;
        }
        if (answer.identity) {
            answer.identity->user = caller.effectiveUser;
        }
        co_return answer;
    }
    void become(std::optional<std::string> identifier, std::vector<std::string> capabilities,
                bool isSandboxed)
    {
        const std::lock_guard lock(mutex_);
        answer_ = {};
        answer_.identity = CallerIdentity{};
        answer_.identity->signature.signingIdentifier = std::move(identifier);
        answer_.identity->signature.entitlements.emplace("com.vorlan.developer.user-fonts",
                                                         arrayOfStrings(capabilities));
        answer_.identity->isSandboxed = isSandboxed;
    }
    void becomeAdministrator() { become(std::nullopt, {}, false); }
    void becomeProvider(const std::string& identifier) { become(identifier, {"system-installation"}, true); }
    void failWith(IpcError error)
    {
        const std::lock_guard lock(mutex_);
        answer_ = {.identity = std::nullopt, .error = std::move(error)};
    }

private:
    std::mutex mutex_;
    Answer answer_;
};

/// Writes down what is reported, as lines.
class KeptReports final : public ChangeReports {
public:
    Task<void> announce() override
    {
        add("updating");
        co_return;
    }
    Task<void> report(RegistryChange change, Kind kind) override
    {
        const std::string suffix = kind == Kind::userFonts ? "" : " of profiles";
        for (const auto& path : change.available) {
            add("+" + path.substr(path.rfind('/') + 1) + suffix);
        }
        for (const auto& path : change.gone) {
            add("-" + path.substr(path.rfind('/') + 1) + suffix);
        }
        co_return;
    }
    std::vector<std::string> taken()
    {
        const std::lock_guard lock(mutex_);
        return std::exchange(lines_, {});
    }
    /// The labels of the queues on which something was reported.
    std::set<std::string> queues()
    {
        const std::lock_guard lock(mutex_);
        return queues_;
    }

private:
    void add(std::string line)
    {
        const std::lock_guard lock(mutex_);
        lines_.push_back(std::move(line));
        queues_.insert(WorkItem::current()->queue.label());
    }
    std::mutex mutex_;
    std::vector<std::string> lines_;
    std::set<std::string> queues_;
};

class RunningService {
public:
    explicit RunningService(const RootDirectory& root, ReadFontNames readNames)
        : store(root, readNames, log), profileFonts(root, readNames, log), fontAssets(root, readNames, log),
          ipc(pool, queues, log, root, instanceOfPeer, IpcLimits{}, EndpointHandshake::client)
    {
        openError = store.open().error;
        store.changeWasReported();
        service =
            std::make_shared<FontRegistryService>(FontRegistryService::Parts{.store = store,
                                                                             .profileFonts = profileFonts,
                                                                             .fontAssets = fontAssets,
                                                                             .identities = identities,
                                                                             .reports = reports,
                                                                             .log = log,
                                                                             .changes = *changes},
                                                  OwnUser{.user = ::geteuid()});
        listener = startFontRegistryService(ipc, service);
        identities.becomeAdministrator();
    }
    RunningService(const RunningService&) = delete;
    RunningService& operator=(const RunningService&) = delete;
    ~RunningService()
    {
        listener->invalidate();
        pool.stop();
    }

    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    EventPool pool;
    LinuxWorkQueues queues{pool};
    std::shared_ptr<WorkQueue> changes = queues.createSerialQueue("com.vorlan.typhond.fontChanges");
    DecidedIdentities identities;
    KeptReports reports;
    FontStore store;
    ProfileFonts profileFonts;
    FontAssets fontAssets;
    LinuxIpc ipc;
    std::optional<std::string> openError;
    std::shared_ptr<FontRegistryService> service;
    std::shared_ptr<Listener> listener;
};

}  // namespace typhon::test_service
