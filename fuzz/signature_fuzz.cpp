// Any bytes as each of the files that signing reads, and as a statement that a key has really signed.

#include "platform/linux/code_signature.h"
#include "platform/linux/signing.h"
#include "require.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

#include <sodium.h>

namespace typhon {
namespace {

void checkFiles(std::span<const std::uint8_t> bytes)
{
    const auto signature = decodeSignature(bytes);
    require(signature.value.has_value() == signature.error.empty(), "a signature or an error");
    if (signature.value) {
        const auto statement = verifiedStatement(*signature.value);
        require(statement.value.has_value() == statement.error.empty(), "a statement or an error");
    }
    if (const auto key = decodeTrustedKey(bytes); key.value) {
        const auto text = encodeTrustedKey(*key.value);
        const auto again =
            decodeTrustedKey({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
        require(again.value && again.value->key == key.value->key, "a trusted key survives its file");
        require(again.value->scope.platform == key.value->scope.platform, "its scope survives too");
    }
    decodePublicKey(bytes);
    decodeSigningKey(bytes);
}

void checkStatement(std::span<const std::uint8_t> bytes)
{
    static const SigningKey key = generateSigningKey();
    constexpr std::string_view domain{"com.vorlan.typhond code signature 1", 36};
    Bytes text(domain.begin(), domain.end());
    text.insert(text.end(), bytes.begin(), bytes.end());
    CodeSignature signature{key.publicKey, {}, {bytes.begin(), bytes.end()}};
    crypto_sign_detached(signature.signature.data(), nullptr, text.data(), text.size(), key.secret.data());
    const auto statement = verifiedStatement(signature);
    require(statement.value.has_value() == statement.error.empty(), "a statement or an error");
    if (!statement.value) {
        return;
    }
    require(isValidSigningIdentifier(statement.value->identifier), "an identifier is text of limited length");
    const auto file = makeSignature(key, *statement.value);
    require(file.value.has_value(), "what was read can be signed");
    const auto again = verifiedStatement(*decodeSignature(*file.value).value);
    require(again.value && again.value->identifier == statement.value->identifier &&
                again.value->entitlements == statement.value->entitlements,
            "a statement survives its file");
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::checkFiles({data, size});
    typhon::checkStatement({data, size});
    return 0;
}
