#include "fontmanager/daemon/service_fixture.h"
#include "fontmanager/font_names.h"
#include "fontmanager/font_paths.h"
#include "fontmanager/linux_user_font_manager.h"
#include "platform/file_url.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/listening_sockets.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_user_font_manager.h"

#include <array>
#include <atomic>
#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <thread>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;

/// One library, and how the suite lets its synchronisations end.
class Subject {
public:
    virtual ~Subject() = default;
    virtual TYUserFontManager& manager() = 0;
    virtual void finishSynchronizations() = 0;
    /// Makes the registry this, with a file for each of its paths.
    virtual void writeRegistry(PropertyList::Dictionary entries) = 0;
    /// Lets operations that were started go on.
    virtual void proceed() = 0;
};

class SimulatedSubject final : public Subject {
public:
    TYUserFontManager& manager() override { return manager_; }
    void finishSynchronizations() override { manager_.finishProfileSynchronizations(); }
    void writeRegistry(PropertyList::Dictionary entries) override
    {
        fileSystem_.addFile(font_paths::registry, std::move(entries));
    }
    void proceed() override { scheduler_.runUntilIdle(); }

private:
    SimulatedScheduler scheduler_{1};
    SimulatedFileSystem fileSystem_;
    SimulatedUserFontManager manager_{scheduler_, fileSystem_};
};

