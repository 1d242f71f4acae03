#include "clients/typhon_handler.h"
#include "daemon/typhon_daemon.h"
#include "platform/file_url.h"
#include "platform/simulated/simulated_platform.h"
#include "protocol/wire.h"

#include <gtest/gtest.h>

// What becomes of a report that fonts changed, from the client that reports it to those that are told.

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Strings = std::vector<std::string>;

const std::string fontFiles = "/var/mobile/Library/UserFonts/FontFiles/";
const std::string fontAssets = "/var/mobile/Library/UserFonts/FontAssets/";
const std::string ownFont = fontFiles + "com.example.provider/a.ttf";
const std::string disabledFont = fontFiles + "com.example.provider/b.ttf";
const std::string otherFont = fontFiles + "com.example.other/c.ttf";
const std::string assetFont = fontAssets + "com.example.provider/d.ttf";
const std::string profileFont = "/var/mobile/Library/Fonts/Managed/p.ttf";

const PropertyList entry = Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}};

/// What a client was told: the arguments, or the name of its own reply.
struct Message {
    std::optional<PropertyList> info;
    std::optional<PropertyList> added;
    std::optional<PropertyList> removed;

    PropertyList fonts() const { return *info.value().find("fontsInfo"); }
};

/// A client process, and what it hears.
class Client final : public ExportedObject {
public:
    Task<void> handle(std::shared_ptr<IncomingCall> call) override
    {
        EXPECT_FALSE(call->isReplyExpected());
        const auto value = [&](std::size_t index) {
            return wire::fromNullable(std::get<PropertyList>(call->arguments().at(index)));
        };
        messages.push_back({value(0), value(1), value(2)});
        co_return;
    }

    AuditToken token;
    std::shared_ptr<Connection> connection;
    std::vector<Message> messages;
    int replies = 0;
};

PropertyList urlsOf(const Strings& paths)
{
    Array urls;
    for (const auto& path : paths) {
        urls.emplace_back(fileUrlFromPath(path));
    }
    return urls;
}

PropertyList added(const Strings& paths, int kind = 0)
{
    return Dictionary{{"urls", urlsOf(paths)}, {"added", true}, {"kind", kind}};
}

PropertyList removed(const Strings& paths, int kind = 0)
{
    return Dictionary{{"urls", urlsOf(paths)}, {"added", false}, {"kind", kind}};
}

Task<void> countReply(std::shared_ptr<Client> client)
{
    ++client->replies;
    co_return;
}

class FontChangeBroadcastTest : public testing::Test {
protected:
    FontChangeBroadcastTest()
    {
        auto off = *entry.asDictionary();
        off.emplace("disabled", true);
        simulated.fileSystem.addFile(
            UserFontRegistry::path,
            Dictionary{{ownFont, entry}, {disabledFont, off}, {otherFont, entry}, {assetFont, entry}});
        simulated.userFontManager.setProfileFontsInfo(
            Dictionary{{profileFont, entry}, {"/var/mobile/Library/Fonts/Managed/q.ttf", entry}});
        daemon->setupForSluiceService();
    }

    std::shared_ptr<Client> connect(const Strings& capabilities,
                                    const std::string& identifier = "com.example.app")
    {
        auto client = std::make_shared<Client>();
        client->token = simulated.processes.add(
            {.signingIdentifier = identifier,
             .entitlements = {{"com.vorlan.developer.user-fonts", arrayOfStrings(capabilities)}}});
        client->connection = simulated.ipc.connectClient(wire::serviceName, client->token);
        client->connection->setRemoteObjectInterfaces(wire::typhonDaemonInterfaces());
        client->connection->setExportedInterfaces(wire::typhonClientInterfaces());
        client->connection->setExportedObject(client);
        client->connection->resume();
        simulated.drain();
        return client;
    }
    std::shared_ptr<Client> checkedIn(const Strings& capabilities,
                                      const std::string& identifier = "com.example.app")
    {
        auto client = connect(capabilities, identifier);
        client->connection->call(wire::checkin.interface, wire::checkin.member, {}, nullptr, nullptr);
        simulated.drain();
        return client;
    }
    std::shared_ptr<Client> provider() { return checkedIn({"system-installation"}, "com.example.provider"); }

