#pragma once

#include "fontmanager/daemon/caller_identity.h"
#include "platform/ipc.h"

#include <memory>

namespace typhon {

/// Asks the font daemon who callers are: it alone can see the programs of other users and knows the
/// sandboxes. Any thread.
class DaemonIdentities final : public CallerIdentities {
public:
    /// `ipc` outlives this.
    explicit DaemonIdentities(Ipc& ipc);
    ~DaemonIdentities() override;

    Task<Answer> identityOf(AuditToken caller) override;

private:
    const std::shared_ptr<Connection> daemon_;
};

}  // namespace typhon