/// The library and its helper's service, which takes the library for an administrator.
class LinuxSubject final : public Subject {
public:
    TYUserFontManager& manager() override { return manager_; }
    void finishSynchronizations() override {}
    void writeRegistry(PropertyList::Dictionary entries) override
    {
        for (const auto& [path, entry] : entries) {
            scratch_.writeFile(path, "font");
        }
        scratch_.writeFile(font_paths::registry, writeXmlPropertyList(std::move(entries)));
    }
    void proceed() override {}

private:
    ScratchDirectory scratch_;
    LinuxLog log_{LogLevel::error};
    test_service::RunningService helper_{RootDirectory(scratch_.path()),
                                         [](int file) { return readFontNames(file); }};
    LinuxUserFontManager manager_{RootDirectory(scratch_.path()), log_, scratch_.real("/no-helper")};
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class UserFontManagerContract : public testing::TestWithParam<Implementation> {
protected:
    const std::unique_ptr<Subject> subject = GetParam().make();
};

TEST_P(UserFontManagerContract, AnIdentifierOfPlainCharactersIsItsOwnDirectoryName)
{
    EXPECT_EQ(subject->manager().directoryNameFromIdentifier("com.example.Font-Shop9"),
              "com.example.Font-Shop9");
    EXPECT_EQ(subject->manager().identifierFromDirectoryName("com.example.Font-Shop9"),
              "com.example.Font-Shop9");
}

TEST_P(UserFontManagerContract, EveryByteIsEscapedAlikeAndComesBack)
{
    constexpr const char* plain = "-.0123456789ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz";
    constexpr const char* digits = "0123456789ABCDEF";
    for (unsigned value = 0; value < 256; ++value) {
        const char byte = static_cast<char>(value);
        const bool isPlain = value != 0 && std::string(plain).find(byte) != std::string::npos;
        const std::string escaped{'%', digits[value / 16], digits[value % 16]};
        const std::string identifier = std::string("a") + byte;
        const std::string name = "a" + (isPlain ? std::string(1, byte) : escaped);
        EXPECT_EQ(subject->manager().directoryNameFromIdentifier(identifier), name);
        EXPECT_EQ(subject->manager().identifierFromDirectoryName(name), identifier);
    }
}

TEST_P(UserFontManagerContract, NoIdentifierNamesAnotherDirectory)
{
    EXPECT_EQ(subject->manager().directoryNameFromIdentifier("."), "%2E");
    EXPECT_EQ(subject->manager().directoryNameFromIdentifier(".."), "%2E%2E");
    EXPECT_EQ(subject->manager().identifierFromDirectoryName("%2E%2E"), "..");
    EXPECT_EQ(subject->manager().identifierFromDirectoryName(".."), std::nullopt);
}

TEST_P(UserFontManagerContract, EmptyAndOverlongIdentifiersHaveNoDirectory)
{
    EXPECT_EQ(subject->manager().directoryNameFromIdentifier(""), std::nullopt);
    EXPECT_EQ(subject->manager().directoryNameFromIdentifier(std::string(255, 'a')), std::string(255, 'a'));
    EXPECT_EQ(subject->manager().directoryNameFromIdentifier(std::string(256, 'a')), std::nullopt);
    EXPECT_EQ(subject->manager().directoryNameFromIdentifier(std::string(86, '_')), std::nullopt);
}

TEST_P(UserFontManagerContract, ANameThatIsNotExactlyAnEscapeIsNobodys)
{
    for (const char* name :
         {"", "a_b", "a%5fb", "a%5", "a%", "%41", "%2Ex", "a b", "%GG", "a%2Eb", "\xC3\xA9"}) {
        EXPECT_EQ(subject->manager().identifierFromDirectoryName(name), std::nullopt) << name;
    }
}

TEST_P(UserFontManagerContract, SynchronizingReturnsBeforeItsCompletionIsThrough)
{
    std::promise<void> returned;
    std::promise<bool> completed;
    auto hasReturned = returned.get_future().share();
    // Called from within, the completion would wait here for its caller.
    subject->manager().synchronizeProfileFonts(
        [&] { completed.set_value(hasReturned.wait_for(30s) == std::future_status::ready); });
    returned.set_value();
    subject->finishSynchronizations();
    auto outcome = completed.get_future();
    ASSERT_EQ(outcome.wait_for(30s), std::future_status::ready);
    EXPECT_TRUE(outcome.get());
}

TEST_P(UserFontManagerContract, EverySynchronizationCompletesInOrder)
{
    std::vector<int> order;
    std::promise<void> last;
    for (int n = 0; n < 5; ++n) {
        subject->manager().synchronizeProfileFonts([&, n] {
            order.push_back(n);
            if (n == 4) {
                last.set_value();
            }
        });
    }
    subject->finishSynchronizations();
    ASSERT_EQ(last.get_future().wait_for(30s), std::future_status::ready);
    EXPECT_EQ(order, (std::vector<int>{0, 1, 2, 3, 4}));
}

constexpr const char* fontOfA = "/var/mobile/Library/UserFonts/FontFiles/org.example.a/x.ttf";
constexpr const char* otherFontOfA = "/var/mobile/Library/UserFonts/FontFiles/org.example.a/y%z.ttf";
constexpr const char* fontOfB = "/var/mobile/Library/UserFonts/FontFiles/b%2Fc/x.ttf";

class UserFontManagerChanges : public UserFontManagerContract {
protected:
    UserFontManagerChanges()
    {
        subject->writeRegistry(
            {{fontOfB, entry(false)}, {fontOfA, entry(false)}, {otherFontOfA, entry(true)}});
    }
    static PropertyList entry(bool disabled)
    {
        return PropertyList::Dictionary{
            {"familyName", PropertyList::Dictionary{{"X", "X"}}}, {"disabled", disabled}, {"colour", "blue"}};
    }
    FontManagerError enableOrDisable(std::vector<std::string> urls, bool enabled)
    {
        return completed([&](auto completion) {
            subject->manager().enableOrDisablePersistentURLs(std::move(urls), enabled, std::move(completion));
        });
    }
    FontManagerError unregister(const std::string& identifier)
    {
        return completed([&](auto completion) {
            subject->manager().unregisterAndRemoveFontFilesForIdentifier(identifier, std::move(completion));
        });
    }
    bool isDisabled(const char* path)
    {
        return subject->manager().userFontsInfo().find(path)->find("disabled")->isTrue();
    }

private:
    FontManagerError completed(const std::function<void(std::function<void(FontManagerError)>)>& start)
    {
        std::promise<FontManagerError> promise;
        // A second completion would throw.
        start([&](FontManagerError error) { promise.set_value(std::move(error)); });
        subject->proceed();
        auto outcome = promise.get_future();
        const bool isThere = outcome.wait_for(30s) == std::future_status::ready;
        EXPECT_TRUE(isThere);
        return isThere ? outcome.get() : FontManagerError("no completion");
    }
};

TEST_P(UserFontManagerContract, WithoutARegistryThereAreNoFontsAndNoProviders)
{
    EXPECT_EQ(subject->manager().userFontsInfo(), PropertyList());
    EXPECT_EQ(subject->manager().profileFontsInfo(), PropertyList());
    EXPECT_TRUE(subject->manager().knownFontProviders().empty());
}

TEST_P(UserFontManagerChanges, ProvidersAreKnownByTheirDirectoriesEachOnceAndSorted)
{
    EXPECT_EQ(subject->manager().knownFontProviders(), (std::vector<std::string>{"b/c", "org.example.a"}));
}

TEST_P(UserFontManagerChanges, FontsAreSwitchedOnAndOffByTheirUrls)
{
    EXPECT_EQ(enableOrDisable({fileUrlFromPath(fontOfA), fileUrlFromPath(fontOfB)}, false), std::nullopt);
    EXPECT_TRUE(isDisabled(fontOfA));
    EXPECT_TRUE(isDisabled(fontOfB));
    EXPECT_EQ(enableOrDisable({fileUrlFromPath(otherFontOfA)}, true), std::nullopt);
    EXPECT_FALSE(isDisabled(otherFontOfA));
    EXPECT_EQ(*subject->manager().userFontsInfo().find(otherFontOfA), entry(false));
}

TEST_P(UserFontManagerChanges, SwitchingIsAllOrNone)
{
    const auto before = subject->manager().userFontsInfo();
    const auto stranger = fileUrlFromPath("/var/mobile/Library/UserFonts/FontFiles/org.example.a/none.ttf");
    EXPECT_NE(enableOrDisable({fileUrlFromPath(fontOfA), stranger}, false), std::nullopt);
    EXPECT_NE(enableOrDisable({fileUrlFromPath(fontOfA), "no URL"}, false), std::nullopt);
    EXPECT_EQ(subject->manager().userFontsInfo(), before);
}

TEST_P(UserFontManagerChanges, UnregisteringAProviderLeavesTheOthers)
{
    EXPECT_EQ(unregister("org.example.a"), std::nullopt);
    EXPECT_EQ(subject->manager().knownFontProviders(), std::vector<std::string>{"b/c"});
    EXPECT_EQ(unregister("b/c"), std::nullopt);
    EXPECT_EQ(subject->manager().userFontsInfo(), PropertyList());
}

TEST_P(UserFontManagerChanges, UnregisteringWhoHasNoFontsIsNoError)
{
    const auto before = subject->manager().userFontsInfo();
    EXPECT_EQ(unregister("org.example.none"), std::nullopt);
    EXPECT_EQ(unregister(std::string(300, 'a')), std::nullopt);
    EXPECT_EQ(subject->manager().userFontsInfo(), before);
}

TEST_P(UserFontManagerChanges, ACompletionMayBeLeftOut)
{
    subject->manager().enableOrDisablePersistentURLs({fileUrlFromPath(fontOfA)}, false, {});
    subject->manager().unregisterAndRemoveFontFilesForIdentifier("b/c", {});
    subject->manager().synchronizeFontProviders();
    // Comes after those.
    EXPECT_EQ(enableOrDisable({fileUrlFromPath(otherFontOfA)}, true), std::nullopt);
    EXPECT_TRUE(isDisabled(fontOfA));
    EXPECT_EQ(subject->manager().userFontsInfo().find(fontOfB), nullptr);
}

TEST_P(UserFontManagerContract, SynchronizingAssetsCompletesForEachThatAsks)
{
    std::array<std::promise<bool>, 5> promises;
    for (auto& promise : promises) {
        subject->manager().synchronizeFontAssets([&](bool success) { promise.set_value(success); });
    }
    subject->manager().synchronizeFontAssets({});
    subject->proceed();
    for (auto& promise : promises) {
        auto outcome = promise.get_future();
        ASSERT_EQ(outcome.wait_for(30s), std::future_status::ready);
        EXPECT_TRUE(outcome.get());
    }
}

TEST(LinuxUserFontManagerTest, AssetSynchronisationsThatAreAskedForDuringOneAreOneMore)
{
    constexpr unsigned others = 50;
    const ScratchDirectory scratch;
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    scratch.writeFile("/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/a.asset/AssetData/bad.ttf", "");
    std::promise<void> began;
    std::promise<void> gate;
    std::atomic<unsigned> readings = 0;
    // A bad font is read by every synchronisation, and by none twice.
    test_service::RunningService helper(RootDirectory(scratch.path()),
                                        [&, isOpen = gate.get_future().share()](int) {
                                            if (readings++ == 0) {
                                                began.set_value();
                                            }
                                            isOpen.wait();
                                            return FontNamesReading{.familyNames = {}, .error = "no font"};
                                        });
    LinuxUserFontManager manager(RootDirectory(scratch.path()), log, scratch.real("/no-helper"));
    std::promise<void> last;
    const auto count = [&, completed = std::make_shared<unsigned>(0)](bool success) {
        EXPECT_TRUE(success);
        if (++*completed == others + 1) {
            last.set_value();
        }
    };
    manager.synchronizeFontAssets(count);
    const bool hasBegun = began.get_future().wait_for(30s) == std::future_status::ready;
    for (unsigned other = 0; other < others; ++other) {
        manager.synchronizeFontAssets(count);
    }
    gate.set_value();
    ASSERT_TRUE(hasBegun);
    ASSERT_EQ(last.get_future().wait_for(30s), std::future_status::ready);
    EXPECT_EQ(readings, 2U) << "what is asked for in the middle of one may be too late for it";
}

TEST(LinuxUserFontManagerTest, WithoutTheHelperOperationsEndWithAnError)
{
    const ScratchDirectory scratch;
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    std::vector<FontManagerError> errors;
    bool isSynchronized = false;
    {
        LinuxUserFontManager manager(RootDirectory(scratch.path()), log, scratch.real("/no-helper"));
        const auto keep = [&](FontManagerError error) { errors.push_back(std::move(error)); };
        manager.enableOrDisablePersistentURLs({fileUrlFromPath(fontOfA)}, true, keep);
        manager.unregisterAndRemoveFontFilesForIdentifier("org.example.a", keep);
        manager.synchronizeProfileFonts([&] { isSynchronized = true; });
    }
    ASSERT_EQ(errors.size(), 2u);
    for (const auto& error : errors) {
        EXPECT_NE(error.value_or("").find("does not run"), std::string::npos);
    }
    EXPECT_TRUE(isSynchronized);
}

TEST(LinuxUserFontManagerTest, AHelperThatEndsDuringACallMakesItFail)
{
    const ScratchDirectory scratch;
    LinuxLog log{LogLevel::error, LinuxLog::Destination::descriptor, -1};
    // Takes the connection, as a helper does, and ends before it answers.
    auto listening = listenForService(RootDirectory(scratch.path()), "com.vorlan.Typhon.UserFontManager");
    ASSERT_TRUE(listening.socket);
    ASSERT_EQ(::fcntl(listening.socket.get(), F_SETFL, 0), 0);
    std::thread dying([&] {
        const FileDescriptor connection(::accept4(listening.socket.get(), nullptr, nullptr, SOCK_CLOEXEC));
        std::array<char, 1> first{};
        EXPECT_EQ(::read(connection.get(), first.data(), first.size()), 1);
    });
    std::promise<FontManagerError> promise;
    LinuxUserFontManager manager(RootDirectory(scratch.path()), log, scratch.real("/no-helper"));
    manager.enableOrDisablePersistentURLs({fileUrlFromPath(fontOfA)}, true, [&](FontManagerError error) {
        promise.set_value(std::move(error));
    });
    auto outcome = promise.get_future();
    dying.join();
    ASSERT_EQ(outcome.wait_for(30s), std::future_status::ready);
    EXPECT_NE(outcome.get(), std::nullopt);
}

const auto implementations = testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                             Implementation{"Linux", std::make_unique<LinuxSubject>});

INSTANTIATE_TEST_SUITE_P(, UserFontManagerChanges, implementations,
                         [](const auto& implementation) { return implementation.param.name; });
INSTANTIATE_TEST_SUITE_P(, UserFontManagerContract, implementations,
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
