#pragma once

#include "platform/linux/file_descriptor.h"

#include <memory>

#include <systemd/sd-bus.h>

namespace typhon {

struct SdBusClose {
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};

/// An sd-bus object that believes to have been through the handshake. sd-bus reads that together with
/// whatever follows it, and fails when that comes with descriptors; so the real handshake is not its
/// business. It begins between two sockets of our own, and is moved onto the real one afterwards. The
/// caller locks.
class OpenedBus {
public:
    OpenedBus() = default;
    OpenedBus(const OpenedBus&) = delete;
    OpenedBus& operator=(const OpenedBus&) = delete;
    /// A negative errno when it cannot be made.
    int open(bool withDescriptors);
    /// Replaces the sockets of our own by `socket`, which does not block. A negative errno on failure.
    int moveOnto(FileDescriptor socket);
    /// Reads the plain message that lies in the socket, and nothing behind it: a positive number when it was
    /// read, and `message` is it, unless sd-bus has dealt with it alone; zero when it had to write first. A
    /// negative errno when the bus is of no more use.
    int readMessage(sd_bus_message** message);
    /// Writes as much as the peer takes of what waits, and reads nothing meanwhile. Returns as
    /// `sd_bus_process`.
    int writeOnly();
    void close();

    sd_bus* get() const { return bus_.get(); }
    /// What it writes to, and what announces input and room.
    int socket() const { return socket_; }
    /// The other one of our sockets, before `moveOnto`.
    int farEnd() const { return far_.get(); }

private:
    int begin(bool withDescriptors);
    static int sawMessage(sd_bus_message* message, void* bus, sd_bus_error* error);

    std::unique_ptr<sd_bus, SdBusClose> bus_;
    FileDescriptor far_;
    /// Owned by the bus.
    int socket_ = -1;
    bool sawMessage_ = false;
};

}  // namespace typhon
