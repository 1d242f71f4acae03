#include "fontmanager/kept_font_record.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"

#include <filesystem>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace typhon {
namespace {

constexpr const char* path = "/UserFonts.plist";

class KeptFontRecordTest : public testing::Test {
protected:
    void replace(const char* font)
    {
        ASSERT_EQ(replaceFile(scratch.real(path), contentsFor(font), 0644), std::nullopt);
    }
    static std::vector<std::uint8_t> contentsFor(const char* font)
    {
        return writeBinaryPropertyList(PropertyList::Dictionary{{font, 1}});
    }
    /// The font in the record.
    std::string font()
    {
        const auto read = record.read();
        return read.asDictionary()->empty() ? "none" : read.asDictionary()->begin()->first;
    }
    /// Lets the kernel's clock for changes of files go on past the present one's.
    void settle() const
    {
        struct stat status {};
        do {
            ASSERT_EQ(::stat(scratch.real(path).c_str(), &status), 0);
        } while (!FileIdentity(status).isSettled());
    }

    ScratchDirectory scratch;
    RootDirectory root{scratch.path()};
    KeptFontRecord record{root, path};
};

TEST_F(KeptFontRecordTest, EveryReplacementIsSeenHoweverQuickly)
{
    for (int round = 0; round < 20; ++round) {
        replace("a");
        EXPECT_EQ(font(), "a");
        replace("b");
        EXPECT_EQ(font(), "b");
    }
}

TEST_F(KeptFontRecordTest, AFileThatStaysIsNotReadAgain)
{
    replace("a");
    settle();
    const auto first = record.read();
    EXPECT_EQ(record.read().asDictionary(), first.asDictionary()) << "the very same value";
}

TEST_F(KeptFontRecordTest, AChangeInPlaceIsSeen)
{
    replace("a");
    settle();
    EXPECT_EQ(font(), "a");
    const auto contents = contentsFor("b");
    scratch.writeFile(path, {reinterpret_cast<const char*>(contents.data()), contents.size()});
    EXPECT_EQ(font(), "b");
}

TEST_F(KeptFontRecordTest, WithoutARecordThereIsNothing)
{
    EXPECT_EQ(font(), "none");
    replace("a");
    settle();
    EXPECT_EQ(font(), "a");
    std::filesystem::remove(scratch.real(path));
    EXPECT_EQ(font(), "none");
    scratch.writeFile(path, "no property list");
    EXPECT_EQ(font(), "none");
}

}  // namespace
}  // namespace typhon
