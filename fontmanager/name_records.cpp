#include "fontmanager/name_records.h"

#include "platform/linux/unicode.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <span>
#include <utility>

#include <ft2build.h>

#include FT_FREETYPE_H
#include FT_SFNT_NAMES_H
#include FT_TRUETYPE_IDS_H

// FreeType's own family name is ASCII with question marks in place of the rest, so the name table is read
// here. It holds each name many times, by platform, encoding and language; the best record decides.

namespace typhon {

namespace {

constexpr FT_UInt mostNameRecords = 4096;

/// The Macintosh encodings differ beyond ASCII; only what they share is taken.
std::optional<std::string> fromAscii(std::span<const FT_Byte> bytes)
{
    if (!std::ranges::all_of(bytes, [](FT_Byte byte) { return byte >= 0x20 && byte < 0x7F; })) {
        return std::nullopt;
    }
    return std::string(bytes.begin(), bytes.end());
}

bool isWindowsUnicode(const FT_SfntName& record)
{
    return record.platform_id == TT_PLATFORM_MICROSOFT &&
           (record.encoding_id == TT_MS_ID_UNICODE_CS || record.encoding_id == TT_MS_ID_UCS_4);
}

std::optional<std::string> textOf(const FT_SfntName& record)
{
    const std::span bytes(record.string, record.string_len);
    if (isWindowsUnicode(record) || record.platform_id == TT_PLATFORM_APPLE_UNICODE) {
        return utf8FromUtf16BigEndian(bytes);
    }
    const bool isRoman = record.platform_id == TT_PLATFORM_MACINTOSH && record.encoding_id == TT_MAC_ID_ROMAN;
    return isRoman ? fromAscii(bytes) : std::nullopt;
}

/// How much a record is wanted among those of one name; larger is better.
int preference(const FT_SfntName& record)
{
    constexpr unsigned primaryLanguage = 0x3FF;
    constexpr unsigned english = 0x09;
    if (isWindowsUnicode(record)) {
        if (record.language_id == TT_MS_LANGID_ENGLISH_UNITED_STATES) {
            return 5;
        }
        return (record.language_id & primaryLanguage) == english ? 4 : 1;
    }
    if (record.platform_id == TT_PLATFORM_APPLE_UNICODE) {
        return 2;
    }
    return record.platform_id == TT_PLATFORM_MACINTOSH && record.language_id == TT_MAC_LANGID_ENGLISH ? 3 : 0;
}

std::optional<std::string> nameOf(FT_Face face, FT_UShort nameIdentifier, std::size_t limit)
{
    std::optional<std::string> best;
    int bestPreference = -1;
    const FT_UInt count = std::min(FT_Get_Sfnt_Name_Count(face), mostNameRecords);
    for (FT_UInt index = 0; index < count; ++index) {
        FT_SfntName record{};
        if (FT_Get_Sfnt_Name(face, index, &record) != 0 || record.name_id != nameIdentifier ||
            preference(record) <= bestPreference) {
            continue;
        }
        auto text = textOf(record);
        if (text && isUsableFamilyName(*text, limit)) {
            best = std::move(text);
            bestPreference = preference(record);
        }
    }
    return best;
}

}  // namespace

bool isUsablePostScriptName(const std::string& name, std::size_t limit)
{
    return !name.empty() && name.size() <= limit &&
           std::ranges::all_of(name, [](char c) { return c > 0x20 && c < 0x7F; });
}

bool isUsableFamilyName(const std::string& name, std::size_t limit)
{
    return !name.empty() && name.size() <= limit && name == visibleText(name);
}

std::optional<std::string> postScriptNameOf(FT_FaceRec_* face, std::size_t limit)
{
    const char* name = FT_Get_Postscript_Name(face);
    if (name == nullptr) {
        return std::nullopt;
    }
    const std::string text(name);
    return isUsablePostScriptName(text, limit) ? std::optional(text) : std::nullopt;
}

std::optional<std::string> familyNameOf(FT_FaceRec_* face, std::size_t limit)
{
    auto name = nameOf(face, TT_NAME_ID_TYPOGRAPHIC_FAMILY, limit);
    return name ? name : nameOf(face, TT_NAME_ID_FONT_FAMILY, limit);
}

}  // namespace typhon
