#include "requests/request_gate.h"

#include <chrono>

namespace typhon {

Task<void> RequestGate::enter(std::string signingIdentifier)
{
    auto& gate = platform_.requestGate;
    if (gate.inFlight.fetch_add(1) != 0) {
        systemLog(platform_.log,
                  "Previous LFFontManagerRequestFonts call has not been resolved.  This call from \"" +
                      signingIdentifier +
                      "\" is blocked until the previous call is acknowledged by the user.");
    }
    auto turn = gate.semaphore().wait();
    co_await std::move(turn);
}

Task<void> RequestGate::leave()
{
    // Intended: whatever queue finishes a request is held for a second. That may be `mainHandlerQueue`, and
    // delays everything else that waits there.
    auto pause = platform_.queues.pause(std::chrono::seconds(1));
    co_await std::move(pause);
    platform_.queues.mainQueue().async([&gate = platform_.requestGate] {
        --gate.inFlight;
        gate.semaphore().signal();
    });
}

}  // namespace typhon
