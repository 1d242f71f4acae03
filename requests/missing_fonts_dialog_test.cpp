#include "testing/request_world.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace testing_aid;
using Names = std::vector<std::string>;

class MissingFontsDialogTest : public testing::Test {
protected:
    using Answers = std::shared_ptr<std::vector<Array>>;

    static Task<void> keep(Answers answers, Array answer)
    {
        answers->push_back(std::move(answer));
        co_return;
    }
    /// Shows a dialog with one row over the process; gives the answers that come.
    Answers show(const AuditToken& process, const std::string& name = "Gamma")
    {
        auto answers = std::make_shared<std::vector<Array>>();
        world.simulated.run(world.dialog.showDialog(
            MissingFontsDialog::missingFontsDialogRequestsFromUnknownFontNames({name}),
            LWSProcessIdentifier::identifierWithPid(process),
            [answers](Array answer) { return keep(answers, std::move(answer)); }));
        return answers;
    }
    std::size_t ignored(const AuditToken& process)
    {
        return world.simulated.log.count(
            LogSink::daemon, LogLevel::defaultLevel,
            "An application (pid:" + std::to_string(process.processIdentifier) +
                ") tried to show missing fonts dialog in the background.  It's ignored.");
    }
    std::shared_ptr<MissingFontsDialogHandler> handler() { return world.dialog.missingFontsDialogHandler(); }
    const auto& alerts() { return world.simulated.remoteAlerts.alerts(); }

    RequestWorld world;
    AuditToken visible = world.addApplication("com.example.app");
    const std::vector<Array> emptyAnswer{{}};
};

TEST_F(MissingFontsDialogTest, UnknownNamesGiveRowsInTheirOrderWithoutProviders)
{
    EXPECT_EQ(MissingFontsDialog::missingFontsDialogRequestsFromUnknownFontNames({"B", "A"}),
              (Array{Dictionary{{"displayName", "B"}, {"providers", Array{}}},
                     Dictionary{{"displayName", "A"}, {"providers", Array{}}}}));
}

