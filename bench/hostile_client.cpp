// Bare sockets and prepared bytes, so that the daemon is kept busier than the client.

#include "hostile_client.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/descriptor_passing.h"
#include "platform/linux/introspection.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/opened_bus.h"
#include "platform/linux/property_list_writer.h"
#include "protocol/wire.h"
#include "sdk/service_socket.h"

#include <array>
#include <functional>
#include <span>
#include <stdexcept>
#include <vector>

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr std::size_t callsAtOnce = 100;
constexpr std::size_t mostDescriptors = 253;

using Fill = std::function<void(sd_bus_message*)>;

/// A call as it travels, without the descriptors that go with it.
std::string callBytes(const wire::Operation& operation, bool expectsReply, const Fill& fill = {})
{
    OpenedBus bus;
    std::array<char, 4096> bytes{};
    if (bus.open(true) < 0 || ::recv(bus.farEnd(), bytes.data(), bytes.size(), 0) < 0) {
        throw std::runtime_error("no bus");
    }
    sd_bus_message* raw = nullptr;
    sd_bus_message_new_method_call(bus.get(), &raw, nullptr, exportedObjectPath, operation.interface,
                                   operation.member);
    const BusMessage message(raw);
    sd_bus_message_set_expect_reply(raw, expectsReply ? 1 : 0);
    if (fill) {
        fill(raw);
    }
    sd_bus_send(bus.get(), raw, nullptr);
    const auto size = ::recv(bus.farEnd(), bytes.data(), bytes.size(), 0);
    return {bytes.data(), static_cast<std::size_t>(std::max<ssize_t>(size, 0))};
}

std::string repeated(const std::string& text, std::size_t times)
{
    std::string result;
    while (times-- > 0) {
        result += text;
    }
    return result;
}

class HostileClient {
public:
    explicit HostileClient(std::string path) : path_(std::move(path)) {}

    [[noreturn]] void floods() const;
    [[noreturn]] void neverReads() const;
    [[noreturn]] void halfMessages() const;
    [[noreturn]] void connects() const;
    [[noreturn]] void manyDescriptors() const;
    [[noreturn]] void neverAnswered() const;
    [[noreturn]] void largeValues() const;

private:
    /// Past the handshake.
    FileDescriptor connected() const;
    /// Sends it all, reading meanwhile if it is to; false when the connection has ended.
    static bool send(int socket, std::string_view bytes, bool reads);
    static bool sendWithDescriptors(int socket, std::string_view bytes, int descriptor, std::size_t count);
    static bool readsAnswer(int socket);

    const std::string path_;
};

FileDescriptor HostileClient::connected() const
{
    auto socket = connectToSocket(path_);
    if (!socket) {
        return {};
    }
    constexpr std::string_view handshake("\0AUTH ANONYMOUS 61\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n", 46);
    std::array<char, 256> answer{};
    const bool sent = send(socket->get(), handshake, false);
    if (!sent || ::recv(socket->get(), answer.data(), answer.size(), 0) <= 0) {
        return {};
    }
    return std::move(*socket);
}

bool HostileClient::send(int socket, std::string_view bytes, bool reads)
{
    std::array<char, 1U << 16> answers;
    while (!bytes.empty()) {
        pollfd state{socket, static_cast<short>(POLLOUT | (reads ? POLLIN : 0)), 0};
        ::poll(&state, 1, -1);
        if ((state.revents & POLLIN) != 0 &&
            ::recv(socket, answers.data(), answers.size(), MSG_DONTWAIT) == 0) {
            return false;
        }
        const auto sent = ::send(socket, bytes.data(), bytes.size(), MSG_DONTWAIT | MSG_NOSIGNAL);
        if (sent < 0 && errno != EAGAIN) {
            return false;
        }
        bytes.remove_prefix(static_cast<std::size_t>(std::max<ssize_t>(sent, 0)));
    }
    return true;
}

