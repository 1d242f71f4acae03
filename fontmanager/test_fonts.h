#pragma once

#include <array>
#include <cstddef>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string>
#include <vector>

// Real fonts for tests, from the Debian packages fonts-dejavu-core, fonts-liberation and fonts-wqy-microhei.

namespace typhon::test_fonts {

inline constexpr const char* sans = "/usr/share/fonts/truetype/dejavu/DejaVuSans.ttf";
inline constexpr const char* sansBold = "/usr/share/fonts/truetype/dejavu/DejaVuSans-Bold.ttf";
inline constexpr const char* serif = "/usr/share/fonts/truetype/liberation/LiberationSerif-Regular.ttf";
inline constexpr const char* collection = "/usr/share/fonts/truetype/wqy/wqy-microhei.ttc";

inline std::string contentsOf(const std::string& path)
{
    std::ifstream file(path, std::ios::binary);
    std::string contents{std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>()};
    if (contents.empty()) {
        throw std::runtime_error("the font " + path + " is missing; install its Debian package");
    }
    return contents;
}

inline unsigned long read32(const std::string& bytes, std::size_t at)
{
    unsigned long value = 0;
    for (std::size_t index = 0; index < 4; ++index) {
        value = value << 8 | static_cast<unsigned char>(bytes.at(at + index));
    }
    return value;
}

inline std::string written32(unsigned long value)
{
    return {static_cast<char>(value >> 24), static_cast<char>(value >> 16), static_cast<char>(value >> 8),
            static_cast<char>(value)};
}

/// A collection of whole fonts: a header with the offset of each, then the fonts one after another, in whose
/// table directories the offsets now count from the start of the collection.
inline std::string collectionOf(const std::vector<std::string>& fonts)
{
    std::string header = "ttcf" + written32(0x00010000) + written32(fonts.size());
    std::string bodies;
    const std::size_t bodiesStart = header.size() + 4 * fonts.size();
    for (std::string font : fonts) {
        const std::size_t start = bodiesStart + bodies.size();
        header += written32(start);
        const std::size_t tables = read32(font, 4) >> 16;
        for (std::size_t table = 0; table < tables; ++table) {
            const std::size_t offset = 12 + 16 * table + 8;
            font.replace(offset, 4, written32(read32(font, offset) + start));
        }
        font.resize((font.size() + 3) / 4 * 4);
        bodies += font;
    }
    return header + bodies;
}

}  // namespace typhon::test_fonts
