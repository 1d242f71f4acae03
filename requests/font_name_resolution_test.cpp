#include "platform/font_directories.h"
#include "testing/request_world.h"

#include <algorithm>
#include <random>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using namespace testing_aid;
using Names = std::vector<std::string>;

class FontNameResolutionTest : public testing::Test {
protected:
    PlacedFontNames place(const Array& requests)
    {
        return world.resolution.unknownFontNamesAndEnabledFamilyNames(requests);
    }

    RequestWorld world;
    FontNameResolution& resolution = world.resolution;
};

TEST_F(FontNameResolutionTest, WithoutARegistryEveryNameIsUnknownAndHasNoProvider)
{
    const auto names = place({family("Beta"), postScript("Alpha-Regular")});
    EXPECT_EQ(names.unknownFontNames, (Names{"Alpha-Regular", "Beta"}));
    EXPECT_TRUE(names.enabledFamilyNames.empty());
    EXPECT_TRUE(names.disabledFamilyNames.empty());
    EXPECT_TRUE(resolution.providerIdentifiersFromFamilyName("Beta").empty());
    const auto providers = resolution.providerIdentifiersAndFamilyName("Alpha-Regular");
    EXPECT_TRUE(providers.providerIdentifiers.empty());
    EXPECT_EQ(providers.familyName, std::nullopt);
    bool isEnabled = true;
    EXPECT_FALSE(resolution.isKnownFamilyName("Beta", &isEnabled));
    EXPECT_FALSE(isEnabled);
    isEnabled = true;
    EXPECT_EQ(resolution.knownFamilyNameFromPostScriptName("Alpha-Regular", &isEnabled), std::nullopt);
    EXPECT_FALSE(isEnabled);
}

TEST_F(FontNameResolutionTest, ARequestWithoutANameChangesNothing)
{
    const auto names = place({Dictionary{}, Dictionary{{"other", "Alpha"}}});
    EXPECT_TRUE(names.unknownFontNames.empty() && names.enabledFamilyNames.empty() &&
                names.disabledFamilyNames.empty());
}

TEST_F(FontNameResolutionTest, NamesOfOtherTypesAreIgnored)
{
    const auto names = place({Dictionary{{kLFFontFamilyNameAttribute, 7}, {kLFFontNameAttribute, Array{"a"}}},
                              PropertyList("Alpha"), Array{}, true,
                              Dictionary{{kLFFontFamilyNameAttribute, 7}, {kLFFontNameAttribute, "Beta"}}});
    EXPECT_EQ(names.unknownFontNames, Names{"Beta"});
}

TEST_F(FontNameResolutionTest, AnUnknownFamilyThatIsAskedForTwiceIsListedOnce)
{
    EXPECT_EQ(place({family("Beta"), family("Beta")}).unknownFontNames, Names{"Beta"});
}

