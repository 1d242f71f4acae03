#include "platform/linux/memory_return.h"

#include <malloc.h>

namespace typhon {

void MemoryReturn::connectionClosed()
{
    const std::lock_guard lock(mutex_);
    if (delay_.count() == 0 || scheduled_) {
        return;
    }
    if (!timer_) {
        timer_ = queues_.createTimer(*queue_, [weak = weak_from_this()] {
            if (const auto self = weak.lock()) {
                self->giveBack();
            }
        });
    }
    scheduled_ = true;
    timer_->schedule(delay_, delay_ / 10);
}

void MemoryReturn::giveBack()
{
    {
        const std::lock_guard lock(mutex_);
        scheduled_ = false;
    }
    ::malloc_trim(0);
}

}  // namespace typhon