    void callFontChanged(const std::shared_ptr<Client>& client, const PropertyList& change)
    {
        client->connection->call(
            wire::fontChanged.interface, wire::fontChanged.member, {change},
            [client](const Arguments&) { return countReply(client); },
            [](const IpcError& error) { ADD_FAILURE() << error.name; });
    }
    /// Has a client that takes no part report a change.
    void report(const PropertyList& change)
    {
        const auto reporter = connect({});
        callFontChanged(reporter, change);
        simulated.drain();
        EXPECT_EQ(reporter->replies, 1);
        EXPECT_TRUE(reporter->messages.empty());
    }
    std::size_t complaintsAbout(const std::string& path) const
    {
        return simulated.log.count(LogSink::daemon, LogLevel::error, "got invalid font path: " + path);
    }

    SimulatedPlatform simulated;
    std::shared_ptr<TyphonDaemon> daemon = std::make_shared<TyphonDaemon>(simulated.platform);
};

TEST_F(FontChangeBroadcastTest, AnEnumeratingClientIsToldOfAllAddedFontsWithTheirEntries)
{
    const auto client = checkedIn({"font-enumeration"});
    report(added({ownFont, disabledFont, otherFont, assetFont}));
    ASSERT_EQ(client->messages.size(), 1U);
    EXPECT_EQ(client->messages[0].fonts(),
              PropertyList(Dictionary{{ownFont, entry}, {otherFont, entry}, {assetFont, entry}}));
    EXPECT_EQ(client->messages[0].info->asDictionary()->size(), 1U);
    EXPECT_EQ(client->messages[0].added, urlsOf({ownFont, disabledFont, otherFont, assetFont}));
    EXPECT_EQ(client->messages[0].removed, std::nullopt);
}

TEST_F(FontChangeBroadcastTest, AProviderIsToldOfItsOwnAddedFontsAndGetsItsDirectory)
{
    const auto client = provider();
    report(added({ownFont, otherFont, assetFont, disabledFont}));
    ASSERT_EQ(client->messages.size(), 1U);
    const auto& message = client->messages[0];
    EXPECT_EQ(message.fonts(), PropertyList(Dictionary{{ownFont, entry}, {assetFont, entry}}));
    EXPECT_EQ(message.added, urlsOf({ownFont, assetFont, disabledFont}));
    EXPECT_NE(message.info->find("extension.provider"), nullptr);
    EXPECT_EQ(simulated.sandbox.issued().back().path, fontFiles + "com.example.provider");
    EXPECT_EQ(simulated.sandbox.issued().back().token, client->token);
}

TEST_F(FontChangeBroadcastTest, AProviderIsNotToldOfFontsThatOthersAdded)
{
    const auto client = provider();
    report(added({otherFont, fontFiles + "com.example.provider/deeper/x.ttf"}));
    EXPECT_TRUE(client->messages.empty());
}

TEST_F(FontChangeBroadcastTest, AProviderWhoseAddedFontsAreNotRegisteredGetsNoExtension)
{
    const auto client = provider();
    report(added({fontFiles + "com.example.provider/unknown.ttf"}));
    ASSERT_EQ(client->messages.size(), 1U);
    EXPECT_EQ(client->messages[0].info, PropertyList(Dictionary{{"fontsInfo", Dictionary{}}}));
}

TEST_F(FontChangeBroadcastTest, AProviderThatCanReadItsDirectoryGetsNoExtension)
{
    const auto client = provider();
    simulated.processes.set(client->token, {.signingIdentifier = "com.example.provider",
                                            .readablePaths = {fontFiles + "com.example.provider"}});
    report(added({ownFont}));
    EXPECT_EQ(client->messages.at(0).info->asDictionary()->size(), 1U);
}

