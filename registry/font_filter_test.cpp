#include "platform/font_directories.h"
#include "platform/simulated/simulated_platform.h"
#include "registry/per_client_font_info.h"

#include <random>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Dictionary = PropertyList::Dictionary;

PropertyList font(bool disabled)
{
    return Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}, {"disabled", disabled}};
}

class FontFilterTest : public testing::Test {
protected:
    AuditToken add(bool isSandboxed) { return simulated.processes.add({.isSandboxed = isSandboxed}); }

    SimulatedPlatform simulated;
    UserFontUpdates updates{simulated.platform.processWideQueues};
    UserFontRegistry registry{simulated.fileSystem, simulated.log, updates};
    std::shared_ptr<WorkQueue> mainHandlerQueue = simulated.queues.createSerialQueue("com.vorlan.typhond");
    PerClientFontInfo fontInfo{
        simulated.platform,
        registry,
        *mainHandlerQueue,
        {[this](const AuditToken& token) { return simulated.sandbox.isSandboxed(token); },
         [](const std::string&) { return std::vector<std::string>{}; }}};
};

TEST_F(FontFilterTest, TheFilterSeesEveryEntryWithTheNoGrantFlagDown)
{
    registry.setUserFontsInfo(Dictionary{{"/f/X/a.ttf", font(true)}, {"/f/X/b.ttf", font(false)}});
    std::vector<std::string> seen;
    fontInfo.filterUserFontInfoForAuditToken(
        add(true), false, [&](const std::string& path, const PropertyList& entry, bool& noGrant) {
            EXPECT_FALSE(noGrant);
            EXPECT_NE(entry.find("disabled"), nullptr);
            noGrant = true;
            seen.push_back(path);
            return true;
        });
    EXPECT_EQ(seen, (std::vector<std::string>{"/f/X/a.ttf", "/f/X/b.ttf"}));
}

TEST_F(FontFilterTest, WhatTheFilterAdmitsIsListedWithoutItsDisabledKeyAlsoWhenDisabled)
{
    registry.setUserFontsInfo(Dictionary{{"/f/X/a.ttf", font(true)}, {"/f/X/b.ttf", font(false)}});
    const auto listed = fontInfo.filterUserFontInfoForAuditToken(
        add(false), false,
        [&](const std::string& path, const PropertyList&, bool&) { return path == "/f/X/a.ttf"; });
    EXPECT_EQ(listed,
              PropertyList(Dictionary{
                  {"/f/X/a.ttf", Dictionary{{"familyName", Dictionary{{"Alpha-Regular", "Alpha"}}}}}}));
}

TEST_F(FontFilterTest, GrantsAreIssuedOnlyToASandboxedClientWithoutEnumerationAndNoGrantFlag)
{
    registry.setUserFontsInfo(Dictionary{{"/f/X/a.ttf", font(false)}});
    const auto grants = [&](bool isSandboxed, bool enumeration, bool flag) {
        const auto before = simulated.sandbox.issued().size();
        const auto listed = fontInfo.filterUserFontInfoForAuditToken(
            add(isSandboxed), enumeration, [&](const std::string&, const PropertyList&, bool& noGrant) {
                noGrant = flag;
                return true;
            });
        EXPECT_EQ(listed.asDictionary()->size(), 1U);
        const auto issued = simulated.sandbox.issued().size() - before;
        EXPECT_EQ(listed.find("/f/X/a.ttf")->find("data") != nullptr, issued == 1);
        return issued;
    };
    EXPECT_EQ(grants(true, false, false), 1U);
    EXPECT_EQ(grants(true, false, true), 0U);
    EXPECT_EQ(grants(true, true, false), 0U);
    EXPECT_EQ(grants(false, false, false), 0U);
}

TEST_F(FontFilterTest, AnEmptyRegistryIsNotFiltered)
{
    const auto listed = fontInfo.filterUserFontInfoForAuditToken(
        add(true), false, [](const std::string&, const PropertyList&, bool&) {
            ADD_FAILURE() << "there is no entry to ask about";
            return true;
        });
    EXPECT_EQ(listed, PropertyList(Dictionary{}));
}

/// What the choice of fonts must come to, said as a filter over the whole registry.
struct ChoiceByWalking {
    bool enumeration;
    bool installation;
    std::optional<std::string> directoryName;
    const std::optional<std::set<std::string>>& allowed;
    bool found = false;

    bool operator()(const std::string& path, const PropertyList& entry, bool& noGrant)
    {
        if ((allowed && !allowed->contains(path)) || isDisabled(entry)) {
            return false;
        }
        if (enumeration || !installation) {
            return enumeration;
        }
        const bool isOwn = font_directories::nameOfDirectoryHolding(path) == directoryName;
        noGrant = isOwn;
        found = found || isOwn;
        return isOwn;
    }
};

Dictionary randomRegistry(std::mt19937_64& random)
{
    const auto roll = [&](unsigned sides) { return static_cast<unsigned>(random() % sides); };
    const std::vector<std::string> roots{"/var/mobile/Library/UserFonts/FontFiles/",
                                         "/var/mobile/Library/UserFonts/FontAssets/",
                                         "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/", "/"};
    Dictionary fonts;
    for (unsigned count = roll(12); count != 0; --count) {
        fonts.insert_or_assign(roots[roll(4)] + std::string(1, static_cast<char>('a' + roll(4))) + "/" +
                                   std::to_string(roll(5)) + ".ttf",
                               font(roll(3) == 0));
    }
    return fonts;
}

TEST_F(FontFilterTest, TheIndexesChooseWhatWalkingTheRegistryWouldChoose)
{
    std::mt19937_64 random(7);
    for (int round = 0; round < 2000; ++round) {
        const auto fonts = randomRegistry(random);
        registry.setUserFontsInfo(fonts);
        const bool enumeration = random() % 2 == 0;
        const bool installation = random() % 2 == 0;
        const auto identifier =
            random() % 5 == 0 ? std::nullopt : std::optional(std::string(1, "abcdx"[random() % 5]));
        std::optional<std::set<std::string>> allowed;
        if (random() % 2 == 0) {
            allowed.emplace();
            for (const auto& [path, entry] : fonts) {
                if (random() % 2 == 0) {
                    allowed->insert(path);
                }
            }
            allowed->insert("/not/installed.ttf");
        }
        const auto token = add(random() % 2 == 0);
        const bool hasDirectory = identifier && installation && !enumeration;
        ChoiceByWalking choice{enumeration, installation, hasDirectory ? identifier : std::nullopt, allowed};
        const auto expected = fontInfo.filterUserFontInfoForAuditToken(token, enumeration, std::ref(choice));

        std::optional<std::string> foundFontDirectoryName;
        EXPECT_EQ(fontInfo.fontInfoForAuditToken(token, enumeration, installation, identifier, allowed,
                                                 &foundFontDirectoryName),
                  expected)
            << "round " << round;
        EXPECT_EQ(foundFontDirectoryName.has_value(), choice.found) << "round " << round;
        if (foundFontDirectoryName) {
            EXPECT_EQ(foundFontDirectoryName, identifier);
        }
        simulated.processes.exit(token);
    }
}

}  // namespace
}  // namespace typhon
