#include "sdk/font_grant.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Way = FontGrant::Way;
using Dictionary = PropertyList::Dictionary;

const std::string mine = "/var/mobile/Library/UserFonts/FontFiles/org.example.foundry/a.ttf";
const std::string asset = "/var/mobile/Library/UserFonts/FontAssets/abc.asset/a.ttf";
const std::string store = "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/abc.asset/AssetData/a.ttf";
const std::string managed = "/var/mobile/Library/Fonts/Managed/a.ttf";

PropertyList token(std::uint8_t byte)
{
    return Data{{byte, 0}};
}

PropertyList checkin(Dictionary fonts, Dictionary extensions = {})
{
    extensions.emplace("fontsInfo", std::move(fonts));
    return extensions;
}

void expectToken(const FontGrant& grant, std::uint8_t byte, std::string_view source)
{
    EXPECT_EQ(grant.way, Way::broker);
    EXPECT_EQ(PropertyList(grant.token), token(byte));
    EXPECT_EQ(grant.source, source);
}

void expectEmptyToken(const FontGrant& grant)
{
    EXPECT_EQ(grant.way, Way::broker);
    EXPECT_TRUE(grant.token.bytes.empty());
    EXPECT_TRUE(grant.source.empty());
}

TEST(FontGrant, AFilesOwnTokenComesFirst)
{
    const auto view = checkin({{mine, Dictionary{{"data", token(1)}}}}, {{"extension", token(2)}});
    expectToken(fontGrantFor(view, mine), 1, "data");
}

TEST(FontGrant, TheTokenOfTheFontFilesIsForFilesThereOnly)
{
    const auto view = checkin({{mine, Dictionary{}}, {asset, Dictionary{}}}, {{"extension", token(2)}});
    expectToken(fontGrantFor(view, mine), 2, "extension");
    EXPECT_EQ(fontGrantFor(view, asset).way, Way::ownAccess);
}

TEST(FontGrant, TheTokenOfTheAssetsIsForFilesThereOnly)
{
    const auto view =
        checkin({{mine, Dictionary{}}, {asset, Dictionary{}}}, {{"extension.fontasset", token(3)}});
    expectToken(fontGrantFor(view, asset), 3, "extension.fontasset");
    EXPECT_EQ(fontGrantFor(view, mine).way, Way::ownAccess);
}

TEST(FontGrant, AProvidersTokenServesItsDirectory)
{
    const auto view = checkin({{mine, Dictionary{}}}, {{"extension.provider", token(4)}});
    expectToken(fontGrantFor(view, mine), 4, "extension.provider");
}

TEST(FontGrant, AFileThatNeedsNoGrantHasTheEmptyTokenListedOrNot)
{
    expectEmptyToken(fontGrantFor(checkin({{store, Dictionary{}}}), store));
    expectEmptyToken(fontGrantFor(checkin({}), store));
    expectEmptyToken(fontGrantFor(PropertyList(), managed));
}

TEST(FontGrant, AListedFileWithoutATokenIsOpenedByTheProcessItself)
{
    const auto grant = fontGrantFor(checkin({{mine, Dictionary{}}}), mine);
    EXPECT_EQ(grant.way, Way::ownAccess);
    EXPECT_TRUE(grant.token.bytes.empty());
}

TEST(FontGrant, AFileThatWasNotListedIsLeftToTheBrokerToRefuse)
{
    expectEmptyToken(fontGrantFor(checkin({}), mine));
    expectEmptyToken(fontGrantFor(PropertyList(), mine));
    expectEmptyToken(fontGrantFor(checkin({}), "/etc/passwd"));
}

TEST(FontGrant, APathThatOnlyLooksLikeATreeIsOutsideOfIt)
{
    const auto view = checkin({}, {{"extension", token(2)}});
    expectEmptyToken(fontGrantFor(view, "/var/mobile/Library/UserFonts/FontFilesToo/a.ttf"));
}

TEST(FontGrant, ATokenThatIsNoDataCountsAsNone)
{
    const auto view = checkin({{mine, Dictionary{{"data", "text"}}}}, {{"extension", true}});
    EXPECT_EQ(fontGrantFor(view, mine).way, Way::ownAccess);
}

TEST(FontGrant, AMalformedCheckinGrantsNothing)
{
    expectEmptyToken(fontGrantFor(PropertyList("text"), mine));
    expectEmptyToken(fontGrantFor(Dictionary{{"fontsInfo", 1}}, mine));
}

}  // namespace
}  // namespace typhon