TEST_F(FontNameResolutionTest, OnlyAnExactMatchCounts)
{
    world.install(fontFiles + "com.example.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}});
    EXPECT_TRUE(resolution.isKnownFamilyName("Alpha"));
    EXPECT_FALSE(resolution.isKnownFamilyName("alpha"));
    EXPECT_FALSE(resolution.isKnownFamilyName("Alpha "));
    EXPECT_FALSE(resolution.isKnownFamilyName("Alpha-Regular"));
    EXPECT_EQ(resolution.knownFamilyNameFromPostScriptName("Alpha"), std::nullopt);
    EXPECT_EQ(place({family("Alpha"), family("alpha")}).unknownFontNames, Names{"alpha"});
}

TEST_F(FontNameResolutionTest, AFamilyThatIsEnabledAnywhereInARequestIsNotDisabled)
{
    world.install(fontFiles + "a.foundry/a.ttf", {{"Alpha-Bold", "Alpha"}}, true);
    world.install(fontFiles + "b.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}}, false);
    EXPECT_EQ(place({family("Alpha")}).disabledFamilyNames, Names{"Alpha"});
    const auto names = place({family("Alpha"), postScript("Alpha-Regular")});
    EXPECT_EQ(names.enabledFamilyNames, Names{"Alpha"});
    EXPECT_TRUE(names.disabledFamilyNames.empty());
}

TEST_F(FontNameResolutionTest, TheFirstFileByPathDecidesWhetherAFamilyIsEnabled)
{
    world.install(fontFiles + "a.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}}, false);
    world.install(fontFiles + "b.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}}, true);
    bool isEnabled = false;
    EXPECT_TRUE(resolution.isKnownFamilyName("Alpha", &isEnabled));
    EXPECT_TRUE(isEnabled);
    world.install(fontFiles + "a.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}}, true);
    EXPECT_TRUE(resolution.isKnownFamilyName("Alpha", &isEnabled));
    EXPECT_FALSE(isEnabled);
}

TEST_F(FontNameResolutionTest, UnknownNamesAreSortedWithUpperCaseFirst)
{
    EXPECT_EQ(place({family("alpha"), family("Zeta"), family("Beta"), postScript("Alpha")}).unknownFontNames,
              (Names{"Alpha", "Beta", "Zeta", "alpha"}));
}

TEST_F(FontNameResolutionTest, OfTwoUnknownNamesInOneRequestTheFamilyIsListed)
{
    EXPECT_EQ(place({familyAndPostScript("Beta", "Beta-Bold")}).unknownFontNames, Names{"Beta"});
}

TEST_F(FontNameResolutionTest, AKnownFamilyWithAnUnknownFaceIsNotUnknown)
{
    world.install(fontFiles + "com.example.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}});
    const auto names = place({familyAndPostScript("Alpha", "Alpha-Heavy")});
    EXPECT_TRUE(names.unknownFontNames.empty());
    EXPECT_EQ(names.enabledFamilyNames, Names{"Alpha"});
}

TEST_F(FontNameResolutionTest, AFaceOfAnotherFamilyThanTheOneAskedForAddsBoth)
{
    world.install(fontFiles + "com.example.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}});
    world.install(fontFiles + "com.example.foundry/b.ttf", {{"Beta-Regular", "Beta"}}, true);
    const auto names = place({familyAndPostScript("Alpha", "Beta-Regular")});
    EXPECT_EQ(names.enabledFamilyNames, Names{"Alpha"});
    EXPECT_EQ(names.disabledFamilyNames, Names{"Beta"});
    EXPECT_EQ(place({familyAndPostScript("Gamma", "Beta-Regular")}).unknownFontNames, Names{});
}

TEST_F(FontNameResolutionTest, ADirectoryThatIsNoApplicationsProvidesNothingButItsNamesAreKnown)
{
    const auto path = fontFiles + "%zz/a.ttf";
    world.install(path, {{"Alpha-Regular", "Alpha"}});
    EXPECT_EQ(resolution.identifierFromFilePath(path), std::nullopt);
    EXPECT_TRUE(resolution.providerIdentifiersFromFamilyName("Alpha").empty());
    EXPECT_TRUE(resolution.isKnownFamilyName("Alpha"));
    EXPECT_EQ(resolution.providerIdentifiersAndFamilyName("Alpha-Regular").familyName, "Alpha");
}

TEST_F(FontNameResolutionTest, EveryProviderOfAFamilyCountsEnabledOrNot)
{
    world.install(fontFiles + "a.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}}, true);
    world.install(fontFiles + "b.foundry/a.ttf", {{"Alpha-Bold", "Alpha"}, {"Alpha-Thin", "Alpha"}});
    world.install(fontFiles + "b.foundry/b.ttf", {{"Alpha-Regular", "Alpha"}});
    EXPECT_EQ(resolution.providerIdentifiersFromFamilyName("Alpha"),
              (std::set<std::string>{"a.foundry", "b.foundry"}));
}

TEST_F(FontNameResolutionTest, TheLastFileByPathSaysWhichFamilyTheProvidersOfAFaceHave)
{
    world.install(fontFiles + "a.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}});
    world.install(fontFiles + "b.foundry/a.ttf", {{"Alpha-Regular", "Alpha Next"}}, true);
    const auto providers = resolution.providerIdentifiersAndFamilyName("Alpha-Regular");
    EXPECT_EQ(providers.providerIdentifiers, (std::set<std::string>{"a.foundry", "b.foundry"}));
    EXPECT_EQ(providers.familyName, "Alpha Next");
    EXPECT_EQ(resolution.knownFamilyNameFromPostScriptName("Alpha-Regular"), "Alpha");
}

TEST_F(FontNameResolutionTest, AHundredThousandNamesAndNamesOfAMegabyteArePlaced)
{
    world.install(fontFiles + "com.example.foundry/a.ttf", {{"Alpha-Regular", "Alpha"}});
    Array requests;
    for (int number = 0; number < 100'000; ++number) {
        requests.push_back(familyAndPostScript("Family " + std::to_string(number % 50'000), "Face"));
    }
    for (const char letter : {'a', 'b'}) {
        requests.push_back(family(std::string(1U << 20, letter)));
    }
    requests.push_back(family("Alpha"));
    const auto names = place(requests);
    EXPECT_EQ(names.unknownFontNames.size(), 50'002U);
    EXPECT_EQ(names.enabledFamilyNames, Names{"Alpha"});
}

/// The same lookups as walks over every entry, in the registry's order.
struct Walks {
    const Dictionary& entries;
    FontNameResolution& resolution;

    static const Dictionary& faces(const PropertyList& entry)
    {
        return *entry.find("familyName")->asDictionary();
    }
    static bool hasFamily(const PropertyList& entry, const std::string& name)
    {
        return std::ranges::any_of(faces(entry),
                                   [&](const auto& face) { return face.second == PropertyList(name); });
    }

    std::optional<std::string> familyOf(const std::string& name, bool& isEnabled) const
    {
        isEnabled = false;
        for (const auto& [path, entry] : entries) {
            const auto found = faces(entry).find(name);
            if (found != faces(entry).end()) {
                isEnabled = !isDisabled(entry);
                return *found->second.asString();
            }
        }
        return std::nullopt;
    }
    bool isKnown(const std::string& name, bool& isEnabled) const
    {
        isEnabled = false;
        for (const auto& [path, entry] : entries) {
            if (hasFamily(entry, name)) {
                isEnabled = !isDisabled(entry);
                return true;
            }
        }
        return false;
    }
    PlacedFontNames place(const Array& requests) const
    {
        std::set<std::string> unknown;
        std::set<std::string> enabled;
        std::set<std::string> disabled;
        for (const auto& request : requests) {
            bool isEnabled = false;
            const auto* familyName = request.find(kLFFontFamilyNameAttribute);
            const auto* name = request.find(kLFFontNameAttribute);
            const bool isFamilyKnown = familyName != nullptr && isKnown(*familyName->asString(), isEnabled);
            if (isFamilyKnown) {
                (isEnabled ? enabled : disabled).insert(*familyName->asString());
            }
            if (name != nullptr) {
                if (const auto found = familyOf(*name->asString(), isEnabled)) {
                    (isEnabled ? enabled : disabled).insert(*found);
                } else if (!isFamilyKnown) {
                    unknown.insert(*(familyName != nullptr ? familyName : name)->asString());
                }
            } else if (familyName != nullptr && !isFamilyKnown) {
                unknown.insert(*familyName->asString());
            }
        }
        for (const auto& both : enabled) {
            disabled.erase(both);
        }
        return {{unknown.begin(), unknown.end()},
                {enabled.begin(), enabled.end()},
                {disabled.begin(), disabled.end()}};
    }
    std::set<std::string> providersOfFamily(const std::string& name) const
    {
        std::set<std::string> providers;
        for (const auto& [path, entry] : entries) {
            const auto provider = resolution.identifierFromFilePath(path);
            if (hasFamily(entry, name) && provider) {
                providers.insert(*provider);
            }
        }
        return providers;
    }
    PostScriptNameProviders providersOfFace(const std::string& name) const
    {
        PostScriptNameProviders found;
        for (const auto& [path, entry] : entries) {
            const auto face = faces(entry).find(name);
            if (face == faces(entry).end()) {
                continue;
            }
            found.familyName = *face->second.asString();
            if (const auto provider = resolution.identifierFromFilePath(path)) {
                found.providerIdentifiers.insert(*provider);
            }
        }
        return found;
    }
};

struct RandomNames {
    std::mt19937_64& random;

    std::string some(const char* kind) const { return kind + std::to_string(random() % 7); }
    Dictionary registry() const
    {
        const Names directories{"a.foundry", "b.foundry", "%zz", "c", ""};
        Dictionary entries;
        for (auto count = random() % 12; count != 0; --count) {
            Dictionary faces;
            for (auto face = random() % 4; face != 0; --face) {
                faces.insert_or_assign(some("name"), random() % 5 == 0 ? some("name") : some("family"));
            }
            Dictionary entry{{"familyName", std::move(faces)}};
            if (random() % 2 == 0) {
                entry.emplace("disabled", random() % 2 == 0);
            }
            entries.insert_or_assign(
                fontFiles + directories[random() % 5] + "/" + std::to_string(random() % 4), std::move(entry));
        }
        return entries;
    }
    Array requests() const
    {
        Array requests;
        for (auto count = random() % 6; count != 0; --count) {
            Dictionary request;
            if (random() % 2 == 0) {
                request.emplace(kLFFontFamilyNameAttribute, some("family"));
            }
            if (random() % 2 == 0) {
                request.emplace(kLFFontNameAttribute, some("name"));
            }
            requests.emplace_back(std::move(request));
        }
        return requests;
    }
};

TEST_F(FontNameResolutionTest, TheIndexesFindWhatWalkingTheRegistryWouldFind)
{
    std::mt19937_64 random(11);
    const RandomNames some{random};
    for (int round = 0; round < 3000; ++round) {
        const auto entries = some.registry();
        world.registry.setUserFontsInfo(entries);
        const Walks walks{entries, resolution};
        const auto name = some.some(random() % 2 == 0 ? "name" : "family");
        bool isEnabled = random() % 2 == 0;
        bool isExpectedEnabled = false;
        EXPECT_EQ(resolution.knownFamilyNameFromPostScriptName(name, &isEnabled),
                  walks.familyOf(name, isExpectedEnabled));
        EXPECT_EQ(isEnabled, isExpectedEnabled);
        EXPECT_EQ(resolution.isKnownFamilyName(name, &isEnabled), walks.isKnown(name, isExpectedEnabled));
        EXPECT_EQ(isEnabled, isExpectedEnabled);
        const auto requests = some.requests();
        const auto placed = place(requests);
        const auto expected = walks.place(requests);
        EXPECT_EQ(placed.unknownFontNames, expected.unknownFontNames);
        EXPECT_EQ(placed.enabledFamilyNames, expected.enabledFamilyNames);
        EXPECT_EQ(placed.disabledFamilyNames, expected.disabledFamilyNames);
        EXPECT_EQ(resolution.providerIdentifiersFromFamilyName(name), walks.providersOfFamily(name));
        const auto providers = resolution.providerIdentifiersAndFamilyName(name);
        EXPECT_EQ(providers.providerIdentifiers, walks.providersOfFace(name).providerIdentifiers);
        EXPECT_EQ(providers.familyName, walks.providersOfFace(name).familyName);
        ASSERT_FALSE(HasFailure()) << "round " << round;
    }
}

}  // namespace
}  // namespace typhon
