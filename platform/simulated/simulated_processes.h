#pragma once

#include "platform/audit_token.h"
#include "platform/property_list.h"

#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <utility>

namespace typhon {

/// What a test says about one process.
struct SimulatedProcess {
    /// Null for a process without a valid signature (then without entitlements), and for a signature that
    /// names nobody.
    std::optional<std::string> signingIdentifier = std::nullopt;
    PropertyList::Dictionary entitlements = {};
    bool isSandboxed = true;
    /// Logical paths that it can read by itself: the file or directory itself, nothing beneath it.
    std::set<std::string> readablePaths = {};
    /// False to let the issuing of read extensions fail.
    bool acceptsExtensions = true;
};

/// The processes of a simulated machine, by audit token. A token that is not here names no process. Shared
/// by the simulated code signing and sandbox. Any thread.
class SimulatedProcesses {
public:
    /// Adds a process and returns its token, different from all others.
    AuditToken add(SimulatedProcess process);
    /// Replaces what is known of a process, or adds one with a token of the test's own.
    void set(const AuditToken& token, SimulatedProcess process);

    /// The process exits: its token names nobody from now on.
    void exit(const AuditToken& token);

    /// The process becomes another program: the old token names nobody, the new one is returned. `process`
    /// is the new program.
    AuditToken exec(const AuditToken& token, SimulatedProcess process);

    std::optional<SimulatedProcess> find(const AuditToken& token) const;

private:
    using Key = std::pair<std::uint64_t, std::uint64_t>;
    static Key keyOf(const AuditToken& token);
    struct Entry {
        AuditToken token;
        SimulatedProcess process;
    };

    mutable std::mutex mutex_;
    std::map<Key, Entry> byInstance_;
    std::uint64_t count_ = 0;
};

}  // namespace typhon
