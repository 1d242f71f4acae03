#include "platform/linux/file_descriptor.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/signing.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>

#include <fcntl.h>
#include <sodium.h>
#include <sys/stat.h>
#include <unistd.h>

// Key files: a secret key stays with whoever signs; its public half is what an administrator trusts. The
// secret file holds the 32-byte seed, from which both halves follow.

namespace typhon {

namespace {

constexpr const char* secretType = "typhon secret key";
constexpr const char* publicType = "typhon public key";
constexpr PropertyListLimits keyFileLimits{.bytes = 4096, .depth = 2, .values = 16};

bool sodiumIsReady()
{
    static const bool ready = sodium_init() >= 0;
    return ready;
}

Data dataOf(std::span<const std::uint8_t> bytes)
{
    return {{bytes.begin(), bytes.end()}};
}

std::string encodeKey(const char* type, std::span<const std::uint8_t> bytes)
{
    return writeXmlPropertyList(PropertyList::Dictionary{{"key", dataOf(bytes)}, {"type", type}});
}

/// The 32 bytes of a key file of that type.
Result<std::array<std::uint8_t, 32>> decodeKey(const char* type, std::span<const std::uint8_t> bytes)
{
    const auto reading = readPropertyList(bytes, keyFileLimits);
    if (!reading.value) {
        return {std::nullopt, reading.error};
    }
    const auto* dictionary = reading.value->asDictionary();
    const auto* kind = reading.value->find("type");
    const auto* key = reading.value->find("key");
    const auto* data = key != nullptr ? key->asData() : nullptr;
    std::array<std::uint8_t, 32> result;
    if (dictionary == nullptr || dictionary->size() != 2 || kind == nullptr || *kind != PropertyList(type) ||
        data == nullptr || data->bytes.size() != result.size()) {
        return {std::nullopt, "it is not a " + std::string(type)};
    }
    std::ranges::copy(data->bytes, result.begin());
    return {result, {}};
}

SigningKey keyOfSeed(const std::array<std::uint8_t, 32>& seed)
{
    SigningKey key;
    crypto_sign_seed_keypair(key.publicKey.bytes.data(), key.secret.data(), seed.data());
    return key;
}

std::optional<std::string> writeNewFile(const std::string& path, const std::string& text, mode_t mode)
{
    const FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, mode));
    if (!file) {
        return path + ": " + errorText(errno);
    }
    const auto written = ::write(file.get(), text.data(), text.size());
    if (written != static_cast<ssize_t>(text.size()) || ::fsync(file.get()) != 0) {
        return path + ": it could not be written";
    }
    return std::nullopt;
}

Result<Bytes> readSmallFile(const std::string& path)
{
    const auto opened = openRegularFile(path);
    if (opened.error != 0) {
        return {std::nullopt, path + ": " + opened.errorText()};
    }
    auto contents = readWhole(opened.file.get(), keyFileLimits.bytes);
    if (contents.error != 0) {
        return {std::nullopt, path + ": " + errorText(contents.error)};
    }
    return {std::move(contents.bytes), {}};
}

}  // namespace

SigningKey::~SigningKey()
{
    sodium_memzero(secret.data(), secret.size());
}

SigningKey generateSigningKey()
{
    if (!sodiumIsReady()) {
        std::abort();
    }
    std::array<std::uint8_t, 32> seed;
    randombytes_buf(seed.data(), seed.size());
    auto key = keyOfSeed(seed);
    sodium_memzero(seed.data(), seed.size());
    return key;
}

std::string encodeSigningKey(const SigningKey& key)
{
    std::array<std::uint8_t, crypto_sign_SEEDBYTES> seed;
    crypto_sign_ed25519_sk_to_seed(seed.data(), key.secret.data());
    auto text = encodeKey(secretType, seed);
    sodium_memzero(seed.data(), seed.size());
    return text;
}

Result<SigningKey> decodeSigningKey(std::span<const std::uint8_t> bytes)
{
    const auto seed = decodeKey(secretType, bytes);
    return seed.value ? Result<SigningKey>{keyOfSeed(*seed.value), {}}
                      : Result<SigningKey>{std::nullopt, seed.error};
}

std::string encodePublicKey(const PublicKey& key)
{
    return encodeKey(publicType, key.bytes);
}

Result<PublicKey> decodePublicKey(std::span<const std::uint8_t> bytes)
{
    const auto key = decodeKey(publicType, bytes);
    return key.value ? Result<PublicKey>{PublicKey{*key.value}, {}}
                     : Result<PublicKey>{std::nullopt, key.error};
}

std::optional<std::string> writeKeyFiles(const std::string& path, const SigningKey& key)
{
    if (auto error = writeNewFile(path, encodeSigningKey(key), 0600)) {
        return error;
    }
    auto error = writeNewFile(path + ".pub", encodePublicKey(key.publicKey), 0644);
    if (error) {
        // A secret key without its public one would be in the way of the next try.
        ::unlink(path.c_str());
    }
    return error;
}

Result<SigningKey> readSigningKeyFile(const std::string& path)
{
    const auto bytes = readSmallFile(path);
    if (!bytes.value) {
        return {std::nullopt, bytes.error};
    }
    auto key = decodeSigningKey(*bytes.value);
    key.error = key.value ? "" : path + ": " + key.error;
    return key;
}

Result<PublicKey> readPublicKeyFile(const std::string& path)
{
    const auto bytes = readSmallFile(path);
    if (!bytes.value) {
        return {std::nullopt, bytes.error};
    }
    auto key = decodePublicKey(*bytes.value);
    key.error = key.value ? "" : path + ": " + key.error;
    return key;
}

}  // namespace typhon
