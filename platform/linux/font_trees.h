#pragma once

#include <string_view>

namespace typhon {

/// A tree of font files that the daemon hands out.
struct FontTree {
    /// Its logical path, with the final "/".
    std::string_view path;
    /// False when any identified process may read its files without a grant.
    bool needsGrant = true;
};

/// True for an absolute path of at most 4,095 bytes without empty, "." or ".." components and without zero
/// bytes. A final "/" counts as an empty component.
bool isPlainPath(std::string_view path);

/// The tree that holds a file of that plain logical path, or null.
const FontTree* fontTreeOf(std::string_view path);

/// True when `directory` (with or without a final "/") is a tree or lies in one, or names a file of one.
bool isGrantable(std::string_view path);

/// True when a grant for `granted` is one for the file `path`: the same, or a directory above it.
bool covers(std::string_view granted, std::string_view path);

}  // namespace typhon
