#include "raw_client.h"

#include "sdk/service_socket.h"

#include <cstring>
#include <stdexcept>

namespace typhon::bench {

namespace {

void check(int outcome, const char* what)
{
    if (outcome < 0) {
        throw std::runtime_error(std::string(what) + ": " + std::strerror(-outcome));
    }
}

}  // namespace

RawClient::RawClient(const std::string& socketPath)
{
    auto socket = connectToSocket(socketPath);
    if (!socket) {
        throw std::runtime_error("cannot connect to " + socketPath);
    }
    sd_bus* bus = nullptr;
    check(sd_bus_new(&bus), "a bus");
    bus_.reset(bus);
    const int descriptor = socket->release();
    check(sd_bus_set_fd(bus, descriptor, descriptor), "its socket");
    check(sd_bus_negotiate_fds(bus, 1), "descriptors");
    check(sd_bus_start(bus), "its start");
}

RawClient::Message RawClient::newCall(const char* interface, const char* member) const
{
    sd_bus_message* message = nullptr;
    check(sd_bus_message_new_method_call(bus_.get(), &message, nullptr, "/com/vorlan/typhond", interface,
                                         member),
          member);
    return Message(message);
}

RawClient::Message RawClient::send(const Message& message) const
{
    sd_bus_message* reply = nullptr;
    check(sd_bus_call(bus_.get(), message.get(), 0, nullptr, &reply),
          sd_bus_message_get_member(message.get()));
    return Message(reply);
}

RawClient::Message RawClient::call(const char* interface, const char* member) const
{
    return send(newCall(interface, member));
}

RawClient::Message RawClient::openBare(const std::string& path) const
{
    const auto message = newCall(bareInterface, "open");
    check(sd_bus_message_append(message.get(), "s", path.c_str()), "open");
    return send(message);
}

RawClient::Message RawClient::openGranted(const std::vector<unsigned char>& token,
                                          const std::string& path) const
{
    const auto message = newCall("com.vorlan.typhond.FileAccess", "open");
    check(sd_bus_message_append_array(message.get(), 'y', token.data(), token.size()), "token");
    check(sd_bus_message_append(message.get(), "s", path.c_str()), "open");
    return send(message);
}

}  // namespace typhon::bench
