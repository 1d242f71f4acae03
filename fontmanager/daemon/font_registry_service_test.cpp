#include "fontmanager/daemon/service_fixture.h"
#include "fontmanager/font_names.h"
#include "fontmanager/font_registry_client.h"
#include "fontmanager/font_registry_wire.h"
#include "fontmanager/test_fonts.h"
#include "platform/file_url.h"
#include "platform/linux/linux_file_system.h"

#include <thread>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace test_service;
using ::testing::ElementsAre;
using ::testing::HasSubstr;

const std::string own = std::string(font_paths::fontFiles) + "org.example.a/";

class FontRegistryServiceTest : public testing::Test {
protected:
    FontRegistryClient client()
    {
        auto connected = FontRegistryClient::connect({.root = scratch.path(), .helper = "/no-helper"});
        EXPECT_TRUE(connected) << connected.error().message;
        return std::move(*connected);
    }
    PropertyList registry() const
    {
        auto reading = LinuxFileSystem(RootDirectory(scratch.path())).readPropertyList(font_paths::registry);
        return reading.value ? *reading.value : PropertyList();
    }

    ScratchDirectory scratch;
    RunningService running{RootDirectory(scratch.path()), [](int file) { return readFontNames(file); }};
};

template <class T>
std::string errorName(const ClientResult<T>& result)
{
    return result ? "" : result.error().name;
}

TEST_F(FontRegistryServiceTest, AProviderInstallsForItselfAndReportsFollow)
{
    running.identities.becomeProvider("org.example.a");
    std::vector<std::size_t> progress;
    const auto paths =
        client().registerFonts("", {test_fonts::sans, test_fonts::collection}, true,
                               [&](std::size_t taken, std::size_t) { progress.push_back(taken); });
    ASSERT_TRUE(paths) << paths.error().message;
    EXPECT_THAT(*paths, ElementsAre(own + "DejaVuSans.ttf", own + "wqy-microhei.ttc"));
    EXPECT_THAT(progress, ElementsAre(1u, 2u));
    EXPECT_EQ(registry().asDictionary()->size(), 2u);
    EXPECT_THAT(running.reports.taken(), ElementsAre("updating", "+DejaVuSans.ttf", "+wqy-microhei.ttc"));
}

TEST_F(FontRegistryServiceTest, SwitchingAndRemovingReportWhatChanged)
{
    auto admin = client();
    ASSERT_TRUE(admin.registerFonts("org.example.a", {test_fonts::sans, test_fonts::serif}, true));
    running.reports.taken();
    const auto url = fileUrlFromPath(own + "DejaVuSans.ttf");
    EXPECT_EQ(*admin.enableOrDisable({url}, false), 1);
    EXPECT_EQ(*admin.enableOrDisable({url}, false), 0);
    EXPECT_EQ(*admin.enableOrDisable({url}, true), 1);
    EXPECT_THAT(running.reports.taken(),
                ElementsAre("updating", "-DejaVuSans.ttf", "updating", "updating", "+DejaVuSans.ttf"));
    EXPECT_EQ(*admin.unregisterFonts({url}), 1);
    EXPECT_EQ(*admin.unregisterAllFonts("org.example.a"), 1);
    EXPECT_THAT(running.reports.taken(),
                ElementsAre("updating", "-DejaVuSans.ttf", "updating", "-LiberationSerif-Regular.ttf"));
}

TEST_F(FontRegistryServiceTest, AChangeIsReportedBeforeTheNextBeginsSoThatNoReportOvertakesAnother)
{
    const std::set<std::string> turns{running.changes->label()};
    ASSERT_TRUE(client().registerFonts("org.example.a", {test_fonts::sans}, true));
    EXPECT_EQ(running.reports.queues(), turns);
    ASSERT_TRUE(client().enableOrDisable({fileUrlFromPath(own + "DejaVuSans.ttf")}, false));
    ASSERT_TRUE(client().unregisterAllFonts("org.example.a"));
    ASSERT_TRUE(client().synchronizeFontProviders());
    EXPECT_EQ(running.reports.queues(), turns);
}

TEST_F(FontRegistryServiceTest, WhatWasReportedIsNotReportedByTheNextRun)
{
    ASSERT_TRUE(client().registerFonts("org.example.a", {test_fonts::sans}, true));
    EXPECT_FALSE(std::filesystem::exists(scratch.path() + font_paths::journal));
}

TEST_F(FontRegistryServiceTest, AProviderIsDeniedEverythingOfOthers)
{
    ASSERT_TRUE(client().registerFonts("org.example.b", {test_fonts::sans}, true));
    running.identities.becomeProvider("org.example.a");
    auto provider = client();
    const auto url = fileUrlFromPath(std::string(font_paths::fontFiles) + "org.example.b/DejaVuSans.ttf");
    EXPECT_EQ(errorName(provider.registerFonts("org.example.b", {test_fonts::sans}, true)),
              ipc_errors::accessDenied);
    EXPECT_EQ(errorName(provider.unregisterFonts({url})), ipc_errors::accessDenied);
    EXPECT_EQ(errorName(provider.unregisterAllFonts("org.example.b")), ipc_errors::accessDenied);
    EXPECT_EQ(errorName(provider.enableOrDisable({url}, false)), ipc_errors::accessDenied);
    EXPECT_EQ(errorName(provider.enableOrDisable({"file:///etc/passwd"}, false)), ipc_errors::accessDenied);
    EXPECT_EQ(errorName(provider.synchronizeFontProviders()), ipc_errors::accessDenied);
    EXPECT_EQ(errorName(provider.synchronizeProfileFonts()), ipc_errors::accessDenied);
    EXPECT_EQ(registry().asDictionary()->size(), 1u);
}

