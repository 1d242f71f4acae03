#include "fontmanager/font_answer.h"

#include "fontmanager/name_records.h"
#include "platform/linux/binary_property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/visible_text.h"
#include "platform/property_list.h"

#include <utility>

// An answer is a binary property list: {"Names": {PostScript name: family name}} or {"Error": text}. Whoever
// takes over a reader can answer what he likes, but nothing that an ordinary font could not have said as
// well.

namespace typhon {

namespace {

constexpr const char* namesKey = "Names";
constexpr const char* errorKey = "Error";
constexpr std::size_t longestError = 400;

FontNamesReading failure(std::string error)
{
    return {.familyNames = std::nullopt, .error = std::move(error)};
}

FontNamesReading nonsense()
{
    return failure("the font reader gave an answer that makes no sense");
}

FontNamesReading acceptedNames(const PropertyList::Dictionary& names, const FontLimits& limits)
{
    if (names.empty() || names.size() > static_cast<std::size_t>(limits.faces)) {
        return nonsense();
    }
    std::map<std::string, std::string> accepted;
    for (const auto& [postScript, value] : names) {
        const auto* family = value.asString();
        if (family == nullptr || !isUsablePostScriptName(postScript, limits.nameBytes) ||
            !isUsableFamilyName(*family, limits.nameBytes)) {
            return nonsense();
        }
        accepted.emplace(postScript, *family);
    }
    return {.familyNames = std::move(accepted), .error = {}};
}

}  // namespace

std::vector<std::uint8_t> encodeFontAnswer(const FontNamesReading& reading)
{
    PropertyList::Dictionary answer;
    if (reading.familyNames) {
        answer.emplace(namesKey,
                       PropertyList::Dictionary(reading.familyNames->begin(), reading.familyNames->end()));
    } else {
        answer.emplace(errorKey, reading.error);
    }
    return writeBinaryPropertyList(answer);
}

FontNamesReading decodeFontAnswer(std::span<const std::uint8_t> answer, const FontLimits& limits)
{
    const PropertyListLimits cost{.bytes = largestFontAnswer(limits),
                                  .depth = 2,
                                  .values = 2 * static_cast<std::size_t>(limits.faces) + 3};
    const auto reading = readBinaryPropertyList(answer, cost);
    const auto* answered = reading.value ? reading.value->asDictionary() : nullptr;
    if (answered == nullptr || answered->size() != 1) {
        return nonsense();
    }
    const auto& [key, value] = *answered->begin();
    if (const auto* names = value.asDictionary(); names != nullptr && key == namesKey) {
        return acceptedNames(*names, limits);
    }
    const auto* error = key == errorKey ? value.asString() : nullptr;
    return error == nullptr || error->empty() ? nonsense() : failure(visibleText(*error, longestError));
}

std::size_t largestFontAnswer(const FontLimits& limits)
{
    // Two names a face, in UTF-16 at most twice as long as in UTF-8, and what the form adds.
    constexpr std::size_t overhead = 64;
    return static_cast<std::size_t>(limits.faces) * (2 * 2 * limits.nameBytes + overhead) + 4096;
}

}  // namespace typhon
