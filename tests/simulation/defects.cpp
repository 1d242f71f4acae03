#include "simulation/defects.h"

#include "registry/user_font_registry.h"

#include <algorithm>

namespace typhon::simulation {

namespace {

class TwiceAnsweredCall final : public IncomingCall {
public:
    explicit TwiceAnsweredCall(std::shared_ptr<IncomingCall> call) : call_(std::move(call)) {}
    const std::string& interface() const override { return call_->interface(); }
    const std::string& member() const override { return call_->member(); }
    const Arguments& arguments() const override { return call_->arguments(); }
    bool isReplyExpected() const override { return call_->isReplyExpected(); }
    void reply(Arguments results) override
    {
        call_->reply(results);
        call_->reply(std::move(results));
    }
    void fail(IpcError error) override { call_->fail(std::move(error)); }

private:
    const std::shared_ptr<IncomingCall> call_;
};

class TwiceAnsweringObject final : public ExportedObject {
public:
    explicit TwiceAnsweringObject(std::shared_ptr<ExportedObject> object) : object_(std::move(object)) {}
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        return object_->handle(std::make_shared<TwiceAnsweredCall>(std::move(call)));
    }

private:
    const std::shared_ptr<ExportedObject> object_;
};

/// Gets every fifth signal wrong: seldom enough that requests wait for each other first.
class MiscountingSemaphore final : public Semaphore {
public:
    MiscountingSemaphore(std::shared_ptr<Semaphore> real, Defect defect)
        : real_(std::move(real)), defect_(defect)
    {}
    Task<void> wait() override { return real_->wait(); }
    void signal() override
    {
        const bool isWrong = ++signals_ % 5 == 0;
        if (!isWrong || defect_ != Defect::losesTheGate) {
            real_->signal();
        }
        if (isWrong && defect_ == Defect::opensTheGateTwice) {
            real_->signal();
        }
    }

private:
    const std::shared_ptr<Semaphore> real_;
    const Defect defect_;
    int signals_ = 0;
};

}  // namespace

std::shared_ptr<Semaphore> MeddlingQueues::createSemaphore(unsigned initialCount)
{
    return std::make_shared<MiscountingSemaphore>(real_.createSemaphore(initialCount), defect_);
}

std::optional<CodeSigningTask> ConfusableCodeSigning::taskFromAuditToken(const AuditToken& token)
{
    auto task = real_.taskFromAuditToken(token);
    return isConfused_ ? std::exchange(before_, std::move(task)) : task;
}

PropertyListReading AgeingFileSystem::readPropertyList(const std::string& path)
{
    auto reading = real_.readPropertyList(path);
    if (!isOld_ || path != UserFontRegistry::path || !reading.value) {
        return reading;
    }
    if (!first_) {
        first_ = std::move(reading);
    }
    return *first_;
}

/// Decides as the daemon does, and notes what comes of it.
class MeddlingIpc::Delegate final : public ListenerDelegate {
public:
    Delegate(MeddlingIpc& ipc, std::weak_ptr<ListenerDelegate> daemon) : ipc_(ipc), daemon_(std::move(daemon))
    {}
    bool listener(Listener& listener, std::shared_ptr<Connection> shouldAcceptNewConnection) override
    {
        const auto daemon = daemon_.lock();
        if (!daemon || !daemon->listener(listener, shouldAcceptNewConnection)) {
            return false;
        }
        const auto object = shouldAcceptNewConnection->exportedObject();
        ipc_.made_.emplace_back(object);
        ipc_.made_.emplace_back(shouldAcceptNewConnection);
        if (ipc_.defect_ == Defect::answersTwice) {
            shouldAcceptNewConnection->setExportedObject(std::make_shared<TwiceAnsweringObject>(object));
        } else if (ipc_.defect_ == Defect::keepsHandlers) {
            ipc_.kept_.push_back(object);
        }
        return true;
    }

private:
    MeddlingIpc& ipc_;
    const std::weak_ptr<ListenerDelegate> daemon_;
};

class MeddlingIpc::NamedListener final : public Listener {
public:
    NamedListener(MeddlingIpc& ipc, std::shared_ptr<Listener> real) : ipc_(ipc), real_(std::move(real)) {}
    void setDelegate(std::weak_ptr<ListenerDelegate> delegate) override
    {
        ipc_.delegates_.push_back(std::make_shared<Delegate>(ipc_, std::move(delegate)));
        real_->setDelegate(ipc_.delegates_.back());
    }
    void resume() override { real_->resume(); }
    void invalidate() override { real_->invalidate(); }
    std::shared_ptr<ListenerEndpoint> endpoint() const override { return real_->endpoint(); }

private:
    MeddlingIpc& ipc_;
    const std::shared_ptr<Listener> real_;
};

std::shared_ptr<Listener> MeddlingIpc::listenerForService(std::string name)
{
    return std::make_shared<NamedListener>(*this, real_.listenerForService(std::move(name)));
}

std::size_t MeddlingIpc::held() const
{
    return static_cast<std::size_t>(
        std::ranges::count_if(made_, [](const auto& object) { return !object.expired(); }));
}

}  // namespace typhon::simulation