TEST_F(FontRegistryServiceTest, ApplicationsThatAreNoProvidersAreDenied)
{
    for (const bool isSandboxed : {true, false}) {
        running.identities.become("org.example.a", {"font-enumeration", "app-usage"}, isSandboxed);
        EXPECT_EQ(errorName(client().registerFonts("", {test_fonts::sans}, true)), ipc_errors::accessDenied);
    }
    running.identities.become(std::nullopt, {}, true);
    EXPECT_EQ(errorName(client().unregisterAllFonts("")), ipc_errors::accessDenied);
    EXPECT_EQ(registry(), PropertyList());
}

TEST_F(FontRegistryServiceTest, AnAdministratorWithoutAnIdentifierHasToSayWhoseFontsItMeans)
{
    EXPECT_EQ(errorName(client().registerFonts("", {test_fonts::sans}, true)), ipc_errors::invalidArguments);
    EXPECT_EQ(errorName(client().unregisterAllFonts("")), ipc_errors::invalidArguments);
}

TEST_F(FontRegistryServiceTest, ACallerThatCannotBeIdentifiedIsToldSo)
{
    running.identities.failWith({ipc_errors::accessDenied, "start the daemon"});
    const auto outcome = client().registerFonts("org.example.a", {test_fonts::sans}, true);
    ASSERT_FALSE(outcome);
    EXPECT_EQ(outcome.error().message, "start the daemon");
}

TEST_F(FontRegistryServiceTest, ARefusedFileIsNamedAndEndsTheRegistration)
{
    scratch.writeFile("/bad.ttf", "garbage");
    auto admin = client();
    const auto outcome =
        admin.registerFonts("org.example.a", {test_fonts::sans, scratch.real("/bad.ttf")}, true);
    ASSERT_FALSE(outcome);
    EXPECT_THAT(outcome.error().message, HasSubstr("bad.ttf: "));
    EXPECT_EQ(registry(), PropertyList());
    // The connection is as good as before.
    EXPECT_TRUE(admin.registerFonts("org.example.a", {test_fonts::sans}, true));
}

TEST_F(FontRegistryServiceTest, AFileThatTheClientCannotOpenCancelsTheRegistration)
{
    auto admin = client();
    EXPECT_FALSE(admin.registerFonts("org.example.a", {test_fonts::sans, "/no/such.ttf"}, true));
    EXPECT_FALSE(std::filesystem::exists(scratch.real(own)));
    EXPECT_TRUE(admin.registerFonts("org.example.a", {}, true));
}

TEST_F(FontRegistryServiceTest, MembersOutOfOrderAreErrors)
{
    auto connection = ServiceConnection::open(RootDirectory(scratch.path()), font_registry_wire::serviceName);
    ASSERT_TRUE(connection);
    EXPECT_EQ(errorName(connection->call(font_registry_wire::commitRegistration, {})), ipc_errors::failed);
    Arguments beginning;
    beginning.emplace_back(PropertyList("org.example.a"));
    beginning.emplace_back(PropertyList(true));
    EXPECT_TRUE(connection->call(font_registry_wire::beginRegistration, beginning));
    EXPECT_EQ(errorName(connection->call(font_registry_wire::beginRegistration, beginning)),
              ipc_errors::failed);
    EXPECT_TRUE(connection->call(font_registry_wire::cancelRegistration, {}));
    EXPECT_TRUE(connection->call(font_registry_wire::cancelRegistration, {}));
}

TEST_F(FontRegistryServiceTest, ManyWritersAtOnceLoseNothing)
{
    std::vector<std::thread> writers;
    writers.reserve(4);
    for (int writer = 0; writer < 4; ++writer) {
        writers.emplace_back([this, writer] {
            auto admin = client();
            for (const auto* font : {test_fonts::sans, test_fonts::sansBold, test_fonts::serif}) {
                EXPECT_TRUE(admin.registerFonts("org.example." + std::to_string(writer), {font}, true));
            }
        });
    }
    for (auto& writer : writers) {
        writer.join();
    }
    EXPECT_EQ(registry().asDictionary()->size(), 12u);
}

TEST_F(FontRegistryServiceTest, ProfileFontsAreSynchronisedAndReportedAsSuch)
{
    scratch.writeFile(std::string(font_paths::managedFonts) + "p.ttf",
                      test_fonts::contentsOf(test_fonts::sans));
    EXPECT_TRUE(client().synchronizeProfileFonts());
    EXPECT_THAT(running.reports.taken(), ElementsAre("+p.ttf of profiles"));
}

TEST_F(FontRegistryServiceTest, AddressesThatAreNoFileUrlsAreInvalid)
{
    EXPECT_EQ(errorName(client().unregisterFonts({"http://example.org/x.ttf"})),
              ipc_errors::invalidArguments);
    EXPECT_EQ(errorName(client().enableOrDisable({"x.ttf"}, true)), ipc_errors::invalidArguments);
}

}  // namespace
}  // namespace typhon
