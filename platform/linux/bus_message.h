#pragma once

#include "platform/audit_token.h"
#include "platform/ipc.h"
#include "platform/linux/file_descriptor.h"

#include <memory>
#include <optional>
#include <string>

#include <systemd/sd-bus.h>

namespace typhon {

struct BusMessageUnref {
    void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
/// Created, used and dropped where its bus may be used: under the lock of its link, or on the bus's queue.
using BusMessage = std::unique_ptr<sd_bus_message, BusMessageUnref>;

/// A descriptor received in a message, or to be sent in one. A listener endpoint is an `O_PATH` descriptor of
/// a bound, listening socket.
class LinuxTransferredFile : public TransferredFile {
public:
    explicit LinuxTransferredFile(FileDescriptor file, std::optional<AuditToken> from = std::nullopt)
        : descriptor(std::move(file)), sender(from)
    {}
    const FileDescriptor descriptor;
    /// Who sent it; null for one made here. The peer behind an endpoint must be of the sender's user.
    const std::optional<AuditToken> sender;
};

/// Appends arguments by D-Bus signature ("aa{sv}s"). In an outermost dictionary, a value whose binary
/// property list is larger than 64 KiB or nested deeper than 8 travels as a sealed memory file when
/// `descriptorsAllowed`; the encoding of such a value is made once for as long as the value lives. An `h`
/// takes a `LinuxTransferredFile`. Returns a negative errno on failure. The caller locks the bus.
int appendArguments(sd_bus_message* message, const std::string& types, const Arguments& arguments,
                    bool descriptorsAllowed);

/// The arguments of a message whose signature must be `types`; null when they differ, do not fit the value
/// type (a 64-bit unsigned beyond 63 bits), or hold a memory file that is not sealed or not a property
/// list. An `h` becomes a transferred file that notes `sender`. The caller locks the bus.
std::optional<Arguments> readArguments(sd_bus_message* message, const std::string& types,
                                       const std::optional<AuditToken>& sender = std::nullopt);

}  // namespace typhon
