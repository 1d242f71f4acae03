#include "sdk/service_connection.h"

#include "platform/linux/bus_message.h"
#include "sdk/client_errors.h"
#include "sdk/service_socket.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <utility>

#include <systemd/sd-bus.h>

namespace typhon {

namespace {

constexpr const char* objectPath = "/com/vorlan/typhond";
constexpr std::uint64_t withoutLimit = std::numeric_limits<std::uint64_t>::max();

std::uint64_t microseconds(const ServiceConnection::Patience& patience)
{
    // Zero would mean the library's own limit.
    return patience ? static_cast<std::uint64_t>(
                          std::max<std::int64_t>(1, std::chrono::microseconds(*patience).count()))
                    : withoutLimit;
}

struct UnrefMessage {
    void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, UnrefMessage>;

struct UnrefBus {
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};
using Bus = std::unique_ptr<sd_bus, UnrefBus>;

/// What sd-bus wrote into an error, freed with it.
class BusError {
public:
    BusError() = default;
    BusError(const BusError&) = delete;
    BusError& operator=(const BusError&) = delete;
    ~BusError() { sd_bus_error_free(&error_); }

    sd_bus_error* out() { return &error_; }
    ClientError asClientError(int number, const std::string& what) const
    {
        // A lost connection is reported as an errno in disguise; only a peer's own errors are taken by name.
        if (number == ECONNRESET || number == ENOTCONN || !sd_bus_error_is_set(&error_)) {
            return systemError(number, what);
        }
        return clientError(error_.name, error_.message == nullptr ? what : error_.message);
    }

private:
    sd_bus_error error_{};
};

/// Takes over the socket when it succeeds.
int startBus(sd_bus* bus, FileDescriptor& socket)
{
    int outcome = sd_bus_set_fd(bus, socket.get(), socket.get());
    if (outcome >= 0) {
        socket.release();
        outcome = sd_bus_negotiate_fds(bus, 1);
    }
    return outcome < 0 ? outcome : sd_bus_start(bus);
}

int sendOnly(sd_bus* bus, sd_bus_message* message)
{
    int outcome = sd_bus_message_set_expect_reply(message, 0);
    outcome = outcome < 0 ? outcome : sd_bus_send(bus, message, nullptr);
    return outcome < 0 ? outcome : sd_bus_flush(bus);
}

}  // namespace

ClientResult<ServiceConnection> ServiceConnection::open(const RootDirectory& root,
                                                        std::string_view serviceName)
{
    auto socket = connectToSocket(serviceSocketPath(root, serviceName));
    if (!socket) {
        return socket.error();
    }
    return overSocket(std::move(*socket), std::string(serviceName));
}

ClientResult<ServiceConnection> ServiceConnection::overSocket(FileDescriptor socket, const std::string& peer)
{
    sd_bus* made = nullptr;
    int outcome = sd_bus_new(&made);
    Bus bus(made);
    outcome = outcome < 0 ? outcome : startBus(bus.get(), socket);
    if (outcome < 0) {
        return systemError(-outcome, "cannot talk to " + peer);
    }
    return ServiceConnection(bus.release());
}

ServiceConnection::ServiceConnection(ServiceConnection&& other) noexcept
    : bus_(std::exchange(other.bus_, nullptr)), handler_(std::move(other.handler_))
{}

ServiceConnection& ServiceConnection::operator=(ServiceConnection&& other) noexcept
{
    std::swap(bus_, other.bus_);
    std::swap(handler_, other.handler_);
    return *this;
}

ServiceConnection::~ServiceConnection()
{
    sd_bus_close_unref(bus_);
}

bool ServiceConnection::isOpen() const
{
    return bus_ != nullptr && sd_bus_is_open(bus_) > 0;
}

ClientResult<Arguments> ServiceConnection::call(const wire::Operation& operation, const Arguments& arguments,
                                                Patience patience)
{
    auto results = callAndRead(operation, arguments, patience);
    // Left alone, what the daemon calls meanwhile would fill the queue. What became of the connection the
    // next call says.
    static_cast<void>(process());
    return results;
}

ClientResult<Arguments> ServiceConnection::callAndRead(const wire::Operation& operation,
                                                       const Arguments& arguments, Patience patience)
{
    const auto what = std::string(operation.interface) + "." + operation.member;
    sd_bus_message* made = nullptr;
    int outcome = sd_bus_message_new_method_call(bus_, &made, nullptr, objectPath, operation.interface,
                                                 operation.member);
    const Message call(made);
    outcome = outcome < 0 ? outcome : appendArguments(call.get(), operation.inTypes, arguments, true);
    if (outcome < 0) {
        return systemError(-outcome, what);
    }
    if (operation.answer == wire::Answer::never) {
        outcome = sendOnly(bus_, call.get());
        return outcome < 0 ? ClientResult<Arguments>(systemError(-outcome, what)) : Arguments{};
    }
    sd_bus_message* answered = nullptr;
    BusError error;
    outcome = sd_bus_call(bus_, call.get(), microseconds(patience), error.out(), &answered);
    const Message reply(answered);
    if (outcome < 0) {
        return error.asClientError(-outcome, what);
    }
    auto results = readArguments(reply.get(), operation.outTypes);
    if (!results) {
        return clientError(client_errors::inconsistentMessage,
                           what + ": the answer is not \"" + operation.outTypes + "\"");
    }
    return std::move(*results);
}

ClientResult<Done> ServiceConnection::process()
{
    for (;;) {
        sd_bus_message* received = nullptr;
        const int outcome = bus_ == nullptr ? -ENOTCONN : sd_bus_process(bus_, &received);
        const Message message(received);
        if (outcome < 0) {
            return systemError(-outcome, "the connection ended");
        }
        if (message && sd_bus_message_is_method_call(message.get(), nullptr, nullptr) > 0) {
            const PeerCall call(message.get());
            handler_ ? handler_(call) : call.refuse();
        }
        if (outcome == 0) {
            return Done{};
        }
    }
}

int ServiceConnection::descriptor() const
{
    return bus_ == nullptr ? -1 : sd_bus_get_fd(bus_);
}

short ServiceConnection::events() const
{
    const int events = bus_ == nullptr ? 0 : sd_bus_get_events(bus_);
    return static_cast<short>(events < 0 ? 0 : events);
}

}  // namespace typhon
