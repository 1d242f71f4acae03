#include "platform/linux/descriptor_passing.h"
#include "platform/linux/download_wire.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/scratch_directory.h"

#include <array>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>

namespace typhon {
namespace {

using ::testing::HasSubstr;

const std::string unusable = "the downloader gave no answer that can be used";
const std::string ended = "the downloader ended without an answer";

class DownloadWire : public testing::Test {
protected:
    DownloadWire()
    {
        std::array<int, 2> pair{};
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, pair.data()), 0);
        ours = FileDescriptor(pair[0]);
        theirs = FileDescriptor(pair[1]);
    }
    static FileDescriptor memoryFile(std::string_view text)
    {
        auto file = emptyMemoryFile();
        EXPECT_EQ(::write(file.get(), text.data(), text.size()), static_cast<ssize_t>(text.size()));
        return file;
    }
    /// What a downloader can send that was taken over.
    void sendRaw(const Bytes& packet, const std::vector<int>& files = {})
    {
        ASSERT_EQ(sendWithDescriptors(theirs.get(), packet, files), static_cast<ssize_t>(packet.size()));
    }
    DownloadAnswer answer(std::size_t mostBytes = 100)
    {
        return receiveDownloadAnswer(ours.get(), mostBytes);
    }

    const Bytes success = writeBinaryPropertyList(PropertyList::Dictionary{{"error", ""}});
    FileDescriptor ours;
    FileDescriptor theirs;
};

TEST_F(DownloadWire, ARequestArrivesAsItWas)
{
    const DownloadRequest request{.url = "https://example.org/",
                                  .certificates = "/etc/a.pem",
                                  .mostBytes = 64 << 20,
                                  .bytesPerSecond = 1000,
                                  .stallSeconds = 3,
                                  .totalSeconds = 4};
    ASSERT_TRUE(sendDownloadRequest(ours.get(), request));
    EXPECT_EQ(receiveDownloadRequest(theirs.get()), request);
}

TEST_F(DownloadWire, WhoeverIsGoneGetsAndSendsNoRequest)
{
    theirs = FileDescriptor();
    EXPECT_FALSE(sendDownloadRequest(ours.get(), {}));
    EXPECT_EQ(receiveDownloadRequest(ours.get()), std::nullopt);
}

TEST_F(DownloadWire, ContentsArriveInASealedMemoryFile)
{
    const auto file = memoryFile("a catalogue");
    sendDownloadAnswer(theirs.get(), "", file.get());
    const auto received = answer();
    EXPECT_EQ(received.error, "");
    EXPECT_EQ(std::string(received.contents.begin(), received.contents.end()), "a catalogue");
    EXPECT_LT(::write(file.get(), "x", 1), 0);
}

TEST_F(DownloadWire, AReasonIsOneVisibleLineOfBoundedLength)
{
    sendDownloadAnswer(theirs.get(), "two\nlines\x1b[31m");
    EXPECT_EQ(answer().error, "two\\nlines\\x1B[31m");
    sendDownloadAnswer(theirs.get(), std::string(5000, 'a'));
    EXPECT_LT(answer().error.size(), 400U);
}

TEST_F(DownloadWire, NothingIsNoAnswer)
{
    EXPECT_EQ(answer().error, ended);
    theirs = FileDescriptor();
    EXPECT_EQ(answer().error, ended);
}

TEST_F(DownloadWire, SuccessWithoutAFileIsNoAnswer)
{
    sendRaw(success);
    EXPECT_EQ(answer().error, unusable);
}

TEST_F(DownloadWire, AFileThatCouldStillChangeIsNoAnswer)
{
    const auto unsealed = memoryFile("a catalogue");
    sendRaw(success, {unsealed.get()});
    EXPECT_EQ(answer().error, unusable);
    ASSERT_EQ(::fcntl(unsealed.get(), F_ADD_SEALS, F_SEAL_SHRINK | F_SEAL_GROW), 0);
    sendRaw(success, {unsealed.get()});
    EXPECT_EQ(answer().error, unusable);
}

TEST_F(DownloadWire, WhatIsNoMemoryFileIsNoAnswer)
{
    ScratchDirectory scratch;
    scratch.writeFile("/a", "a catalogue");
    const FileDescriptor file(::open(scratch.real("/a").c_str(), O_RDONLY | O_CLOEXEC));
    const FileDescriptor device(::open("/dev/zero", O_RDONLY | O_CLOEXEC));
    for (const int descriptor : {file.get(), device.get(), theirs.get()}) {
        sendRaw(success, {descriptor});
        EXPECT_EQ(answer().error, unusable);
    }
}

TEST_F(DownloadWire, AFileOverTheLimitIsNoAnswer)
{
    const auto file = memoryFile(std::string(101, 'a'));
    ASSERT_TRUE(sealMemoryFile(file.get()));
    sendRaw(success, {file.get()});
    EXPECT_EQ(answer().error, unusable);
    sendRaw(success, {file.get()});
    EXPECT_EQ(answer(101).contents.size(), 101U);
}

TEST_F(DownloadWire, MoreThanOneFileIsNoAnswerAndNoneStaysOpen)
{
    const auto file = memoryFile("a catalogue");
    ASSERT_TRUE(sealMemoryFile(file.get()));
    const FileDescriptor before(::dup(0));
    sendRaw(success, {file.get(), file.get(), file.get()});
    EXPECT_EQ(answer().error, ended);
    const FileDescriptor after(::dup(0));
    EXPECT_EQ(after.get(), before.get() + 1);
}

TEST_F(DownloadWire, NonsenseIsNoAnswer)
{
    sendRaw({1, 2, 3});
    EXPECT_EQ(answer().error, ended);
    sendRaw(Bytes(20'000, 'a'));
    EXPECT_EQ(answer().error, ended);
    sendRaw(writeBinaryPropertyList(PropertyList::Array{"error"}));
    EXPECT_EQ(answer().error, unusable);
}

}  // namespace
}  // namespace typhon