bool HostileClient::sendWithDescriptors(int socket, std::string_view bytes, int descriptor, std::size_t count)
{
    const std::span data(reinterpret_cast<const std::uint8_t*>(bytes.data()), bytes.size());
    return typhon::sendWithDescriptors(socket, data, std::vector<int>(count, descriptor)) > 0;
}

/// Waits for something to read; false when the connection has ended.
bool HostileClient::readsAnswer(int socket)
{
    std::array<char, 4096> answer;
    return ::recv(socket, answer.data(), answer.size(), 0) > 0;
}

void HostileClient::floods() const
{
    const auto burst = repeated(callBytes(wire::updatingUserFonts, true), callsAtOnce);
    for (;;) {
        const auto socket = connected();
        while (socket && send(socket.get(), burst, true)) {
        }
    }
}

void HostileClient::neverReads() const
{
    constexpr wire::Operation introspect{"org.freedesktop.DBus.Introspectable", "Introspect", "", "s"};
    const auto burst = repeated(callBytes(introspect, true), callsAtOnce);
    for (;;) {
        const auto socket = connected();
        while (socket && send(socket.get(), burst, false)) {
        }
    }
}

void HostileClient::halfMessages() const
{
    const auto call = callBytes(wire::updatingUserFonts, true);
    for (;;) {
        std::vector<FileDescriptor> sockets;
        for (int count = 0; count < 64; ++count) {
            sockets.push_back(connected());
            send(sockets.back().get(), std::string_view(call).substr(0, call.size() / 2), false);
        }
        readsAnswer(sockets.back().get());
    }
}

void HostileClient::connects() const
{
    for (;;) {
        const auto socket = connected();
    }
}

void HostileClient::manyDescriptors() const
{
    const FileDescriptor nothing(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    const auto call = callBytes(wire::updatingUserFonts, true);
    for (;;) {
        const auto socket = connected();
        while (socket && sendWithDescriptors(socket.get(), call, nothing.get(), mostDescriptors) &&
               readsAnswer(socket.get())) {
        }
    }
}

void HostileClient::neverAnswered() const
{
    const auto call = callBytes(wire::sendFonts, true, [](sd_bus_message* message) {
        sd_bus_message_open_container(message, 'a', "a{sv}");
        sd_bus_message_close_container(message);
    });
    const auto burst = repeated(call, callsAtOnce);
    for (;;) {
        const auto socket = connected();
        while (socket && send(socket.get(), burst, true)) {
        }
    }
}

void HostileClient::largeValues() const
{
    PropertyList::Array urls;
    while (urls.size() < (1U << 18)) {
        urls.emplace_back("file:///var/mobile/Library/UserFonts/" + std::to_string(urls.size()) + ".ttf");
    }
    const auto file = sealedMemoryFile(writeBinaryPropertyList(PropertyList(std::move(urls))));
    const auto call = callBytes(wire::fontChanged, true, [&](sd_bus_message* message) {
        sd_bus_message_append(message, "a{sv}", 1, "urls", "h", file.get());
    });
    std::vector<FileDescriptor> sockets(8);
    for (;;) {
        for (auto& socket : sockets) {
            if (!socket || !sendWithDescriptors(socket.get(), call, file.get(), 1)) {
                socket = connected();
            }
        }
        for (auto& socket : sockets) {
            if (!readsAnswer(socket.get())) {
                socket = FileDescriptor();
            }
        }
    }
}

}  // namespace

Child hostileClient(const std::string& socketPath, Hostility hostility)
{
    return Child([&] {
        const HostileClient client(socketPath);
        switch (hostility) {
        case Hostility::floods:
            client.floods();
        case Hostility::neverReads:
            client.neverReads();
        case Hostility::halfMessages:
            client.halfMessages();
        case Hostility::connects:
            client.connects();
        case Hostility::manyDescriptors:
            client.manyDescriptors();
        case Hostility::neverAnswered:
            client.neverAnswered();
        case Hostility::largeValues:
            client.largeValues();
        }
    });
}

}  // namespace typhon::bench
