#pragma once

#include <string>
#include <string_view>

namespace typhon {

/// True for text that a D-Bus string can carry everywhere: UTF-8 without zero characters, surrogates and
/// noncharacters (which some implementations refuse).
bool isWireText(std::string_view text);

/// The same text with U+FFFD for whatever a D-Bus string cannot carry.
std::string wireText(std::string_view text);

}  // namespace typhon
