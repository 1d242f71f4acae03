// The bus is another service's, and may be there from the start, come later, be restarted under us, or never
// exist. Nothing here waits for it: all work is done on one serial queue, in slices, when the socket or the
// timer says so. sd-bus objects know no threads; being touched on that queue only is their protection.

#include "platform/linux/system_bus.h"

#include "platform/linux/unix_sockets.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstring>
#include <utility>

#include <poll.h>
#include <sys/epoll.h>

namespace typhon {

namespace {

constexpr std::chrono::nanoseconds firstDelay = std::chrono::milliseconds(100);
constexpr std::chrono::nanoseconds longestDelay = std::chrono::seconds(5);
/// A connection that lasted this long was a good one: the pauses begin anew.
constexpr std::chrono::seconds goodConnection{10};

/// Messages handled before other work of the pool gets its turn.
constexpr int messagesInARow = 256;

std::string errorText(int error)
{
    return std::strerror(-error);
}

}  // namespace

SystemBus::SystemBus(EventPool& pool, WorkQueues& queues, Log& log, std::string socketPath)
    : pool_(pool), queues_(queues), log_(log), socketPath_(std::move(socketPath)),
      queue_(queues.createSerialQueue("com.vorlan.typhon.system-bus")),
      timer_(queues.createTimer(*queue_,
                                [this] {
                                    // Runs on the queue, which a shared owner may have left meanwhile.
                                    if (const auto self = weak_from_this().lock()) {
                                        self->timerFired();
                                    }
                                })),
      delay_(firstDelay)
{}

SystemBus::~SystemBus()
{
    closeBus();
}

void SystemBus::start(std::weak_ptr<SystemBusUser> user)
{
    queue_->async([weak = weak_from_this(), user = std::move(user)] {
        if (const auto self = weak.lock()) {
            self->user_ = user;
            self->timer_ = self->queues_.createTimer(*self->queue_, [weak] {
                if (const auto live = weak.lock()) {
                    live->timerFired();
                }
            });
            self->connect();
        }
    });
}

void SystemBus::withBus(std::function<void(sd_bus* bus)> work)
{
    queue_->async([weak = weak_from_this(), work = std::move(work)] {
        const auto self = weak.lock();
        if (self && self->bus_ != nullptr) {
            work(self->bus_);
            self->arm();
        }
    });
}

void SystemBus::onQueue(void (SystemBus::*step)())
{
    queue_->async([weak = weak_from_this(), step] {
        if (const auto self = weak.lock()) {
            (*self.*step)();
        }
    });
}

void SystemBus::connect()
{
    auto [socket, problem] = connectToPath(socketPath_);
    if (!socket) {
        lose(problem);
        return;
    }
    const int result = open(std::move(socket));
    if (result < 0) {
        lose(errorText(result));
        return;
    }
    process();
}

int SystemBus::open(FileDescriptor socket)
{
    int result = sd_bus_new(&bus_);
    if (result < 0) {
        return result;
    }
    result = sd_bus_set_fd(bus_, socket.get(), socket.get());
    if (result < 0) {
        return result;
    }
    const int descriptor = socket.release();
    sd_bus_set_bus_client(bus_, 1);
    sd_bus_negotiate_fds(bus_, 0);
    result = sd_bus_start(bus_);
    if (result >= 0) {
        watch_ = pool_.watch(descriptor, [weak = weak_from_this()](std::uint32_t) {
            if (const auto self = weak.lock()) {
                self->onQueue(&SystemBus::process);
            }
        });
    }
    return result;
}

void SystemBus::process()
{
    // What was added to the bus refers to the user, who has to be there while messages are handled.
    const auto user = user_.lock();
    if (bus_ == nullptr || !user) {
        return;
    }
    for (int message = 0; message < messagesInARow; ++message) {
        const int result = sd_bus_process(bus_, nullptr);
        if (result < 0 || sd_bus_is_open(bus_) <= 0) {
            lose(result < 0 ? errorText(result) : "it closed the connection");
            return;
        }
        announce(*user);
        if (result == 0) {
            arm();
            return;
        }
    }
    onQueue(&SystemBus::process);
}

void SystemBus::announce(SystemBusUser& user)
{
    if (isReady_ || sd_bus_is_ready(bus_) <= 0) {
        return;
    }
    isReady_ = true;
    connectedAt_ = Clock::now();
    if (std::exchange(absenceIsLogged_, false)) {
        TYLog(log_, "connected to the system bus at " + socketPath_);
    }
    user.busConnected(bus_);
}

void SystemBus::arm()
{
    const int wanted = sd_bus_get_events(bus_);
    std::uint32_t events = EPOLLIN;
    if (wanted >= 0) {
        events = ((wanted & POLLIN) != 0 ? EPOLLIN : 0U) | ((wanted & POLLOUT) != 0 ? EPOLLOUT : 0U);
    }
    watch_->arm(events);
    std::uint64_t due = 0;
    if (sd_bus_get_timeout(bus_, &due) > 0) {
        const auto now =
            std::chrono::duration_cast<std::chrono::microseconds>(Clock::now().time_since_epoch());
        const auto delay = std::chrono::microseconds(due) - now;
        timer_->schedule(delay, std::chrono::milliseconds(10));
    } else {
        timer_->cancel();
    }
}

void SystemBus::timerFired()
{
    if (bus_ != nullptr) {
        process();
    } else {
        connect();
    }
}

void SystemBus::lose(const std::string& reason)
{
    const bool wasReady = std::exchange(isReady_, false);
    closeBus();
    if (!std::exchange(absenceIsLogged_, true)) {
        TYLog(log_, (wasReady ? "lost the system bus at " : "no system bus at ") + socketPath_ + " (" +
                        reason + "): no notifications until it is there");
    }
    if (wasReady) {
        if (Clock::now() - connectedAt_ >= goodConnection) {
            delay_ = firstDelay;
        }
        if (const auto user = user_.lock()) {
            user->busLost();
        }
    }
    retryLater();
}

void SystemBus::closeBus()
{
    watch_.reset();
    sd_bus_close_unref(std::exchange(bus_, nullptr));
}

void SystemBus::retryLater()
{
    timer_->schedule(delay_, delay_ / 10);
    delay_ = std::min(delay_ * 2, longestDelay);
}

}  // namespace typhon
