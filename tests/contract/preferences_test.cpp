#include "platform/linux/linux_preferences.h"
#include "platform/linux/scratch_directory.h"
#include "platform/simulated/simulated_log.h"
#include "platform/simulated/simulated_preferences.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include <gtest/gtest.h>

namespace typhon {
namespace {

/// One store, and what the suite needs besides the contract.
class Subject {
public:
    virtual ~Subject() = default;
    virtual Preferences& preferences() = 0;
    /// The process ends and begins again.
    virtual void restart() = 0;
    /// Somebody else changes the store.
    virtual void changeFromOutside(const std::string& key, std::optional<PropertyList> value) = 0;
};

class SimulatedSubject final : public Subject {
public:
    Preferences& preferences() override { return preferences_; }
    void restart() override { preferences_.restart(); }
    void changeFromOutside(const std::string& key, std::optional<PropertyList> value) override
    {
        preferences_.changeFromOutside(key, std::move(value));
    }

private:
    SimulatedPreferences preferences_;
};

class LinuxSubject final : public Subject {
public:
    Preferences& preferences() override { return *preferences_; }
    void restart() override { preferences_ = std::make_unique<LinuxPreferences>(root_, log_); }
    void changeFromOutside(const std::string& key, std::optional<PropertyList> value) override
    {
        LinuxPreferences another(root_, log_);
        another.setValue(key, std::move(value));
        ASSERT_TRUE(another.synchronize());
    }

private:
    ScratchDirectory scratch_;
    RootDirectory root_{scratch_.path()};
    SimulatedLog log_;
    std::unique_ptr<LinuxPreferences> preferences_ = std::make_unique<LinuxPreferences>(root_, log_);
};

struct Implementation {
    std::string name;
    std::function<std::unique_ptr<Subject>()> make;
};

class PreferencesContract : public testing::TestWithParam<Implementation> {
protected:
    Preferences& preferences() { return subject->preferences(); }
    const std::unique_ptr<Subject> subject = GetParam().make();
};

TEST_P(PreferencesContract, AbsentValuesAreNullAndReadAsNothing)
{
    EXPECT_EQ(preferences().value("version"), std::nullopt);
    EXPECT_EQ(preferences().integer("version"), 0);
    EXPECT_TRUE(preferences().dictionary("issues").empty());
}

TEST_P(PreferencesContract, AValueOfAnotherKindReadsAsNothing)
{
    preferences().setValue("version", PropertyList("3"));
    preferences().setValue("issues", PropertyList(3));
    EXPECT_EQ(preferences().integer("version"), 0);
    EXPECT_TRUE(preferences().dictionary("issues").empty());
}

TEST_P(PreferencesContract, ChangesAreReadBeforeTheyAreSynchronized)
{
    preferences().setValue("version", PropertyList(3));
    EXPECT_EQ(preferences().integer("version"), 3);
    preferences().setValue("version", std::nullopt);
    EXPECT_EQ(preferences().value("version"), std::nullopt);
}

TEST_P(PreferencesContract, OnlySynchronizedChangesSurviveARestart)
{
    preferences().setValue("missed", PropertyList(1));
    EXPECT_TRUE(preferences().synchronize());
    preferences().setValue("missed", PropertyList(2));
    subject->restart();
    EXPECT_EQ(preferences().integer("missed"), 1);
}

TEST_P(PreferencesContract, EveryKindOfValueSurvivesARestart)
{
    const PropertyList value(PropertyList::Dictionary{
        {"array", PropertyList::Array{1, "two", 3.5, true}},
        {"data", Data{{0, 255}}},
        {"date", Date{1.5e9}},
        {"dictionary", PropertyList::Dictionary{{"", "empty key"}, {"\xC3\xA9", ""}}},
    });
    preferences().setValue("issues", value);
    EXPECT_TRUE(preferences().synchronize());
    subject->restart();
    EXPECT_EQ(preferences().value("issues"), value);
}

TEST_P(PreferencesContract, ARemovedValueStaysRemoved)
{
    preferences().setValue("delete", PropertyList(1));
    EXPECT_TRUE(preferences().synchronize());
    preferences().setValue("delete", std::nullopt);
    EXPECT_TRUE(preferences().synchronize());
    subject->restart();
    EXPECT_EQ(preferences().value("delete"), std::nullopt);
}

TEST_P(PreferencesContract, ReadsSeeWhatOthersChanged)
{
    EXPECT_EQ(preferences().value("deleteDelay"), std::nullopt);
    subject->changeFromOutside("deleteDelay", PropertyList(60.0));
    EXPECT_EQ(preferences().value("deleteDelay"), PropertyList(60.0));
    subject->changeFromOutside("deleteDelay", std::nullopt);
    EXPECT_EQ(preferences().value("deleteDelay"), std::nullopt);
}

TEST_P(PreferencesContract, ChangesOfOthersToOtherKeysAreKept)
{
    preferences().setValue("missed", PropertyList(1));
    subject->changeFromOutside("deleteDelay", PropertyList(60.0));
    EXPECT_TRUE(preferences().synchronize());
    preferences().setValue("resolved", PropertyList(2));
    subject->changeFromOutside("deleteDelay", PropertyList(90.0));
    EXPECT_TRUE(preferences().synchronize());
    subject->restart();
    EXPECT_EQ(preferences().value("deleteDelay"), PropertyList(90.0));
    EXPECT_EQ(preferences().integer("missed"), 1);
    EXPECT_EQ(preferences().integer("resolved"), 2);
}

TEST_P(PreferencesContract, UnderOneKeyTheLastWriterWins)
{
    preferences().setValue("missed", PropertyList(1));
    subject->changeFromOutside("missed", PropertyList(7));
    EXPECT_EQ(preferences().integer("missed"), 1);
    EXPECT_TRUE(preferences().synchronize());
    subject->changeFromOutside("missed", PropertyList(8));
    EXPECT_TRUE(preferences().synchronize());
    EXPECT_EQ(preferences().integer("missed"), 8);
}

TEST_P(PreferencesContract, ADictionaryIsChangedFromTheNewestEntriesThatThereAre)
{
    const auto add = [this](const std::string& entry) {
        preferences().changeDictionary("delete",
                                       [&](PropertyList::Dictionary& entries) { entries.emplace(entry, 1); });
    };
    add("written");
    const auto before = preferences().value("delete");
    EXPECT_TRUE(preferences().synchronize());
    subject->changeFromOutside("delete", PropertyList::Dictionary{{"outside", 2}});
    add("changed");
    add("changed again");
    const PropertyList expected =
        PropertyList::Dictionary{{"changed", 1}, {"changed again", 1}, {"outside", 2}};
    EXPECT_EQ(preferences().value("delete"), expected);
    EXPECT_TRUE(preferences().synchronize());
    subject->restart();
    EXPECT_EQ(preferences().value("delete"), expected);
    EXPECT_EQ(before, PropertyList(PropertyList::Dictionary{{"written", 1}}));
}

TEST_P(PreferencesContract, WhatIsNoDictionaryIsChangedFromAnEmptyOne)
{
    subject->changeFromOutside("delete", PropertyList("text"));
    preferences().changeDictionary("delete", [](PropertyList::Dictionary& entries) {
        EXPECT_TRUE(entries.empty());
        entries.emplace("entry", 1);
    });
    EXPECT_EQ(preferences().value("delete"), PropertyList(PropertyList::Dictionary{{"entry", 1}}));
}

INSTANTIATE_TEST_SUITE_P(, PreferencesContract,
                         testing::Values(Implementation{"Simulated", std::make_unique<SimulatedSubject>},
                                         Implementation{"Linux", std::make_unique<LinuxSubject>}),
                         [](const auto& implementation) { return implementation.param.name; });

}  // namespace
}  // namespace typhon
