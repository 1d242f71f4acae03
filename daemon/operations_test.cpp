#include "daemon/operations.h"
#include "daemon/typhon_daemon.h"
#include "platform/simulated/simulated_platform.h"

#include <set>

#include <gtest/gtest.h>

namespace typhon {
namespace {

/// A call that is not of any connection.
class LooseCall final : public IncomingCall {
public:
    LooseCall(std::string interface, std::string member, Arguments arguments)
        : interface_(std::move(interface)), member_(std::move(member)), arguments_(std::move(arguments))
    {}
    const std::string& interface() const override { return interface_; }
    const std::string& member() const override { return member_; }
    const Arguments& arguments() const override { return arguments_; }
    bool isReplyExpected() const override { return true; }
    void reply(Arguments) override { outcomes.emplace_back("reply"); }
    void fail(IpcError error) override { outcomes.push_back(error.name); }

    std::vector<std::string> outcomes;

private:
    std::string interface_;
    std::string member_;
    Arguments arguments_;
};

class OperationsTest : public testing::Test {
protected:
    /// What becomes of a call by a process of that identifier.
    std::vector<std::string> outcomesOf(std::string interface, std::string member, Arguments arguments = {},
                                        const std::string& identifier = "com.example.app")
    {
        const auto call =
            std::make_shared<LooseCall>(std::move(interface), std::move(member), std::move(arguments));
        const auto token = simulated.processes.add({.signingIdentifier = identifier});
        simulated.runAs(token, dispatch(handler, call));
        return call->outcomes;
    }
    std::vector<std::string> outcomesOf(const wire::Operation& operation, Arguments arguments = {},
                                        const std::string& identifier = "com.example.app")
    {
        return outcomesOf(operation.interface, operation.member, std::move(arguments), identifier);
    }

    SimulatedPlatform simulated;
    std::shared_ptr<TyphonDaemon> daemon = std::make_shared<TyphonDaemon>(simulated.platform);
    std::shared_ptr<TyphonHandler> handler = std::make_shared<TyphonHandler>(daemon);
};

using Outcomes = std::vector<std::string>;

TEST_F(OperationsTest, TheTableHoldsExactlyWhatConnectionsExport)
{
    std::set<std::string> dispatched;
    for (const auto& row : dispatchTable()) {
        EXPECT_TRUE(dispatched
                        .insert(std::string(row.operation.interface) + "." + row.operation.member +
                                row.operation.inTypes + ">" + row.operation.outTypes)
                        .second);
    }
    std::set<std::string> exported;
    for (const auto& interface : *wire::typhonDaemonInterfaces()) {
        for (const auto& member : interface.members) {
            exported.insert(interface.name + "." + member.name + member.inTypes + ">" + member.outTypes);
        }
    }
    EXPECT_EQ(dispatched, exported);
}

TEST_F(OperationsTest, RequestingFontsForAClientIsForTheFontPickerOnly)
{
    const Arguments arguments{PropertyList("Alpha"), simulated.ipc.anonymousListener()->endpoint()};
    EXPECT_EQ(outcomesOf(wire::requestFontsForClient, arguments), Outcomes{ipc_errors::accessDenied});
    EXPECT_EQ(outcomesOf(wire::requestFontsForClient, arguments, "com.vorlan.Panekit.FontPicker"),
              Outcomes{"reply"});
}

TEST_F(OperationsTest, AnUnknownMemberOrInterfaceIsAnUnknownMethod)
{
    const Outcomes unknown{ipc_errors::unknownMethod};
    EXPECT_EQ(outcomesOf(wire::typhonProtocol, "fontChanged"), unknown);
    EXPECT_EQ(outcomesOf(wire::typhonSilkpageSupportProtocol, "checkin"), unknown);
    EXPECT_EQ(outcomesOf("", ""), unknown);
}

TEST_F(OperationsTest, ServedOperationsAnswerOnce)
{
    const Outcomes one{"reply"};
    EXPECT_EQ(outcomesOf(wire::checkin), one);
    EXPECT_EQ(outcomesOf(wire::checkinForFontPicker), one);
    EXPECT_EQ(outcomesOf(wire::fontChanged, {PropertyList()}), one);
    EXPECT_EQ(outcomesOf(wire::updatingUserFonts), one);
    EXPECT_EQ(outcomesOf(wire::scheduleFontFilesDeletion, {PropertyList(PropertyList::Array{})}), one);
    EXPECT_EQ(outcomesOf(wire::resetIssuedFontsFor, {PropertyList("com.example.app")}), one);
    EXPECT_EQ(outcomesOf(wire::requestFonts, {PropertyList(PropertyList::Array{})}), one);
    EXPECT_EQ(outcomesOf(wire::synchronizeFontAssets, {PropertyList(PropertyList::Array{})}), one);
}

TEST_F(OperationsTest, SendFontsNeverAnswers)
{
    EXPECT_EQ(outcomesOf(wire::sendFonts, {PropertyList(PropertyList::Array{})}), Outcomes{});
}

TEST_F(OperationsTest, TheDaemonItselfDoesNotKnowWhatItDoesNotImplement)
{
    const auto isUnknown = [&](Task<void> operation) {
        bool threw = false;
        try {
            simulated.run(std::move(operation));
        } catch (const std::logic_error&) {
            threw = true;
        }
        return threw;
    };
    const auto nobody = [](const std::optional<PropertyList>&) {};
    EXPECT_TRUE(isUnknown(daemon->checkin(nobody)));
    EXPECT_TRUE(isUnknown(daemon->checkinForFontPicker(nobody)));
    EXPECT_TRUE(isUnknown(daemon->sendFonts({}, [] {})));
    EXPECT_TRUE(isUnknown(daemon->checkinForSilkpageProcess(nullptr, [] {})));
}

}  // namespace
}  // namespace typhon
