#include "platform/linux/extension_tokens.h"
#include "platform/linux/font_trees.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using Verdict = ExtensionTokens::Verdict;

constexpr const char* fontFiles = "/var/mobile/Library/UserFonts/FontFiles";
constexpr const char* file = "/var/mobile/Library/UserFonts/FontFiles/org.example.foundry/a.ttf";
constexpr AuditToken target{1, 42, 1000, 77, 501, 5};

TEST(ExtensionTokens, GrantTheirFileToTheirTarget)
{
    const ExtensionTokens tokens;
    const auto token = tokens.issue(target, file);
    ASSERT_TRUE(token);
    EXPECT_EQ(tokens.check(*token, target, file), Verdict::granted);
}

TEST(ExtensionTokens, GrantAllFilesBeneathADirectory)
{
    const ExtensionTokens tokens;
    for (const std::string& directory : {std::string(fontFiles), std::string(fontFiles) + "/",
                                         std::string(fontFiles) + "/org.example.foundry"}) {
        const auto token = tokens.issue(target, directory);
        ASSERT_TRUE(token) << directory;
        EXPECT_EQ(tokens.check(*token, target, file), Verdict::granted) << directory;
        EXPECT_EQ(tokens.check(*token, target, std::string(fontFiles) + "Elsewhere/a.ttf"), Verdict::refused);
    }
}

TEST(ExtensionTokens, GrantNothingElse)
{
    const ExtensionTokens tokens;
    const auto token = tokens.issue(target, file);
    for (const std::string& path :
         {std::string(fontFiles) + "/org.example.foundry/b.ttf", std::string(file) + "2",
          std::string(fontFiles), std::string(file).substr(1), std::string("/etc/passwd"), std::string(),
          std::string(fontFiles) + "/org.example.foundry/../org.example.foundry/a.ttf"}) {
        EXPECT_EQ(tokens.check(*token, target, path), Verdict::refused) << path;
    }
}

TEST(ExtensionTokens, ServeNoOtherProcess)
{
    const ExtensionTokens tokens;
    const auto token = tokens.issue(target, file);
    auto other = target;
    ++other.execGeneration;
    EXPECT_EQ(tokens.check(*token, other, file), Verdict::refused);
    other = target;
    ++other.processInstance;
    EXPECT_EQ(tokens.check(*token, other, file), Verdict::refused);
    other = target;
    ++other.processIdentifier;
    EXPECT_EQ(tokens.check(*token, other, file), Verdict::refused);
    EXPECT_EQ(tokens.check(*token, AuditToken{}, file), Verdict::refused);
}

TEST(ExtensionTokens, AreRefusedWithAnyBitChanged)
{
    const ExtensionTokens tokens;
    const auto token = *tokens.issue(target, file);
    for (std::size_t bit = 0; bit < token.size() * 8; ++bit) {
        auto changed = token;
        changed[bit / 8] = static_cast<char>(changed[bit / 8] ^ (1 << bit % 8));
        EXPECT_EQ(tokens.check(changed, target, file), Verdict::refused) << bit;
    }
}

TEST(ExtensionTokens, AreRefusedWhenCutOrLengthened)
{
    const ExtensionTokens tokens;
    const auto token = *tokens.issue(target, file);
    for (std::size_t length = 0; length < token.size(); ++length) {
        EXPECT_EQ(tokens.check(token.substr(0, length), target, file), Verdict::refused) << length;
    }
    EXPECT_EQ(tokens.check(token + "x", target, file), Verdict::refused);
    EXPECT_EQ(tokens.check(std::string(100'000, 'x'), target, file), Verdict::refused);
}

TEST(ExtensionTokens, OfAnEarlierDaemonAreExpired)
{
    const ExtensionTokens earlier;
    const ExtensionTokens tokens;
    const auto token = *earlier.issue(target, file);
    EXPECT_EQ(tokens.check(token, target, file), Verdict::expired);
    for (std::size_t bit = 0; bit < token.size() * 8; ++bit) {
        auto changed = token;
        changed[bit / 8] = static_cast<char>(changed[bit / 8] ^ (1 << bit % 8));
        EXPECT_EQ(tokens.check(changed, target, file), Verdict::refused) << bit;
    }
}

TEST(ExtensionTokens, AreAllDifferent)
{
    const ExtensionTokens tokens;
    EXPECT_NE(tokens.issue(target, file), tokens.issue(target, file));
}

TEST(ExtensionTokens, AreIssuedForTheFontTreesOnly)
{
    const ExtensionTokens tokens;
    for (const std::string& path :
         {std::string("/etc/passwd"), std::string("/"), std::string(),
          std::string("/var/mobile/Library/UserFonts"), std::string(fontFiles) + "/../UserFonts.plist",
          std::string(fontFiles) + "Elsewhere", std::string(fontFiles) + "//",
          std::string(fontFiles) + std::string("/a\0b", 4),
          std::string(fontFiles) + "/" + std::string(5000, 'x')}) {
        EXPECT_EQ(tokens.issue(target, path), std::nullopt) << path;
    }
    for (const auto* path :
         {"/var/mobile/Library/UserFonts/FontAssets/", "/var/mobile/Library/Fonts/Managed/a.ttf",
          "/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/x.asset/AssetData/a.ttf"}) {
        EXPECT_TRUE(tokens.issue(target, path)) << path;
    }
}

TEST(PlainPaths, HaveNoComponentThatLeadsElsewhere)
{
    EXPECT_TRUE(isPlainPath("/a/b.ttf"));
    EXPECT_TRUE(isPlainPath("/a/..b/c..ttf/..."));
    for (const auto* path :
         {"", "/", "a", "/a/", "//a", "/a//b", "/a/./b", "/a/../b", "/..", "/.", "/a/..", "/a/."}) {
        EXPECT_FALSE(isPlainPath(path)) << path;
    }
    EXPECT_FALSE(isPlainPath(std::string_view("/a\0b", 4)));
    EXPECT_TRUE(isPlainPath("/" + std::string(4094, 'x')));
    EXPECT_FALSE(isPlainPath("/" + std::string(4095, 'x')));
}

TEST(FontTrees, HoldFilesNotThemselves)
{
    EXPECT_EQ(fontTreeOf(fontFiles), nullptr);
    EXPECT_EQ(fontTreeOf(std::string(fontFiles) + "/"), nullptr);
    ASSERT_NE(fontTreeOf(file), nullptr);
    EXPECT_TRUE(fontTreeOf(file)->needsGrant);
    EXPECT_FALSE(fontTreeOf("/var/mobile/Library/Fonts/Managed/a.ttf")->needsGrant);
    EXPECT_FALSE(fontTreeOf("/private/var/Cargon/AssetsV2/com_vorlan_Cargon_Font7/a")->needsGrant);
    EXPECT_TRUE(fontTreeOf("/var/mobile/Library/UserFonts/FontAssets/a.ttf")->needsGrant);
}

}  // namespace
}  // namespace typhon
