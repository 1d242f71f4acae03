#pragma once

#include "platform/linux/root_directory.h"
#include "platform/property_list.h"

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {

/// Something read or made from outside data, or why there is none.
template <class T>
struct Result {
    std::optional<T> value;
    /// Set exactly when `value` is null; for people.
    std::string error;
};

using Bytes = std::vector<std::uint8_t>;
using Sha256 = std::array<std::uint8_t, 32>;

/// The SHA-256 of a regular file, streamed from its start; null on a read error. Does not move the offset.
std::optional<Sha256> sha256OfFile(int descriptor);
std::string hexOf(std::span<const std::uint8_t> bytes);

/// An Ed25519 public key.
struct PublicKey {
    std::array<std::uint8_t, 32> bytes{};
    auto operator<=>(const PublicKey&) const = default;  // NOLINT(modernize-use-nullptr): misread
};

/// An Ed25519 secret key with its public one. Wiped when destroyed.
struct SigningKey {
    PublicKey publicKey;
    std::array<std::uint8_t, 64> secret{};

    SigningKey() = default;
    SigningKey(const SigningKey&) = default;
    SigningKey& operator=(const SigningKey&) = default;
    ~SigningKey();
};

SigningKey generateSigningKey();

/// Key files are XML property lists. Reading one accepts nothing else.
std::string encodeSigningKey(const SigningKey& key);
Result<SigningKey> decodeSigningKey(std::span<const std::uint8_t> bytes);
std::string encodePublicKey(const PublicKey& key);
Result<PublicKey> decodePublicKey(std::span<const std::uint8_t> bytes);

/// Writes a new pair: the secret to `path` (mode 0600), the public key to `path` + ".pub". Refuses to
/// replace a file. Null on success, else what went wrong.
std::optional<std::string> writeKeyFiles(const std::string& path, const SigningKey& key);
Result<SigningKey> readSigningKeyFile(const std::string& path);
Result<PublicKey> readPublicKeyFile(const std::string& path);

/// What a code signature states about an executable.
struct CodeStatement {
    std::string identifier;
    PropertyList::Dictionary entitlements;
    Sha256 executable{};
};

/// What a trusted key may sign. With nothing set: every identifier outside "com.vorlan.", with any
/// entitlement.
struct KeyScope {
    /// Every identifier, those within "com.vorlan." included.
    bool platform = false;
    /// Only identifiers that begin with one of these. One within "com.vorlan." counts only when the prefix
    /// itself begins with "com.vorlan." or the key is a platform key.
    std::optional<std::vector<std::string>> identifiers;
    /// Only these entitlement keys.
    std::optional<std::vector<std::string>> entitlements;

    /// False when the identifier or any one entitlement is outside the scope.
    bool admits(const CodeStatement& statement) const;
};

struct TrustedKey {
    PublicKey key;
    KeyScope scope;
};

std::string encodeTrustedKey(const TrustedKey& key);
Result<TrustedKey> decodeTrustedKey(std::span<const std::uint8_t> bytes);

/// A valid signing identifier: 1 to 255 bytes of UTF-8 without control characters.
bool isValidSigningIdentifier(std::string_view identifier);

/// The contents of a signature file for `statement`. Fails when the identifier is not valid or the
/// entitlements are too large or too deep.
Result<Bytes> makeSignature(const SigningKey& key, const CodeStatement& statement);

/// Where signatures and trusted keys lie; logical paths.
inline constexpr const char* signaturesDirectory = "/var/lib/typhon/signatures";
inline constexpr const char* trustedKeysDirectory = "/etc/typhon/trusted-keys.d";

/// Makes and stores a signature, replacing an earlier one for the same contents; creates the directory. Gives
/// the logical path of the file.
Result<std::string> writeSignature(const RootDirectory& root, const SigningKey& key,
                                   const CodeStatement& statement);
/// Stores a key as trusted, replacing an earlier scope of the same key; creates the directory. Gives the
/// logical path of the file.
Result<std::string> writeTrustedKey(const RootDirectory& root, const TrustedKey& key);

}  // namespace typhon
