#include "fontmanager/font_parser.h"
#include "fontmanager/test_fonts.h"
#include "fontmanager/test_tables.h"
#include "platform/linux/file_descriptor.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <functional>
#include <iterator>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

// Real fonts, damaged in the ways that hurt readers of fonts. The seed is fixed, so a failure repeats.

namespace typhon {
namespace {

using Random = std::mt19937;

constexpr unsigned seed = 20240521;
constexpr int rounds = 120;

std::size_t below(Random& random, std::size_t limit)
{
    return std::uniform_int_distribution<std::size_t>(0, limit - 1)(random);
}

/// Numbers at which arithmetic goes wrong.
unsigned long awkwardNumber(Random& random)
{
    constexpr std::array<unsigned long, 10> numbers{0,        1,          0x7F,       0xFFFF,     0x10000,
                                                    0xFFFFFF, 0x7FFFFFFF, 0x80000000, 0xFFFFFFF0, 0xFFFFFFFF};
    return numbers.at(below(random, numbers.size()));
}

std::string withBytesChanged(std::string font, Random& random)
{
    for (std::size_t count = 1 + below(random, 20); count > 0; --count) {
        font.at(below(random, font.size())) = static_cast<char>(below(random, 256));
    }
    return font;
}

std::string truncated(std::string font, Random& random)
{
    font.resize(below(random, below(random, 2) == 0 ? 2000 : font.size()));
    return font;
}

std::string withDirectoryEdited(std::string font, Random& random)
{
    const std::size_t tables = test_fonts::read32(font, 4) >> 16;
    for (std::size_t count = 1 + below(random, 3); count > 0; --count) {
        const std::size_t entry = 12 + 16 * below(random, tables);
        font.replace(entry + 4 * below(random, 4), 4, test_fonts::written32(awkwardNumber(random)));
    }
    return font;
}

/// Damages a table that is read for the names.
std::string withTableDamaged(const std::string& font, Random& random)
{
    auto tables = test_fonts::tablesOf(font);
    constexpr std::array tags{"name", "head", "maxp", "cmap", "post", "OS/2", "hhea", "loca", "hmtx"};
    auto& table = tables[tags.at(below(random, tags.size()))];
    for (std::size_t count = 1 + below(random, 6); count > 0 && table.size() > 4; --count) {
        const std::size_t at = below(random, std::min<std::size_t>(table.size() - 4, 200));
        table.replace(at, 4, test_fonts::written32(awkwardNumber(random)));
    }
    return test_fonts::fontOf(tables);
}

/// Puts tables of another font in place of its own, under the same or another tag.
std::string withTablesOf(const std::string& font, const std::string& other, Random& random)
{
    auto tables = test_fonts::tablesOf(font);
    const auto others = test_fonts::tablesOf(other);
    for (std::size_t count = 1 + below(random, 3); count > 0; --count) {
        const auto& [tag, body] = *std::next(others.begin(), static_cast<long>(below(random, others.size())));
        const auto target = std::next(tables.begin(), static_cast<long>(below(random, tables.size())));
        tables[below(random, 3) == 0 ? target->first : tag] = body;
    }
    return test_fonts::fontOf(tables);
}

std::string damagedCollection(const std::string& font, Random& random)
{
    auto collection = test_fonts::collectionWithNames(font, {"One", "Two", "Three"});
    const std::size_t at = 4 * (1 + below(random, 60));
    return collection.replace(at, 4, test_fonts::written32(awkwardNumber(random)));
}

class FontMutationTest : public testing::Test {
protected:
    FontMutationTest()
    {
        for (const char* path :
             {test_fonts::sansBold, test_fonts::serif, "/usr/share/fonts/truetype/lato/Lato-Black.ttf"}) {
            fonts.push_back(test_fonts::contentsOf(path));
        }
    }

    const std::string& anyFont() { return fonts.at(below(random, fonts.size())); }

    void readAll(const std::function<std::string()>& makeFont)
    {
        int accepted = 0;
        for (int round = 0; round < rounds; ++round) {
            const auto reading = read(makeFont());
            EXPECT_NE(reading.familyNames.has_value(), !reading.error.empty()) << round;
            EXPECT_THAT(reading.error, testing::Not(testing::HasSubstr("the font reader"))) << round;
            accepted += reading.familyNames ? 1 : 0;
        }
        RecordProperty("accepted", accepted);
        EXPECT_LT(accepted, rounds) << "the damage does nothing";
        EXPECT_TRUE(read(fonts.front()).familyNames);
    }

    std::vector<std::string> fonts;
    Random random{seed};
    FontParser parser;

private:
    FontNamesReading read(const std::string& font)
    {
        const FileDescriptor file(::memfd_create("font", MFD_CLOEXEC));
        EXPECT_EQ(::write(file.get(), font.data(), font.size()), static_cast<ssize_t>(font.size()));
        return parser.read(file.get());
    }
};

TEST_F(FontMutationTest, BytesChangedInTheFirstThousands)
{
    readAll([this] {
        const auto& font = anyFont();
        return withBytesChanged(font.substr(0, 4000), random) + font.substr(4000);
    });
}

TEST_F(FontMutationTest, BytesChangedInTheFirstHundreds)
{
    readAll([this] {
        const auto& font = anyFont();
        return withBytesChanged(font.substr(0, 400), random) + font.substr(400);
    });
}

TEST_F(FontMutationTest, Truncated)
{
    readAll([this] { return truncated(anyFont(), random); });
}

TEST_F(FontMutationTest, TableDirectoryEdited)
{
    readAll([this] { return withDirectoryEdited(anyFont(), random); });
}

TEST_F(FontMutationTest, TableDamaged)
{
    readAll([this] { return withTableDamaged(anyFont(), random); });
}

TEST_F(FontMutationTest, TablesOfAnotherFont)
{
    readAll([this] { return withTablesOf(anyFont(), anyFont(), random); });
}

TEST_F(FontMutationTest, CollectionDamaged)
{
    readAll([this] { return damagedCollection(anyFont(), random); });
}

}  // namespace
}  // namespace typhon