TEST_F(MissingFontsDialogTest, ADisabledFamilyGivenTwiceIsOneRowWithAllItsProviders)
{
    world.install(fontFiles + "a.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}}, true);
    world.install(fontFiles + "b.foundry/a.ttf", {{"Alpha-Bold", "Alpha"}}, true);
    EXPECT_EQ(world.dialog.missingFontsDialogRequestsFromDisabledFamilyNames({"Alpha", "Alpha"}),
              (Array{Dictionary{{"displayName", "Alpha"},
                                {"providers", Array{"a.foundry", "b.foundry"}},
                                {"uniqueID", "Alpha"}}}));
}

TEST_F(MissingFontsDialogTest, AFamilyWithoutProvidersStillHasARow)
{
    EXPECT_EQ(world.dialog.missingFontsDialogRequestsFromDisabledFamilyNames({"Alpha"}),
              (Array{Dictionary{{"displayName", "Alpha"}, {"providers", Array{}}, {"uniqueID", "Alpha"}}}));
}

TEST_F(MissingFontsDialogTest, AVisibleApplicationGetsTheAlertWithItsRows)
{
    const auto answers = show(visible);
    ASSERT_EQ(alerts().size(), 1U);
    EXPECT_EQ(alerts()[0]->definition.serviceName, "com.vorlan.FontInstallViewService");
    EXPECT_EQ(alerts()[0]->definition.viewControllerClassName, "FontInstallMissingController");
    EXPECT_EQ(alerts()[0]->activations,
              std::vector<PropertyList>{(Dictionary{
                  {"fonts", Array{Dictionary{{"displayName", "Gamma"}, {"providers", Array{}}}}}})});
    EXPECT_TRUE(answers->empty());
    ASSERT_NE(handler(), nullptr);
    EXPECT_NE(handler()->listener(), nullptr);
    EXPECT_EQ(handler()->daemon(), world.daemon);
    EXPECT_TRUE(handler()->completionHandler());
}

TEST_F(MissingFontsDialogTest, AnApplicationInTheBackgroundIsAnsweredEmptyAndNoted)
{
    const auto hidden = world.addApplication("com.example.hidden", false);
    EXPECT_EQ(*show(hidden), emptyAnswer);
    EXPECT_EQ(ignored(hidden), 1U);
    EXPECT_TRUE(alerts().empty());
    EXPECT_EQ(handler(), nullptr);
}

TEST_F(MissingFontsDialogTest, AnApplicationThatHasExitedIsAnsweredEmptyAndNoted)
{
    world.simulated.processes.exit(visible);
    EXPECT_EQ(*show(visible), emptyAnswer);
    EXPECT_EQ(ignored(visible), 1U);
}

TEST_F(MissingFontsDialogTest, AProcessThatInheritedTheIdentifierIsNotTheOneThatAsked)
{
    auto successor = visible;
    successor.processInstance += 1000;
    world.simulated.processes.exit(visible);
    world.simulated.processes.set(successor, {});
    world.simulated.processLifecycle.setVisible(successor, true);
    EXPECT_EQ(*show(visible), emptyAnswer);
    EXPECT_EQ(ignored(visible), 1U);
}

TEST_F(MissingFontsDialogTest, WithoutAnAlertServiceTheAnswerIsEmptyAndNothingIsSaid)
{
    world.simulated.remoteAlerts.setDefinitionClassAvailable(false);
    EXPECT_EQ(*show(visible), emptyAnswer);
    EXPECT_TRUE(world.simulated.log.entries().empty());
}

TEST_F(MissingFontsDialogTest, TheAnswerIsPassedOnAndTheListenerCloses)
{
    const auto answers = show(visible);
    ViewService service(world, 0);
    service.answer({choice("Gamma", "com.example.foundry"), Dictionary{}});
    EXPECT_EQ(*answers, (std::vector<Array>{{choice("Gamma", "com.example.foundry"), Dictionary{}}}));
    EXPECT_EQ(service.outcomes(), Names{"answered"});
    ASSERT_NE(handler(), nullptr);
    EXPECT_EQ(handler()->listener(), nullptr);
    // Nobody else can connect, and the one that is connected may answer again.
    ViewService late(world, 0);
    late.answer({});
    EXPECT_EQ(late.outcomes(), Names{ipc_errors::disconnected});
    service.answer({});
    EXPECT_EQ(answers->size(), 2U);
}

TEST_F(MissingFontsDialogTest, EveryConnectionToTheListenerIsAccepted)
{
    const auto answers = show(visible);
    ViewService first(world, 0);
    ViewService second(world, 0);
    second.answer({});
    first.answer({});
    EXPECT_EQ(answers->size(), 2U);
}

TEST_F(MissingFontsDialogTest, ASecondDialogReplacesTheHandlerAndTheFirstCanStillAnswer)
{
    const auto firstAnswers = show(visible);
    const std::weak_ptr<MissingFontsDialogHandler> first = handler();
    ViewService service(world, 0);
    const auto secondAnswers = show(visible, "Delta");
    EXPECT_NE(handler(), first.lock());
    ASSERT_FALSE(first.expired());
    EXPECT_NE(first.lock()->listener(), nullptr);
    service.answer({});
    EXPECT_EQ(first.lock()->listener(), nullptr);
    EXPECT_NE(handler()->listener(), nullptr);
    EXPECT_EQ(firstAnswers->size(), 1U);
    EXPECT_TRUE(secondAnswers->empty());
    service.disconnect();
    EXPECT_TRUE(first.expired());
}

TEST_F(MissingFontsDialogTest, AReplacedDialogThatNobodyIsConnectedToLeavesNothingBehind)
{
    show(visible);
    const std::weak_ptr<MissingFontsDialogHandler> first = handler();
    const std::weak_ptr<Listener> listener = handler()->listener();
    show(visible, "Delta");
    EXPECT_TRUE(first.expired());
    EXPECT_TRUE(listener.expired());
    ViewService late(world, 0);
    late.answer({});
    EXPECT_EQ(late.outcomes(), Names{ipc_errors::disconnected});
}

}  // namespace
}  // namespace typhon
