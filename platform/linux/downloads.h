#pragma once

#include "platform/linux/download_wire.h"
#include "platform/linux/event_pool.h"
#include "platform/linux/root_directory.h"
#include "platform/linux/timer_service.h"

#include <functional>
#include <memory>
#include <string>

namespace typhon {

/// Downloads by processes of their own, of which nothing is believed: neither that they answer in time or at
/// all, nor what they answer. Any thread; none ever waits for the network.
class Downloads {
public:
    /// Called once, on a thread of the pool.
    using Then = std::function<void(DownloadAnswer answer)>;

    /// The pool outlives this. `program` is for tests (see `DownloaderProcess`).
    Downloads(EventPool& pool, RootDirectory root, std::string program = {});
    /// Ends all of them; what has not been called by now is never called.
    ~Downloads();

    /// Begins a download, now or as soon as there are few enough. A discretionary one waits until no other is
    /// running or waiting.
    void start(const DownloadRequest& request, bool discretionary, Then then);

    /// Others that run at the same time, and those that may wait; what is beyond is refused.
    static constexpr std::size_t mostRunning = 4;
    static constexpr std::size_t mostWaiting = 64;

private:
    class State;
    std::shared_ptr<State> state_;
};

}  // namespace typhon
