#pragma once

#include "platform/linux/signing.h"

#include <array>
#include <cstdint>
#include <span>

namespace typhon {

/// A signature file as it lies on disk: signed bytes that nobody has believed yet.
struct CodeSignature {
    PublicKey key;
    std::array<std::uint8_t, 64> signature{};
    Bytes statement;
};

/// The largest signature file that is read.
inline constexpr std::size_t signatureFileLimit = 512 * 1024;

Result<CodeSignature> decodeSignature(std::span<const std::uint8_t> bytes);

/// What the signature states, if its own key made it. Whether that key is trusted, for this identifier and
/// for these entitlements, is another question.
Result<CodeStatement> verifiedStatement(const CodeSignature& signature);

}  // namespace typhon
