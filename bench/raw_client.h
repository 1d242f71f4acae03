#pragma once

#include <cstddef>
#include <memory>
#include <string>
#include <vector>

#include <systemd/sd-bus.h>

namespace typhon::bench {

/// A client on plain sd-bus, for ours and for bare servers alike, so that both are measured from the same
/// place. Throws when something does not work: a figure of failing calls is worth nothing.
class RawClient {
public:
    explicit RawClient(const std::string& socketPath);

    struct Unref {
        void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
        void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
    };
    using Message = std::unique_ptr<sd_bus_message, Unref>;

    /// A call without arguments.
    Message call(const char* interface, const char* member) const;
    /// Opens a file through the bare server.
    Message openBare(const std::string& path) const;
    /// Opens a file through the file-access service.
    Message openGranted(const std::vector<unsigned char>& token, const std::string& path) const;
    /// For any other call: one without arguments yet, and its reply once it has them.
    Message newCall(const char* interface, const char* member) const;
    Message send(const Message& message) const;
    sd_bus* bus() const { return bus_.get(); }

private:
    std::unique_ptr<sd_bus, Unref> bus_;
};

/// The interface of the bare server.
inline constexpr const char* bareInterface = "com.vorlan.typhond.Bench";

}  // namespace typhon::bench
