#include "platform/linux/journal_event.h"
#include "platform/linux/linux_analytics.h"
#include "testing/manual_queues.h"
#include "testing/scratch_folder.h"

#include <array>
#include <fstream>
#include <iterator>

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

namespace typhon {
namespace {

using testing::ManualQueues;
using testing::RecordingLog;
using testing::ScratchFolder;

PropertyList payload()
{
    return PropertyList::Dictionary{{"name", "org.example.a\nFORGED=1"}, {"misses", std::int64_t{2}}};
}

/// A socket that takes what a journal would.
class Journal {
public:
    explicit Journal(const std::string& path) : socket_(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0))
    {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        if (::bind(socket_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
            throw std::runtime_error("no socket " + path);
        }
    }
    /// The next entry; empty when there is none.
    std::string entry()
    {
        std::array<char, 4096> buffer;
        const auto length = ::recv(socket_.get(), buffer.data(), buffer.size(), MSG_DONTWAIT);
        return {buffer.data(), static_cast<std::size_t>(length > 0 ? length : 0)};
    }

private:
    FileDescriptor socket_;
};

class LinuxAnalyticsTest : public ::testing::Test {
protected:
    const ScratchFolder folder;
    RecordingLog log;
    ManualQueues queues;
};

TEST(EventFields, AreOneLineEachAndKeepTheirNames)
{
    const auto text = eventText(eventFields("com.vorlan.font-privacy", payload()));
    EXPECT_EQ(text,
              "MESSAGE=analytics event com.vorlan.font-privacy, misses 2, name org.example.a\\nFORGED=1\n"
              "PRIORITY=6\nTYPHON_EVENT=com.vorlan.font-privacy\nTYPHON_EVENT_MISSES=2\n"
              "TYPHON_EVENT_NAME=org.example.a\\nFORGED=1\n");
}

TEST_F(LinuxAnalyticsTest, BuildsNothingWhereThereIsNoJournal)
{
    LinuxAnalytics analytics(RootDirectory(), log, queues, folder.path + "/journal");
    bool isBuilt = false;
    analytics.sendEventLazily("event", [&isBuilt] {
        isBuilt = true;
        return payload();
    });
    queues.fire();
    EXPECT_FALSE(isBuilt);
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(LinuxAnalyticsTest, SendsEachEventToTheJournalAsOneEntry)
{
    Journal journal(folder.path + "/journal");
    LinuxAnalytics analytics(RootDirectory(), log, queues, folder.path + "/journal");
    analytics.sendEventLazily("com.vorlan.font-privacy", payload);
    EXPECT_EQ(journal.entry(), "");
    queues.fire();
    EXPECT_EQ(journal.entry(),
              eventText(eventFields("com.vorlan.font-privacy", payload())) + "SYSLOG_IDENTIFIER=typhond\n");
    EXPECT_EQ(journal.entry(), "");
}

TEST_F(LinuxAnalyticsTest, BuildsNothingWhileItIsOfferedAnEventAndEachEventOnce)
{
    LinuxAnalytics analytics(folder.root, log, queues);
    int built = 0;
    for (int count = 0; count < 3; ++count) {
        analytics.sendEventLazily("event", [&built] {
            ++built;
            return payload();
        });
    }
    EXPECT_EQ(built, 0);
    EXPECT_GT(queues.armedFor, 0);
    EXPECT_LT(queues.armedFor, 1);
    queues.fire();
    EXPECT_EQ(built, 3);
    queues.fire();
    EXPECT_EQ(built, 3);
}

TEST_F(LinuxAnalyticsTest, KeepsTheEventsOfAScratchSystemInItsFile)
{
    std::filesystem::create_directories(folder.path + "/run/typhon");
    LinuxAnalytics analytics(folder.root, log, queues);
    analytics.sendEventLazily("one", payload);
    analytics.sendEventLazily("two", payload);
    queues.fire();
    std::ifstream file(folder.root.real(LinuxAnalytics::eventsPath));
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    EXPECT_EQ(text.rfind("_BOOT_ID=", 0), 0U);
    EXPECT_NE(text.find("\nTYPHON_EVENT=one\n"), std::string::npos);
    EXPECT_NE(text.find("\n\n_BOOT_ID="), std::string::npos);
    EXPECT_NE(text.find("\nTYPHON_EVENT=two\n"), std::string::npos);
}

TEST_F(LinuxAnalyticsTest, CollectsNothingMoreWhenTheFileIsFull)
{
    const auto real = folder.write(LinuxAnalytics::eventsPath, "");
    std::filesystem::resize_file(real, LinuxAnalytics::largestFile);
    LinuxAnalytics analytics(folder.root, log, queues);
    bool isBuilt = false;
    for (int count = 0; count < 2; ++count) {
        analytics.sendEventLazily("event", [&isBuilt] {
            isBuilt = true;
            return payload();
        });
        queues.fire();
    }
    EXPECT_FALSE(isBuilt);
    EXPECT_EQ(log.lines().size(), 1U);
}

}  // namespace
}  // namespace typhon
