#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {

/// Decodes base64 as it arrives, in pieces cut anywhere. White space is skipped; anything else outside the
/// alphabet, padding that does not complete a group of four, and text after the padding are refused.
class Base64Decoder {
public:
    /// Appends what is complete to `bytes`; false when `text` is refused.
    bool decode(std::string_view text, std::vector<std::uint8_t>& bytes);
    /// True when the text so far was complete. Starts anew.
    bool finish();

private:
    bool take(unsigned sextet, std::vector<std::uint8_t>& bytes);
    bool pad(std::vector<std::uint8_t>& bytes);

    unsigned group_ = 0;
    unsigned count_ = 0;
    unsigned padding_ = 0;
};

/// Null when `text` is refused.
std::optional<std::vector<std::uint8_t>> bytesFromBase64(std::string_view text);

void appendBase64(std::string& text, std::span<const std::uint8_t> bytes);
std::string base64FromBytes(std::span<const std::uint8_t> bytes);

}  // namespace typhon
