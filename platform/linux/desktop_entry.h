#pragma once

#include <optional>
#include <string_view>

namespace typhon {

/// What the application registry takes from a desktop entry.
struct DesktopEntry {
    /// X-Typhon-Placeholder=true: announced but not (yet) really installed.
    bool isPlaceholder = false;
};

/// Parses a desktop entry. Null for what does not stand for an installed application: no group
/// "Desktop Entry" at the start, a Type other than Application, or Hidden=true, which means deleted.
std::optional<DesktopEntry> parseDesktopEntry(std::string_view text);

}  // namespace typhon
