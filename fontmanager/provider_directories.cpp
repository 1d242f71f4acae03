#include "fontmanager/provider_directories.h"

#include "fontmanager/font_paths.h"
#include "platform/linux/directory_listing.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/regular_file.h"

#include <cerrno>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr mode_t directoryPermissions = 0755;
constexpr std::size_t mostProviders = 1U << 20;

std::string failure(const std::string& what, const std::string& name)
{
    const int error = errno;
    return "cannot " + what + " the font directory " + name + ": " + errorText(error);
}

/// Files that root makes belong to whoever owns the directory they are in, as everything there does.
void giveToOwner(int directory, const std::string& name)
{
    struct stat above {};
    if (::geteuid() == 0 && ::fstat(directory, &above) == 0 && above.st_uid != 0) {
        ::fchownat(directory, name.c_str(), above.st_uid, above.st_gid, AT_SYMLINK_NOFOLLOW);
    }
}

std::optional<std::string> makeDirectory(int fontFiles, const std::string& name)
{
    if (::mkdirat(fontFiles, name.c_str(), directoryPermissions) != 0) {
        return errno == EEXIST ? std::nullopt : std::optional(failure("make", name));
    }
    ::fchmodat(fontFiles, name.c_str(), directoryPermissions, 0);
    giveToOwner(fontFiles, name);
    return flushOpenDirectory(fontFiles, name);
}

}  // namespace

std::optional<std::string> flushOpenDirectory(int directory, const std::string& name)
{
    return ::fsync(directory) == 0 ? std::nullopt : std::optional(failure("flush", name));
}

FileDescriptor ProviderDirectories::openFontFiles() const
{
    auto path = root_.real(font_paths::fontFiles);
    path.pop_back();
    FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!directory && errno == ENOENT && !makeDirectories(path, directoryPermissions)) {
        directory = FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    }
    return directory;
}

ProviderDirectories::Opening ProviderDirectories::open(const std::string& name, bool create)
{
    const std::lock_guard lock(mutex_);
    const auto fontFiles = openFontFiles();
    if (!fontFiles) {
        return {nullptr, failure("open", font_paths::fontFiles)};
    }
    if (create) {
        if (auto error = makeDirectory(fontFiles.get(), name)) {
            return {nullptr, std::move(error)};
        }
    }
    FileDescriptor directory(
        ::openat(fontFiles.get(), name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!directory) {
        return {nullptr, failure("open", name)};
    }
    ++leases_[name];
    Opening opening;
    opening.lease = std::make_unique<Lease>(*this, name, std::move(directory));
    return opening;
}

void ProviderDirectories::leave(const std::string& name)
{
    const std::lock_guard lock(mutex_);
    const auto found = leases_.find(name);
    if (--found->second > 0) {
        return;
    }
    leases_.erase(found);
    const auto fontFiles = openFontFiles();
    // Fails, as it should, unless the directory is empty.
    ::unlinkat(fontFiles.get(), name.c_str(), AT_REMOVEDIR);
}

std::vector<std::string> ProviderDirectories::names()
{
    const auto fontFiles = openFontFiles();
    return fontFiles ? listDirectory(fontFiles.get(), mostProviders).directories : std::vector<std::string>();
}

}  // namespace typhon
