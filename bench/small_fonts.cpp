#include "small_fonts.h"

#include "fontmanager/test_tables.h"
#include "sample_registry.h"

namespace typhon::bench {

namespace {

using test_fonts::written16;
using test_fonts::written32;

constexpr unsigned long firstCharacter = 0x20;
constexpr unsigned long lastCharacter = 0x7e;
/// Glyph 0 stands for whatever is missing.
constexpr unsigned long glyphs = lastCharacter - firstCharacter + 2;

/// The characters in one segment, and the one that ends every such table.
std::string characterMap()
{
    constexpr unsigned long segments = 2;
    const auto body = written16(2 * segments) + written16(4) + written16(1) + written16(0) +
                      written16(lastCharacter) + written16(0xffff) + written16(0) +
                      written16(firstCharacter) + written16(0xffff) + written16(1 - firstCharacter) +
                      written16(1) + written16(0) + written16(0);
    const auto table = written16(4) + written16(6 + body.size()) + written16(0) + body;
    return written16(0) + written16(1) + written16(3) + written16(1) + written32(12) + table;
}

/// The tables of a real font, with hardly a glyph in them.
test_fonts::Tables smallTables()
{
    const auto real = test_fonts::tablesOf(test_fonts::contentsOf(test_fonts::sans));
    test_fonts::Tables tables;
    for (const char* kept : {"OS/2", "head", "hhea", "maxp"}) {
        tables[kept] = real.at(kept);
    }
    tables["maxp"].replace(4, 2, written16(glyphs));
    constexpr std::size_t metricsCount = 34;
    tables["hhea"].replace(metricsCount, 2, written16(1));
    constexpr std::size_t offsetFormat = 50;
    tables["head"].replace(offsetFormat, 2, written16(0));
    tables["hmtx"] = written16(1'000) + std::string(2 * glyphs, '\0');
    tables["loca"] = std::string(2 * (glyphs + 1), '\0');
    tables["glyf"] = std::string(4, '\0');
    tables["cmap"] = characterMap();
    // Without names of glyphs.
    tables["post"] = written32(0x00030000) + std::string(28, '\0');
    return tables;
}

}  // namespace

std::string smallFont(int index)
{
    static const auto shared = smallTables();
    auto tables = shared;
    tables["name"] = test_fonts::nameTable(samplePostScriptName(index), sampleFamilyName(index));
    return test_fonts::fontOf(tables);
}

}  // namespace typhon::bench
