#include "fontmanager/font_store_fixture.h"

#include <gmock/gmock.h>
#include <sys/socket.h>

namespace typhon {
namespace {

using namespace test_store;
using ::testing::HasSubstr;
using ::testing::IsEmpty;

class FontRegistrationTest : public FontStoreFixture {
protected:
    std::string refusal(int file, const std::string& name = "x.ttf")
    {
        return store.begin("org.example.a", true).registration->add(name, file).value_or("");
    }
};

TEST_F(FontRegistrationTest, WhatIsNoRegularFileIsRefused)
{
    int pipe[2];
    ASSERT_EQ(::pipe2(pipe, O_CLOEXEC), 0);
    const FileDescriptor readEnd(pipe[0]);
    const FileDescriptor writeEnd(pipe[1]);
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    const FileDescriptor folder(::open("/tmp", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const FileDescriptor device(::open("/dev/zero", O_RDONLY | O_CLOEXEC));
    for (const int file : {readEnd.get(), socket.get(), folder.get(), device.get()}) {
        EXPECT_EQ(refusal(file), "x.ttf: it is not a regular file");
    }
    EXPECT_THAT(files(), IsEmpty());
}

TEST_F(FontRegistrationTest, WhatIsNotOpenForReadingIsRefused)
{
    scratch.writeFile("/font", "font X");
    const FileDescriptor path(::open(scratch.real("/font").c_str(), O_PATH | O_CLOEXEC));
    const FileDescriptor forWriting(::open(scratch.real("/font").c_str(), O_WRONLY | O_CLOEXEC));
    EXPECT_EQ(refusal(path.get()), "x.ttf: it is not open for reading");
    EXPECT_EQ(refusal(forWriting.get()), "x.ttf: it is not open for reading");
}

TEST_F(FontRegistrationTest, TheOffsetOfThePassedFileDoesNotMatterAndStays)
{
    const auto file = fileWith("font X");
    ASSERT_EQ(::lseek(file.get(), 3, SEEK_SET), 3);
    EXPECT_EQ(refusal(file.get()), "");
    EXPECT_EQ(::lseek(file.get(), 0, SEEK_CUR), 3);
}

TEST_F(FontRegistrationTest, NamesAreCheckedAndTakenOnce)
{
    const auto file = fileWith("font X");
    EXPECT_THAT(refusal(file.get(), "../x.ttf"), HasSubstr("plain name"));
    auto begun = store.begin("org.example.a", true);
    EXPECT_EQ(begun.registration->add("x.ttf", file.get()), std::nullopt);
    EXPECT_THAT(begun.registration->add("x.ttf", file.get()).value_or(""), HasSubstr("two of the files"));
}

TEST_F(FontRegistrationTest, TheErrorNamesEvenAHostileFileHarmlessly)
{
    EXPECT_EQ(refusal(fileWith("font X").get(), "\x1B[2J.ttf").find('\x1B'), std::string::npos);
}

TEST_F(FontRegistrationTest, LimitsHoldForOneFileAndForAll)
{
    auto leaseFor = [this] { return std::make_unique<ProviderDirectories>(root); };
    const auto directories = leaseFor();
    const RegistrationLimits limits{.files = 2, .fileBytes = 10, .allBytes = 15};
    const auto begin = [&] {
        return std::make_unique<FontRegistration>(directories->open("org.example.b", true).lease, true, 1,
                                                  readText, limits);
    };
    EXPECT_EQ(begin()->add("x.ttf", fileWith("font 12345").get()), std::nullopt);
    EXPECT_EQ(begin()->add("x.ttf", fileWith("font 123456").get()), "x.ttf: it is larger than 10 bytes");
    auto together = begin();
    EXPECT_EQ(together->add("x.ttf", fileWith("font 12345").get()), std::nullopt);
    EXPECT_THAT(together->add("y.ttf", fileWith("font 1").get()).value_or(""), HasSubstr("together"));
    together.reset();
    auto many = begin();
    EXPECT_EQ(many->add("x.ttf", fileWith("font 1").get()), std::nullopt);
    EXPECT_EQ(many->add("y.ttf", fileWith("font 1").get()), std::nullopt);
    EXPECT_THAT(many->add("z.ttf", fileWith("font 1").get()).value_or(""), HasSubstr("2 files at most"));
}

TEST_F(FontRegistrationTest, ABadFileEndsTheRegistrationWhileOthersAreStillAdded)
{
    auto begun = store.begin("org.example.a", true);
    std::optional<std::string> error = begun.registration->add("bad.ttf", fileWith("nothing").get());
    for (int n = 0; n < 10 && !error; ++n) {
        error = begun.registration->add(std::to_string(n) + ".ttf", fileWith("font X").get());
    }
    EXPECT_EQ(error, "bad.ttf: not a font");
}

TEST_F(FontRegistrationTest, AnUnfinishedRegistrationLeavesNothing)
{
    {
        auto begun = store.begin("org.example.a", true);
        EXPECT_EQ(begun.registration->add("x.ttf", fileWith("font X").get()), std::nullopt);
        EXPECT_EQ(files().size(), 1u);
    }
    EXPECT_THAT(files(), IsEmpty());
}

TEST_F(FontRegistrationTest, IdentifiersWithoutADirectoryAreRefused)
{
    EXPECT_TRUE(store.begin("", true).error);
    EXPECT_TRUE(store.begin(std::string(300, 'a'), true).error);
    EXPECT_THAT(files(), IsEmpty());
}

}  // namespace
}  // namespace typhon
