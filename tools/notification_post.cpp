#include "tools/notification_post.h"

#include "platform/ipc.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/notification_names.h"
#include "platform/linux/system_bus.h"
#include "platform/linux/unix_sockets.h"
#include "sdk/client_errors.h"

#include <cstring>
#include <memory>
#include <string_view>
#include <utility>

#include <systemd/sd-bus.h>

namespace typhon {

namespace {

struct BusClose {
    void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
};
using Bus = std::unique_ptr<sd_bus, BusClose>;

constexpr const char* serviceUnknown = "org.freedesktop.DBus.Error.ServiceUnknown";

ClientResult<Bus> connectToBus(const std::string& path)
{
    auto connected = connectToPath(path);
    if (!connected.socket) {
        return ClientError{ipc_errors::failed, "no system bus at " + path + " (" + connected.problem + ")",
                           "Start the system bus, or name the scratch system with --root."};
    }
    sd_bus* raw = nullptr;
    int result = sd_bus_new(&raw);
    Bus bus(raw);
    if (result >= 0) {
        result = sd_bus_set_fd(raw, connected.socket.get(), connected.socket.get());
    }
    if (result >= 0) {
        static_cast<void>(connected.socket.release());
        sd_bus_set_bus_client(raw, 1);
        result = sd_bus_start(raw);
    }
    if (result < 0) {
        return systemError(-result, "cannot talk to the system bus at " + path);
    }
    return bus;
}

std::string adviceFor(std::string_view error)
{
    if (error == ipc_errors::accessDenied) {
        return "Only an administrator may post notifications; use sudo.";
    }
    if (error == serviceUnknown) {
        return "Start typhon-relayd: systemctl start typhon-relayd";
    }
    return {};
}

}  // namespace

ClientResult<Done> postNotification(const RootDirectory& root, const std::string& name,
                                    const std::optional<PropertyList>& userInfo)
{
    const auto bus = connectToBus(root.real(systemBusSocket));
    if (!bus) {
        return bus.error();
    }
    const auto& service = userInfo ? relayService : pingService;
    Arguments arguments{PropertyList(name)};
    if (userInfo) {
        arguments.emplace_back(*userInfo);
    }
    sd_bus_message* raw = nullptr;
    int result = sd_bus_message_new_method_call(bus->get(), &raw, service.name, service.path, service.name,
                                                postMethod);
    const BusMessage call(raw);
    if (result >= 0) {
        result = appendArguments(raw, service.types, arguments, false);
    }
    if (result < 0) {
        return systemError(-result, "the notification cannot be sent");
    }
    sd_bus_error error = SD_BUS_ERROR_NULL;
    result = sd_bus_call(bus->get(), raw, 0, &error, nullptr);
    const std::unique_ptr<sd_bus_error, void (*)(sd_bus_error*)> owned(&error, sd_bus_error_free);
    if (result >= 0) {
        return Done{};
    }
    const std::string errorName = error.name == nullptr ? ipc_errors::failed : error.name;
    const std::string text = error.message == nullptr ? std::strerror(-result) : error.message;
    return ClientError{errorName, "the notification was not posted: " + text, adviceFor(errorName)};
}

}  // namespace typhon
