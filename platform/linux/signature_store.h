#pragma once

#include "platform/code_signing.h"
#include "platform/linux/bounded_cache.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/signing.h"
#include "platform/linux/trusted_keys.h"
#include "platform/log.h"

#include <mutex>
#include <optional>
#include <string>

namespace typhon {

/// What the signatures in /var/lib/typhon/signatures say about executables, as far as the trusted keys of the
/// moment may say it. Any thread; blocks on the disk.
class SignatureStore {
public:
    /// `root` and `log` outlive this.
    SignatureStore(const RootDirectory& root, Log& log) : root_(root), log_(log), keys_(root, log) {}

    /// The identifier and entitlements of an executable with that digest; neither without a valid signature.
    CodeSigningTask taskOfExecutable(const Sha256& executable);

    /// The digest of an executable file, computed once for as long as it is not changed. Null for anything
    /// but a readable regular file of reasonable size on a file system that the kernel itself serves.
    std::optional<Sha256> digestOfExecutable(int descriptor);

    /// A file by the name it was found under: its digest if that is known, otherwise itself, to be read.
    struct Executable {
        std::optional<Sha256> digest;
        FileDescriptor file;
    };
    /// What the process whose directory in /proc it is runs. Reads nothing of it yet.
    Executable executableOf(int processDirectory);
    /// Null as above.
    std::optional<Sha256> digestOf(const Executable& executable);

private:
    /// A state of a file on one mount, which is for good a mount of one file system.
    struct FileOnMount {
        FileIdentity file;
        /// Zero when the kernel does not tell.
        std::uint64_t mount = 0;
        // NOLINTNEXTLINE(modernize-use-nullptr): it misreads the comparison
        auto operator<=>(const FileOnMount&) const = default;
    };
    static std::optional<FileOnMount> executableAt(int directory, const char* name);
    std::optional<Sha256> knownDigest(const FileOnMount& executable);
    struct Known {
        FileIdentity file;
        TrustedKeys::Snapshot keys;
        CodeSigningTask task;
    };
    CodeSigningTask read(const Sha256& executable, const std::vector<TrustedKey>& keys);

    const RootDirectory& root_;
    Log& log_;
    TrustedKeys keys_;
    std::mutex mutex_;
    BoundedCache<Sha256, Known> known_{4096};
    BoundedCache<FileOnMount, Sha256> digests_{4096};
};

}  // namespace typhon
