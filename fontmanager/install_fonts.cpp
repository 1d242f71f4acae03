#include "fontmanager/install_fonts.h"

#include "fontmanager/directory_names.h"
#include "fontmanager/font_names.h"
#include "fontmanager/font_paths.h"
#include "fontmanager/registry_writer.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <array>
#include <cerrno>
#include <cstdint>
#include <filesystem>
#include <set>
#include <span>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

// The copies are read for their names, not the files they were made from, which may change meanwhile. All
// copies are made and read before the first takes its place, all of it under the registry's lock, and the
// registry learns of all of them at once. What a failure or a crash can leave behind is a file that nobody
// lists, or one that begins with ".installing-", which the next installation sweeps away.

namespace typhon {

namespace {

constexpr const char* temporaryPrefix = ".installing-";
constexpr mode_t directoryPermissions = 0755;
constexpr mode_t filePermissions = 0644;
constexpr std::size_t longestFileName = 255;

struct Copy {
    std::string temporary;
    std::string finalPath;
    RegisteredFont font;
};

/// One installation, whose steps run in this order under the registry's lock.
struct Installation {
    std::string logicalDirectory;
    std::string realDirectory;
    bool enabled;
    std::vector<Copy> copies;
};

std::string failure(const std::string& what, const std::string& path)
{
    const int error = errno;
    return "cannot " + what + " " + visibleText(path) + ": " + errorText(error);
}

std::optional<std::string> writeBlock(int file, std::span<const std::uint8_t> block, const std::string& path)
{
    while (!block.empty()) {
        const auto count = ::write(file, block.data(), block.size());
        if (count < 0 && errno != EINTR) {
            return failure("write", path);
        }
        block = block.subspan(count < 0 ? 0 : static_cast<std::size_t>(count));
    }
    return std::nullopt;
}

/// Copies and flushes, within the size that a font may have.
std::optional<std::string> copyContents(int from, int to, const std::string& path)
{
    std::array<std::uint8_t, 64 * 1024> block;
    std::uint64_t copied = 0;
    while (true) {
        const auto count = ::read(from, block.data(), block.size());
        if (count < 0 && errno != EINTR) {
            return failure("read", path);
        }
        if (count == 0) {
            return ::fsync(to) == 0 ? std::nullopt : std::optional(failure("flush the copy of", path));
        }
        const auto bytes = count < 0 ? 0 : static_cast<std::size_t>(count);
        copied += bytes;
        if (copied > FontLimits{}.bytes) {
            return visibleText(path) + " is too large for a font";
        }
        if (auto error = writeBlock(to, std::span(block).first(bytes), path)) {
            return error;
        }
    }
}

std::optional<std::string> copyFont(const std::string& source, Copy& copy)
{
    const auto opened = openRegularFile(source);
    if (opened.error != 0) {
        return "cannot open " + visibleText(source) + ": " + opened.errorText();
    }
    const FileDescriptor target(
        ::open(copy.temporary.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!target || ::fchmod(target.get(), filePermissions) != 0) {
        return failure("create", copy.temporary);
    }
    giveToOwnerOfDirectory(copy.temporary);
    if (auto error = copyContents(opened.file.get(), target.get(), source)) {
        return error;
    }
    auto names = readFontNames(target.get());
    if (!names.familyNames) {
        return visibleText(source) + ": " + names.error;
    }
    copy.font.familyNames = std::move(*names.familyNames);
    return std::nullopt;
}

/// The file name that `source` is installed under, or null when it has none that serves.
std::optional<std::string> fileNameOf(const std::string& source)
{
    const auto name = source.substr(source.rfind('/') + 1);
    const bool serves =
        !name.empty() && name.front() != '.' && name.size() <= longestFileName && name == visibleText(name);
    return serves ? std::optional(name) : std::nullopt;
}

void sweepTemporaries(const std::string& directory)
{
    std::error_code ignored;
    for (const auto& entry : std::filesystem::directory_iterator(directory, ignored)) {
        if (entry.path().filename().string().starts_with(temporaryPrefix)) {
            ::unlink(entry.path().c_str());
        }
    }
}

std::optional<std::string> makeCopies(Installation& installation, const std::vector<std::string>& files)
{
    std::set<std::string> taken;
    for (const auto& source : files) {
        const auto name = fileNameOf(source);
        if (!name) {
            return "a font file needs a plain name that does not begin with \".\": " + visibleText(source);
        }
        if (!taken.insert(*name).second) {
            return "two of the font files have the name " + *name;
        }
        Copy copy{.temporary =
                      installation.realDirectory + "/" + temporaryPrefix + std::to_string(taken.size()),
                  .finalPath = installation.realDirectory + "/" + *name,
                  .font = {.path = installation.logicalDirectory + "/" + *name,
                           .familyNames = {},
                           .disabled = !installation.enabled}};
        if (auto error = copyFont(source, copy)) {
            return error;
        }
        installation.copies.push_back(std::move(copy));
    }
    return std::nullopt;
}

std::optional<std::string> placeCopies(const Installation& installation, PropertyList::Dictionary& entries)
{
    for (const auto& copy : installation.copies) {
        if (::rename(copy.temporary.c_str(), copy.finalPath.c_str()) != 0) {
            return failure("replace", copy.finalPath);
        }
        if (auto error = putFont(entries, copy.font)) {
            return error;
        }
    }
    return flushDirectory(installation.realDirectory);
}

std::optional<std::string> install(Installation& installation, const std::vector<std::string>& files,
                                   PropertyList::Dictionary& entries)
{
    if (auto error = makeDirectories(installation.realDirectory, directoryPermissions)) {
        return error;
    }
    sweepTemporaries(installation.realDirectory);
    auto error = makeCopies(installation, files);
    if (!error) {
        error = placeCopies(installation, entries);
    }
    if (error) {
        sweepTemporaries(installation.realDirectory);
    }
    return error;
}

}  // namespace

std::optional<std::string> fontDirectoryOfProvider(const std::string& identifier)
{
    const auto name = directoryNameFromIdentifier(identifier);
    return name ? std::optional(font_paths::fontFiles + *name) : std::nullopt;
}

FontInstallation installFontFiles(const RootDirectory& root, const std::string& identifier,
                                  const std::vector<std::string>& files, bool enabled)
{
    const auto directory = fontDirectoryOfProvider(identifier);
    if (!directory) {
        return {.paths = {}, .error = "no application can have the identifier " + visibleText(identifier)};
    }
    Installation installation{.logicalDirectory = *directory,
                              .realDirectory = root.real(*directory),
                              .enabled = enabled,
                              .copies = {}};
    auto error = RegistryWriter(root).update(
        [&](PropertyList::Dictionary& entries) { return install(installation, files, entries); });
    if (error) {
        return {.paths = {}, .error = std::move(error)};
    }
    FontInstallation result;
    for (const auto& copy : installation.copies) {
        result.paths.push_back(copy.font.path);
    }
    return result;
}

}  // namespace typhon
