#include "fontmanager/linux_user_font_manager.h"
#include "platform/linux/linux_log.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_user_font_manager.h"

#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace std::chrono_literals;

/// One library, and how the suite lets its synchronisations end.
class Subject {
public:
    virtual ~Subject() = default;
    virtual TYUserFontManager& manager() = 0;
    virtual void finishSynchronizations() = 0;
};

class SimulatedSubject final : public Subject {
public:
    TYUserFontManager& manager() override { return manager_; }
    void finishSynchronizations() override { manager_.finishProfileSynchronizations(); }

private:
    SimulatedScheduler scheduler_{1};
    SimulatedFileSystem fileSystem_;
    SimulatedUserFontManager manager_{scheduler_, fileSystem_};
};

class LinuxSubject final : public Subject {
public:
    TYUserFontManager& manager() override { return manager_; }
    void finishSynchronizations() override {}

private:
    ScratchDirectory scratch_;
    LinuxLog log_{LogLevel::error};
    /// No program of that name: the helper is not there.
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

INSTANTIATE_TEST_SUITE_P(, UserFontManagerContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
