#include "registry/registry_cleaning.h"

#include <algorithm>
#include <array>
#include <optional>
#include <string_view>

namespace typhon {

namespace {

bool isControlCharacter(char character)
{
    const auto byte = static_cast<unsigned char>(character);
    return byte < 0x20 || byte == 0x7f;
}

/// "." or "..": such a path could name a file by way of another directory.
bool hasDotComponent(std::string_view path)
{
    return path.ends_with("/.") || path.ends_with("/..") || path.find("/./") != std::string_view::npos ||
           path.find("/../") != std::string_view::npos;
}

bool isUsablePath(std::string_view path)
{
    return path.starts_with('/') && !hasDotComponent(path) && std::ranges::none_of(path, isControlCharacter);
}

bool isDictionary(const PropertyList& entry)
{
    return entry.asDictionary() != nullptr;
}

bool hasUsableFamilyName(const PropertyList& entry)
{
    const auto* familyName = entry.find("familyName");
    if (familyName == nullptr) {
        return true;
    }
    const auto* faces = familyName->asDictionary();
    return faces != nullptr &&
           std::ranges::all_of(*faces, [](const auto& face) { return face.second.asString() != nullptr; });
}

bool hasUsableDisabled(const PropertyList& entry)
{
    const auto* disabled = entry.find("disabled");
    return disabled == nullptr || disabled->asBoolean() != nullptr;
}

struct Rule {
    const char* reason;
    bool (*isKept)(const std::string& path, const PropertyList& entry);
};

constexpr std::array rules{
    Rule{"have no absolute path without \".\", \"..\" or control characters",
         [](const std::string& path, const PropertyList&) { return isUsablePath(path); }},
    Rule{"are not dictionaries",
         [](const std::string&, const PropertyList& entry) { return isDictionary(entry); }},
    Rule{"have a \"familyName\" that is not a dictionary of strings",
         [](const std::string&, const PropertyList& entry) { return hasUsableFamilyName(entry); }},
    Rule{"have a \"disabled\" that is not a boolean",
         [](const std::string&, const PropertyList& entry) { return hasUsableDisabled(entry); }},
};

using Counts = std::array<EntriesLeftOut, rules.size()>;

/// The first rule that the entry breaks, or null.
const Rule* brokenRule(const std::string& path, const PropertyList& entry)
{
    const auto broken =
        std::ranges::find_if(rules, [&](const Rule& rule) { return !rule.isKept(path, entry); });
    return broken == rules.end() ? nullptr : &*broken;
}

void count(Counts& counts, const Rule& rule, const std::string& path)
{
    auto& entries = counts[static_cast<std::size_t>(&rule - rules.data())];
    if (entries.count++ == 0) {
        entries.reason = rule.reason;
        entries.firstPath = path;
    }
}

}  // namespace

CleanedRegistry cleanRegistry(PropertyList root)
{
    Counts counts;
    std::vector<const std::string*> malformed;
    for (const auto& [path, entry] : *root.asDictionary()) {
        if (const auto* rule = brokenRule(path, entry)) {
            count(counts, *rule, path);
            malformed.push_back(&path);
        }
    }
    if (malformed.empty()) {
        return {std::move(root), {}};
    }
    auto kept = *root.asDictionary();
    for (const auto* path : malformed) {
        kept.erase(*path);
    }
    CleanedRegistry cleaned{std::move(kept), {}};
    std::ranges::copy_if(counts, std::back_inserter(cleaned.leftOut),
                         [](const auto& entries) { return entries.count != 0; });
    return cleaned;
}

}  // namespace typhon
