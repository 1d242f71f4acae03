#include "platform/linux/code_signature.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/signing.h"
#include "testing/scratch_folder.h"

#include <gtest/gtest.h>
#include <sodium.h>

namespace typhon {
namespace {

Bytes bytesOf(const std::string& text)
{
    return {text.begin(), text.end()};
}

CodeStatement statementFor(std::string identifier, PropertyList::Dictionary entitlements = {})
{
    CodeStatement statement{std::move(identifier), std::move(entitlements), {}};
    statement.executable.fill(7);
    return statement;
}

TEST(SigningKeys, SurviveTheirFiles)
{
    const testing::ScratchFolder folder;
    const auto key = generateSigningKey();
    const auto path = folder.path + "/key";
    ASSERT_EQ(writeKeyFiles(path, key), std::nullopt);
    const auto secret = readSigningKeyFile(path);
    const auto publicKey = readPublicKeyFile(path + ".pub");
    ASSERT_TRUE(secret.value) << secret.error;
    ASSERT_TRUE(publicKey.value) << publicKey.error;
    EXPECT_EQ(secret.value->secret, key.secret);
    EXPECT_EQ(secret.value->publicKey, key.publicKey);
    EXPECT_EQ(*publicKey.value, key.publicKey);
    struct stat status;
    ASSERT_EQ(::stat(path.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777u, 0600u);
}

TEST(SigningKeys, AreNotOverwritten)
{
    const testing::ScratchFolder folder;
    const auto path = folder.path + "/key";
    ASSERT_EQ(writeKeyFiles(path, generateSigningKey()), std::nullopt);
    EXPECT_NE(writeKeyFiles(path, generateSigningKey()), std::nullopt);
}

TEST(SigningKeys, DifferEachTime)
{
    EXPECT_NE(generateSigningKey().publicKey, generateSigningKey().publicKey);
}

TEST(SigningKeys, AreNotTakenForOneAnother)
{
    const auto key = generateSigningKey();
    EXPECT_FALSE(decodeSigningKey(bytesOf(encodePublicKey(key.publicKey))).value);
    EXPECT_FALSE(decodePublicKey(bytesOf(encodeSigningKey(key))).value);
    EXPECT_FALSE(decodePublicKey(bytesOf("")).value);
    EXPECT_FALSE(decodePublicKey(bytesOf("garbage")).value);
    EXPECT_FALSE(readPublicKeyFile("/nonexistent").value);
    EXPECT_FALSE(readPublicKeyFile("/dev/zero").value);
}

TEST(SigningIdentifiers, AreBoundedText)
{
    EXPECT_TRUE(isValidSigningIdentifier("org.example.viewer"));
    EXPECT_TRUE(isValidSigningIdentifier("org.example.\xC3\xA9"));
    EXPECT_TRUE(isValidSigningIdentifier(std::string(255, 'a')));
    EXPECT_FALSE(isValidSigningIdentifier(std::string(256, 'a')));
    EXPECT_FALSE(isValidSigningIdentifier(""));
    EXPECT_FALSE(isValidSigningIdentifier("a\nb"));
    EXPECT_FALSE(isValidSigningIdentifier(std::string("a\0b", 3)));
    EXPECT_FALSE(isValidSigningIdentifier("a\x7F"));
    EXPECT_FALSE(isValidSigningIdentifier("a\xC2\x85"));
    EXPECT_FALSE(isValidSigningIdentifier("a\xFF"));
    EXPECT_FALSE(isValidSigningIdentifier("a\xC0\xAF"));
    EXPECT_FALSE(isValidSigningIdentifier("a\xED\xA0\x80"));
}

TEST(KeyScopes, WithoutRestrictionsCoverEverythingOutsideTheSystemsOwn)
{
    const KeyScope scope;
    EXPECT_TRUE(scope.admits(statementFor("org.example.viewer", {{"anything", true}})));
    EXPECT_TRUE(scope.admits(statementFor("com.vorlanesque")));
    EXPECT_FALSE(scope.admits(statementFor("com.vorlan.typhonctl")));
    EXPECT_FALSE(scope.admits(statementFor("com.vorlan.")));
}

TEST(KeyScopes, OfThePlatformCoverEverything)
{
    const KeyScope scope{.platform = true, .identifiers = {}, .entitlements = {}};
    EXPECT_TRUE(scope.admits(statementFor("com.vorlan.typhonctl", {{"anything", true}})));
    EXPECT_TRUE(scope.admits(statementFor("org.example.viewer")));
}

TEST(KeyScopes, WithPrefixesCoverThoseOnly)
{
    const KeyScope scope{.platform = false, .identifiers = {{"org.example.", "net."}}, .entitlements = {}};
    EXPECT_TRUE(scope.admits(statementFor("org.example.viewer")));
    EXPECT_TRUE(scope.admits(statementFor("net.x")));
    EXPECT_FALSE(scope.admits(statementFor("org.examples.viewer")));
    EXPECT_FALSE(scope.admits(statementFor("com.vorlan.x")));
    const KeyScope none{.platform = false, .identifiers = std::vector<std::string>{}, .entitlements = {}};
    EXPECT_FALSE(none.admits(statementFor("org.example.viewer")));
}

TEST(KeyScopes, ReachTheSystemsOwnOnlyByAPrefixWithinThem)
{
    const KeyScope wide{.platform = false, .identifiers = {{"com.", "", "com.vorlan"}}, .entitlements = {}};
    EXPECT_FALSE(wide.admits(statementFor("com.vorlan.tool")));
    EXPECT_TRUE(wide.admits(statementFor("com.example.tool")));
    const KeyScope within{.platform = false, .identifiers = {{"com.vorlan.tool"}}, .entitlements = {}};
    EXPECT_TRUE(within.admits(statementFor("com.vorlan.tool")));
    EXPECT_FALSE(within.admits(statementFor("com.vorlan.other")));
    const KeyScope platform{.platform = true, .identifiers = {{"com."}}, .entitlements = {}};
    EXPECT_TRUE(platform.admits(statementFor("com.vorlan.tool")));
    EXPECT_FALSE(platform.admits(statementFor("org.example")));
}

TEST(KeyScopes, WithEntitlementsSpoilASignatureThatHasAnother)
{
    const KeyScope scope{.platform = false, .identifiers = {}, .entitlements = {{"one", "two"}}};
    EXPECT_TRUE(scope.admits(statementFor("a", {{"one", true}, {"two", 2}})));
    EXPECT_TRUE(scope.admits(statementFor("a")));
    EXPECT_FALSE(scope.admits(statementFor("a", {{"one", true}, {"three", 3}})));
    const KeyScope none{.platform = false, .identifiers = {}, .entitlements = std::vector<std::string>{}};
    EXPECT_FALSE(none.admits(statementFor("a", {{"one", true}})));
}

TEST(TrustedKeyFiles, SurviveTheirEncoding)
{
    TrustedKey key{generateSigningKey().publicKey, {true, {{"a.", "b."}}, {{"one"}}}};
    const auto read = decodeTrustedKey(bytesOf(encodeTrustedKey(key)));
    ASSERT_TRUE(read.value) << read.error;
    EXPECT_EQ(read.value->key, key.key);
    EXPECT_TRUE(read.value->scope.platform);
    EXPECT_EQ(read.value->scope.identifiers, key.scope.identifiers);
    EXPECT_EQ(read.value->scope.entitlements, key.scope.entitlements);

    const auto plain = decodeTrustedKey(bytesOf(encodeTrustedKey({key.key, {}})));
    ASSERT_TRUE(plain.value);
    EXPECT_FALSE(plain.value->scope.platform);
    EXPECT_EQ(plain.value->scope.identifiers, std::nullopt);
    EXPECT_EQ(plain.value->scope.entitlements, std::nullopt);
}

TEST(TrustedKeyFiles, AreRefusedWhenTheirScopeIsNotUnderstood)
{
    const Data key{Bytes(32, 1)};
    const auto read = [](PropertyList::Dictionary file) {
        return decodeTrustedKey(writeBinaryPropertyList(std::move(file))).value.has_value();
    };
    EXPECT_TRUE(read({{"type", "typhon trusted key"}, {"key", key}}));
    EXPECT_FALSE(read({{"type", "typhon trusted key"}, {"key", key}, {"notAfter", 1}}));
    EXPECT_FALSE(read({{"type", "typhon trusted key"}, {"key", key}, {"platform", 1}}));
    EXPECT_FALSE(read({{"type", "typhon trusted key"}, {"key", key}, {"identifiers", "org."}}));
    EXPECT_FALSE(
        read({{"type", "typhon trusted key"}, {"key", key}, {"entitlements", PropertyList::Array{1}}}));
    EXPECT_FALSE(read({{"type", "typhon trusted key"}, {"key", Data{Bytes(31, 1)}}}));
    EXPECT_FALSE(read({{"type", "typhon public key"}, {"key", key}}));
}

TEST(Signatures, StateWhatWasSigned)
{
    const auto key = generateSigningKey();
    const auto statement =
        statementFor("org.example.viewer", {{"list", PropertyList::Array{"a", "b"}}, {"n", 1}});
    const auto file = makeSignature(key, statement);
    ASSERT_TRUE(file.value) << file.error;
    const auto signature = decodeSignature(*file.value);
    ASSERT_TRUE(signature.value) << signature.error;
    EXPECT_EQ(signature.value->key, key.publicKey);
    const auto read = verifiedStatement(*signature.value);
    ASSERT_TRUE(read.value) << read.error;
    EXPECT_EQ(read.value->identifier, statement.identifier);
    EXPECT_EQ(read.value->entitlements, statement.entitlements);
    EXPECT_EQ(read.value->executable, statement.executable);
}

TEST(Signatures, DoNotSurviveTheChangeOfAnyBit)
{
    const auto key = generateSigningKey();
    const auto file = *makeSignature(key, statementFor("org.example.viewer", {{"n", 1}})).value;
    const auto whole = readPropertyList(file).value;
    std::size_t refused = 0;
    for (std::size_t bit = 0; bit < file.size() * 8; ++bit) {
        auto changed = file;
        changed[bit / 8] = static_cast<std::uint8_t>(changed[bit / 8] ^ (1u << bit % 8));
        const auto signature = decodeSignature(changed);
        const bool counts = signature.value && verifiedStatement(*signature.value).value;
        // A bit that the property list does not use leaves the same signature.
        EXPECT_FALSE(counts && readPropertyList(changed).value != whole) << bit;
        refused += counts ? 0 : 1;
    }
    EXPECT_GT(refused, file.size() * 7);
}

TEST(Signatures, OverOtherTextByTheSameKeyDoNotCount)
{
    const auto key = generateSigningKey();
    auto signature = *decodeSignature(*makeSignature(key, statementFor("a")).value).value;
    crypto_sign_detached(signature.signature.data(), nullptr, signature.statement.data(),
                         signature.statement.size(), key.secret.data());
    EXPECT_FALSE(verifiedStatement(signature).value);
}

TEST(Signatures, AreNotMadeForWhatWouldNotBeRead)
{
    const auto key = generateSigningKey();
    EXPECT_FALSE(makeSignature(key, statementFor("")).value);
    EXPECT_FALSE(makeSignature(key, statementFor("a\nb")).value);
    EXPECT_FALSE(makeSignature(key, statementFor("a", {{"huge", std::string(300 * 1024, 'x')}})).value);
    PropertyList deep(1);
    for (int level = 0; level < 40; ++level) {
        deep = PropertyList::Array{deep};
    }
    EXPECT_FALSE(makeSignature(key, statementFor("a", {{"deep", deep}})).value);
}

TEST(Hashes, OfAFileAreThoseOfItsWholeContents)
{
    const testing::ScratchFolder folder;
    // Larger than one block, and not a multiple of it.
    const std::string contents(600'001, 'x');
    const auto path = folder.write("/file", contents);
    Sha256 expected;
    crypto_hash_sha256(expected.data(), reinterpret_cast<const unsigned char*>(contents.data()),
                       contents.size());
    EXPECT_EQ(testing::digestOf(path), expected);
    EXPECT_EQ(sha256OfFile(-1), std::nullopt);
    EXPECT_EQ(hexOf(Bytes{0x00, 0xAF, 0x10}), "00af10");
}

}  // namespace
}  // namespace typhon
