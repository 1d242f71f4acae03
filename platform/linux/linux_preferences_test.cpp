#include "platform/linux/linux_preferences.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/scratch_directory.h"

#include <atomic>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

constexpr const char* store = "/var/mobile/Library/Preferences/com.vorlan.typhond.plist";

class RecordingLog final : public Log {
public:
    void write(LogSink, LogLevel, std::string_view message) override { messages.emplace_back(message); }
    std::vector<std::string> messages;
};

class LinuxPreferencesTest : public testing::Test {
protected:
    std::optional<PropertyList> stored() const
    {
        const auto opened = openRegularFile(scratch.real(store));
        return opened.error == 0 ? readPropertyListFromDescriptor(opened.file.get()).value : std::nullopt;
    }
    void writeStore(const PropertyList& value) const
    {
        const auto bytes = writeBinaryPropertyList(value);
        scratch.writeFile(store, std::string(bytes.begin(), bytes.end()));
    }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
    RecordingLog log;
    LinuxPreferences preferences{root, log};
};

TEST_F(LinuxPreferencesTest, TouchesNothingBeforeTheFirstWrite)
{
    EXPECT_EQ(preferences.value("version"), std::nullopt);
    preferences.setValue("version", PropertyList(3));
    EXPECT_TRUE(std::filesystem::is_empty(scratch.path()));
    EXPECT_THAT(log.messages, ElementsAre());
}

