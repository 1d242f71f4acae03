#include "bare_server.h"

#include "platform/linux/file_descriptor.h"
#include "platform/linux/memory_file.h"

#include <cstring>
#include <map>
#include <stdexcept>
#include <vector>

#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

namespace typhon::bench {

namespace {

constexpr const char* interface = "com.vorlan.typhond.Bench";

struct Service {
    FileDescriptor view;
    FileDescriptor folder;
    BareServer::Answers more;
};

FileDescriptor openBeneath(int folder, const char* path)
{
    open_how how{};
    how.flags = O_RDONLY | O_CLOEXEC;
    how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS;
    return FileDescriptor(static_cast<int>(::syscall(SYS_openat2, folder, path, &how, sizeof how)));
}

int answerWithFile(sd_bus_message* call, const FileDescriptor& file)
{
    return file ? sd_bus_reply_method_return(call, "h", file.get())
                : sd_bus_reply_method_errnof(call, errno, "no file");
}

int handle(sd_bus_message* call, void* userdata, sd_bus_error* /*error*/)
{
    const auto& service = *static_cast<Service*>(userdata);
    if (sd_bus_message_is_method_call(call, interface, "empty") > 0) {
        return sd_bus_reply_method_return(call, nullptr);
    }
    if (sd_bus_message_is_method_call(call, interface, "view") > 0) {
        return answerWithFile(call, reopenedReadOnly(service.view.get()));
    }
    if (sd_bus_message_is_method_call(call, interface, "open") > 0) {
        const char* path = "";
        sd_bus_message_read(call, "s", &path);
        return answerWithFile(call, openBeneath(service.folder.get(), path));
    }
    const char* member = sd_bus_message_get_member(call);
    const auto found = service.more.find(member == nullptr ? "" : member);
    return found == service.more.end() ? 0 : found->second(call);
}

sd_bus* acceptBus(int listener, Service& service)
{
    const int socket = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
    sd_id128_t identity{};
    sd_id128_randomize(&identity);
    sd_bus* bus = nullptr;
    if (socket < 0 || sd_bus_new(&bus) < 0) {
        return nullptr;
    }
    sd_bus_set_fd(bus, socket, socket);
    sd_bus_set_server(bus, 1, identity);
    sd_bus_set_anonymous(bus, 1);
    sd_bus_negotiate_fds(bus, 1);
    sd_bus_add_filter(bus, nullptr, handle, &service);
    sd_bus_start(bus);
    return bus;
}

/// Handles all that has come. False when the connection has ended.
bool process(sd_bus* bus)
{
    int outcome = 0;
    while ((outcome = sd_bus_process(bus, nullptr)) > 0) {
    }
    return outcome == 0;
}

void serve(int listener, Service& service)
{
    const FileDescriptor poll(::epoll_create1(EPOLL_CLOEXEC));
    epoll_event interest{};
    interest.events = EPOLLIN;
    ::epoll_ctl(poll.get(), EPOLL_CTL_ADD, listener, &interest);
    for (;;) {
        epoll_event ready{};
        if (::epoll_wait(poll.get(), &ready, 1, -1) < 1) {
            continue;
        }
        auto* bus = static_cast<sd_bus*>(ready.data.ptr);
        if (bus == nullptr) {
            bus = acceptBus(listener, service);
            interest.data.ptr = bus;
            if (bus == nullptr) {
                continue;
            }
            // The beginning of the handshake is read by now and must be answered without another event.
            ::epoll_ctl(poll.get(), EPOLL_CTL_ADD, sd_bus_get_fd(bus), &interest);
        }
        if (!process(bus)) {
            sd_bus_close_unref(bus);
        }
    }
}

}  // namespace

int listenAt(const std::string& path)
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (socket < 0 || path.size() >= sizeof address.sun_path) {
        throw std::runtime_error("cannot listen at " + path);
    }
    std::memcpy(address.sun_path, path.data(), path.size());
    if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        ::listen(socket, SOMAXCONN) != 0) {
        throw std::runtime_error("cannot listen at " + path);
    }
    return socket;
}

BareServer::BareServer(std::string path, std::size_t viewBytes, const std::string& folder, Answers more)
    : path_(std::move(path))
{
    const FileDescriptor listener(listenAt(path_));
    process_ = Child([&] {
        Service service;
        service.view = sealedMemoryFile(std::vector<std::uint8_t>(viewBytes));
        service.more = std::move(more);
        service.folder = FileDescriptor(::open(folder.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
        serve(listener.get(), service);
    });
}

}  // namespace typhon::bench
