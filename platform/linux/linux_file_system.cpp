#include "platform/linux/linux_file_system.h"

#include "platform/linux/linux_confined_deletion.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/regular_file.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <memory>
#include <string_view>

#include <dirent.h>
#include <sys/stat.h>

namespace typhon {

namespace {

struct DirectoryCloser {
    void operator()(DIR* directory) const { ::closedir(directory); }
};

PropertyListReading failure(std::string error)
{
    return {.value = std::nullopt, .error = std::move(error)};
}

}  // namespace

/// Null for what is no path: the system would read a shorter one, or one below the working directory.
std::optional<std::string> LinuxFileSystem::realPath(const std::string& path) const
{
    const bool isPath = path.starts_with('/') && path.find('\0') == std::string::npos;
    return isPath ? std::optional(root_.real(path)) : std::nullopt;
}

bool LinuxFileSystem::exists(const std::string& path)
{
    const auto real = realPath(path);
    struct stat status {};
    return real && ::stat(real->c_str(), &status) == 0;
}

PropertyListReading LinuxFileSystem::readPropertyList(const std::string& path)
{
    const auto real = realPath(path);
    if (!real) {
        return failure("not an absolute path");
    }
    const auto watched = slowReads_ != nullptr ? slowReads_->watch(path) : nullptr;
    const auto opened = openRegularFile(*real);
    if (opened.error != 0) {
        return failure(opened.errorText());
    }
    const PropertyListLimits limits;
    if (static_cast<std::uint64_t>(opened.status.st_size) > limits.bytes) {
        return failure("larger than " + std::to_string(limits.bytes) + " bytes");
    }
    return readPropertyListFromDescriptor(opened.file.get(), limits);
}

std::optional<std::vector<std::string>> LinuxFileSystem::contentsOfDirectory(const std::string& path)
{
    const auto real = realPath(path);
    const std::unique_ptr<DIR, DirectoryCloser> directory(real ? ::opendir(real->c_str()) : nullptr);
    if (!directory) {
        return std::nullopt;
    }
    std::vector<std::string> names;
    errno = 0;
    while (const auto* entry = ::readdir(directory.get())) {
        const std::string_view name = entry->d_name;
        if (name != "." && name != "..") {
            names.emplace_back(name);
        }
        errno = 0;
    }
    if (errno != 0) {
        return std::nullopt;
    }
    std::ranges::sort(names);
    return names;
}

std::unique_ptr<ConfinedDeletion> LinuxFileSystem::deletionBelow(const std::string& tree)
{
    return std::make_unique<LinuxConfinedDeletion>(root_, tree);
}

}  // namespace typhon