TEST_F(LinuxPreferencesTest, WritesABinaryFileForItsOwnerOnlyAndMakesItsFolders)
{
    preferences.setValue("version", PropertyList(3));
    ASSERT_TRUE(preferences.synchronize());
    EXPECT_TRUE(scratch.readFile(store).starts_with("bplist00"));
    struct stat status {};
    ASSERT_EQ(::stat(scratch.real(store).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0600u);
    EXPECT_EQ(stored(), PropertyList(PropertyList::Dictionary{{"version", 3}}));
}

TEST_F(LinuxPreferencesTest, ReadsAnXmlFileThatAnAdministratorWrote)
{
    scratch.writeFile(store, writeXmlPropertyList(PropertyList::Dictionary{{"deleteDelay", 60.0}}));
    EXPECT_EQ(preferences.value("deleteDelay"), PropertyList(60.0));
}

TEST_F(LinuxPreferencesTest, NoticesAReplacedFileAndOneChangedInPlace)
{
    writeStore(PropertyList::Dictionary{{"missed", 1}});
    EXPECT_EQ(preferences.integer("missed"), 1);
    writeStore(PropertyList::Dictionary{{"missed", 2}});
    EXPECT_EQ(preferences.integer("missed"), 2);
    for (int round = 3; round < 50; ++round) {
        LinuxPreferences other(root, log);
        other.setValue("missed", PropertyList(round));
        ASSERT_TRUE(other.synchronize());
        ASSERT_EQ(preferences.integer("missed"), round);
    }
    std::filesystem::remove(scratch.real(store));
    EXPECT_EQ(preferences.value("missed"), std::nullopt);
}

/// With a file as long as before, in the same tick of the clock more often than not.
TEST_F(LinuxPreferencesTest, NoticesAFileThatWasChangedInPlaceOrReplacedRightAfterItsOwnWriting)
{
    const std::string padding(100'000, 'x');
    for (int round = 0; round < 100; ++round) {
        preferences.setValue("missed", PropertyList(1));
        preferences.setValue("padding", PropertyList(padding));
        ASSERT_TRUE(preferences.synchronize());
        if (round % 2 == 1) {
            std::filesystem::remove(scratch.real(store));
        }
        writeStore(PropertyList::Dictionary{{"missed", 2}, {"padding", padding}});
        ASSERT_EQ(preferences.integer("missed"), 2);
    }
}

TEST_F(LinuxPreferencesTest, DoesNotReadAgainWhatItWroteItselfHoweverRecently)
{
    for (int writing = 0; writing < 100; ++writing) {
        const PropertyList written(std::string(writing, 'x'));
        preferences.setValue("text", written);
        ASSERT_TRUE(preferences.synchronize());
        const auto identity = preferences.value("text")->identity();
        EXPECT_TRUE(!identity.owner_before(written.identity()) && !written.identity().owner_before(identity));
    }
    EXPECT_EQ(LinuxPreferences(root, log).value("text"), preferences.value("text"));
}

TEST_F(LinuxPreferencesTest, MalformedStoreReadsAsEmptyIsLoggedOnceAndKeptAsideBeforeTheFirstWrite)
{
    scratch.writeFile(store, "bplist00 and then nothing that makes sense");
    EXPECT_EQ(preferences.value("version"), std::nullopt);
    EXPECT_EQ(preferences.value("version"), std::nullopt);
    ASSERT_EQ(log.messages.size(), 1u);
    EXPECT_THAT(log.messages[0], HasSubstr("are malformed and read as empty"));
    EXPECT_EQ(scratch.readFile(store), "bplist00 and then nothing that makes sense");

    preferences.setValue("version", PropertyList(3));
    ASSERT_TRUE(preferences.synchronize());
    EXPECT_EQ(scratch.readFile(store + std::string(".broken-1")),
              "bplist00 and then nothing that makes sense");
    EXPECT_EQ(stored(), PropertyList(PropertyList::Dictionary{{"version", 3}}));
    ASSERT_EQ(log.messages.size(), 2u);
    EXPECT_THAT(log.messages[1], HasSubstr(".broken-1"));
}

TEST_F(LinuxPreferencesTest, KeepsNoMoreThanNineBrokenStores)
{
    for (int round = 1; round <= 11; ++round) {
        scratch.writeFile(store, "broken " + std::to_string(round));
        preferences.setValue("version", PropertyList(round));
        ASSERT_TRUE(preferences.synchronize());
    }
    EXPECT_EQ(scratch.readFile(store + std::string(".broken-1")), "broken 1");
    EXPECT_EQ(scratch.readFile(store + std::string(".broken-9")), "broken 11");
    EXPECT_FALSE(std::filesystem::exists(scratch.real(store) + ".broken-10"));
}

TEST_F(LinuxPreferencesTest, AStoreThatIsNoDictionaryOrNoFileOrTooLargeIsMalformed)
{
    writeStore(PropertyList(PropertyList::Array{1, 2}));
    EXPECT_TRUE(preferences.values().empty());
    EXPECT_THAT(log.messages.back(), HasSubstr("its root is not a dictionary"));

    std::filesystem::remove(scratch.real(store));
    ASSERT_EQ(::mkfifo(scratch.real(store).c_str(), 0600), 0);
    EXPECT_TRUE(preferences.values().empty());
    EXPECT_THAT(log.messages.back(), HasSubstr("not a regular file"));

    std::filesystem::remove(scratch.real(store));
    scratch.writeFile(store, "");
    std::filesystem::resize_file(scratch.real(store), std::uintmax_t(1) << 40);
    EXPECT_TRUE(preferences.values().empty());
    EXPECT_THAT(log.messages.back(), HasSubstr("File too large"));
}

/// As a user without permission: the test may run as root, whom no permission stops.
TEST_F(LinuxPreferencesTest, AStoreThatMayNotBeReadIsNotTouched)
{
    writeStore(PropertyList::Dictionary{{"version", 3}});
    std::filesystem::permissions(scratch.path(), std::filesystem::perms(0777));
    std::filesystem::permissions(std::filesystem::path(scratch.real(store)).parent_path(),
                                 std::filesystem::perms(0777));
    std::filesystem::permissions(scratch.real(store), std::filesystem::perms::none);
    const pid_t child = ::fork();
    if (child == 0) {
        if (::geteuid() == 0 && ::setresuid(65534, 65534, 65534) != 0) {
            ::_exit(10);
        }
        preferences.setValue("missed", PropertyList(1));
        const bool written = preferences.synchronize();
        const bool explained =
            !log.messages.empty() && log.messages.back().find("cannot read") != std::string::npos;
        ::_exit(!written && explained ? 0 : 1);
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    EXPECT_EQ(status, 0);
    std::filesystem::permissions(scratch.real(store), std::filesystem::perms(0600));
    EXPECT_EQ(stored(), PropertyList(PropertyList::Dictionary{{"version", 3}}));
}

TEST_F(LinuxPreferencesTest, KeepsChangesThatCouldNotBeWrittenAndSaysSoOnce)
{
    scratch.writeFile("/var/mobile", "in the way");
    preferences.setValue("version", PropertyList(3));
    EXPECT_FALSE(preferences.synchronize());
    EXPECT_FALSE(preferences.synchronize());
    ASSERT_EQ(log.messages.size(), 1u);
    EXPECT_THAT(log.messages[0], HasSubstr("the preferences were not written: cannot create directory"));
    EXPECT_EQ(preferences.integer("version"), 3);

    std::filesystem::remove(scratch.real("/var/mobile"));
    EXPECT_TRUE(preferences.synchronize());
    EXPECT_EQ(stored(), PropertyList(PropertyList::Dictionary{{"version", 3}}));
}

TEST_F(LinuxPreferencesTest, RefusesToWriteMoreThanItWouldRead)
{
    preferences.setValue("issues", PropertyList(std::string(17u << 20, 'x')));
    EXPECT_FALSE(preferences.synchronize());
    EXPECT_THAT(log.messages.back(), HasSubstr("would be larger"));
    EXPECT_FALSE(std::filesystem::exists(scratch.real(store)));
}

/// Tries anew where others held the lock for longer than one attempt waits for it; false after a minute.
bool synchronizeInTheEnd(LinuxPreferences& preferences)
{
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::minutes(1);
    bool isWritten = preferences.synchronize();
    while (!isWritten && std::chrono::steady_clock::now() < deadline) {
        isWritten = preferences.synchronize();
    }
    return isWritten;
}

/// Makes `count` synchronised changes in a process of its own; its exit status tells whether all succeeded.
pid_t startWriter(const RootDirectory& root, int writer, int count)
{
    const pid_t child = ::fork();
    if (child == 0) {
        RecordingLog log;
        LinuxPreferences preferences(root, log);
        bool good = true;
        for (int n = 0; n < count; ++n) {
            preferences.setValue(std::to_string(writer) + "-" + std::to_string(n), PropertyList(n));
            good = synchronizeInTheEnd(preferences) && good;
        }
        ::_exit(good ? 0 : 1);
    }
    return child;
}

TEST_F(LinuxPreferencesTest, ConcurrentProcessesNeverLoseEachOthersKeys)
{
    std::vector<pid_t> writers;
    for (int writer = 0; writer < 4; ++writer) {
        writers.push_back(startWriter(root, writer, 25));
    }
    for (const pid_t writer : writers) {
        int status = 0;
        ::waitpid(writer, &status, 0);
        EXPECT_EQ(status, 0);
    }
    EXPECT_EQ(preferences.values().size(), 100u);
}

TEST_F(LinuxPreferencesTest, ThreadsShareOneObject)
{
    std::vector<std::jthread> threads;
    std::atomic<int> failures = 0;
    for (int thread = 0; thread < 3; ++thread) {
        threads.emplace_back([&, thread] {
            for (int n = 0; n < 10; ++n) {
                const auto key = std::to_string(thread) + "-" + std::to_string(n);
                preferences.setValue(key, PropertyList(n));
                failures += preferences.synchronize() ? 0 : 1;
                failures += preferences.value(key) == PropertyList(n) ? 0 : 1;
            }
        });
    }
    threads.clear();
    EXPECT_EQ(failures, 0);
    EXPECT_EQ(LinuxPreferences(root, log).values().size(), 30u);
}

/// Writes a growing number and as long a text, and one byte to `progress` for each, until it is killed.
[[noreturn]] void writeUntilKilled(const RootDirectory& root, int progress)
{
    RecordingLog log;
    LinuxPreferences preferences(root, log);
    for (int n = 0;; n = (n + 1) % 1000) {
        preferences.setValue("number", PropertyList(n));
        preferences.setValue("text", PropertyList(std::string(static_cast<std::size_t>(n) * 50, 'x')));
        if (!preferences.synchronize() || ::write(progress, "+", 1) != 1) {
            ::_exit(1);
        }
    }
}

TEST_F(LinuxPreferencesTest, AKilledWriterLeavesAWholeFileAndNoLock)
{
    for (int round = 0; round < 40; ++round) {
        int progress[2];
        ASSERT_EQ(::pipe(progress), 0);
        const pid_t child = ::fork();
        if (child == 0) {
            writeUntilKilled(root, progress[1]);
        }
        char seen = 0;
        for (int step = 0; step <= round % 7; ++step) {
            ASSERT_EQ(::read(progress[0], &seen, 1), 1);
        }
        ::kill(child, SIGKILL);
        ::waitpid(child, nullptr, 0);
        ::close(progress[0]);
        ::close(progress[1]);

        const auto values = preferences.values();
        ASSERT_TRUE(values.contains("number") && values.contains("text"));
        ASSERT_EQ(values.at("text").asString()->size(),
                  static_cast<std::size_t>(*values.at("number").asInteger()) * 50);
        preferences.setValue("round", PropertyList(round));
        ASSERT_TRUE(preferences.synchronize());
    }
    EXPECT_THAT(log.messages, ElementsAre());
    EXPECT_FALSE(std::filesystem::exists(scratch.real(store) + ".new"));
}

}  // namespace
}  // namespace typhon
