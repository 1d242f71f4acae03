#include "platform/linux/carried_text.h"

#include "platform/linux/unicode.h"

#include <algorithm>
#include <iterator>

namespace typhon {
namespace {

bool isXmlCharacter(char32_t character)
{
    if (character < 0x20)
        return character == '\t' || character == '\n' || character == '\r';
    return character != 0xFFFE && character != 0xFFFF;
}

bool isCarriedCharacter(const Utf8Character& character, CarriedText carried)
{
    return character.value && (carried == CarriedText::unicode || isXmlCharacter(*character.value));
}

}  // namespace

bool isCarried(std::string_view text, CarriedText carried)
{
    if (carried == CarriedText::unicode)
        return isUtf8(text);
    while (!text.empty()) {
        const auto character = firstCharacter(text);
        if (!isCarriedCharacter(character, carried))
            return false;
        text.remove_prefix(character.length);
    }
    return true;
}

std::string replacingUncarried(std::string_view text, CarriedText carried)
{
    std::string replaced;
    while (!text.empty()) {
        const auto character = firstCharacter(text);
        if (isCarriedCharacter(character, carried))
            replaced += text.substr(0, character.length);
        else
            appendUtf8(replaced, replacementCharacter);
        text.remove_prefix(character.length);
    }
    return replaced;
}

const PropertyList::Dictionary& CarriedKeys::operator()(const PropertyList::Dictionary& dictionary)
{
    const auto isFit = [this](const auto& entry) { return isCarried(entry.first, carried_); };
    if (std::all_of(dictionary.begin(), dictionary.end(), isFit))
        return dictionary;
    auto& copy = copies_.emplace_back();
    std::copy_if(dictionary.begin(), dictionary.end(), std::inserter(copy, copy.end()), isFit);
    for (const auto& [key, value] : dictionary)
        copy.try_emplace(replacingUncarried(key, carried_), value);
    return copy;
}

}  // namespace typhon
