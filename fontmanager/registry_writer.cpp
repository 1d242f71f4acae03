#include "fontmanager/registry_writer.h"

#include "fontmanager/font_paths.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <cerrno>
#include <span>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr mode_t directoryPermissions = 0755;
/// The names of installed fonts are nobody's business but the daemon's.
constexpr mode_t registryPermissions = 0600;

struct Registry {
    PropertyList::Dictionary entries;
    std::optional<std::string> error;
};

Registry readRegistry(const std::string& path)
{
    const auto opened = openRegularFile(path);
    if (opened.error == ENOENT) {
        return {};
    }
    if (opened.error != 0) {
        return {.entries = {}, .error = "cannot read " + path + ": " + opened.errorText()};
    }
    const auto reading = readPropertyListFromDescriptor(opened.file.get());
    const auto* entries = reading.value ? reading.value->asDictionary() : nullptr;
    if (entries == nullptr) {
        return {.entries = {},
                .error = "the font registry " + path + " is malformed (" +
                         (reading.value ? "not a dictionary" : reading.error) +
                         "); move it away or repair it, then try again"};
    }
    return {.entries = *entries, .error = std::nullopt};
}

std::vector<std::uint8_t> encode(PropertyList::Dictionary entries, RegistryWriter::Format format)
{
    const PropertyList root(std::move(entries));
    if (format == RegistryWriter::Format::binary) {
        return writeBinaryPropertyList(root);
    }
    const auto text = writeXmlPropertyList(root);
    return {text.begin(), text.end()};
}

/// The entry under `path`, to be changed; empty when there is none, or none that makes sense.
PropertyList::Dictionary entryOf(const PropertyList::Dictionary& entries, const std::string& path)
{
    const auto found = entries.find(path);
    const auto* entry = found == entries.end() ? nullptr : found->second.asDictionary();
    return entry == nullptr ? PropertyList::Dictionary{} : *entry;
}

}  // namespace

std::optional<std::string> putFont(PropertyList::Dictionary& entries, const RegisteredFont& font)
{
    if (!font.path.starts_with('/') || font.path != visibleText(font.path)) {
        return "a font path is absolute and plain text: " + visibleText(font.path);
    }
    auto entry = entryOf(entries, font.path);
    entry.insert_or_assign("familyName",
                           PropertyList::Dictionary(font.familyNames.begin(), font.familyNames.end()));
    entry.insert_or_assign("disabled", font.disabled);
    entries.insert_or_assign(font.path, std::move(entry));
    return std::nullopt;
}

RegistryWriter::RegistryWriter(RootDirectory root, Format format) : root_(std::move(root)), format_(format) {}

std::optional<std::string> RegistryWriter::update(const Change& change, const Step& beforeReplacing)
{
    const auto path = root_.real(font_paths::registry);
    if (auto error = makeDirectories(directoryOf(path), directoryPermissions)) {
        return error;
    }
    const FileLock lock(path + ".lock");
    if (lock.error()) {
        return lock.error();
    }
    auto registry = readRegistry(path);
    if (registry.error) {
        return registry.error;
    }
    const auto before = registry.entries;
    if (auto error = change(registry.entries)) {
        return error;
    }
    if (!beforeReplacing && registry.entries == before) {
        return std::nullopt;
    }
    auto error = prepareReplacement(path, encode(std::move(registry.entries), format_), registryPermissions);
    if (!error && beforeReplacing) {
        error = beforeReplacing();
    }
    error = error ? error : markUnreported();
    return error ? error : finishReplacement(path);
}

/// Not flushed: whoever would have to hear of it does not survive a loss of power either.
std::optional<std::string> RegistryWriter::markUnreported() const
{
    const auto path = root_.real(font_paths::unreported);
    const FileDescriptor mark(
        ::open(path.c_str(), O_CREAT | O_WRONLY | O_CLOEXEC | O_NOFOLLOW, registryPermissions));
    const int error = errno;
    return mark ? std::nullopt : std::optional("cannot make " + path + ": " + errorText(error));
}

bool RegistryWriter::isUnreported() const
{
    return ::access(root_.real(font_paths::unreported).c_str(), F_OK) == 0;
}

void RegistryWriter::wasReported()
{
    ::unlink(root_.real(font_paths::unreported).c_str());
}

std::optional<std::string> RegistryWriter::add(const std::vector<RegisteredFont>& fonts)
{
    return update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
        for (const auto& font : fonts) {
            if (auto error = putFont(entries, font)) {
                return error;
            }
        }
        return std::nullopt;
    });
}

std::optional<std::string> RegistryWriter::remove(const std::vector<std::string>& paths)
{
    return update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
        for (const auto& path : paths) {
            entries.erase(path);
        }
        return std::nullopt;
    });
}

std::optional<std::string> RegistryWriter::setDisabled(const std::vector<std::string>& paths, bool disabled)
{
    return update([&](PropertyList::Dictionary& entries) -> std::optional<std::string> {
        for (const auto& path : paths) {
            if (!entries.contains(path)) {
                return "no such font in the registry: " + path;
            }
            auto entry = entryOf(entries, path);
            entry.insert_or_assign("disabled", disabled);
            entries.insert_or_assign(path, std::move(entry));
        }
        return std::nullopt;
    });
}

}  // namespace typhon
