#include "platform/linux/code_signature.h"

#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <algorithm>
#include <string_view>

#include <sodium.h>

// A signature file carries the signed bytes themselves, so that nothing depends on encoding a statement the
// same way twice, and so that what is parsed is exactly what was signed. The key signs them behind a text
// that no other use of the key begins with.

namespace typhon {

namespace {

using namespace std::string_view_literals;

// With a zero byte at its end.
constexpr auto domain = "com.vorlan.typhond code signature 1\0"sv;
constexpr const char* signatureType = "typhon code signature";
constexpr PropertyListLimits fileLimits{.bytes = signatureFileLimit, .depth = 2, .values = 16};
constexpr PropertyListLimits statementLimits{.bytes = 256 * 1024, .depth = 16, .values = 8192};

Bytes signedBytes(std::span<const std::uint8_t> statement)
{
    Bytes bytes(domain.size() + statement.size());
    const auto end = std::copy(domain.begin(), domain.end(), bytes.begin());
    std::copy(statement.begin(), statement.end(), end);
    return bytes;
}

/// The data of exactly that length under `name`, or null.
const Bytes* dataMember(const PropertyList& dictionary, std::string_view name, std::size_t length)
{
    const auto* member = dictionary.find(name);
    const auto* data = member != nullptr ? member->asData() : nullptr;
    return data != nullptr && data->bytes.size() == length ? &data->bytes : nullptr;
}

Result<CodeStatement> decodeStatement(std::span<const std::uint8_t> bytes)
{
    const auto reading = readPropertyList(bytes, statementLimits);
    if (!reading.value) {
        return {std::nullopt, reading.error};
    }
    const auto* members = reading.value->asDictionary();
    const auto* identifier = reading.value->find("identifier");
    const auto* entitlements = reading.value->find("entitlements");
    const auto* executable = dataMember(*reading.value, "sha256", sizeof(Sha256));
    if (members == nullptr || members->size() != 3 || identifier == nullptr || entitlements == nullptr ||
        identifier->asString() == nullptr || entitlements->asDictionary() == nullptr ||
        executable == nullptr) {
        return {std::nullopt, "its statement is malformed"};
    }
    if (!isValidSigningIdentifier(*identifier->asString())) {
        return {std::nullopt, "its identifier is not valid"};
    }
    CodeStatement statement{*identifier->asString(), *entitlements->asDictionary(), {}};
    std::ranges::copy(*executable, statement.executable.begin());
    return {std::move(statement), {}};
}

}  // namespace

Result<Bytes> makeSignature(const SigningKey& key, const CodeStatement& statement)
{
    const auto encoded = writeBinaryPropertyList(PropertyList::Dictionary{
        {"entitlements", statement.entitlements},
        {"identifier", statement.identifier},
        {"sha256", Data{{statement.executable.begin(), statement.executable.end()}}}});
    if (auto readable = decodeStatement(encoded); !readable.value) {
        return {std::nullopt, readable.error};
    }
    const auto bytes = signedBytes(encoded);
    Data signature{Bytes(crypto_sign_BYTES)};
    crypto_sign_detached(signature.bytes.data(), nullptr, bytes.data(), bytes.size(), key.secret.data());
    const PropertyList file(
        PropertyList::Dictionary{{"key", Data{{key.publicKey.bytes.begin(), key.publicKey.bytes.end()}}},
                                 {"signature", std::move(signature)},
                                 {"statement", Data{encoded}},
                                 {"type", signatureType}});
    return {writeBinaryPropertyList(file), {}};
}

Result<CodeSignature> decodeSignature(std::span<const std::uint8_t> bytes)
{
    const auto reading = readPropertyList(bytes, fileLimits);
    if (!reading.value) {
        return {std::nullopt, reading.error};
    }
    const auto& file = *reading.value;
    const auto* members = file.asDictionary();
    const auto* type = file.find("type");
    const auto* key = dataMember(file, "key", sizeof(PublicKey::bytes));
    const auto* signature = dataMember(file, "signature", sizeof(CodeSignature::signature));
    const auto* statement = file.find("statement");
    if (members == nullptr || members->size() != 4 || type == nullptr ||
        *type != PropertyList(signatureType) || key == nullptr || signature == nullptr ||
        statement == nullptr || statement->asData() == nullptr) {
        return {std::nullopt, "it is not a typhon code signature"};
    }
    CodeSignature result;
    std::ranges::copy(*key, result.key.bytes.begin());
    std::ranges::copy(*signature, result.signature.begin());
    result.statement = statement->asData()->bytes;
    return {std::move(result), {}};
}

Result<CodeStatement> verifiedStatement(const CodeSignature& signature)
{
    const auto bytes = signedBytes(signature.statement);
    if (crypto_sign_verify_detached(signature.signature.data(), bytes.data(), bytes.size(),
                                    signature.key.bytes.data()) != 0) {
        return {std::nullopt, "it was not made by the key it names"};
    }
    return decodeStatement(signature.statement);
}

}  // namespace typhon
