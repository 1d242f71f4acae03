#include "platform/linux/asset_catalogue.h"

#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/visible_text.h"

#include <algorithm>

#include <sodium.h>

// Like the signature of a program, a catalogue file carries the signed bytes themselves, and the key signs
// them behind a text that no other use of the key begins with.

namespace typhon {

namespace {

using namespace std::string_view_literals;

// With a zero byte at its end.
constexpr auto domain = "com.vorlan.typhond asset catalogue 1\0"sv;
constexpr const char* catalogueType = "typhon asset catalogue";
constexpr PropertyListLimits fileLimits{.bytes = catalogueFileLimit, .depth = 2, .values = 16};
constexpr PropertyListLimits statementLimits{.bytes = catalogueFileLimit, .depth = 16, .values = 4 << 20};

Bytes signedBytes(std::span<const std::uint8_t> statement)
{
    Bytes bytes(domain.size() + statement.size());
    const auto behindDomain = std::ranges::copy(domain, bytes.begin()).out;
    std::ranges::copy(statement, behindDomain);
    return bytes;
}

Data dataOf(std::span<const std::uint8_t> bytes)
{
    return {Bytes(bytes.begin(), bytes.end())};
}

const Bytes* dataMember(const PropertyList& dictionary, std::string_view name)
{
    const auto* member = dictionary.find(name);
    const auto* data = member != nullptr ? member->asData() : nullptr;
    return data != nullptr ? &data->bytes : nullptr;
}

PropertyList encoded(const ListedAsset& asset)
{
    PropertyList::Dictionary files;
    for (const auto& [name, digest] : asset.files) {
        files.emplace(name, dataOf(digest));
    }
    return PropertyList::Dictionary{{"attributes", asset.attributes}, {"files", std::move(files)}};
}

PropertyList encoded(const AssetCatalogue& catalogue)
{
    PropertyList::Dictionary assets;
    for (const auto& [assetId, asset] : catalogue.assets) {
        assets.emplace(assetId, encoded(asset));
    }
    return PropertyList::Dictionary{
        {"assetType", catalogue.assetType}, {"assets", std::move(assets)}, {"version", catalogue.version}};
}

std::optional<ListedAsset> decodeAsset(const PropertyList& value)
{
    const auto* attributes = value.find("attributes");
    const auto* files = value.find("files");
    if (attributes == nullptr || attributes->asDictionary() == nullptr || files == nullptr ||
        files->asDictionary() == nullptr) {
        return std::nullopt;
    }
    ListedAsset asset{*attributes->asDictionary(), {}};
    for (const auto& [name, digest] : *files->asDictionary()) {
        const auto* data = digest.asData();
        if (!isValidAssetId(name) || data == nullptr || data->bytes.size() != sizeof(Sha256)) {
            return std::nullopt;
        }
        std::ranges::copy(data->bytes, asset.files[name].begin());
    }
    return asset;
}

Result<AssetCatalogue> decodeStatement(std::span<const std::uint8_t> bytes)
{
    const auto reading = readPropertyList(bytes, statementLimits);
    if (!reading.value) {
        return {std::nullopt, reading.error};
    }
    const auto* type = reading.value->find("assetType");
    const auto* version = reading.value->find("version");
    const auto* assets = reading.value->find("assets");
    if (type == nullptr || type->asString() == nullptr || !isValidAssetId(*type->asString()) ||
        version == nullptr || version->asInteger() == nullptr || assets == nullptr ||
        assets->asDictionary() == nullptr) {
        return {std::nullopt, "its statement is malformed"};
    }
    AssetCatalogue catalogue{*type->asString(), *version->asInteger(), {}};
    for (const auto& [assetId, value] : *assets->asDictionary()) {
        auto asset = decodeAsset(value);
        if (!isValidAssetId(assetId) || !asset) {
            return {std::nullopt, "its asset \"" + visibleText(assetId, 300) + "\" is malformed"};
        }
        catalogue.assets.emplace(assetId, *std::move(asset));
    }
    return {std::move(catalogue), {}};
}

bool mayBeSigned(const std::vector<TrustedKey>& keys, const Bytes& key, const std::string& assetType)
{
    return std::ranges::any_of(keys, [&](const TrustedKey& trusted) {
        const auto& types = trusted.scope.identifiers;
        return std::ranges::equal(trusted.key.bytes, key) &&
               (!types || std::ranges::any_of(*types, [&](const std::string& prefix) {
                   return assetType.starts_with(prefix);
               }));
    });
}

}  // namespace

bool isValidAssetId(std::string_view assetId)
{
    return !assetId.empty() && assetId.size() <= 255 && assetId.front() != '.' &&
           assetId.find('/') == std::string_view::npos && visibleText(assetId) == assetId;
}

Result<Bytes> makeCatalogue(const SigningKey& key, const AssetCatalogue& catalogue)
{
    const auto statement = writeBinaryPropertyList(encoded(catalogue));
    if (auto readable = decodeStatement(statement); !readable.value) {
        return {std::nullopt, readable.error};
    }
    const auto bytes = signedBytes(statement);
    Data signature{Bytes(crypto_sign_BYTES)};
    crypto_sign_detached(signature.bytes.data(), nullptr, bytes.data(), bytes.size(), key.secret.data());
    return {writeBinaryPropertyList(PropertyList::Dictionary{{"key", dataOf(key.publicKey.bytes)},
                                                             {"signature", std::move(signature)},
                                                             {"statement", dataOf(statement)},
                                                             {"type", catalogueType}}),
            {}};
}

Result<AssetCatalogue> decodeCatalogue(std::span<const std::uint8_t> bytes,
                                       const std::vector<TrustedKey>& keys)
{
    const auto reading = readPropertyList(bytes, fileLimits);
    if (!reading.value) {
        return {std::nullopt, reading.error};
    }
    const auto* type = reading.value->find("type");
    const auto* key = dataMember(*reading.value, "key");
    const auto* signature = dataMember(*reading.value, "signature");
    const auto* statement = dataMember(*reading.value, "statement");
    if (type == nullptr || *type != PropertyList(catalogueType) || key == nullptr || signature == nullptr ||
        statement == nullptr || key->size() != sizeof(PublicKey::bytes) ||
        signature->size() != crypto_sign_BYTES) {
        return {std::nullopt, "it is not an asset catalogue"};
    }
    const auto signedPart = signedBytes(*statement);
    if (crypto_sign_verify_detached(signature->data(), signedPart.data(), signedPart.size(), key->data()) !=
        0) {
        return {std::nullopt, "it was not signed by the key it names"};
    }
    auto catalogue = decodeStatement(*statement);
    if (catalogue.value && !mayBeSigned(keys, *key, catalogue.value->assetType)) {
        return {std::nullopt, "its key is not trusted to sign it"};
    }
    return catalogue;
}

}  // namespace typhon
