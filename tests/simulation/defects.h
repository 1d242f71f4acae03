#pragma once

#include "platform/code_signing.h"
#include "platform/file_system.h"
#include "platform/ipc.h"
#include "platform/preferences.h"
#include "platform/work_queues.h"

#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace typhon::simulation {

/// What is wrong with the daemon of a run: each breaks one of the invariants.
enum class Defect {
    none,
    /// Takes a process for the one that it asked about before.
    confusesProcesses,
    /// Answers every call twice.
    answersTwice,
    /// Believes the registry file that it saw first.
    trustsAnOldRegistry,
    /// Says that it flushed, and did not.
    pretendsToFlush,
    /// Holds on to what it made for clients that are gone.
    keepsHandlers,
    /// Forgets now and then to open the gate after a font request.
    losesTheGate,
    /// Opens the gate twice now and then.
    opensTheGateTwice,
};

/// Code signatures, of the wrong process for a confused daemon.
class ConfusableCodeSigning final : public CodeSigning {
public:
    ConfusableCodeSigning(CodeSigning& real, bool isConfused) : real_(real), isConfused_(isConfused) {}
    std::optional<CodeSigningTask> taskFromAuditToken(const AuditToken& token) override;

private:
    CodeSigning& real_;
    const bool isConfused_;
    std::optional<CodeSigningTask> before_;
};

/// The registry file as it was read first, for a daemon that trusts an old one.
class AgeingFileSystem final : public FileSystem {
public:
    AgeingFileSystem(FileSystem& real, bool isOld) : real_(real), isOld_(isOld) {}
    bool exists(const std::string& path) override { return real_.exists(path); }
    PropertyListReading readPropertyList(const std::string& path) override;
    std::optional<std::vector<std::string>> contentsOfDirectory(const std::string& path) override
    {
        return real_.contentsOfDirectory(path);
    }
    std::unique_ptr<ConfinedDeletion> deletionBelow(const std::string& tree) override
    {
        return real_.deletionBelow(tree);
    }

private:
    FileSystem& real_;
    const bool isOld_;
    std::optional<PropertyListReading> first_;
};

/// Preferences that may only pretend to be flushed.
class PretendingPreferences final : public Preferences {
public:
    PretendingPreferences(Preferences& real, bool pretends) : real_(real), pretends_(pretends) {}
    std::optional<PropertyList> value(const std::string& key) override { return real_.value(key); }
    void setValue(const std::string& key, std::optional<PropertyList> value) override
    {
        real_.setValue(key, std::move(value));
    }
    bool synchronize() override { return pretends_ || real_.synchronize(); }

private:
    Preferences& real_;
    const bool pretends_;
};

/// Queues whose semaphores count wrongly where the defect wants it.
class MeddlingQueues final : public WorkQueues {
public:
    MeddlingQueues(WorkQueues& real, Defect defect) : real_(real), defect_(defect) {}
    std::shared_ptr<WorkQueue> createSerialQueue(std::string label) override
    {
        return real_.createSerialQueue(std::move(label));
    }
    WorkQueue& concurrentQueue(Priority priority) override { return real_.concurrentQueue(priority); }
    WorkQueue& mainQueue() override { return real_.mainQueue(); }
    std::shared_ptr<Semaphore> createSemaphore(unsigned initialCount) override;
    std::unique_ptr<Timer> createTimer(WorkQueue& queue, std::function<void()> handler) override
    {
        return real_.createTimer(queue, std::move(handler));
    }
    Task<void> pause(std::chrono::nanoseconds duration) override { return real_.pause(duration); }
    void runMainLoop() override { real_.runMainLoop(); }

private:
    WorkQueues& real_;
    const Defect defect_;
};

/// The daemon's transport, which knows what the daemon holds for each client of its named service, and comes
/// between them where the defect wants it. What it hands out must not outlive it.
class MeddlingIpc final : public Ipc {
public:
    MeddlingIpc(Ipc& real, Defect defect) : real_(real), defect_(defect) {}
    std::shared_ptr<Listener> listenerForService(std::string name) override;
    std::shared_ptr<Listener> anonymousListener() override { return real_.anonymousListener(); }
    std::shared_ptr<Connection> connectionToEndpoint(std::shared_ptr<ListenerEndpoint> endpoint) override
    {
        return real_.connectionToEndpoint(std::move(endpoint));
    }
    std::shared_ptr<Connection> connectionToService(std::string name) override
    {
        return real_.connectionToService(std::move(name));
    }

    /// Connections that the daemon accepted, and objects that serve them, which somebody still holds.
    std::size_t held() const;
    /// Lets go of what a defect keeps, which must not outlive the device.
    void release() { kept_.clear(); }

private:
    class Delegate;
    class NamedListener;

    Ipc& real_;
    const Defect defect_;
    /// The transport does not keep its delegates.
    std::vector<std::shared_ptr<ListenerDelegate>> delegates_;
    std::vector<std::weak_ptr<void>> made_;
    std::vector<std::shared_ptr<void>> kept_;
};

}  // namespace typhon::simulation
