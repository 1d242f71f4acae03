#include "platform/linux/bus_message.h"
#include "platform/linux/bus_message_codec.h"
#include "platform/linux/large_values.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/wire_text.h"

#include <array>
#include <cstdint>
#include <limits>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>

namespace typhon {
namespace {

/// A bus to make messages for; they are sealed and read back without travelling.
class BusMessages : public testing::Test {
protected:
    BusMessages()
    {
        std::array<int, 2> pair{};
        EXPECT_EQ(::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, pair.data()), 0);
        other_ = FileDescriptor(pair[1]);
        sd_bus_new(&bus_);
        sd_bus_set_fd(bus_, pair[0], pair[0]);
        EXPECT_GE(sd_bus_start(bus_), 0);
        newMessage();
    }
    ~BusMessages() override
    {
        sd_bus_message_unref(message_);
        sd_bus_close_unref(bus_);
    }

    void newMessage()
    {
        sd_bus_message_unref(message_);
        sd_bus_message_new_method_call(bus_, &message_, nullptr, "/x", "x.y", "z");
    }
    void seal() { ASSERT_GE(sd_bus_message_seal(message_, 1, 0), 0); }

    /// The arguments as they arrive; null when they cannot be sent or read.
    std::optional<Arguments> roundTrip(const std::string& types, const Arguments& arguments,
                                       bool descriptorsAllowed = true)
    {
        newMessage();
        if (appendArguments(message_, types, arguments, descriptorsAllowed) < 0) {
            return std::nullopt;
        }
        seal();
        return readArguments(message_, types);
    }
    void expectRoundTrip(const std::string& types, const PropertyList& value)
    {
        EXPECT_EQ(roundTrip(types, {value}), Arguments{value}) << types;
    }
    /// What arrives when somebody else fills the message.
    template <class... Values>
    std::optional<PropertyList> received(const std::string& types, const char* format, Values... values)
    {
        newMessage();
        EXPECT_GE(sd_bus_message_append(message_, format, values...), 0) << format;
        seal();
        const auto arguments = readArguments(message_, types);
        return arguments ? std::optional(std::get<PropertyList>(arguments->front())) : std::nullopt;
    }
    /// The value of the only variant in a message.
    template <class... Values>
    std::optional<PropertyList> receivedVariant(Values... values)
    {
        return received("v", "v", values...);
    }

