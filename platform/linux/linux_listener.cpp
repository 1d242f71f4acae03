#include "platform/linux/linux_listener.h"

#include "platform/linux/bus_message.h"
#include "platform/linux/descriptor_headroom.h"
#include "platform/linux/linux_connection.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <fcntl.h>
#include <sys/epoll.h>
#include <sys/socket.h>

namespace typhon {

namespace {

constexpr auto retryDelay = std::chrono::milliseconds(100);
constexpr auto shortageIsNewsAfter = std::chrono::minutes(1);

FileDescriptor acceptFrom(int listening)
{
    return FileDescriptor(::accept4(listening, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
}

FileDescriptor newReserve()
{
    return FileDescriptor(::open("/dev/null", O_RDONLY | O_CLOEXEC));
}

}  // namespace

LinuxListener::LinuxListener(std::shared_ptr<IpcContext> context, std::string name, ListeningSocket socket,
                             BusLink::Role role)
    : context_(std::move(context)), name_(std::move(name)), role_(role),
      socket_(std::make_shared<const ListeningSocket>(std::move(socket))), reserve_(newReserve())
{}

std::shared_ptr<LinuxListener> LinuxListener::ofService(std::shared_ptr<IpcContext> context, std::string name)
{
    auto socket = listenForService(context->root, name);
    if (socket.isTaken) {
        TYLog(context->log, "another process serves " + name + "; trying again");
    } else if (!socket.socket) {
        TYLog_Error(context->log, "cannot listen on " + name + ": " + socket.problem);
    }
    return std::make_shared<LinuxListener>(std::move(context), std::move(name), std::move(socket),
                                           BusLink::Role::server);
}

LinuxListener::~LinuxListener()
{
    closeSocket();
}

void LinuxListener::setDelegate(std::weak_ptr<ListenerDelegate> delegate)
{
    const std::lock_guard lock(mutex_);
    delegate_ = std::move(delegate);
}

void LinuxListener::resume()
{
    {
        const std::lock_guard lock(mutex_);
        if (!socket_ || watch_ || retry_) {
            return;
        }
        if (socket_->isTaken) {
            nameDeadline_ = std::chrono::steady_clock::now() + context_->limits.nameOfService;
            tryForNameLater();
        } else if (socket_->socket) {
            watchSocket();
        } else {
            return;
        }
    }
    context_->listeners.add(shared_from_this());
}

void LinuxListener::watchSocket()
{
    watch_ = context_->pool.watch(socket_->socket.get(), [weak = weak_from_this()](std::uint32_t) {
        if (const auto listener = weak.lock()) {
            listener->handleEvents();
        }
    });
    watch_->arm(EPOLLIN);
}

void LinuxListener::tryForNameLater()
{
    retry_ = context_->queues.createTimer(*context_->deadlines, [weak = weak_from_this()] {
        if (const auto self = weak.lock()) {
            self->tryForName();
        }
    });
    retry_->schedule(retryDelay, retryDelay);
}

void LinuxListener::tryForName()
{
    const std::lock_guard lock(mutex_);
    if (!socket_ || watch_) {
        return;
    }
    auto socket = listenForService(context_->root, name_);
    if (socket.isTaken && std::chrono::steady_clock::now() < nameDeadline_) {
        retry_->schedule(retryDelay, retryDelay);
        return;
    }
    context_->dispose(std::move(retry_));
    if (!socket.socket) {
        TYLog_Error(context_->log, "cannot listen on " + name_ + ": " + socket.problem);
        return;
    }
    socket_ = std::make_shared<const ListeningSocket>(std::move(socket));
    watchSocket();
    TYLog(context_->log, "listening on " + name_);
}

void LinuxListener::invalidate()
{
    {
        const std::lock_guard lock(mutex_);
        closeSocket();
    }
    context_->listeners.remove(this);
}

void LinuxListener::closeSocket()
{
    watch_.reset();
    context_->dispose(std::move(retry_));
    if (socket_ && socket_->socket && !socket_->path.empty()) {
        ::unlink(socket_->path.c_str());
    }
    socket_.reset();
}

std::shared_ptr<ListenerEndpoint> LinuxListener::endpoint() const
{
    const std::lock_guard lock(mutex_);
    if (!socket_ || !socket_->endpoint) {
        return nullptr;
    }
    FileDescriptor copy(::fcntl(socket_->endpoint.get(), F_DUPFD_CLOEXEC, 3));
    return copy ? std::make_shared<LinuxTransferredFile>(std::move(copy)) : nullptr;
}

void LinuxListener::arm()
{
    const std::lock_guard lock(mutex_);
    if (watch_) {
        watch_->arm(EPOLLIN);
    }
}

void LinuxListener::armLater()
{
    const std::lock_guard lock(mutex_);
    if (!watch_) {
        return;
    }
    if (!retry_) {
        retry_ = context_->queues.createTimer(*context_->deadlines, [weak = weak_from_this()] {
            if (const auto self = weak.lock()) {
                self->arm();
            }
        });
    }
    retry_->schedule(retryDelay, retryDelay);
}

void LinuxListener::handleEvents()
{
    std::shared_ptr<const ListeningSocket> socket;
    {
        const std::lock_guard lock(mutex_);
        socket = socket_;
    }
    constexpr int atOnce = 16;
    auto outcome = socket ? Accepting::more : Accepting::done;
    for (int count = 0; outcome == Accepting::more && count < atOnce; ++count) {
        outcome = acceptOne(socket->socket.get());
    }
    if (outcome == Accepting::later) {
        armLater();
    } else {
        arm();
    }
}

LinuxListener::Accepting LinuxListener::acceptOne(int listening)
{
    auto accepted = acceptFrom(listening);
    if (!accepted) {
        return acceptFailed(listening, errno);
    }
    if (isWithinDescriptorHeadroom(accepted.get())) {
        logRefusal(EMFILE);
        return Accepting::more;
    }
    offer(std::move(accepted));
    return Accepting::more;
}

LinuxListener::Accepting LinuxListener::acceptFailed(int listening, int error)
{
    if (error == EAGAIN) {
        return Accepting::done;
    }
    if (error == EINTR || error == ECONNABORTED) {
        return Accepting::more;
    }
    logRefusal(error);
    if (error != EMFILE && error != ENFILE) {
        return Accepting::later;
    }
    // Left alone the newcomer would wake us again at once, for ever.
    reserve_ = FileDescriptor();
    const bool refused = static_cast<bool>(acceptFrom(listening));
    reserve_ = newReserve();
    return refused && reserve_ ? Accepting::more : Accepting::later;
}

void LinuxListener::logRefusal(int error)
{
    const auto now = std::chrono::steady_clock::now();
    if (refusalLogged_ && now - *refusalLogged_ < shortageIsNewsAfter) {
        return;
    }
    refusalLogged_ = now;
    TYLog_Error(context_->log, "connections to " + name_ + " are refused: " + std::strerror(error) +
                                   " (raise the limit of the service, LimitNOFILE, or end clients)");
}

void LinuxListener::offer(FileDescriptor socket)
{
    const auto peer = context_->identifyPeer(socket.get());
    auto admission = context_->accounting->admit(peer);
    if (!admission.refusal.empty()) {
        context_->offenders.report(peer, "connections", admission.refusal);
    }
    std::shared_ptr<ListenerDelegate> delegate;
    {
        const std::lock_guard lock(mutex_);
        delegate = delegate_.lock();
    }
    if (!admission.charge || !delegate) {
        return;
    }
    auto once = std::make_shared<FileDescriptor>(std::move(socket));
    auto connector = [once, peer, role = role_]() -> ConnectedSocket {
        return {std::move(*once), peer, role, "the connection was used up"};
    };
    auto connection =
        std::make_shared<LinuxConnection>(context_, LinuxConnection::Lifetime::oneSocket,
                                          std::move(connector), peer, std::move(admission.charge));
    if (!delegate->listener(*this, connection)) {
        connection->invalidate();
    }
}

}  // namespace typhon
