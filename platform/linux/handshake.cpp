#include "platform/linux/handshake.h"

#include <algorithm>
#include <optional>
#include <utility>

namespace typhon {

namespace {

constexpr std::string_view lineEnd = "\r\n";

/// The text up to the first space, and what follows that space (null when there is none).
std::pair<std::string_view, std::optional<std::string>> split(std::string_view text)
{
    const auto space = text.find(' ');
    if (space == std::string_view::npos) {
        return {text, std::nullopt};
    }
    return {text.substr(0, space), std::string(text.substr(space + 1))};
}

bool isHexadecimal(std::string_view text)
{
    return text.size() % 2 == 0 && text.find_first_not_of("0123456789abcdefABCDEF") == std::string_view::npos;
}

/// A number in decimal digits, each of them written in hexadecimal ("31303030" for 1000).
bool isUserIdentifier(std::string_view text)
{
    for (std::size_t at = 0; at + 1 < text.size(); at += 2) {
        if (text[at] != '3' || text[at + 1] < '0' || text[at + 1] > '9') {
            return false;
        }
    }
    return text.size() % 2 == 0 && text.size() <= 20;
}

}  // namespace

std::size_t Handshake::receive(std::string_view bytes)
{
    std::size_t taken = 0;
    while (taken < bytes.size() && state_ == State::going) {
        receiveByte(bytes[taken++]);
    }
    return taken;
}

void Handshake::receiveByte(char byte)
{
    if (std::exchange(zeroExpected_, false)) {
        if (byte != '\0') {
            fail("it does not begin with a zero byte");
        }
        return;
    }
    line_ += byte;
    if (++bytes_ > maximumBytes) {
        fail("the handshake is too long");
    } else if (line_.ends_with(lineEnd)) {
        auto line = std::exchange(line_, {});
        line.resize(line.size() - lineEnd.size());
        if (++lines_ > maximumLines) {
            fail("the handshake has too many lines");
        } else {
            receiveLine(line);
        }
    }
}

std::string Handshake::takeOutput()
{
    return std::exchange(output_, {});
}

void Handshake::fail(std::string problem)
{
    state_ = State::failed;
    problem_ = std::move(problem);
}

void ServerHandshake::receiveLine(std::string_view line)
{
    const auto [command, rest] = split(line);
    if (waiting_ == Waiting::forBegin) {
        receiveAuthenticated(command);
    } else if (command == "AUTH" && waiting_ == Waiting::forMechanism && rest) {
        const auto [mechanism, response] = split(*rest);
        receiveMechanism(mechanism, response ? &*response : nullptr);
    } else {
        receiveInAuthentication(command, rest ? *rest : std::string_view());
    }
}

void ServerHandshake::receiveMechanism(std::string_view mechanism, const std::string* response)
{
    if (mechanism != "EXTERNAL" && mechanism != "ANONYMOUS") {
        reject();
        return;
    }
    const auto kind = mechanism == "EXTERNAL" ? Waiting::forExternalData : Waiting::forAnonymousData;
    if (response != nullptr) {
        receiveResponse(kind, *response);
    } else {
        waiting_ = kind;
        send("DATA\r\n");
    }
}

void ServerHandshake::receiveInAuthentication(std::string_view command, std::string_view rest)
{
    if (command == "DATA" && waiting_ != Waiting::forMechanism) {
        receiveResponse(waiting_, rest);
    } else if (command == "AUTH" || command == "CANCEL" || command == "ERROR") {
        reject();
    } else if (command == "BEGIN") {
        fail("it began without authentication");
    } else {
        send("ERROR\r\n");
    }
}

void ServerHandshake::receiveResponse(Waiting kind, std::string_view response)
{
    const bool fits = kind == Waiting::forExternalData ? isUserIdentifier(response) : isHexadecimal(response);
    if (!fits) {
        reject();
        return;
    }
    waiting_ = Waiting::forBegin;
    send("OK " + identifier_ + "\r\n");
}

void ServerHandshake::receiveAuthenticated(std::string_view command)
{
    if (command == "BEGIN") {
        finish();
    } else if (command == "NEGOTIATE_UNIX_FD") {
        agreeOnDescriptors();
        send("AGREE_UNIX_FD\r\n");
    } else if (command == "CANCEL" || command == "ERROR") {
        reject();
    } else {
        send("ERROR\r\n");
    }
}

void ServerHandshake::reject()
{
    waiting_ = Waiting::forMechanism;
    send("REJECTED EXTERNAL ANONYMOUS\r\n");
}

ClientHandshake::ClientHandshake() : Handshake(false)
{
    send(std::string_view("\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n", 48));
}

void ClientHandshake::receiveLine(std::string_view line)
{
    const auto [command, rest] = split(line);
    if (authenticated_) {
        if (command == "AGREE_UNIX_FD") {
            agreeOnDescriptors();
        }
        finish();
    } else if (command == "OK") {
        authenticated_ = true;
    } else if (command != "DATA") {
        fail("the server rejects the handshake");
    }
}

}  // namespace typhon
