#pragma once

#include "platform/linux/regular_file.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/signing.h"
#include "platform/log.h"

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

namespace typhon {

/// The keys in a directory, as they are now: a file that was added, changed or removed counts
/// from the next question on. A file that cannot be believed or understood is logged and does not count.
/// Any thread.
class TrustedKeys {
public:
    using Snapshot = std::shared_ptr<const std::vector<TrustedKey>>;

    /// `root` and `log` outlive this, and so does the directory's logical path.
    TrustedKeys(const RootDirectory& root, Log& log, const char* directory = trustedKeysDirectory)
        : root_(root), log_(log), directory_(directory)
    {}

    /// The present keys. The same pointer as before exactly when nothing was re-read.
    Snapshot current();

private:
    /// The directory and what it held, each as it was.
    struct Seen {
        std::optional<FileIdentity> directory;
        std::vector<std::pair<std::string, std::optional<FileIdentity>>> files;
        bool operator==(const Seen&) const = default;
        bool isSettled() const;
    };
    bool isUnchanged() const;
    void load();

    const RootDirectory& root_;
    Log& log_;
    const char* const directory_;
    std::mutex mutex_;
    Snapshot keys_;
    Seen seen_;
    bool isSettled_ = false;
};

/// True when one of the keys may sign the statement.
bool isTrusted(const std::vector<TrustedKey>& keys, const PublicKey& key, const CodeStatement& statement);

}  // namespace typhon
