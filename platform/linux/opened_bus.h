#pragma once

#include "platform/linux/file_descriptor.h"

#include <memory>

#include <systemd/sd-bus.h>

namespace typhon {

struct SdBusClose {
    void operator()(sd_bus* bus) const { sd_bus_close_unref(bus); }
};

/// A socket that is never ready for reading.
class IdleSocket {
public:
    IdleSocket();
    int get() const { return near_.get(); }

private:
    FileDescriptor near_;
    FileDescriptor far_;
};

/// An sd-bus object that believes to have been through the handshake. sd-bus reads that together with
/// whatever follows it, and fails when that comes with descriptors; so the real handshake is not its
/// business. It begins between two sockets of our own, and is moved onto the real one afterwards. It reads
/// and writes through two descriptors, so that it can be kept from reading. The caller locks.
class OpenedBus {
public:
    OpenedBus() = default;
    /// A negative errno when it cannot be made.
    int open(bool withDescriptors);
    /// Replaces the sockets of our own by `socket`, which does not block. A negative errno on failure.
    int moveOnto(FileDescriptor socket);
    /// Writes as much as the peer takes of what waits, and reads nothing meanwhile. Returns as
    /// `sd_bus_process`.
    int writeOnly(const IdleSocket& idle);
    void close();

    sd_bus* get() const { return bus_.get(); }
    /// What it writes to, and what announces input and room.
    int socket() const { return output_; }
    /// The other one of our sockets, before `moveOnto`.
    int farEnd() const { return far_.get(); }

private:
    int begin(bool withDescriptors);

    std::unique_ptr<sd_bus, SdBusClose> bus_;
    FileDescriptor far_;
    // Owned by the bus.
    int input_ = -1;
    int output_ = -1;
};

}  // namespace typhon