TEST_F(FontChangeBroadcastTest, AProviderThatMayEnumerateIsToldOfEverythingAndNeedsNoExtension)
{
    const auto client = checkedIn({"font-enumeration", "system-installation"}, "com.example.provider");
    report(added({ownFont, otherFont}));
    EXPECT_EQ(client->messages.at(0).info,
              PropertyList(Dictionary{{"fontsInfo", Dictionary{{ownFont, entry}, {otherFont, entry}}}}));
}

TEST_F(FontChangeBroadcastTest, ARemovalReachesEnumeratingClientsAndProvidersAlsoOfOthersFilesWithAnEmptyInfo)
{
    const auto client = provider();
    const auto other = checkedIn({"system-installation"}, "com.example.stranger");
    const auto enumerating = checkedIn({"font-enumeration"});
    report(removed({otherFont, "/elsewhere.ttf"}));
    for (const auto& told : {client, other, enumerating}) {
        ASSERT_EQ(told->messages.size(), 1U);
        EXPECT_EQ(told->messages[0].info, PropertyList(Dictionary{}));
        EXPECT_EQ(told->messages[0].added, std::nullopt);
        EXPECT_EQ(told->messages[0].removed, urlsOf({otherFont, "/elsewhere.ttf"}));
    }
    EXPECT_EQ(complaintsAbout("/elsewhere.ttf"), 0U);
}

TEST_F(FontChangeBroadcastTest, AChangeWhoseUrlsAllFailTheTestsSendsNothing)
{
    const auto enumerating = checkedIn({"font-enumeration"});
    const auto client = provider();
    report(added({"/elsewhere/a.ttf", "/var/mobile/Library/UserFonts/FontFilesElsewhere/b.ttf"}));
    report(Dictionary{{"urls", Array{"no url", 5}}, {"added", true}});
    report(Dictionary{{"urls", Array{"no url", 5}}, {"added", false}});
    report(Dictionary{});
    report(Dictionary{{"urls", "file:///a"}, {"added", true}});
    EXPECT_TRUE(enumerating->messages.empty());
    EXPECT_TRUE(client->messages.empty());
}

TEST_F(FontChangeBroadcastTest, AFontElsewhereIsComplainedOfOnceAChangeAndSkipped)
{
    const auto first = checkedIn({"font-enumeration"});
    const auto second = checkedIn({"font-enumeration"});
    report(added({"/elsewhere/a b.ttf", ownFont}));
    EXPECT_EQ(first->messages.at(0).added, urlsOf({ownFont}));
    EXPECT_EQ(second->messages.at(0).added, urlsOf({ownFont}));
    EXPECT_EQ(complaintsAbout("/elsewhere/a b.ttf"), 1U);
}

TEST_F(FontChangeBroadcastTest, NobodyComplainsOfFontsElsewhereWhenNobodyIsTold)
{
    checkedIn({"app-usage"});
    report(added({"/elsewhere/a.ttf"}));
    EXPECT_EQ(complaintsAbout("/elsewhere/a.ttf"), 0U);
}

TEST_F(FontChangeBroadcastTest, AClientThatOnlyUsesIssuedFontsIsRegisteredAndHearsNothingOfUserFonts)
{
    const auto client = checkedIn({"app-usage"});
    EXPECT_EQ(daemon->notificationCenter().observerCount("fontChanged"), 1U);
    report(added({ownFont}));
    report(removed({ownFont}));
    EXPECT_TRUE(client->messages.empty());
}

TEST_F(FontChangeBroadcastTest, AProfileFontChangeReachesEvenAClientWithoutEntitlements)
{
    const auto client = checkedIn({});
    report(added({profileFont, "/unknown.ttf"}, 1));
    report(removed({profileFont}, 2));
    ASSERT_EQ(client->messages.size(), 2U);
    EXPECT_EQ(client->messages[0].info,
              PropertyList(Dictionary{{"fontsInfo", Dictionary{{profileFont, entry}}}}));
    EXPECT_EQ(client->messages[0].added, urlsOf({profileFont, "/unknown.ttf"}));
    EXPECT_EQ(client->messages[0].removed, std::nullopt);
    EXPECT_EQ(client->messages[1].info, std::nullopt);
    EXPECT_EQ(client->messages[1].added, std::nullopt);
    EXPECT_EQ(client->messages[1].removed, urlsOf({profileFont}));
}

