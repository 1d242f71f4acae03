#pragma once

#include "platform/audit_token.h"
#include "platform/code_signing.h"
#include "platform/linux/confinement.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/process_inspection.h"
#include "platform/linux/signature_store.h"

#include <cstddef>
#include <memory>
#include <optional>
#include <string>

namespace typhon {

/// The sandboxes that a launcher outside has vouched for, each with the executable it was started for. A
/// process belongs to the innermost registered sandbox whose process namespace holds it, whatever it says of
/// itself. A sandbox is forgotten when its first process ends. Any thread.
class SandboxInstances {
public:
    struct Limits {
        std::size_t perUser = 256;
    };
    enum class Refusal { none, notAllowed, invalid, alreadyRegistered, tooMany };
    struct Outcome {
        Refusal refusal = Refusal::none;
        /// Says what is wrong with the request; empty when it was granted.
        std::string explanation;
    };

    /// All of them outlive this.
    SandboxInstances(const ConfinementProbe& probe, SignatureStore& signatures, EventPool& pool,
                     Limits limits);
    SandboxInstances(const ConfinementProbe& probe, SignatureStore& signatures, EventPool& pool)
        : SandboxInstances(probe, signatures, pool, Limits{})
    {}
    ~SandboxInstances();

    /// `caller` vouches that the sandbox whose first process is behind `firstProcess` (a pidfd) runs
    /// `executable` (a file opened for reading). Allowed to an unsandboxed process of the same user, and to
    /// root's. An executable without a valid signature gives the sandbox no identity, which is no error.
    Outcome registerInstance(const AuditToken& caller, FileDescriptor firstProcess, int executable);

    /// The identity of the sandbox that the process lives in, or null when nobody registered one.
    std::optional<CodeSigningTask> taskOf(const ProcessInspection& process) const;

    std::size_t count() const;

private:
    struct Instance;
    struct Table;
    struct Candidate;
    bool mayRegister(const AuditToken& caller) const;
    std::optional<Candidate> candidateOf(const FileDescriptor& firstProcess) const;
    Outcome insert(std::unique_ptr<Instance> instance, const Inode& where);

    const ConfinementProbe& probe_;
    SignatureStore& signatures_;
    EventPool& pool_;
    const Limits limits_;
    /// Shared with the watches on the first processes, which may outlive this by a moment.
    const std::shared_ptr<Table> table_;
};

}  // namespace typhon
