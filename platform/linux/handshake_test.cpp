#include "platform/linux/handshake.h"

#include <gtest/gtest.h>

namespace typhon {
namespace {

using State = Handshake::State;

const std::string identifier(32, 'a');
const std::string zero(1, '\0');
const std::string welcome = "OK " + identifier + "\r\n";

/// What the server says to `input`, arriving in two pieces.
struct Exchange {
    explicit Exchange(const std::string& input, std::size_t split = 0)
    {
        taken = server.receive(std::string_view(input).substr(0, split));
        output = server.takeOutput();
        taken += server.receive(std::string_view(input).substr(taken));
        output += server.takeOutput();
    }
    ServerHandshake server{identifier};
    std::size_t taken;
    std::string output;
};

TEST(ServerHandshake, takesEveryWayToAuthenticate)
{
    const std::pair<std::string, std::string> cases[] = {
        {"AUTH EXTERNAL 31303030\r\n", welcome},
        {"AUTH EXTERNAL\r\nDATA\r\n", "DATA\r\n" + welcome},
        {"AUTH EXTERNAL\r\nDATA 30\r\n", "DATA\r\n" + welcome},
        {"AUTH ANONYMOUS 6162\r\n", welcome},
        {"AUTH ANONYMOUS\r\nDATA\r\n", "DATA\r\n" + welcome},
        {"AUTH\r\nAUTH EXTERNAL 30\r\n", "REJECTED EXTERNAL ANONYMOUS\r\n" + welcome},
        {"AUTH OTHER 30\r\nAUTH EXTERNAL 30\r\n", "REJECTED EXTERNAL ANONYMOUS\r\n" + welcome},
        {"AUTH EXTERNAL\r\nCANCEL\r\nAUTH EXTERNAL 30\r\n",
         "DATA\r\nREJECTED EXTERNAL ANONYMOUS\r\n" + welcome},
    };
    for (const auto& [input, expected] : cases) {
        const Exchange exchange(zero + input + "BEGIN\r\n");
        EXPECT_EQ(exchange.output, expected) << input;
        EXPECT_EQ(exchange.server.state(), State::done) << input;
        EXPECT_FALSE(exchange.server.descriptorsAgreed());
    }
}

TEST(ServerHandshake, takesNothingBehindItsEndHoweverTheBytesArrive)
{
    const auto handshake = zero + "AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
    const auto input = handshake + "l\1\0\1message\r\n";
    for (std::size_t split = 0; split <= input.size(); ++split) {
        const Exchange exchange(input, split);
        EXPECT_EQ(exchange.taken, handshake.size());
        EXPECT_EQ(exchange.output, "DATA\r\n" + welcome + "AGREE_UNIX_FD\r\n");
        EXPECT_EQ(exchange.server.state(), State::done);
        EXPECT_TRUE(exchange.server.descriptorsAgreed());
    }
}

TEST(ServerHandshake, refusesClaimsThatAreNone)
{
    for (const std::string claim : {"3", "3x", "61", "333333333333333333333333"}) {
        EXPECT_EQ(Exchange(zero + "AUTH EXTERNAL " + claim + "\r\n").output,
                  "REJECTED EXTERNAL ANONYMOUS\r\n");
    }
    EXPECT_EQ(Exchange(zero + "AUTH ANONYMOUS xy\r\n").output, "REJECTED EXTERNAL ANONYMOUS\r\n");
}

TEST(ServerHandshake, failsWithoutZeroByteAndOnAnEarlyBegin)
{
    const Exchange noZero("GET / HTTP/1.1\r\n");
    EXPECT_EQ(noZero.server.state(), State::failed);
    EXPECT_EQ(noZero.taken, 1U);
    for (const std::string early : {"", "AUTH EXTERNAL\r\n", "AUTH OTHER\r\n", "NEGOTIATE_UNIX_FD\r\n"}) {
        EXPECT_EQ(Exchange(zero + early + "BEGIN\r\n").server.state(), State::failed);
    }
}

TEST(ServerHandshake, answersWhatItDoesNotKnowWithAnError)
{
    EXPECT_EQ(Exchange(zero + "HELLO\r\n").output, "ERROR\r\n");
    EXPECT_EQ(Exchange(zero + "DATA 30\r\n").output, "ERROR\r\n");
    EXPECT_EQ(Exchange(zero + "AUTH EXTERNAL 30\r\nSTARTTLS\r\n").output, welcome + "ERROR\r\n");
    EXPECT_EQ(Exchange(zero + "AUTH EXTERNAL 30\nBEGIN\r\n").output, "REJECTED EXTERNAL ANONYMOUS\r\n");
}

TEST(ServerHandshake, isBoundedInBytesAndLines)
{
    const Exchange longLine(zero + std::string(2 * Handshake::maximumBytes, 'A'));
    EXPECT_EQ(longLine.server.state(), State::failed);
    EXPECT_LE(longLine.taken, Handshake::maximumBytes + 2);
    std::string lines = zero;
    for (unsigned count = 0; count <= Handshake::maximumLines; ++count) {
        EXPECT_EQ(Exchange(lines).server.state(), State::going);
        lines += "\r\n";
    }
    EXPECT_EQ(Exchange(lines).server.state(), State::failed);
}

TEST(ClientHandshake, agreesWithTheServer)
{
    ClientHandshake client;
    ServerHandshake server(identifier);
    const auto said = client.takeOutput();
    EXPECT_EQ(server.receive(said), said.size());
    const auto answer = server.takeOutput();
    EXPECT_EQ(client.receive(answer + "message"), answer.size());
    EXPECT_EQ(server.state(), State::done);
    EXPECT_EQ(client.state(), State::done);
    EXPECT_TRUE(server.descriptorsAgreed());
    EXPECT_TRUE(client.descriptorsAgreed());
}

TEST(ClientHandshake, goesOnWithoutDescriptorsButNotWithoutAuthentication)
{
    ClientHandshake plain;
    plain.receive("DATA\r\n" + welcome + "ERROR unknown command\r\n");
    EXPECT_EQ(plain.state(), State::done);
    EXPECT_FALSE(plain.descriptorsAgreed());
    ClientHandshake rejected;
    rejected.receive("REJECTED EXTERNAL\r\n");
    EXPECT_EQ(rejected.state(), State::failed);
}

}  // namespace
}  // namespace typhon
