#include "tools/agent/terminal_keys.h"

#include <optional>

namespace typhon {

namespace {

constexpr char escape = '\x1B';

std::optional<Key> keyOf(char byte)
{
    switch (byte) {
    case 'k':
        return Key::up;
    case 'j':
        return Key::down;
    case 'h':
        return Key::left;
    case 'l':
    case ' ':
    case '\t':
        return Key::right;
    case '\r':
    case '\n':
        return Key::enter;
    case 'q':
        return Key::escape;
    case '\x03':
        return Key::interrupt;
    default:
        return std::nullopt;
    }
}

/// Of "ESC [ x" and "ESC O x".
std::optional<Key> keyOfSequence(char last)
{
    switch (last) {
    case 'A':
        return Key::up;
    case 'B':
        return Key::down;
    case 'C':
        return Key::right;
    case 'D':
    case 'Z':
        return Key::left;
    default:
        return std::nullopt;
    }
}

bool isFinal(char byte)
{
    return byte >= 0x40 && byte <= 0x7E;
}

}  // namespace

std::vector<Key> TerminalKeys::read(std::string_view bytes)
{
    std::vector<Key> keys;
    const auto add = [&keys](std::optional<Key> key) {
        if (key) {
            keys.push_back(*key);
        }
    };
    for (const char byte : bytes) {
        if (byte == escape) {
            add(pending_.size() == 1 ? std::optional(Key::escape) : std::nullopt);
            pending_ = escape;
        } else if (pending_.empty()) {
            add(keyOf(byte));
        } else if (pending_.size() == 1) {
            // Escape and a letter is what Alt and a letter send: nothing here.
            pending_ = byte == '[' || byte == 'O' ? pending_ + byte : std::string();
        } else if (isFinal(byte)) {
            add(pending_.size() == 2 ? keyOfSequence(byte) : std::nullopt);
            pending_.clear();
        } else {
            // Parameters, of which only the presence matters.
            pending_ = std::string("\x1B[;");
        }
    }
    return keys;
}

std::vector<Key> TerminalKeys::flush()
{
    const bool isLone = pending_.size() == 1;
    pending_.clear();
    return isLone ? std::vector{Key::escape} : std::vector<Key>{};
}

}  // namespace typhon
