#include "platform/linux/bus_message.h"
#include "platform/linux/message_decoder.h"
#include "platform/linux/opened_bus.h"
#include "platform/linux/plain_message.h"
#include "testing/wire_message.h"

#include <array>
#include <cerrno>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <sys/socket.h>

namespace typhon {
namespace {

using Bytes = std::vector<std::uint8_t>;

Bytes bytesOf(const std::string& text)
{
    return {text.begin(), text.end()};
}

bool sdBusAccepts(const Bytes& message)
{
    MessageDecoder decoder;
    return decoder.decode({message, {}}) != nullptr;
}

/// A call to answer.
BusMessage incomingCall(sd_bus* bus)
{
    sd_bus_message* message = nullptr;
    EXPECT_GE(sd_bus_message_new_method_call(bus, &message, nullptr, "/", "a.b", "c"), 0);
    EXPECT_GE(sd_bus_message_seal(message, 7, 0), 0);
    return BusMessage(message);
}

/// What sd-bus itself sends.
class SentMessages : public testing::Test {
protected:
    using Fill = std::function<int(sd_bus*, sd_bus_message**)>;

    SentMessages()
    {
        EXPECT_GE(bus_.open(true), 0);
        received();
    }
    Bytes sent(const Fill& fill)
    {
        sd_bus_message* raw = nullptr;
        EXPECT_GE(fill(bus_.get(), &raw), 0);
        const BusMessage message(raw);
        EXPECT_GE(sd_bus_send(bus_.get(), raw, nullptr), 0);
        return received();
    }
    Bytes received() const
    {
        Bytes bytes(4096);
        const auto got = ::recv(bus_.farEnd(), bytes.data(), bytes.size(), MSG_DONTWAIT);
        EXPECT_GT(got, 0);
        bytes.resize(static_cast<std::size_t>(std::max<ssize_t>(got, 0)));
        return bytes;
    }
    std::vector<Bytes> oneOfEachKind();

    OpenedBus bus_;
};

std::vector<Bytes> SentMessages::oneOfEachKind()
{
    return {
        sent([](sd_bus* bus, sd_bus_message** message) {
            sd_bus_message_new_method_call(bus, message, ":1.5", "/com/vorlan/typhond", "com.vorlan.Some_1",
                                           "member_2");
            return sd_bus_message_append(*message, "sa{sv}(iv)", "text", 1, "key", "d", 1.5, 2, "ay", 1, 7);
        }),
        sent([](sd_bus* bus, sd_bus_message** message) {
            return sd_bus_message_new_method_return(incomingCall(bus).get(), message);
        }),
        sent([](sd_bus* bus, sd_bus_message** message) {
            return sd_bus_message_new_method_errorf(incomingCall(bus).get(), message, "com.vorlan.Error",
                                                    "some");
        }),
        sent([](sd_bus* bus, sd_bus_message** message) {
            return sd_bus_message_new_signal(bus, message, "/", "com.vorlan.Signals", "Some");
        }),
    };
}

TEST_F(SentMessages, ArePlain)
{
    for (const auto& message : oneOfEachKind()) {
        EXPECT_TRUE(isPlainMessage(message)) << testing::PrintToString(message);
    }
}

TEST_F(SentMessages, AreNotPlainWithAnythingMissingOrBehindThem)
{
    for (const auto& message : oneOfEachKind()) {
        auto longer = message;
        longer.push_back(0);
        EXPECT_FALSE(isPlainMessage(longer));
        for (std::size_t size = 0; size < message.size(); ++size) {
            EXPECT_FALSE(isPlainMessage(std::span(message).first(size))) << size;
        }
    }
}

TEST_F(SentMessages, HoweverTheyAreChangedAreUnderstoodBySdBusWherePlain)
{
    constexpr std::array<std::uint8_t, 20> others{0,   1,   2,   3,   5,   8,   9,   '-', '.', '/',
                                                  ':', '0', 'Z', '_', 'a', 'g', 's', 'u', '{', 0xFF};
    for (const auto& message : oneOfEachKind()) {
        for (std::size_t at = 0; at < message.size(); ++at) {
            for (const auto other : others) {
                auto changed = message;
                changed[at] = other;
                EXPECT_TRUE(!isPlainMessage(changed) || sdBusAccepts(changed))
                    << testing::PrintToString(changed);
            }
        }
    }
}

TEST(PlainMessage, MayHaveAnyNameThatIsOne)
{
    const auto isPlain = [](const char* interface, const char* member) {
        return isPlainMessage(bytesOf(WireMessage::call(1, interface, member)));
    };
    EXPECT_TRUE(isPlain("a.b", "c"));
    EXPECT_TRUE(isPlain("_a._1", "_"));
    for (const auto* odd : {"", "a", ".a.b", "a..b", "a.b.", "a.1", "1.a", "a-b.c", "no interface",
                            "a.\xC3\xA4", "org.freedesktop.DBus.Local"}) {
        EXPECT_FALSE(isPlain(odd, "c")) << odd;
    }
    for (const auto* odd : {"", "1", "a.b", "a-b", "a b"}) {
        EXPECT_FALSE(isPlain("a.b", odd)) << odd;
    }
    const std::string longName(260, 'a');
    EXPECT_FALSE(isPlain(("a." + longName).c_str(), "c"));
    EXPECT_FALSE(isPlain("a.b", longName.c_str()));
}

TEST(PlainMessage, HasNoDescriptors)
{
    auto message = bytesOf(WireMessage::call(1, "a.b", "c", nullptr, 1));
    EXPECT_FALSE(isPlainMessage(message));
    // Some say so.
    message[message.size() - 4] = 0;
    EXPECT_TRUE(isPlainMessage(message));
    EXPECT_TRUE(sdBusAccepts(message));
}

TEST(PlainMessage, HasASerialNumber)
{
    EXPECT_FALSE(isPlainMessage(bytesOf(WireMessage::call(0, "a.b", "c"))));
}

}  // namespace
}  // namespace typhon
