#pragma once

#include "platform/platform.h"
#include "platform/task.h"

#include <functional>

namespace typhon {

/// Keeps reads of the registry file and the acknowledgements of clients' updates strictly one after
/// another, on the process-wide serial queue "com.vorlan.typhon.UpdatingUserFonts". A client that was
/// answered knows that the daemon is not in the middle of reading the registry. Changes no state. Any
/// thread.
class UserFontUpdates {
public:
    /// `queues` outlives this.
    explicit UserFontUpdates(ProcessWideQueues& queues) : queues_(queues) {}

    /// `updatingUserFonts:`, as clients call it. Runs `block` on the queue and suspends the caller until it
    /// has returned. The block must not call either form again.
    Task<void> updatingUserFonts(std::function<void()> block);

    /// The same for the daemon's own reading: blocks the calling thread, for as long as the reads and
    /// acknowledgements before it take.
    void updatingUserFontsAndWait(const std::function<void()>& block);

private:
    WorkQueue& queue();

    ProcessWideQueues& queues_;
};

}  // namespace typhon
