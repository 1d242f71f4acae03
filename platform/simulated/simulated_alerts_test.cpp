#include "platform/simulated/simulated_platform.h"

#include <gtest/gtest.h>

namespace typhon {

namespace {

TEST(SimulatedProcessLifecycle, ShowsWhomTheTestMadeVisibleUntilItExits)
{
    SimulatedPlatform device;
    const auto process = device.processes.add({});
    const auto identifier = LWSProcessIdentifier::identifierWithPid(process);
    EXPECT_TRUE(device.processLifecycle.currentState(identifier)->endowmentNamespaces.empty());

    device.processLifecycle.setVisible(process, true);
    EXPECT_TRUE(device.processLifecycle.currentState(identifier)
                    ->endowmentNamespaces.contains(visibilityEndowmentNamespace));

    device.processes.exit(process);
    EXPECT_FALSE(device.processLifecycle.currentState(identifier));
}

TEST(SimulatedAnalytics, BuildsLaterAndOnlyWhileItCollects)
{
    SimulatedPlatform device;
    int built = 0;
    const auto build = [&built]() -> PropertyList { return PropertyList::Dictionary{{"built", ++built}}; };

    device.analytics.sendEventLazily("event", build);
    EXPECT_EQ(built, 0);
    device.drain();
    ASSERT_EQ(device.analytics.events().size(), 1U);
    EXPECT_EQ(device.analytics.events()[0].name, "event");

    device.analytics.setCollecting(false);
    device.analytics.sendEventLazily("event", build);
    device.drain();
    EXPECT_EQ(built, 1);
    EXPECT_EQ(device.analytics.offered(), 2U);
}

class Answered final : public ExportedObject, public ListenerDelegate {
public:
    bool listener(Listener& /*listener*/, std::shared_ptr<Connection> connection) override
    {
        connection->setExportedInterfaces(interfaces());
        connection->setExportedObject(std::shared_ptr<ExportedObject>(std::shared_ptr<void>(), this));
        connection->resume();
        return true;
    }
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        answers.push_back(std::get<PropertyList>(call->arguments().at(0)));
        call->reply({});
        co_return;
    }
    static InterfaceDescriptions interfaces()
    {
        return std::make_shared<const std::vector<InterfaceDescription>>(
            std::vector<InterfaceDescription>{{"com.vorlan.test.Alert", {{"done", "s", ""}}}});
    }
    std::vector<PropertyList> answers;
};

TEST(SimulatedRemoteAlerts, RemembersAnAlertAndLetsTheTestAnswerIt)
{
    SimulatedPlatform device;
    const auto answered = std::make_shared<Answered>();
    const auto listener = device.ipc.anonymousListener();
    listener->setDelegate(answered);
    listener->resume();

    const auto handle = device.remoteAlerts.newHandle({"service", "Controller"}, {listener->endpoint()});
    handle->activateWithContext({PropertyList::Dictionary{{"fonts", PropertyList::Array{}}}});
    ASSERT_EQ(device.remoteAlerts.alerts().size(), 1U);
    EXPECT_EQ(device.remoteAlerts.alerts()[0]->definition.viewControllerClassName, "Controller");
    EXPECT_EQ(device.remoteAlerts.alerts()[0]->activations.size(), 1U);

    AuditToken viewService{1, 77, 77, 1, 0, 1};
    const auto connection = device.remoteAlerts.connectViewService(0, viewService, Answered::interfaces());
    connection->send("com.vorlan.test.Alert", "done", {PropertyList("yes")}, [](const IpcError&) {});
    device.drain();
    EXPECT_EQ(answered->answers, std::vector<PropertyList>{PropertyList("yes")});
}

}  // namespace

}  // namespace typhon
