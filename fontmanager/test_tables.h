#pragma once

#include "fontmanager/test_fonts.h"

#include <cstddef>
#include <map>
#include <string>
#include <vector>

// Fonts taken apart into their tables and put together anew, for tests. Checksums are left zero, as nobody
// looks at them.

namespace typhon::test_fonts {

/// By tag.
using Tables = std::map<std::string, std::string>;

inline std::string written16(unsigned long value)
{
    return {static_cast<char>(value >> 8), static_cast<char>(value)};
}

inline Tables tablesOf(const std::string& font)
{
    Tables tables;
    const std::size_t count = read32(font, 4) >> 16;
    for (std::size_t table = 0; table < count; ++table) {
        const std::size_t entry = 12 + 16 * table;
        tables[font.substr(entry, 4)] = font.substr(read32(font, entry + 8), read32(font, entry + 12));
    }
    return tables;
}

inline std::string directoryEntry(const std::string& tag, std::size_t offset, std::size_t size)
{
    return tag + written32(0) + written32(offset) + written32(size);
}

inline std::string directoryStart(std::size_t tables)
{
    return std::string("\0\1\0\0", 4) + written16(tables) + std::string(6, '\0');
}

inline std::string padded(std::string bytes)
{
    bytes.resize((bytes.size() + 3) / 4 * 4);
    return bytes;
}

inline std::string fontOf(const Tables& tables)
{
    std::string directory = directoryStart(tables.size());
    std::string bodies;
    const std::size_t bodiesStart = directory.size() + 16 * tables.size();
    for (const auto& [tag, body] : tables) {
        directory += directoryEntry(tag, bodiesStart + bodies.size(), body.size());
        bodies += padded(body);
    }
    return directory + bodies;
}

/// A name table with these two names, for Windows in American English.
inline std::string nameTable(const std::string& postScript, const std::string& family)
{
    std::string records;
    std::string texts;
    const auto add = [&](unsigned identifier, const std::string& name) {
        std::string text;
        for (const char c : name) {
            text += std::string(1, '\0') + c;
        }
        records += written16(3) + written16(1) + written16(0x409) + written16(identifier) +
                   written16(text.size()) + written16(texts.size());
        texts += text;
    };
    add(1, family);
    add(6, postScript);
    return written16(0) + written16(2) + written16(6 + records.size()) + records + texts;
}

/// A collection of `names.size()` faces that share every table of `font` but the names; PostScript names as
/// given, all of the family "Many".
inline std::string collectionWithNames(const std::string& font, const std::vector<std::string>& names)
{
    auto tables = tablesOf(font);
    tables.erase("name");
    const std::size_t directorySize = 12 + 16 * (tables.size() + 1);
    const std::size_t sharedStart = 12 + 4 * names.size() + directorySize * names.size();
    std::string shared;
    std::string sharedEntries;
    for (const auto& [tag, body] : tables) {
        sharedEntries += directoryEntry(tag, sharedStart + shared.size(), body.size());
        shared += padded(body);
    }
    std::string header = "ttcf" + written32(0x00010000) + written32(names.size());
    std::string directories;
    std::string nameTables;
    for (const auto& name : names) {
        const auto table = nameTable(name, "Many");
        header += written32(12 + 4 * names.size() + directories.size());
        directories += directoryStart(tables.size() + 1) + sharedEntries +
                       directoryEntry("name", sharedStart + shared.size() + nameTables.size(), table.size());
        nameTables += padded(table);
    }
    return header + directories + shared + nameTables;
}

}  // namespace typhon::test_fonts
