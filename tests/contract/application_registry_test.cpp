#include "../../platform/linux/testing/no_new_descriptors.h"
#include "platform/linux/linux_application_registry.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_application_registry.h"
#include "platform/simulated/simulated_log.h"

#include <filesystem>
#include <functional>
#include <memory>
#include <string>

#include <gtest/gtest.h>

namespace typhon {
namespace {

/// One registry, and how applications get into it.
class Subject {
public:
    virtual ~Subject() = default;
    virtual ApplicationRegistry& registry() = 0;
    virtual void install(const SWApplicationRecord& record) = 0;
    virtual void remove(const std::string& bundleIdentifier) = 0;
    /// Whether what is installed can be looked at.
    virtual void letLook(bool may) = 0;
};

class SimulatedSubject final : public Subject {
public:
    ApplicationRegistry& registry() override { return registry_; }
    void install(const SWApplicationRecord& record) override { registry_.install(record); }
    void remove(const std::string& bundleIdentifier) override { registry_.remove(bundleIdentifier); }
    void letLook(bool may) override { registry_.setComplete(may); }

private:
    SimulatedApplicationRegistry registry_;
};

class LinuxSubject final : public Subject {
public:
    ApplicationRegistry& registry() override { return registry_; }
    void install(const SWApplicationRecord& record) override
    {
        scratch_.writeFile(entry(record.bundleIdentifier),
                           std::string("[Desktop Entry]\nType=Application\n") +
                               (record.isPlaceholder ? "X-Typhon-Placeholder=true\n" : ""));
        const auto version = record.shortVersionString
                                 ? "<release version=\"" + *record.shortVersionString + "\"/>"
                                 : std::string();
        scratch_.writeFile("/usr/share/metainfo/" + record.bundleIdentifier + ".metainfo.xml",
                           "<component><id>" + record.bundleIdentifier + "</id><releases>" + version +
                               "</releases></component>");
    }
    void remove(const std::string& bundleIdentifier) override
    {
        std::filesystem::remove(scratch_.real(entry(bundleIdentifier)));
    }
    void letLook(bool may) override { shortage_ = may ? nullptr : std::make_unique<NoNewDescriptors>(); }

private:
    static std::string entry(const std::string& bundleIdentifier)
    {
        return "/usr/share/applications/" + bundleIdentifier + ".desktop";
    }

    ScratchDirectory scratch_;
    SimulatedLog log_;
    LinuxApplicationRegistry registry_{RootDirectory(scratch_.path()), log_};
    std::unique_ptr<NoNewDescriptors> shortage_;
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class ApplicationRegistryContract : public testing::TestWithParam<Implementation> {
protected:
    std::optional<SWApplicationRecord> record(const std::string& identifier, bool allowPlaceholder = false)
    {
        return subject->registry().record(identifier, allowPlaceholder);
    }
    bool isKnownToBeAbsent(const std::string& identifier)
    {
        return subject->registry().isKnownToBeAbsent(identifier);
    }
    const std::unique_ptr<Subject> subject = GetParam().make();
};

TEST_P(ApplicationRegistryContract, AnInstalledApplicationHasARecord)
{
    subject->install({.bundleIdentifier = "com.example.letters", .shortVersionString = "2.1"});
    const auto found = record("com.example.letters");
    ASSERT_TRUE(found);
    EXPECT_EQ(found->bundleIdentifier, "com.example.letters");
    EXPECT_EQ(found->shortVersionString, "2.1");
    EXPECT_FALSE(found->isPlaceholder);
}

TEST_P(ApplicationRegistryContract, AnotherApplicationHasNone)
{
    subject->install({.bundleIdentifier = "com.example.letters", .shortVersionString = "2.1"});
    for (const char* identifier : {"", "com.example", "com.example.letters2", "Com.example.letters",
                                   "../applications/com.example.letters"}) {
        EXPECT_FALSE(record(identifier)) << identifier;
    }
}

TEST_P(ApplicationRegistryContract, AnApplicationNeedNotHaveAVersion)
{
    subject->install({.bundleIdentifier = "com.example.letters", .shortVersionString = {}});
    ASSERT_TRUE(record("com.example.letters"));
    EXPECT_EQ(record("com.example.letters")->shortVersionString, std::nullopt);
}

TEST_P(ApplicationRegistryContract, APlaceholderIsARecordOnlyForWhoAcceptsIt)
{
    subject->install(
        {.bundleIdentifier = "com.example.letters", .shortVersionString = "1", .isPlaceholder = true});
    EXPECT_FALSE(record("com.example.letters"));
    ASSERT_TRUE(record("com.example.letters", true));
    EXPECT_TRUE(record("com.example.letters", true)->isPlaceholder);
}

TEST_P(ApplicationRegistryContract, UpdatesAndRemovalsAreSeen)
{
    subject->install({.bundleIdentifier = "com.example.letters", .shortVersionString = "2.1"});
    EXPECT_EQ(record("com.example.letters")->shortVersionString, "2.1");
    subject->install({.bundleIdentifier = "com.example.letters", .shortVersionString = "2.2"});
    EXPECT_EQ(record("com.example.letters")->shortVersionString, "2.2");
    subject->remove("com.example.letters");
    EXPECT_FALSE(record("com.example.letters", true));
}

TEST_P(ApplicationRegistryContract, AbsentIsWhatIsNotInstalledOrOnlyAPlaceholder)
{
    EXPECT_TRUE(isKnownToBeAbsent("com.example.letters"));
    subject->install({.bundleIdentifier = "com.example.letters", .shortVersionString = "1"});
    subject->install(
        {.bundleIdentifier = "com.example.numbers", .shortVersionString = "1", .isPlaceholder = true});
    EXPECT_FALSE(isKnownToBeAbsent("com.example.letters"));
    EXPECT_TRUE(isKnownToBeAbsent("com.example.numbers"));
    subject->remove("com.example.letters");
    EXPECT_TRUE(isKnownToBeAbsent("com.example.letters"));
}

TEST_P(ApplicationRegistryContract, NothingIsKnownToBeAbsentWhileNothingCanBeLookedAt)
{
    subject->install({.bundleIdentifier = "com.example.letters", .shortVersionString = "1"});
    subject->letLook(false);
    EXPECT_FALSE(isKnownToBeAbsent("com.example.letters"));
    EXPECT_FALSE(isKnownToBeAbsent("com.example.numbers"));
    subject->letLook(true);
    EXPECT_TRUE(record("com.example.letters"));
    EXPECT_TRUE(isKnownToBeAbsent("com.example.numbers"));
    subject->letLook(false);
    EXPECT_FALSE(isKnownToBeAbsent("com.example.numbers")) << "also not after it could";
    subject->letLook(true);
    EXPECT_TRUE(isKnownToBeAbsent("com.example.numbers"));
}

INSTANTIATE_TEST_SUITE_P(, ApplicationRegistryContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
