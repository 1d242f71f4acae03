#pragma once

// A bus of a test's own, and processes on it.

#include "child_process.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/file_descriptor.h"
#include "platform/linux/unix_sockets.h"

#include <chrono>
#include <filesystem>
#include <fstream>
#include <memory>
#include <stdexcept>
#include <string>
#include <thread>

#include <systemd/sd-bus.h>

namespace typhon::testing {

/// A dbus-daemon that listens at `socketPath` and lets everybody do everything. Ended with the object.
class PrivateBus {
public:
    explicit PrivateBus(std::string socketPath) : socketPath_(std::move(socketPath))
    {
        std::filesystem::create_directories(std::filesystem::path(socketPath_).parent_path());
        const auto configuration = socketPath_ + ".conf";
        std::ofstream(configuration)
            << "<busconfig><type>scratch</type><listen>unix:path=" << socketPath_
            << "</listen><auth>EXTERNAL</auth><policy context=\"default\"><allow send_destination=\"*\"/>"
               "<allow receive_sender=\"*\"/><allow own=\"*\"/><allow user=\"*\"/></policy></busconfig>";
        daemon_ = std::make_unique<ChildProcess>(std::vector<std::string>{
            "dbus-daemon", "--config-file=" + configuration, "--nofork", "--nopidfile", "--print-address=1"});
        if (daemon_->read().empty()) {
            throw std::runtime_error("no dbus-daemon");
        }
    }
    /// Ends the bus, and with it every connection.
    ~PrivateBus()
    {
        daemon_.reset();
        std::filesystem::remove(socketPath_);
    }
    PrivateBus(const PrivateBus&) = delete;
    PrivateBus& operator=(const PrivateBus&) = delete;

private:
    const std::string socketPath_;
    std::unique_ptr<ChildProcess> daemon_;
};

/// One more process on a bus, which waits for what it asks. One thread.
class BusPeer {
public:
    explicit BusPeer(const std::string& socketPath)
    {
        auto connected = connectToPath(socketPath);
        sd_bus* bus = nullptr;
        sd_bus_new(&bus);
        bus_.reset(bus);
        if (!connected.socket || sd_bus_set_fd(bus, connected.socket.get(), connected.socket.get()) < 0) {
            throw std::runtime_error("no bus at " + socketPath + connected.problem);
        }
        static_cast<void>(connected.socket.release());
        sd_bus_set_bus_client(bus, 1);
        if (sd_bus_start(bus) < 0 || sd_bus_get_unique_name(bus, &uniqueName_) < 0) {
            throw std::runtime_error("the bus at " + socketPath + " does not answer");
        }
    }

    sd_bus* bus() const { return bus_.get(); }
    std::string uniqueName() const { return uniqueName_; }

    void own(const std::string& name)
    {
        if (sd_bus_request_name(bus(), name.c_str(), 0) < 0) {
            throw std::runtime_error("cannot own " + name);
        }
    }
    void release(const std::string& name) { sd_bus_release_name(bus(), name.c_str()); }

    /// Sends a signal with the given arguments, to everybody or to one, and returns when the bus has
    /// delivered it.
    template <class... Values>
    void emitTo(const char* destination, const char* path, const char* interface, const char* member,
                const char* types, Values... values)
    {
        sd_bus_message* raw = nullptr;
        sd_bus_message_new_signal(bus(), &raw, path, interface, member);
        const BusMessage signal(raw);
        if (sd_bus_message_append(raw, types, values...) < 0 ||
            sd_bus_send_to(bus(), raw, destination, nullptr) < 0) {
            throw std::runtime_error("the signal cannot be sent");
        }
        roundTrip();
    }
    template <class... Values>
    void emit(const char* path, const char* interface, const char* types, Values... values)
    {
        emitTo(nullptr, path, interface, "Notification", types, values...);
    }

    /// Returns when the bus has handled all that this peer has sent.
    void roundTrip()
    {
        sd_bus_call_method(bus(), "org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                           "GetId", nullptr, nullptr, "");
    }

    /// Waits until somebody owns `name`; false when nobody does for a long time.
    bool waitForOwner(const std::string& name)
    {
        for (int attempt = 0; attempt < 6000; ++attempt) {
            if (sd_bus_get_name_creds(bus(), name.c_str(), 0, nullptr) >= 0) {
                return true;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        }
        return false;
    }

    /// The next message that is no reply; null when nothing comes for half a minute.
    BusMessage next()
    {
        for (;;) {
            sd_bus_message* raw = nullptr;
            const int result = sd_bus_process(bus(), &raw);
            BusMessage message(raw);
            if (message || result < 0) {
                return message;
            }
            if (result == 0 && sd_bus_wait(bus(), 30'000'000) <= 0) {
                return nullptr;
            }
        }
    }

private:
    struct Close {
        void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
    };
    std::unique_ptr<sd_bus, Close> bus_;
    const char* uniqueName_ = nullptr;
};

}  // namespace typhon::testing
