#include "receivers.h"

#include "raw_client.h"

#include <algorithm>
#include <exception>
#include <stdexcept>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/epoll.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr std::size_t perProcess = 200;

int count(sd_bus_message* /*message*/, void* received, sd_bus_error* /*error*/)
{
    ++*static_cast<std::size_t*>(received);
    return 1;
}

void watch(int poll, sd_bus* bus)
{
    epoll_event interest{};
    interest.events = EPOLLIN;
    interest.data.ptr = bus;
    ::epoll_ctl(poll, EPOLL_CTL_ADD, sd_bus_get_fd(bus), &interest);
}

void giveSign(int signs)
{
    [[maybe_unused]] const auto told = ::write(signs, "+", 1);
}

/// Gives a sign once all are connected, and one for every message that each has had.
void hold(const std::string& socketPath, std::size_t share, const char* interface, const char* member,
          int signs)
{
    const FileDescriptor poll(::epoll_create1(EPOLL_CLOEXEC));
    std::size_t received = 0;
    std::vector<RawClient> clients;
    for (std::size_t index = 0; index < share; ++index) {
        const auto& client = clients.emplace_back(socketPath);
        client.call(interface, member);
        sd_bus_add_filter(client.bus(), nullptr, count, &received);
        watch(poll.get(), client.bus());
    }
    giveSign(signs);
    for (std::size_t announced = 0;;) {
        epoll_event ready{};
        if (::epoll_wait(poll.get(), &ready, 1, -1) == 1) {
            while (sd_bus_process(static_cast<sd_bus*>(ready.data.ptr), nullptr) > 0) {
            }
        }
        for (; received >= (announced + 1) * share; ++announced) {
            giveSign(signs);
        }
    }
}

void awaitSign(const FileDescriptor& signs)
{
    char sign = 0;
    if (::read(signs.get(), &sign, 1) != 1) {
        throw std::runtime_error("a receiving client has ended");
    }
}

}  // namespace

Receivers::Receivers(const std::string& socketPath, std::size_t count, const char* interface,
                     const char* member)
{
    while (count > 0) {
        const auto share = std::min(count, perProcess);
        int ends[2]{};
        if (::pipe2(ends, O_CLOEXEC) != 0) {
            throw std::runtime_error("no pipe");
        }
        FileDescriptor reading(ends[0]);
        FileDescriptor writing(ends[1]);
        Child process([&] {
            try {
                hold(socketPath, share, interface, member, writing.get());
            } catch (const std::exception& failure) {
                // The missing sign says that something failed.
                fmt::print(stderr, "a receiving client: {}\n", failure.what());
            }
        });
        writing = FileDescriptor();
        awaitSign(reading);
        holders_.push_back({std::move(process), std::move(reading)});
        count -= share;
    }
}

void Receivers::awaitOneEach() const
{
    for (const auto& holder : holders_) {
        awaitSign(holder.signs);
    }
}

}  // namespace typhon::bench