    FileDescriptor other_;
    sd_bus* bus_ = nullptr;
    sd_bus_message* message_ = nullptr;
};

PropertyList nested(unsigned depth)
{
    PropertyList value("innermost");
    for (unsigned level = 0; level < depth; ++level) {
        value = PropertyList(PropertyList::Dictionary{{"next", value}});
    }
    return value;
}

TEST_F(BusMessages, EveryTypeOfTheInterfacesTravels)
{
    expectRoundTrip("s", PropertyList("text \xC3\xA9"));
    expectRoundTrip("s", PropertyList(""));
    expectRoundTrip("b", PropertyList(true));
    expectRoundTrip("x", PropertyList(std::numeric_limits<std::int64_t>::min()));
    expectRoundTrip("d", PropertyList(0.25));
    expectRoundTrip("ay", PropertyList(Data{{0, 255}}));
    expectRoundTrip("ay", PropertyList(Data{}));
    expectRoundTrip("as", arrayOfStrings({"a", ""}));
    expectRoundTrip("as", PropertyList(PropertyList::Array{}));
    expectRoundTrip("a{sv}", PropertyList());
    expectRoundTrip("aa{sv}", PropertyList(PropertyList::Array{PropertyList(), nested(3)}));
    expectRoundTrip("aas", PropertyList(PropertyList::Array{arrayOfStrings({"x"})}));
    expectRoundTrip("(d)", PropertyList(Date{1e9}));
}

TEST_F(BusMessages, EveryKindTravelsInsideAVariant)
{
    const PropertyList::Array kinds{true,
                                    std::int64_t{-1},
                                    -0.5,
                                    "text",
                                    Data{{1, 2, 3}},
                                    Data{},
                                    Date{-62135596800.0},
                                    PropertyList::Array{1, "mixed", PropertyList::Array{}},
                                    nested(4)};
    for (const auto& kind : kinds) {
        expectRoundTrip("v", kind);
        expectRoundTrip("a{sv}", PropertyList(PropertyList::Dictionary{{"key", kind}}));
    }
    expectRoundTrip("av", PropertyList(kinds));
}

TEST_F(BusMessages, IntegersOfEveryWidthAreTaken)
{
    EXPECT_EQ(receivedVariant("y", 255), PropertyList(255));
    EXPECT_EQ(receivedVariant("n", -32768), PropertyList(-32768));
    EXPECT_EQ(receivedVariant("q", 65535), PropertyList(65535));
    EXPECT_EQ(receivedVariant("i", -5), PropertyList(-5));
    EXPECT_EQ(receivedVariant("u", 4294967295U), PropertyList(std::int64_t{4294967295}));
    EXPECT_EQ(receivedVariant("t", std::uint64_t{1} << 62), PropertyList(std::int64_t{1} << 62));
    EXPECT_EQ(receivedVariant("t", std::uint64_t{1} << 63), std::nullopt) << "does not fit";
}

TEST_F(BusMessages, ArraysAndDictionariesOfEveryElementTypeAreTaken)
{
    EXPECT_EQ(receivedVariant("as", 2, "a", "b"), arrayOfStrings({"a", "b"}));
    EXPECT_EQ(receivedVariant("ai", 2, 1, 2), PropertyList(PropertyList::Array{1, 2}));
    EXPECT_EQ(receivedVariant("ab", 1, 1), PropertyList(PropertyList::Array{true}));
    EXPECT_EQ(receivedVariant("a{su}", 1, "k", 7U), PropertyList(PropertyList::Dictionary{{"k", 7}}));
    EXPECT_EQ(receivedVariant("a{ss}", 0), PropertyList());
    EXPECT_EQ(receivedVariant("a{oo}", 1, "/k", "/v"), PropertyList(PropertyList::Dictionary{{"/k", "/v"}}));
    EXPECT_EQ(receivedVariant("aa{sv}", 1, 1, "k", "s", "v"),
              PropertyList(PropertyList::Array{PropertyList(PropertyList::Dictionary{{"k", "v"}})}));
    EXPECT_EQ(receivedVariant("v", "v", "s", "deep"), PropertyList("deep"));
    EXPECT_EQ(receivedVariant("g", "a{sv}"), PropertyList("a{sv}"));
    EXPECT_EQ(receivedVariant("(si)", "a", 1), PropertyList(PropertyList::Array{"a", 1}));
}

TEST_F(BusMessages, WhatIsNotAPropertyListIsRefused)
{
    EXPECT_EQ(receivedVariant("a{us}", 1, 1U, "v"), std::nullopt) << "keys are strings";
    EXPECT_EQ(receivedVariant("a{ss}", 2, "k", "1", "k", "2"), std::nullopt) << "one key twice";
    EXPECT_EQ(receivedVariant("(d)", std::numeric_limits<double>::quiet_NaN()), std::nullopt);
    EXPECT_EQ(receivedVariant("h", other_.get()), std::nullopt);
    EXPECT_EQ(received("a{sv}", "a{sv}", 1, "k", "av", 1, "h", other_.get()), std::nullopt);
}

TEST_F(BusMessages, OtherTypesThanDescribedAreRefused)
{
    EXPECT_EQ(received("s", "u", 5U), std::nullopt);
    EXPECT_EQ(received("x", "u", 5U), std::nullopt);
    EXPECT_EQ(received("s", "ss", "a", "b"), std::nullopt);
    EXPECT_EQ(roundTrip("s", {PropertyList(5)}), std::nullopt);
    EXPECT_EQ(roundTrip("y", {PropertyList(256)}), std::nullopt);
    EXPECT_EQ(roundTrip("s", {}), std::nullopt);
    EXPECT_EQ(roundTrip("", {PropertyList("x")}), std::nullopt);
    EXPECT_EQ(roundTrip("h", {PropertyList("x")}), std::nullopt);
    EXPECT_EQ(roundTrip("as", {PropertyList(PropertyList::Array{1})}), std::nullopt);
}

TEST_F(BusMessages, AFileIsHandedOverAsACopyThatNotesItsSender)
{
    FileDescriptor copy(::fcntl(other_.get(), F_DUPFD_CLOEXEC, 3));
    newMessage();
    const Arguments sent{
        std::shared_ptr<TransferredFile>(std::make_shared<LinuxTransferredFile>(std::move(copy)))};
    EXPECT_EQ(appendArguments(message_, "h", sent, false), -EOPNOTSUPP);
    ASSERT_GE(appendArguments(message_, "h", sent, true), 0);
    seal();
    const AuditToken sender{1, 7, 7, 7, 1000, 1};
    const auto received = readArguments(message_, "h", sender);
    ASSERT_TRUE(received);
    const auto file = std::dynamic_pointer_cast<LinuxTransferredFile>(
        std::get<std::shared_ptr<TransferredFile>>(received->front()));
    ASSERT_TRUE(file);
    EXPECT_EQ(file->sender, sender);
    struct stat original {};
    struct stat copied {};
    ::fstat(other_.get(), &original);
    ::fstat(file->descriptor.get(), &copied);
    EXPECT_EQ(original.st_ino, copied.st_ino);
    EXPECT_NE(::fcntl(file->descriptor.get(), F_GETFD) & FD_CLOEXEC, 0);
}

TEST_F(BusMessages, LargeAndDeepValuesTravelAsFilesFromOutermostDictionariesOnly)
{
    const auto filesIn = [&](const std::string& types, const PropertyList& value, bool allowed = true) {
        newMessage();
        const auto appending = appendMessage(message_, types, {value}, allowed);
        EXPECT_EQ(appending.result, 0);
        seal();
        EXPECT_EQ(readArguments(message_, types), Arguments{value});
        return appending.descriptors;
    };
    const PropertyList large(std::string(LargeValues::largestInlineBytes, 'x'));
    const auto holding = [](const PropertyList& value) {
        return PropertyList(PropertyList::Dictionary{{"small", 1}, {"value", value}});
    };
    EXPECT_EQ(filesIn("a{sv}", holding(large)), 1U);
    EXPECT_EQ(filesIn("aa{sv}", PropertyList(PropertyList::Array{holding(large), holding(large)})), 2U);
    EXPECT_EQ(filesIn("a{sv}", holding(large), false), 0U);
    EXPECT_EQ(filesIn("v", holding(large)), 0U);
    EXPECT_EQ(filesIn("s", large), 0U);
    EXPECT_EQ(filesIn("a{sv}", holding(nested(8))), 0U);
    EXPECT_EQ(filesIn("a{sv}", holding(nested(9))), 1U);
}

TEST_F(BusMessages, TextThatDBusCannotCarryIsReplaced)
{
    const std::string odd("a\0b\xFF"
                          "c\xED\xA0\x80"
                          "d\xEF\xBF\xBF",
                          12);
    const std::string replacement = "\xEF\xBF\xBD";
    EXPECT_FALSE(isWireText(odd));
    const auto received = roundTrip("a{sv}", {PropertyList(PropertyList::Dictionary{{"key", odd}})});
    ASSERT_TRUE(received);
    const auto* text = std::get<PropertyList>(received->front()).find("key")->asString();
    const auto three = replacement + replacement + replacement;
    EXPECT_EQ(*text, "a" + replacement + "b" + replacement + "c" + three + "d" + three);
    EXPECT_TRUE(isWireText(*text));
    EXPECT_TRUE(isWireText("\xF0\x9F\x98\x80 \xE2\x82\xAC"));
    EXPECT_FALSE(isWireText("\xC0\x80"));
    EXPECT_FALSE(isWireText("\xF4\x90\x80\x80"));
    EXPECT_FALSE(isWireText("\xE2\x82"));
}

TEST_F(BusMessages, ReadingIsBounded)
{
    const auto readWith = [&](const MessageLimits& limits) {
        newMessage();
        EXPECT_GE(appendArguments(message_, "as", {arrayOfStrings({"12345", "67890"})}, true), 0);
        seal();
        return readMessage(message_, "as", std::nullopt, limits).arguments.has_value();
    };
    MessageLimits limits;
    limits.values = 3;
    limits.bytes = 10;
    limits.depth = 1;
    EXPECT_TRUE(readWith(limits));
    limits.values = 2;
    EXPECT_FALSE(readWith(limits));
    limits.values = 3;
    limits.bytes = 9;
    EXPECT_FALSE(readWith(limits));
    limits.bytes = 10;
    limits.depth = 0;
    EXPECT_FALSE(readWith(limits));
}

TEST_F(BusMessages, MemoryFilesAreBounded)
{
    const auto file = sealedMemoryFile(writeBinaryPropertyList(PropertyList(std::string(1000, 'x'))));
    const auto readWith = [&](const MessageLimits& limits) {
        newMessage();
        EXPECT_GE(sd_bus_message_append(message_, "a{sv}", 2, "a", "h", file.get(), "b", "h", file.get()), 0);
        seal();
        return readMessage(message_, "a{sv}", std::nullopt, limits).arguments.has_value();
    };
    EXPECT_TRUE(readWith({}));
    MessageLimits limits;
    limits.memoryFileBytes = 1500;
    EXPECT_FALSE(readWith(limits));
    limits = {};
    limits.descriptors = 1;
    EXPECT_FALSE(readWith(limits));
    limits = {};
    limits.memoryFileValues = 0;
    EXPECT_FALSE(readWith(limits));
}

}  // namespace
}  // namespace typhon
