#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/signing.h"
#include "platform/linux/unicode.h"

#include <algorithm>
#include <string_view>

// What a trusted key may sign, and the file that says so. A file with a member that is not known here is
// refused as a whole: it might be a restriction.

namespace typhon {

namespace {

constexpr const char* trustedType = "typhon trusted key";
constexpr std::string_view platformPrefix = "com.vorlan.";
constexpr PropertyListLimits trustedKeyLimits{.bytes = 64 * 1024, .depth = 3, .values = 1024};

/// A null `member` is absent; false when it is there and is not an array of strings.
bool readStrings(const PropertyList* member, std::optional<std::vector<std::string>>& strings)
{
    if (member == nullptr) {
        return true;
    }
    const auto* array = member->asArray();
    if (array == nullptr ||
        std::ranges::any_of(*array, [](const auto& element) { return element.asString() == nullptr; })) {
        return false;
    }
    strings = stringsOf(*member);
    return true;
}

bool isKnownMember(std::string_view name)
{
    return name == "type" || name == "key" || name == "platform" || name == "identifiers" ||
           name == "entitlements";
}

}  // namespace

bool isValidSigningIdentifier(std::string_view text)
{
    if (text.empty() || text.size() > 255) {
        return false;
    }
    while (!text.empty()) {
        const auto character = firstCharacter(text);
        const auto value = character.value.value_or(0);
        if (value < 0x20 || (value >= 0x7F && value < 0xA0)) {
            return false;
        }
        text.remove_prefix(character.length);
    }
    return true;
}

bool KeyScope::admits(const CodeStatement& statement) const
{
    const std::string_view identifier = statement.identifier;
    const bool isPlatform = identifier.starts_with(platformPrefix);
    const auto covers = [&](const std::string& prefix) {
        return identifier.starts_with(prefix) &&
               (!isPlatform || platform || prefix.starts_with(platformPrefix));
    };
    const bool hasIdentifier =
        identifiers ? std::ranges::any_of(*identifiers, covers) : (platform || !isPlatform);
    const auto isAllowed = [&](const auto& entitlement) {
        return !entitlements || std::ranges::find(*entitlements, entitlement.first) != entitlements->end();
    };
    return hasIdentifier && std::ranges::all_of(statement.entitlements, isAllowed);
}

std::string encodeTrustedKey(const TrustedKey& key)
{
    PropertyList::Dictionary file{{"type", trustedType},
                                  {"key", Data{{key.key.bytes.begin(), key.key.bytes.end()}}}};
    if (key.scope.platform) {
        file.emplace("platform", true);
    }
    if (key.scope.identifiers) {
        file.emplace("identifiers", arrayOfStrings(*key.scope.identifiers));
    }
    if (key.scope.entitlements) {
        file.emplace("entitlements", arrayOfStrings(*key.scope.entitlements));
    }
    return writeXmlPropertyList(std::move(file));
}

Result<TrustedKey> decodeTrustedKey(std::span<const std::uint8_t> bytes)
{
    const auto reading = readPropertyList(bytes, trustedKeyLimits);
    if (!reading.value) {
        return {std::nullopt, reading.error};
    }
    const auto& file = *reading.value;
    const auto* members = file.asDictionary();
    const auto* type = file.find("type");
    const auto* key = file.find("key");
    const auto* data = key != nullptr ? key->asData() : nullptr;
    if (members == nullptr || type == nullptr || *type != PropertyList(trustedType) || data == nullptr ||
        data->bytes.size() != sizeof(PublicKey::bytes)) {
        return {std::nullopt, "it is not a typhon trusted key"};
    }
    TrustedKey result;
    std::ranges::copy(data->bytes, result.key.bytes.begin());
    const auto* platform = file.find("platform");
    if (!std::ranges::all_of(*members, [](const auto& member) { return isKnownMember(member.first); }) ||
        (platform != nullptr && platform->asBoolean() == nullptr) ||
        !readStrings(file.find("identifiers"), result.scope.identifiers) ||
        !readStrings(file.find("entitlements"), result.scope.entitlements)) {
        return {std::nullopt, "its scope cannot be understood"};
    }
    result.scope.platform = platform != nullptr && platform->isTrue();
    return {std::move(result), {}};
}

}  // namespace typhon