TEST_F(FontChangeBroadcastTest, AProfileFontChangeIsSentWhateverItsUrls)
{
    const auto client = checkedIn({});
    report(Dictionary{{"kind", 1}});
    ASSERT_EQ(client->messages.size(), 1U);
    EXPECT_EQ(client->messages[0].removed, PropertyList(Array{}));
}

TEST_F(FontChangeBroadcastTest, TheReportingClientHearsItsOwnChangeLikeEveryOther)
{
    const auto client = checkedIn({"font-enumeration"});
    callFontChanged(client, added({ownFont}));
    simulated.drain();
    EXPECT_EQ(client->replies, 1);
    ASSERT_EQ(client->messages.size(), 1U);
    EXPECT_EQ(client->messages[0].added, urlsOf({ownFont}));
}

TEST_F(FontChangeBroadcastTest, TheReportingClientIsAnsweredBeforeTheCacheIsDropped)
{
    const auto before = daemon->userFontRegistry().userFontsInfo();
    bool wasKept = false;
    const auto queue = simulated.queues.createSerialQueue("a client's connection");
    queue->async(daemon->fontChanged(
        added({ownFont}), [&] { wasKept = daemon->userFontRegistry().userFontsInfo() == before; }));
    simulated.drain();
    EXPECT_TRUE(wasKept);
    EXPECT_NE(daemon->userFontRegistry().userFontsInfo(), before);
}

TEST_F(FontChangeBroadcastTest, TheReportingClientIsAnsweredWhileMainHandlerQueueIsBusy)
{
    const auto gate = simulated.queues.createSemaphore(0);
    auto waiting = gate->wait();
    daemon->mainHandlerQueue().async(std::move(waiting));
    const auto reporter = connect({});
    const auto client = checkedIn({});
    callFontChanged(reporter, removed({profileFont}, 1));
    simulated.drain();
    EXPECT_EQ(reporter->replies, 1);
    EXPECT_TRUE(client->messages.empty());
    gate->signal();
    simulated.drain();
    EXPECT_EQ(client->messages.size(), 1U);
}

TEST_F(FontChangeBroadcastTest, AClientsFurtherReportsWaitForTheFirstSoThatTheyDoNotPileUp)
{
    const auto gate = simulated.queues.createSemaphore(0);
    auto waiting = gate->wait();
    daemon->mainHandlerQueue().async(std::move(waiting));
    const auto reporter = connect({});
    callFontChanged(reporter, Dictionary{});
    callFontChanged(reporter, Dictionary{});
    simulated.drain();
    EXPECT_EQ(reporter->replies, 1);
    gate->signal();
    simulated.drain();
    EXPECT_EQ(reporter->replies, 2);
}

TEST_F(FontChangeBroadcastTest, TheSystemIsToldAfterTheClients)
{
    EXPECT_TRUE(simulated.notifications.posted().empty());
    report(added({ownFont}));
    EXPECT_EQ(simulated.notifications.posted(), Strings{"FontProviderDidChangeDistributedNotification"});
    EXPECT_TRUE(
        simulated.log.contains(LogSink::daemon, LogLevel::debug, "received fontChanged notification."));
}

TEST_F(FontChangeBroadcastTest, TheRegistryIsReadAnewOnceForAllClients)
{
    const auto first = checkedIn({"font-enumeration"});
    const auto second = provider();
    const auto reads = simulated.fileSystem.reads(UserFontRegistry::path);
    const auto newFont = fontFiles + "com.example.provider/new.ttf";
    simulated.fileSystem.addFile(UserFontRegistry::path, Dictionary{{newFont, entry}});
    report(added({newFont}));
    EXPECT_EQ(first->messages.at(0).fonts(), PropertyList(Dictionary{{newFont, entry}}));
    EXPECT_EQ(second->messages.at(0).fonts(), PropertyList(Dictionary{{newFont, entry}}));
    EXPECT_EQ(simulated.fileSystem.reads(UserFontRegistry::path), reads + 1);
}

