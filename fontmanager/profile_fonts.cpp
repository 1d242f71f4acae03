#include "fontmanager/profile_fonts.h"

#include "fontmanager/font_paths.h"
#include "platform/linux/directory_listing.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <utility>

#include <fcntl.h>
#include <linux/openat2.h>

namespace typhon {

namespace {

constexpr mode_t recordPermissions = 0600;
constexpr std::size_t mostFiles = 4096;
constexpr unsigned deepest = 8;

/// The font files below an open directory, as paths relative to it. Symbolic links are left out.
void collect(int directory, const std::string& prefix, unsigned depth, std::vector<std::string>& found)
{
    const auto listing = listDirectory(directory, mostFiles);
    for (const auto& name : listing.files) {
        if (found.size() < mostFiles && !font_paths::objectionToFontFileName(name)) {
            found.push_back(prefix + name);
        }
    }
    for (const auto& name : listing.directories) {
        const FileDescriptor below(
            ::openat(directory, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
        if (below && depth < deepest && name == visibleText(name)) {
            collect(below.get(), prefix + name + "/", depth + 1, found);
        }
    }
}

RegistryChange difference(const PropertyList::Dictionary& before, const PropertyList::Dictionary& after)
{
    RegistryChange change;
    for (const auto& [path, entry] : after) {
        const auto found = before.find(path);
        if (found == before.end() || !(found->second == entry)) {
            change.available.push_back(path);
        }
    }
    for (const auto& [path, entry] : before) {
        if (!after.contains(path)) {
            change.gone.push_back(path);
        }
    }
    change.isRegistryChanged = !change.available.empty() || !change.gone.empty();
    return change;
}

}  // namespace

PropertyList fontRecordIn(const OpenedFile& opened)
{
    if (opened.error != 0) {
        return PropertyList::Dictionary{};
    }
    auto reading = readPropertyListFromDescriptor(opened.file.get());
    const bool isRecord = reading.value && reading.value->asDictionary() != nullptr;
    return isRecord ? std::move(*reading.value) : PropertyList(PropertyList::Dictionary{});
}

PropertyList readFontRecord(const RootDirectory& root, const char* logicalPath)
{
    return fontRecordIn(openRegularFile(root.real(logicalPath)));
}

PropertyList::Dictionary ProfileFonts::readFonts()
{
    PropertyList::Dictionary fonts;
    const FileDescriptor directory(
        ::open(root_.real(font_paths::managedFonts).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    std::vector<std::string> files;
    if (directory) {
        collect(directory.get(), "", 0, files);
    }
    for (const auto& file : files) {
        const auto opened = openRegularFile(file, directory.get(),
                                            RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS | RESOLVE_NO_MAGICLINKS);
        auto names = opened.error == 0 ? readNames_(opened.file.get())
                                       : FontNamesReading{.familyNames = {}, .error = opened.errorText()};
        if (!names.familyNames) {
            TYLog_Error(log_, "the profile font " + visibleText(file) + " is left out: " + names.error);
            continue;
        }
        fonts.emplace(
            font_paths::managedFonts + file,
            PropertyList::Dictionary{{"familyName", PropertyList::Dictionary(names.familyNames->begin(),
                                                                             names.familyNames->end())}});
    }
    return fonts;
}

RegistryChangeOutcome ProfileFonts::synchronize()
{
    const std::lock_guard lock(mutex_);
    const auto before = readFontRecord(root_, font_paths::profileFonts);
    auto after = readFonts();
    auto change = difference(*before.asDictionary(), after);
    if (!change.isRegistryChanged) {
        return {};
    }
    auto error = replaceFile(root_.real(font_paths::profileFonts), writeBinaryPropertyList(std::move(after)),
                             recordPermissions);
    return error ? RegistryChangeOutcome{.change = {}, .error = std::move(error)}
                 : RegistryChangeOutcome{.change = std::move(change), .error = std::nullopt};
}

}  // namespace typhon
