#pragma once

#include <optional>
#include <span>
#include <string>

namespace typhon {

/// What the application registry takes from an AppStream metadata file.
struct AppStreamMetadata {
    /// The component's identifier, as written.
    std::string identifier;
    /// The version of its newest release: the latest by date, and of equally late or undated ones the first.
    std::optional<std::string> version;
};

/// Parses the metadata of one component (XML). Null for anything else, for text that is not well-formed, and
/// for a document that declares entities. Nothing outside the document is ever loaded.
std::optional<AppStreamMetadata> parseAppStreamMetadata(std::span<const char> document);

}  // namespace typhon
