#include "idle_clients.h"

#include "platform/linux/file_descriptor.h"
#include "raw_client.h"

#include <algorithm>
#include <exception>
#include <stdexcept>

#include <fcntl.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr std::size_t perProcess = 200;

void hold(const std::string& socketPath, std::size_t count, const char* interface, const char* member,
          int ready)
{
    try {
        std::vector<RawClient> clients;
        for (std::size_t index = 0; index < count; ++index) {
            clients.emplace_back(socketPath).call(interface, member);
        }
        [[maybe_unused]] const auto told = ::write(ready, "+", 1);
        ::pause();
    } catch (const std::exception&) {
        // The missing sign says it.
    }
}

}  // namespace

IdleClients::IdleClients(const std::string& socketPath, std::size_t count, const char* interface,
                         const char* member)
{
    while (count > 0) {
        const auto share = std::min(count, perProcess);
        int ends[2]{};
        if (::pipe2(ends, O_CLOEXEC) != 0) {
            throw std::runtime_error("no pipe");
        }
        const FileDescriptor reading(ends[0]);
        FileDescriptor writing(ends[1]);
        holders_.emplace_back([&] { hold(socketPath, share, interface, member, writing.get()); });
        writing = FileDescriptor();
        char sign = 0;
        if (::read(reading.get(), &sign, 1) != 1) {
            throw std::runtime_error("a client was not served at " + socketPath);
        }
        count -= share;
    }
}

}  // namespace typhon::bench
