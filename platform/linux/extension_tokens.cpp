#include "platform/linux/extension_tokens.h"

#include "platform/linux/font_trees.h"
#include "platform/linux/signing.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>

#include <sodium.h>

// The text of a token, with ";" between the fields, everything but the path in lower-case hexadecimal of
// fixed length:
//
//   typhon-extension-1 ; class ; daemon ; target ; nonce ; MAC ; check ; path
//
// The MAC is keyed BLAKE2b and covers every field but itself and the check. The check is a short digest of
// all the rest, under a key that is no secret: it keeps a damaged token from being taken for one of an
// earlier daemon, and proves nothing else.

namespace typhon {

namespace {

constexpr std::string_view heading = "typhon-extension-1;read;";
constexpr std::size_t instanceLength = 32;
constexpr std::size_t targetLength = 2 * sizeof(AuditToken);
constexpr std::size_t nonceLength = 32;
constexpr std::size_t macLength = 2 * crypto_generichash_BYTES;
constexpr std::size_t checkLength = 2 * crypto_shorthash_BYTES;
/// Of all fields but the path, and of what stands between them.
constexpr std::size_t longestFrame =
    instanceLength + targetLength + nonceLength + macLength + checkLength + 6;

/// The fields of a token, all of them views into its text.
struct Fields {
    std::string_view instance;
    std::string_view target;
    std::string_view nonce;
    std::string_view mac;
    std::string_view check;
    std::string_view path;
};

/// Takes `length` characters and the ";" after them off the front; false when they are not there.
bool take(std::string_view& text, std::size_t length, std::string_view& field)
{
    if (text.size() <= length || text[length] != ';') {
        return false;
    }
    field = text.substr(0, length);
    text.remove_prefix(length + 1);
    return true;
}

std::optional<Fields> fieldsOf(std::string_view token)
{
    Fields fields;
    if (token.size() > 8192 || !token.starts_with(heading)) {
        return std::nullopt;
    }
    token.remove_prefix(heading.size());
    if (!take(token, instanceLength, fields.instance) || !take(token, targetLength, fields.target) ||
        !take(token, nonceLength, fields.nonce) || !take(token, macLength, fields.mac) ||
        !take(token, checkLength, fields.check)) {
        return std::nullopt;
    }
    fields.path = token;
    return fields;
}

/// What the MAC covers, with room for the MAC, since the check covers that too.
std::string covered(const Fields& fields)
{
    std::string text;
    text.reserve(heading.size() + longestFrame + fields.path.size());
    text = heading;
    for (const auto field : {fields.instance, fields.target, fields.nonce, fields.path}) {
        text.append(field).push_back(';');
    }
    return text;
}

const unsigned char* bytesOf(std::string_view text)
{
    return reinterpret_cast<const unsigned char*>(text.data());
}

std::string macOf(std::string_view text, const std::array<std::uint8_t, 32>& key)
{
    std::array<std::uint8_t, crypto_generichash_BYTES> mac;
    crypto_generichash(mac.data(), mac.size(), bytesOf(text), text.size(), key.data(), key.size());
    return hexOf(mac);
}

std::string checkOf(std::string_view text)
{
    constexpr std::array<std::uint8_t, crypto_shorthash_KEYBYTES> noKey{};
    std::array<std::uint8_t, checkLength / 2> digest;
    crypto_shorthash(digest.data(), bytesOf(text), text.size(), noKey.data());
    return hexOf(digest);
}

std::string targetHex(const AuditToken& token)
{
    std::array<std::uint8_t, sizeof token> bytes;
    std::memcpy(bytes.data(), &token, sizeof token);
    return hexOf(bytes);
}

std::string randomHex(std::size_t length)
{
    Bytes bytes(length / 2);
    randombytes_buf(bytes.data(), bytes.size());
    return hexOf(bytes);
}

bool isEqual(std::string_view one, std::string_view other)
{
    return one.size() == other.size() && sodium_memcmp(one.data(), other.data(), one.size()) == 0;
}

}  // namespace

ExtensionTokens::ExtensionTokens()
{
    if (sodium_init() < 0) {
        std::abort();
    }
    crypto_generichash_keygen(key_.data());
    instance_ = randomHex(instanceLength);
}

ExtensionTokens::~ExtensionTokens()
{
    sodium_memzero(key_.data(), key_.size());
}

std::optional<std::string> ExtensionTokens::issue(const AuditToken& target, std::string_view path) const
{
    if (!isGrantable(path)) {
        return std::nullopt;
    }
    const auto targetText = targetHex(target);
    const auto nonce = randomHex(nonceLength);
    Fields fields{instance_, targetText, nonce, {}, {}, path};
    auto rest = covered(fields);
    const auto mac = macOf(rest, key_);
    fields.mac = mac;
    std::string text;
    text.reserve(heading.size() + longestFrame + path.size());
    text = heading;
    for (const auto field : {fields.instance, fields.target, fields.nonce, fields.mac}) {
        text.append(field).push_back(';');
    }
    return text.append(checkOf(rest.append(mac))).append(";").append(path);
}

ExtensionTokens::Verdict ExtensionTokens::check(std::string_view token, const AuditToken& bearer,
                                                std::string_view path) const
{
    const auto fields = fieldsOf(token);
    if (!fields) {
        return Verdict::refused;
    }
    auto text = covered(*fields);
    const auto length = text.size();
    if (fields->check != checkOf(text.append(fields->mac))) {
        return Verdict::refused;
    }
    if (fields->instance != instance_) {
        return Verdict::expired;
    }
    const bool isOurs = isEqual(fields->mac, macOf(std::string_view(text).substr(0, length), key_));
    return isOurs && fields->target == targetHex(bearer) && isPlainPath(path) && covers(fields->path, path)
               ? Verdict::granted
               : Verdict::refused;
}

}  // namespace typhon
