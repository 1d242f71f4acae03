#include "platform/linux/trusted_keys.h"
#include "testing/scratch_folder.h"

#include <filesystem>

#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::RecordingLog;
using testing::ScratchFolder;

std::string keyFile(const PublicKey& key, KeyScope scope = {})
{
    return encodeTrustedKey({key, std::move(scope)});
}

std::string pathOf(const std::string& name)
{
    return std::string(trustedKeysDirectory) + "/" + name;
}

struct TrustedKeysTest : ::testing::Test {
    ScratchFolder folder;
    RecordingLog log;
    TrustedKeys keys{folder.root, log};
    const PublicKey one = generateSigningKey().publicKey;
    const PublicKey other = generateSigningKey().publicKey;

    bool trusts(const PublicKey& key)
    {
        return isTrusted(*keys.current(), key, {"org.example.viewer", {}, {}});
    }
};

TEST_F(TrustedKeysTest, AreNoneWithoutADirectory)
{
    EXPECT_TRUE(keys.current()->empty());
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(TrustedKeysTest, CountFromTheMomentTheyAreThereUntilTheyAreRemoved)
{
    EXPECT_FALSE(trusts(one));
    const auto path = folder.write(pathOf("one.plist"), keyFile(one));
    EXPECT_TRUE(trusts(one));
    EXPECT_FALSE(trusts(other));
    folder.write(pathOf("two.plist"), keyFile(other));
    EXPECT_TRUE(trusts(one));
    EXPECT_TRUE(trusts(other));
    std::filesystem::remove(path);
    EXPECT_FALSE(trusts(one));
    EXPECT_TRUE(trusts(other));
}

TEST_F(TrustedKeysTest, ThatTyphonctlWroteCount)
{
    const auto path = writeTrustedKey(folder.root, {one, {}});
    ASSERT_TRUE(path.value) << path.error;
    EXPECT_TRUE(std::filesystem::exists(folder.root.real(*path.value)));
    EXPECT_TRUE(trusts(one));
    KeyScope narrow;
    narrow.identifiers = {"net."};
    ASSERT_TRUE(writeTrustedKey(folder.root, {one, narrow}).value);
    EXPECT_FALSE(trusts(one));
}

TEST_F(TrustedKeysTest, ChangedInPlaceCountAsTheyAre)
{
    folder.write(pathOf("one.plist"), keyFile(one));
    EXPECT_TRUE(trusts(one));
    folder.write(pathOf("one.plist"), keyFile(other));
    EXPECT_FALSE(trusts(one));
    EXPECT_TRUE(trusts(other));
}

TEST_F(TrustedKeysTest, AreKeptWhileNothingChanges)
{
    folder.write(pathOf("one.plist"), keyFile(one));
    // Until the file's time is in the past, every question reads it again; from then on none does.
    auto before = keys.current();
    for (auto after = keys.current(); after != before; after = keys.current()) {
        before = after;
    }
    EXPECT_EQ(keys.current(), before);
}

TEST_F(TrustedKeysTest, ThatOthersCanWriteDoNotCount)
{
    folder.write(pathOf("group.plist"), keyFile(one), 0664);
    folder.write(pathOf("others.plist"), keyFile(other), 0646);
    EXPECT_FALSE(trusts(one));
    EXPECT_FALSE(trusts(other));
    EXPECT_TRUE(log.has("group.plist"));
    EXPECT_TRUE(log.has("others.plist"));
}

TEST_F(TrustedKeysTest, InADirectoryThatOthersCanWriteDoNotCount)
{
    const auto file = folder.write(pathOf("one.plist"), keyFile(one));
    ASSERT_TRUE(trusts(one));
    const auto directory = std::filesystem::path(file).parent_path();
    for (const auto& open : {directory, directory.parent_path(), std::filesystem::path(folder.path)}) {
        ASSERT_EQ(::chmod(open.c_str(), 0777), 0);
        TrustedKeys fresh(folder.root, log);
        EXPECT_TRUE(fresh.current()->empty()) << open;
        EXPECT_TRUE(log.has(open.string() + " can be changed by others"));
        ASSERT_EQ(::chmod(open.c_str(), 0755), 0);
    }
    EXPECT_TRUE(trusts(one));
}

TEST_F(TrustedKeysTest, OfAnotherUserDoNotCount)
{
    if (::geteuid() != 0) {
        // Only root can give files away; to an ordinary user the files of a third one look the same.
        EXPECT_NE(::chown(folder.path.c_str(), 65534, 65534), 0);
        return;
    }
    const auto path = folder.write(pathOf("one.plist"), keyFile(one));
    ASSERT_EQ(::chown(path.c_str(), 65534, 65534), 0);
    EXPECT_FALSE(trusts(one));
}

TEST_F(TrustedKeysTest, BehindSymbolicLinksDoNotCount)
{
    const auto real = folder.write("/elsewhere/one.plist", keyFile(one));
    folder.write(pathOf("two.plist"), keyFile(other));
    std::filesystem::create_symlink(real, folder.root.real(pathOf("one.plist")));
    EXPECT_FALSE(trusts(one));
    EXPECT_TRUE(trusts(other));
    std::filesystem::remove_all(folder.root.real(trustedKeysDirectory));
    std::filesystem::create_directory_symlink(folder.root.real("/elsewhere"),
                                              folder.root.real(trustedKeysDirectory));
    EXPECT_FALSE(trusts(one));
}

TEST_F(TrustedKeysTest, ThatAreNoKeysAreLoggedAndPassedOver)
{
    folder.write(pathOf("bad.plist"), "garbage");
    folder.write(pathOf("large.plist"), std::string(100'000, 'x'));
    folder.write(pathOf("readme.txt"), keyFile(other));
    folder.write(pathOf(".hidden.plist"), keyFile(other));
    std::filesystem::create_directory(folder.root.real(pathOf("folder.plist")));
    ASSERT_EQ(::mkfifo(folder.root.real(pathOf("pipe.plist")).c_str(), 0644), 0);
    folder.write(pathOf("one.plist"), keyFile(one));
    EXPECT_TRUE(trusts(one));
    EXPECT_FALSE(trusts(other));
    for (const auto* name : {"bad.plist", "large.plist", "folder.plist", "pipe.plist"}) {
        EXPECT_TRUE(log.has(name)) << name;
    }
}

TEST_F(TrustedKeysTest, AreLimitedInNumber)
{
    const auto text = keyFile(other);
    for (int number = 100; number < 400; ++number) {
        folder.write(pathOf(std::to_string(number) + ".plist"), text);
    }
    folder.write(pathOf("zzz.plist"), keyFile(one));
    EXPECT_FALSE(trusts(one));
    EXPECT_TRUE(trusts(other));
    EXPECT_TRUE(log.has("holds too many keys"));
}

TEST_F(TrustedKeysTest, InTwoFilesCountWithEitherScope)
{
    KeyScope narrow;
    narrow.identifiers = {"net."};
    folder.write(pathOf("one.plist"), keyFile(one, narrow));
    EXPECT_FALSE(trusts(one));
    folder.write(pathOf("two.plist"), keyFile(one));
    EXPECT_TRUE(trusts(one));
}

}  // namespace
}  // namespace typhon
