#include "platform/linux/sandbox_instances.h"

#include "platform/linux/audit_tokens.h"
#include "platform/linux/pidfd.h"
#include "platform/linux/process_namespace.h"

#include <algorithm>
#include <map>
#include <mutex>

#include <fcntl.h>
#include <sys/epoll.h>

// Inside a sandbox nothing that a process shows of itself can be believed: with a user namespace of its own
// it can make /proc/PID/exe read as any program. What it cannot change is the process namespace it lives in.
// So the identity is bound to that namespace, by a launcher outside, before the first program in it runs. The
// namespace is held open, so that its inode cannot come to mean another one while it is registered.

namespace typhon {

struct SandboxInstances::Instance {
    std::uint64_t serial = 0;
    uid_t user = 0;
    Sha256 executable{};
    FileDescriptor processNamespace;
    FileDescriptor firstProcess;
    /// Last, so that it stops before the descriptor it watches is closed.
    std::unique_ptr<EventPool::Watch> watch;
};

struct SandboxInstances::Table {
    std::mutex mutex;
    std::map<Inode, std::unique_ptr<Instance>> instances;
    std::uint64_t serial = 0;

    void forget(const Inode& where, std::uint64_t serial);
};

/// What was seen of a process that is said to be the first of a sandbox.
struct SandboxInstances::Candidate {
    FileDescriptor processNamespace;
    uid_t user = 0;
};

SandboxInstances::SandboxInstances(const ConfinementProbe& probe, SignatureStore& signatures, EventPool& pool,
                                   Limits limits)
    : probe_(probe), signatures_(signatures), pool_(pool), limits_(limits), table_(std::make_shared<Table>())
{}

SandboxInstances::~SandboxInstances() = default;

bool SandboxInstances::mayRegister(const AuditToken& caller) const
{
    return inspectProcess(caller, [this](const ProcessInspection& process) {
               return std::optional(!probe_.look(process).isSandboxed);
           }) == true;
}

std::optional<SandboxInstances::Candidate>
SandboxInstances::candidateOf(const FileDescriptor& firstProcess) const
{
    const auto token = isPidfd(firstProcess.get()) ? tokenOfProcess(firstProcess.get()) : AuditToken{};
    return inspectProcess(token, [&](const ProcessInspection& process) -> std::optional<Candidate> {
        const auto user = processOfPidfd(process.pidfd());
        auto space = openProcessNamespace(process.directory());
        if (!user || user->effectiveUser != user->realUser || !space || !isFirstOfItsNamespace(process) ||
            inodeAt(space.get(), "") == probe_.hostProcessNamespace()) {
            return std::nullopt;
        }
        return Candidate{std::move(space), user->realUser};
    });
}

SandboxInstances::Outcome SandboxInstances::registerInstance(const AuditToken& caller,
                                                             FileDescriptor firstProcess, int executable)
{
    if (!mayRegister(caller)) {
        return {Refusal::notAllowed, "only a process outside of any sandbox may register one"};
    }
    auto candidate = candidateOf(firstProcess);
    if (!candidate) {
        return {Refusal::invalid, "that is not the first process of a process namespace of its own"};
    }
    if (caller.effectiveUser != 0 && caller.effectiveUser != candidate->user) {
        return {Refusal::notAllowed, "that sandbox belongs to another user"};
    }
    const int flags = ::fcntl(executable, F_GETFL);
    const bool isReadable = flags >= 0 && (flags & O_PATH) == 0 && (flags & O_ACCMODE) != O_WRONLY;
    const auto digest = isReadable ? signatures_.digestOfExecutable(executable) : std::nullopt;
    if (!digest) {
        return {Refusal::invalid, "that is not an executable file opened for reading"};
    }
    auto instance = std::make_unique<Instance>();
    instance->user = candidate->user;
    instance->executable = *digest;
    instance->processNamespace = std::move(candidate->processNamespace);
    instance->firstProcess = std::move(firstProcess);
    const auto where = inodeAt(instance->processNamespace.get(), "");
    return where ? insert(std::move(instance), *where) : Outcome{Refusal::invalid, "it is gone"};
}

SandboxInstances::Outcome SandboxInstances::insert(std::unique_ptr<Instance> instance, const Inode& where)
{
    const std::lock_guard lock(table_->mutex);
    auto& instances = table_->instances;
    const auto mine = std::ranges::count_if(
        instances, [&](const auto& entry) { return entry.second->user == instance->user; });
    if (static_cast<std::size_t>(mine) >= limits_.perUser) {
        return {Refusal::tooMany, "that user has too many sandboxes already"};
    }
    if (instances.contains(where)) {
        return {Refusal::alreadyRegistered, "that sandbox is registered already"};
    }
    instance->serial = ++table_->serial;
    auto& stored = *(instances[where] = std::move(instance));
    const std::weak_ptr<Table> weakTable = table_;
    stored.watch = pool_.watch(stored.firstProcess.get(), [weakTable, where, serial = stored.serial](auto) {
        if (const auto table = weakTable.lock()) {
            table->forget(where, serial);
        }
    });
    stored.watch->arm(EPOLLIN);
    return {};
}

void SandboxInstances::Table::forget(const Inode& where, std::uint64_t ofSerial)
{
    std::unique_ptr<Instance> gone;
    const std::lock_guard lock(mutex);
    const auto found = instances.find(where);
    if (found != instances.end() && found->second->serial == ofSerial) {
        gone = std::move(found->second);
        instances.erase(found);
    }
}

std::optional<CodeSigningTask> SandboxInstances::taskOf(const ProcessInspection& process) const
{
    std::optional<Sha256> executable;
    const auto visit = [&](const Inode& where) {
        const std::lock_guard lock(table_->mutex);
        const auto found = table_->instances.find(where);
        if (found == table_->instances.end() || hasExited(found->second->firstProcess.get())) {
            return false;
        }
        executable = found->second->executable;
        return true;
    };
    if (!walkOutwards(openProcessNamespace(process.directory()), visit)) {
        return std::nullopt;
    }
    return signatures_.taskOfExecutable(*executable);
}

std::size_t SandboxInstances::count() const
{
    const std::lock_guard lock(table_->mutex);
    return table_->instances.size();
}

}  // namespace typhon
