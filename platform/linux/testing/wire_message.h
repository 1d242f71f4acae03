#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace typhon {

/// The client's whole side of the handshake, without waiting for the server's.
inline std::string pipelinedHandshake()
{
    return std::string(1, '\0') + "AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
}

/// A method call with at most one string as its argument, byte for byte as it travels. Descriptors may go
/// with it, which it announces.
class WireMessage {
public:
    static std::string call(std::uint32_t serial, std::string_view interface, std::string_view member,
                            const std::string* text = nullptr, std::uint32_t descriptors = 0)
    {
        std::string body;
        if (text != nullptr) {
            appendText(body, *text);
        }
        std::string fields;
        appendField(fields, 1, 'o', "/com/vorlan/typhond");
        appendField(fields, 2, 's', interface);
        appendField(fields, 3, 's', member);
        if (text != nullptr) {
            pad(fields, 8);
            fields += std::string("\x08\x01g\0\x01s\0", 7);
        }
        if (descriptors > 0) {
            pad(fields, 8);
            fields += std::string("\x09\x01u\0", 4);
            appendNumber(fields, descriptors);
        }
        std::string message("l\1\0\1", 4);
        appendNumber(message, static_cast<std::uint32_t>(body.size()));
        appendNumber(message, serial);
        appendNumber(message, static_cast<std::uint32_t>(fields.size()));
        message += fields;
        pad(message, 8);
        return message + body;
    }

private:
    static void pad(std::string& bytes, std::size_t to)
    {
        bytes.resize((bytes.size() + to - 1) / to * to, '\0');
    }
    static void appendNumber(std::string& bytes, std::uint32_t number)
    {
        for (int shift = 0; shift < 32; shift += 8) {
            bytes += static_cast<char>((number >> shift) & 0xFF);
        }
    }
    static void appendText(std::string& bytes, std::string_view text)
    {
        pad(bytes, 4);
        appendNumber(bytes, static_cast<std::uint32_t>(text.size()));
        bytes += text;
        bytes += '\0';
    }
    static void appendField(std::string& fields, char code, char type, std::string_view text)
    {
        pad(fields, 8);
        fields += code;
        fields += std::string("\1", 1) + type + '\0';
        appendText(fields, text);
    }
};

}  // namespace typhon
