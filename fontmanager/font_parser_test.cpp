#include "fontmanager/font_parser.h"
#include "fontmanager/test_fonts.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/scratch_directory.h"

#include <map>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace typhon {
namespace {

using testing::HasSubstr;
using Names = std::map<std::string, std::string>;

class FontParserTest : public testing::Test {
protected:
    FontNamesReading namesIn(const std::string& path)
    {
        return parser.read(openRegularFile(path).file.get());
    }
    FontNamesReading namesOf(const std::string& contents)
    {
        scratch.writeFile("/font", contents);
        return namesIn(scratch.real("/font"));
    }
    ScratchDirectory scratch;
    FontParser parser;
};

TEST_F(FontParserTest, ReadsWhatTheReaderItselfReads)
{
    EXPECT_EQ(namesIn(test_fonts::sansBold).familyNames, (Names{{"DejaVuSans-Bold", "DejaVu Sans"}}));
    EXPECT_EQ(namesIn(test_fonts::sansBold).error, "");
    EXPECT_EQ(namesIn(test_fonts::collection).familyNames,
              (Names{{"WenQuanYiMicroHei", "WenQuanYi Micro Hei"},
                     {"WenQuanYiMicroHeiMono", "WenQuanYi Micro Hei Mono"}}));
    EXPECT_EQ(namesOf("not a font").error, "not a TrueType or OpenType font");
}

}  // namespace
}  // namespace typhon
