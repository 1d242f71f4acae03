#include "platform/linux/trusted_directory.h"

#include "platform/linux/regular_file.h"

#include <algorithm>
#include <cerrno>
#include <memory>

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {

namespace {

bool belongsToUs(const struct stat& status)
{
    return (status.st_uid == 0 || status.st_uid == ::geteuid()) &&
           (status.st_mode & (S_IWGRP | S_IWOTH)) == 0;
}

std::string lastError(const std::string& path)
{
    return path + ": " + errorText(errno);
}

/// One step down; the error is empty when there is nothing of that name.
Result<FileDescriptor> openStep(int parent, const std::string& name, const std::string& path)
{
    FileDescriptor next(::openat(parent, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat status;
    if (!next || ::fstat(next.get(), &status) != 0) {
        return {std::nullopt, errno == ENOENT ? "" : lastError(path)};
    }
    if (!belongsToUs(status)) {
        return {std::nullopt, path + " can be changed by others than root and this daemon's user"};
    }
    return {std::move(next), {}};
}

}  // namespace

Result<TrustedDirectory> TrustedDirectory::open(const RootDirectory& root, const std::string& logicalPath)
{
    auto path = root.isScratch() ? root.directory() : std::string("/");
    auto step = openStep(AT_FDCWD, path, path);
    for (std::size_t from = 1; step.value && from < logicalPath.size();) {
        const auto to = std::min(logicalPath.find('/', from), logicalPath.size());
        path = root.real(logicalPath.substr(0, to));
        step = openStep(step.value->get(), logicalPath.substr(from, to - from), path);
        from = to + 1;
    }
    if (!step.value && !step.error.empty()) {
        return {std::nullopt, step.error};
    }
    return {TrustedDirectory(step.value ? std::move(*step.value) : FileDescriptor()), {}};
}

std::vector<std::string> TrustedDirectory::propertyLists() const
{
    std::vector<std::string> names;
    const int again = directory_ ? ::openat(directory_.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC) : -1;
    const std::unique_ptr<DIR, int (*)(DIR*)> listing(again >= 0 ? ::fdopendir(again) : nullptr, ::closedir);
    while (const auto* entry = listing ? ::readdir(listing.get()) : nullptr) {
        const std::string name = entry->d_name;
        if (name.ends_with(".plist") && !name.starts_with(".")) {
            names.push_back(name);
        }
    }
    std::ranges::sort(names);
    return names;
}

Result<Bytes> TrustedDirectory::read(const std::string& name, std::size_t limit) const
{
    const FileDescriptor file(
        ::openat(directory_.get(), name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat status;
    if (!file || ::fstat(file.get(), &status) != 0) {
        return {std::nullopt, errorText(errno)};
    }
    if (!S_ISREG(status.st_mode) || !belongsToUs(status)) {
        return {std::nullopt, "it can be changed by others than root and this daemon's user"};
    }
    auto contents = readWhole(file.get(), limit);
    if (contents.error != 0) {
        return {std::nullopt, errorText(contents.error)};
    }
    return {std::move(contents.bytes), {}};
}

}  // namespace typhon
