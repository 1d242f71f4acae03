#include "platform/linux/asset_installation.h"

#include "platform/linux/directory_listing.h"
#include "platform/linux/directory_removal.h"
#include "platform/linux/durable_file.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <cerrno>
#include <utility>

#include <fcntl.h>
#include <linux/openat2.h>
#include <stdio.h>
#include <sys/sendfile.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr std::size_t mostFiles = 4096;
constexpr mode_t directoryPermissions = 0755;
constexpr mode_t filePermissions = 0644;
constexpr int directoryFlags = O_RDONLY | O_DIRECTORY | O_CLOEXEC;

std::optional<std::string> copyFile(int fromDirectory, const std::string& name, int toDirectory)
{
    const auto from = openRegularFile(name, fromDirectory);
    if (from.error != 0 || static_cast<std::uint64_t>(from.status.st_size) > largestAssetFile) {
        return visibleText(name) + ": " + (from.error != 0 ? from.errorText() : "it is too large");
    }
    const FileDescriptor to(
        ::openat(toDirectory, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
    bool isCopied(to);
    for (off_t at = 0; isCopied && at < from.status.st_size;) {
        isCopied = ::sendfile(to.get(), from.file.get(), &at,
                              static_cast<std::size_t>(from.status.st_size - at)) > 0;
    }
    return isCopied ? std::nullopt
                    : std::optional("cannot copy " + visibleText(name) + ": " + errorText(errno));
}

/// Looks at what has been put there, whoever did it, and makes it last.
std::optional<std::string> finishFile(int directory, const std::string& name, const Sha256& listed)
{
    const auto opened = openRegularFile(name, directory, RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS);
    if (opened.error != 0) {
        return visibleText(name) + ": " + opened.errorText();
    }
    if (sha256OfFile(opened.file.get()) != listed) {
        return visibleText(name) + " is not the file that the catalogue lists";
    }
    return ::fchmod(opened.file.get(), filePermissions) == 0 && ::fsync(opened.file.get()) == 0
               ? std::nullopt
               : std::optional("cannot keep " + visibleText(name) + ": " + errorText(errno));
}

std::optional<std::string> finishFiles(int directory, const ListedAsset& listed)
{
    for (const auto& [name, digest] : listed.files) {
        if (auto error = finishFile(directory, name, digest)) {
            return error;
        }
    }
    const auto listing = listDirectory(directory, listed.files.size() + 1);
    return listing.files.size() == listed.files.size() && listing.directories.empty()
               ? std::nullopt
               : std::optional<std::string>("there is more than the catalogue lists");
}

std::optional<std::string> putTogether(const std::string& asset, const ListedAsset& listed,
                                       const FillAsset& fill)
{
    if (auto error = makeDirectories(asset + "/AssetData", directoryPermissions)) {
        return error;
    }
    const FileDescriptor data(::open((asset + "/AssetData").c_str(), directoryFlags));
    auto error = fill(data.get(), listed);
    if (!error) {
        error = finishFiles(data.get(), listed);
    }
    if (!error) {
        error =
            replaceFile(asset + "/Info.plist", writeBinaryPropertyList(listed.attributes), filePermissions);
    }
    return error ? error : flushDirectory(asset + "/AssetData");
}

/// Exchanges with what is installed, so that there is no moment without the asset.
std::optional<std::string> putInPlace(int store, const std::string& temporary, const std::string& assetId)
{
    if (::renameat2(store, temporary.c_str(), store, assetId.c_str(), RENAME_EXCHANGE) != 0 &&
        ::renameat2(store, temporary.c_str(), store, assetId.c_str(), RENAME_NOREPLACE) != 0) {
        return "cannot put " + visibleText(assetId) + " in its place: " + errorText(errno);
    }
    ::fsync(store);
    return std::nullopt;
}

void removeIfThere(int store, const std::string& name)
{
    if (::faccessat(store, name.c_str(), F_OK, AT_SYMLINK_NOFOLLOW) == 0) {
        // What stays begins with a dot, and is no asset.
        [[maybe_unused]] const auto error = removeEntry(store, name);
    }
}

}  // namespace

Result<std::map<std::string, Sha256>> digestsOfFolder(const std::string& folder)
{
    const FileDescriptor directory(::open(folder.c_str(), directoryFlags));
    if (!directory) {
        return {std::nullopt, "cannot open " + visibleText(folder) + ": " + errorText(errno)};
    }
    const auto listing = listDirectory(directory.get(), mostFiles);
    if (listing.isCut || listing.error != 0 || !listing.directories.empty()) {
        return {std::nullopt, visibleText(folder) + " holds folders or too many files"};
    }
    std::map<std::string, Sha256> digests;
    for (const auto& name : listing.files) {
        const auto opened = openRegularFile(name, directory.get());
        const auto digest = opened.error == 0 ? sha256OfFile(opened.file.get()) : std::nullopt;
        if (!digest || !isValidAssetId(name)) {
            return {std::nullopt, visibleText(name) + " cannot be part of an asset"};
        }
        digests.emplace(name, *digest);
    }
    return {std::move(digests), {}};
}

FillAsset fromFolder(std::string folder)
{
    return [folder = std::move(folder)](int directory, const ListedAsset& listed) {
        const FileDescriptor from(::open(folder.c_str(), directoryFlags));
        std::optional<std::string> error;
        if (!from) {
            error = "cannot open " + visibleText(folder) + ": " + errorText(errno);
        }
        for (auto file = listed.files.begin(); !error && file != listed.files.end(); ++file) {
            error = copyFile(from.get(), file->first, directory);
        }
        return error;
    };
}

std::optional<std::string> installAsset(const std::string& store, const std::string& assetId,
                                        const ListedAsset& listed, const FillAsset& fill)
{
    const FileDescriptor directory(::open(store.c_str(), directoryFlags | O_NOFOLLOW));
    if (!directory) {
        return "cannot open the store: " + errorText(errno);
    }
    const auto temporary = ".installing-" + assetId;
    const FileLock lock(store + "/.install.lock");
    if (lock.error()) {
        return lock.error();
    }
    removeIfThere(directory.get(), temporary);
    auto error = putTogether(store + "/" + temporary, listed, fill);
    if (!error) {
        error = putInPlace(directory.get(), temporary, assetId);
    }
    removeIfThere(directory.get(), temporary);
    return error;
}

}  // namespace typhon
