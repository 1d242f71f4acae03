#include "fontmanager/change_journal.h"

#include "fontmanager/font_paths.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/regular_file.h"

#include <cerrno>
#include <utility>

#include <unistd.h>

namespace typhon {

namespace {

constexpr mode_t permissions = 0600;

PropertyList asPropertyList(const StagedFont& staged)
{
    return PropertyList::Dictionary{{"temporary", staged.temporary},
                                    {"path", staged.font.path},
                                    {"disabled", staged.font.disabled},
                                    {"familyName", PropertyList::Dictionary(staged.font.familyNames.begin(),
                                                                            staged.font.familyNames.end())}};
}

/// The text under a key, or an empty one.
std::string textIn(const PropertyList& dictionary, const char* key)
{
    const auto* value = dictionary.find(key);
    const auto* text = value == nullptr ? nullptr : value->asString();
    return text == nullptr ? std::string() : *text;
}

/// Null unless it is something that this library has written.
std::optional<StagedFont> stagedFontFrom(const PropertyList& value)
{
    StagedFont staged{.temporary = textIn(value, "temporary"),
                      .font = {.path = textIn(value, "path"), .familyNames = {}}};
    const auto* names = value.find("familyName");
    const auto* disabled = value.find("disabled");
    if (!staged.temporary.starts_with(FontRegistration::temporaryPrefix) ||
        staged.temporary.find('/') != std::string::npos || !font_paths::placeOfFontFile(staged.font.path) ||
        names == nullptr || names->asDictionary() == nullptr || disabled == nullptr) {
        return std::nullopt;
    }
    staged.font.disabled = disabled->isTrue();
    for (const auto& [postScriptName, family] : *names->asDictionary()) {
        staged.font.familyNames.emplace(postScriptName,
                                        family.asString() == nullptr ? "" : *family.asString());
    }
    return staged;
}

std::optional<PendingChange> changeFrom(const PropertyList& value)
{
    const auto* placements = value.find("placements");
    const auto* removals = value.find("removals");
    if (placements == nullptr || placements->asArray() == nullptr || removals == nullptr ||
        removals->asArray() == nullptr) {
        return std::nullopt;
    }
    PendingChange change{.placements = {}, .removals = stringsOf(*removals)};
    for (const auto& placement : *placements->asArray()) {
        auto staged = stagedFontFrom(placement);
        if (!staged) {
            return std::nullopt;
        }
        change.placements.push_back(std::move(*staged));
    }
    return change;
}

}  // namespace

std::optional<std::string> ChangeJournal::write(const PendingChange& change)
{
    PropertyList::Array placements;
    for (const auto& staged : change.placements) {
        placements.push_back(asPropertyList(staged));
    }
    const PropertyList contents = PropertyList::Dictionary{{"placements", std::move(placements)},
                                                           {"removals", arrayOfStrings(change.removals)}};
    return replaceFile(root_.real(font_paths::journal), writeBinaryPropertyList(contents), permissions);
}

std::optional<std::string> ChangeJournal::erase()
{
    const auto path = root_.real(font_paths::journal);
    if (::unlink(path.c_str()) != 0 && errno != ENOENT) {
        const int error = errno;
        return "cannot remove " + path + ": " + errorText(error);
    }
    return flushDirectory(directoryOf(path));
}

ChangeJournal::Reading ChangeJournal::read() const
{
    const auto path = root_.real(font_paths::journal);
    const auto opened = openRegularFile(path);
    if (opened.error == ENOENT) {
        return {};
    }
    if (opened.error != 0) {
        return {.change = {}, .error = "cannot read " + path + ": " + opened.errorText()};
    }
    const auto reading = readPropertyListFromDescriptor(opened.file.get());
    auto change = reading.value ? changeFrom(*reading.value) : std::nullopt;
    if (!change) {
        return {.change = {},
                .error = path + " is not what the font registry writes; look at it, then move it away"};
    }
    return {.change = std::move(change), .error = std::nullopt};
}

}  // namespace typhon
