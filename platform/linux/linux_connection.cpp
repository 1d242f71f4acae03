// The order in which things happened on the wire is the order of the inbox, which is filled under the link's
// lock. The items on the queue are all alike, each takes what is first in the inbox: so it does not matter
// that two threads, one message each, may come to the queue in the other order.

#include "platform/linux/linux_connection.h"

#include "platform/argument_types.h"
#include "platform/connection_work.h"
#include "platform/linux/held_process.h"
#include "platform/linux/message_looks.h"

#include <utility>

namespace typhon {

namespace {

const IpcError disconnectedError{ipc_errors::disconnected, "the connection is gone"};

void run(const BusLink::Afterwards& afterwards)
{
    for (const auto& action : afterwards) {
        action();
    }
}

}  // namespace

LinuxConnection::LinuxConnection(std::shared_ptr<IpcContext> context, Lifetime lifetime, Connector connector,
                                 AuditToken peer, ConnectionAccounting::Charge charge)
    : context_(std::move(context)),
      queue_(context_->queues.createSerialQueue("com.vorlan.typhond.connection")),
      dialling_(std::make_shared<Dialling>(std::move(connector))), charge_(std::move(charge)), peer_(peer),
      lifetime_(lifetime)
{}

LinuxConnection::~LinuxConnection()
{
    if (link_) {
        link_->close();
    }
}

AuditToken LinuxConnection::auditToken() const
{
    const std::lock_guard lock(mutex_);
    return peer_;
}

void LinuxConnection::setExportedInterfaces(InterfaceDescriptions interfaces)
{
    const std::lock_guard lock(mutex_);
    exported_ = std::move(interfaces);
}

void LinuxConnection::setExportedObject(std::shared_ptr<ExportedObject> object)
{
    const std::lock_guard lock(mutex_);
    object_.swap(object);
}

std::shared_ptr<ExportedObject> LinuxConnection::exportedObject() const
{
    const std::lock_guard lock(mutex_);
    return object_;
}

void LinuxConnection::setRemoteObjectInterfaces(InterfaceDescriptions interfaces)
{
    const std::lock_guard lock(mutex_);
    remote_ = std::move(interfaces);
}

void LinuxConnection::setInvalidationHandler(std::function<void()> handler)
{
    const std::lock_guard lock(mutex_);
    invalidationHandler_.swap(handler);
}

void LinuxConnection::setInterruptionHandler(std::function<void()> handler)
{
    const std::lock_guard lock(mutex_);
    if (dialling_) {
        dialling_->interruptionHandler.swap(handler);
    }
}

void LinuxConnection::resume()
{
    {
        const std::lock_guard lock(mutex_);
        if (resumed_ || ended_) {
            return;
        }
        resumed_ = true;
    }
    const auto self = shared_from_this();
    context_->connections.add(self);
    if (!usableLink() && lifetime_ == Lifetime::oneSocket) {
        invalidate();
    }
}

std::shared_ptr<BusLink> LinuxConnection::usableLink()
{
    std::shared_ptr<Dialling> dialling;
    {
        const std::lock_guard lock(mutex_);
        if (!resumed_ || ended_ || link_) {
            return link_;
        }
        dialling = dialling_;
    }
    std::unique_lock connecting(dialling->connecting);
    {
        const std::lock_guard lock(mutex_);
        if (ended_ || link_) {
            return link_;
        }
    }
    ConnectionAccounting::Charge charge;
    auto link = connect(dialling->connector, charge);
    if (!link) {
        return nullptr;
    }
    {
        const std::lock_guard lock(mutex_);
        if (ended_) {
            return nullptr;
        }
        if (lifetime_ == Lifetime::oneSocket) {
            dialling_.reset();
        }
        link_ = link;
        peer_ = link->peer;
        if (charge) {
            charge_ = std::move(charge);
        }
    }
    connecting.unlock();
    link->start();
    return link;
}

std::shared_ptr<BusLink> LinuxConnection::connect(const Connector& connector,
                                                  ConnectionAccounting::Charge& charge)
{
    auto connected = connector ? connector() : ConnectedSocket{};
    if (!connected.socket) {
        TYLog_Debug(context_->log, "cannot connect: " + connected.problem);
        return nullptr;
    }
    charge = std::move(connected.charge);
    return std::make_shared<BusLink>(context_, std::move(connected.socket), connected.role, connected.peer,
                                     weak_from_this());
}

void LinuxConnection::invalidate()
{
    std::shared_ptr<BusLink> link;
    {
        const std::lock_guard lock(mutex_);
        if (std::exchange(ended_, true)) {
            return;
        }
        invalidatedHere_ = true;
        link = std::move(link_);
        link_.reset();
    }
    if (link) {
        link->close();
    }
    BusLink::Afterwards afterwards;
    enqueue(runInvalidation, afterwards);
    run(afterwards);
    context_->connections.remove(this);
    context_->memoryReturn->connectionClosed();
}

void LinuxConnection::linkClosed(BusLink& link, BusLink::Afterwards& afterwards)
{
    Item item;
    {
        const std::lock_guard lock(mutex_);
        if (ended_ || link_.get() != &link) {
            return;
        }
        afterwards.push_back([keep = std::move(link_)] {});
        link_.reset();
        if (lifetime_ == Lifetime::oneSocket) {
            ended_ = true;
            item = runInvalidation;
        } else if (dialling_ && dialling_->interruptionHandler) {
            item = [handler = dialling_->interruptionHandler](Self self) {
                return connection_work::runCallback(self->context_->log, handler);
            };
        }
    }
    if (item) {
        enqueue(std::move(item), afterwards);
    }
    if (lifetime_ == Lifetime::oneSocket) {
        afterwards.push_back([self = shared_from_this()] {
            self->context_->connections.remove(self.get());
            self->context_->memoryReturn->connectionClosed();
        });
    }
}

Task<void> LinuxConnection::runInvalidation(Self self)
{
    std::function<void()> invalidation;
    std::shared_ptr<ExportedObject> object;
    ConnectionAccounting::Charge charge;
    std::shared_ptr<Dialling> dialling;
    {
        const std::lock_guard lock(self->mutex_);
        invalidation.swap(self->invalidationHandler_);
        charge = std::move(self->charge_);
        dialling.swap(self->dialling_);
    }
    releaseProcess(self->auditToken());
    charge = {};
    if (invalidation) {
        Task<void> running = connection_work::runCallback(self->context_->log, std::move(invalidation));
        co_await std::move(running);
    }
    const std::lock_guard lock(self->mutex_);
    object.swap(self->object_);
}

void LinuxConnection::enqueue(Item item, BusLink::Afterwards& afterwards)
{
    {
        const std::lock_guard lock(mutex_);
        inbox_.push_back(std::move(item));
    }
    afterwards.push_back([self = shared_from_this()] {
        const MessageLooks shared;
        self->queue_->asyncForConnection(self, runNext(self));
    });
}

LinuxConnection::Item LinuxConnection::takeItem()
{
    const std::lock_guard lock(mutex_);
    auto item = std::move(inbox_.front());
    inbox_.pop_front();
    return item;
}

Task<void> LinuxConnection::runNext(Self self)
{
    const Item item = self->takeItem();
    Task<void> work = item(self);
    co_await std::move(work);
}

bool LinuxConnection::isInvalidatedHere() const
{
    const std::lock_guard lock(mutex_);
    return invalidatedHere_;
}

void LinuxConnection::send(std::string_view interface, std::string_view member, Arguments arguments,
                           ErrorHandler onError)
{
    startCall(interface, member, std::move(arguments), false, 0,
              [self = shared_from_this(), onError](CallResult result, BusLink::Afterwards& afterwards) {
                  if (!result.results) {
                      self->enqueueError(onError, std::move(result.error), afterwards);
                  }
              });
}

void LinuxConnection::call(std::string_view interface, std::string_view member, Arguments arguments,
                           ReplyHandler onReply, ErrorHandler onError)
{
    startCall(
        interface, member, std::move(arguments), true, 0,
        [self = shared_from_this(), onReply, onError](CallResult result, BusLink::Afterwards& afterwards) {
            if (!result.results) {
                self->enqueueError(onError, std::move(result.error), afterwards);
            } else if (onReply) {
                self->enqueue(
                    [onReply, results = std::move(*result.results)](Self connection) {
                        return connection_work::handleReply(connection->context_->log, onReply, results);
                    },
                    afterwards);
            }
        });
}

void LinuxConnection::enqueueError(const ErrorHandler& onError, IpcError error,
                                   BusLink::Afterwards& afterwards)
{
    if (onError) {
        enqueue(
            [onError, error = std::move(error)](Self self) {
                return connection_work::runCallback(self->context_->log,
                                                    [onError, error] { onError(error); });
            },
            afterwards);
    }
}

Task<CallResult> LinuxConnection::callAndWait(std::string interface, std::string member, Arguments arguments,
                                              std::int64_t timeout)
{
    return await(shared_from_this(), std::move(interface), std::move(member), std::move(arguments), timeout);
}

Task<CallResult> LinuxConnection::await(Self self, std::string interface, std::string member,
                                        Arguments arguments, std::int64_t timeout)
{
    using Done = std::function<void(CallResult)>;
    std::function<void(Done)> start = [&](Done done) {
        self->startCall(interface, member, std::move(arguments), true, timeout,
                        [done](CallResult result, BusLink::Afterwards& afterwards) {
                            afterwards.push_back([done, result = std::move(result)] { done(result); });
                        });
    };
    auto completion = awaitCompletion<CallResult>(std::move(start));
    co_return co_await completion;
}

void LinuxConnection::startCall(std::string_view interface, std::string_view member, Arguments arguments,
                                bool expectReply, std::int64_t timeout, BusLink::Completion completion)
{
    InterfaceDescriptions interfaces;
    {
        const std::lock_guard lock(mutex_);
        interfaces = remote_;
    }
    const auto* description = findMember(interfaces, interface, member);
    const auto link = description == nullptr ? nullptr : usableLink();
    if (!link) {
        BusLink::Afterwards afterwards;
        completion({std::nullopt,
                    description == nullptr ? unknownMethodError(interface, member) : disconnectedError},
                   afterwards);
        run(afterwards);
        return;
    }
    link->call({std::string(interface), std::string(member), description->inTypes, description->outTypes,
                std::move(arguments), expectReply, timeout, std::move(completion)});
}

}  // namespace typhon