TEST_F(FontChangeBroadcastTest, EnumeratingClientsShareOneValueAndNotBeyondItsChange)
{
    const auto first = checkedIn({"font-enumeration"});
    const auto second = checkedIn({"font-enumeration"});
    report(added({ownFont}));
    report(added({ownFont}));
    const auto identity = [](const std::shared_ptr<Client>& client, std::size_t index) {
        return client->messages.at(index).info->find("fontsInfo")->identity().lock();
    };
    EXPECT_EQ(identity(first, 0), identity(second, 0));
    EXPECT_NE(identity(first, 0), identity(first, 1));
}

TEST_F(FontChangeBroadcastTest, TheFontPickerIsNotToldOfChanges)
{
    const auto picker = connect({}, "com.vorlan.Panekit.FontPicker");
    picker->connection->call(wire::checkinForFontPicker.interface, wire::checkinForFontPicker.member, {},
                             nullptr, nullptr);
    simulated.drain();
    report(added({ownFont}));
    report(removed({profileFont}, 1));
    EXPECT_TRUE(picker->messages.empty());
}

TEST_F(FontChangeBroadcastTest, AClientWhoseConnectionIsGoneIsWorkedForUnderTheZeroTokenAndHearsNothing)
{
    const auto client = connect({}, "com.example.provider");
    const auto handler = std::make_shared<TyphonHandler>(daemon);
    const auto token = simulated.processes.add(
        {.signingIdentifier = "com.example.provider",
         .entitlements = {{"com.vorlan.developer.user-fonts", Array{"system-installation"}}}});
    simulated.runAs(token, handler->checkin([](const std::optional<PropertyList>&) {}));
    EXPECT_EQ(handler->clientConnection(), nullptr);
    // Otherwise nothing would be issued to it that the test could see.
    simulated.processes.set(AuditToken{}, {});
    report(added({ownFont}));
    EXPECT_EQ(simulated.sandbox.issued().back().token, AuditToken{});
    EXPECT_EQ(simulated.sandbox.issued().back().path, fontFiles + "com.example.provider");
    EXPECT_EQ(simulated.log.countContaining("sluice error"), 0U);
}

TEST_F(FontChangeBroadcastTest, AMessageThatCannotBeSentIsSaidInTheSystemLogAndHarmsNobodyElse)
{
    const auto broken = std::make_shared<TyphonHandler>(daemon);
    const auto connection = simulated.ipc.connectionToService("nobody");
    connection->setRemoteObjectInterfaces(wire::typhonClientInterfaces());
    connection->resume();
    broken->setClientConnection(connection);
    daemon->notificationCenter().addObserver(broken, "fontChanged", &TyphonHandler::fontChanged);
    const auto client = checkedIn({});
    report(removed({profileFont}, 1));
    EXPECT_EQ(client->messages.size(), 1U);
    const auto said = simulated.log.count(LogSink::system, LogLevel::defaultLevel,
                                          "sluice error: fontChanged: - "
                                          "org.freedesktop.DBus.Error.Disconnected: the connection is gone");
    EXPECT_EQ(said, 1U);
}

TEST_F(FontChangeBroadcastTest, AnObserverThatVanishesHarmsNobodyElse)
{
    const auto gone = checkedIn({"font-enumeration"});
    const auto client = checkedIn({"font-enumeration"});
    simulated.processes.exit(gone->token);
    simulated.ipc.endProcess(gone->token);
    report(added({ownFont}));
    EXPECT_EQ(client->messages.size(), 1U);
    EXPECT_TRUE(gone->messages.empty());
}

}  // namespace
}  // namespace typhon
