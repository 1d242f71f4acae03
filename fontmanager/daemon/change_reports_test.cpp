#include "fontmanager/daemon/change_reports.h"
#include "platform/simulated/simulated_platform.h"
#include "protocol/wire.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

/// A font daemon that answers a report at once and does something about it when it is let.
class ReportedTo final : public ListenerDelegate,
                         public ExportedObject,
                         public std::enable_shared_from_this<ReportedTo> {
public:
    explicit ReportedTo(SimulatedPlatform& simulated)
        : mayGoOn(simulated.queues.createSemaphore(0)),
          listener_(simulated.ipc.process({1, 1, 1, 1, 0, 2})->listenerForService(wire::serviceName))
    {}

    void listen()
    {
        listener_->setDelegate(weak_from_this());
        listener_->resume();
    }
    bool listener(Listener&, std::shared_ptr<Connection> newConnection) override
    {
        newConnection->setExportedInterfaces(wire::typhonDaemonInterfaces());
        newConnection->setExportedObject(shared_from_this());
        newConnection->resume();
        return true;
    }
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        call->reply({});
        if (call->member() == wire::fontChanged.member) {
            ++reports;
            auto turn = mayGoOn->wait();
            co_await std::move(turn);
        }
    }

    int reports = 0;
    const std::shared_ptr<Semaphore> mayGoOn;

private:
    const std::shared_ptr<Listener> listener_;
};

class ChangeReportsTest : public testing::Test {
protected:
    ChangeReportsTest() { daemon->listen(); }

    void report(RegistryChange change)
    {
        queue->async(reporting(this, std::move(change)));
        simulated.drain();
    }
    static Task<void> reporting(ChangeReportsTest* test, RegistryChange change)
    {
        auto work = test->reports.report(std::move(change), ChangeReports::Kind::userFonts);
        co_await std::move(work);
        test->isOver = true;
    }

    SimulatedPlatform simulated;
    std::shared_ptr<WorkQueue> queue = simulated.queues.createSerialQueue("test");
    std::shared_ptr<ReportedTo> daemon = std::make_shared<ReportedTo>(simulated);
    DaemonReports reports{simulated.ipc, simulated.log};
    bool isOver = false;
};

TEST_F(ChangeReportsTest, AReportIsOverWhenTheDaemonHasDoneSomethingAboutIt)
{
    report({.available = {"/a.ttf"}, .gone = {}, .isRegistryChanged = true});
    EXPECT_EQ(daemon->reports, 1);
    EXPECT_FALSE(isOver) << "answered, and nothing done yet";
    daemon->mayGoOn->signal();
    simulated.drain();
    EXPECT_TRUE(isOver);
}

TEST_F(ChangeReportsTest, TheSecondReportComesAfterTheFirst)
{
    report({.available = {"/a.ttf"}, .gone = {"/b.ttf"}, .isRegistryChanged = true});
    EXPECT_EQ(daemon->reports, 1);
    daemon->mayGoOn->signal();
    simulated.drain();
    EXPECT_EQ(daemon->reports, 2);
    EXPECT_FALSE(isOver);
    daemon->mayGoOn->signal();
    simulated.drain();
    EXPECT_TRUE(isOver);
}

TEST_F(ChangeReportsTest, NoChangeIsNoReport)
{
    report({});
    EXPECT_EQ(daemon->reports, 0);
    EXPECT_TRUE(isOver);
}

}  // namespace
}  // namespace typhon
