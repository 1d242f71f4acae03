#include "platform/linux/installed_applications.h"

#include <cerrno>
#include <string_view>

#include <sys/stat.h>

// A directory's change time says whether names changed in it, which is cheap to ask before every answer. The
// contents of one entry are cheap to read, so they are read when asked for. Metadata is found by what stands
// in it and not by its file's name, so all of it is read once, and again only where a file changed.

namespace typhon {

namespace {

constexpr std::size_t mostNames = 20'000;
constexpr std::size_t mostDirectories = 1'000;
constexpr int deepest = 4;
constexpr std::size_t mostEntryBytes = 1u << 20;
constexpr std::size_t mostMetadataBytes = 4u << 20;
constexpr std::int64_t mostMetadataBytesInAll = 256u << 20;
/// A user's data costs everybody's daemon time.
constexpr std::int64_t mostMetadataBytesOfUser = 32u << 20;
constexpr std::string_view entrySuffix = ".desktop";
constexpr const char* entriesFolder = "applications";

/// Not there, or where it may not lead.
bool isAbsence(int error)
{
    return error == ENOENT || error == ENOTDIR || error == ELOOP || error == EXDEV;
}

bool isPassing(int error)
{
    return error == EMFILE || error == ENFILE || error == ENOMEM || error == EINTR || error == EIO;
}

bool isDenial(int error)
{
    return error == EACCES || error == EPERM;
}

bool isMetadata(std::string_view name)
{
    return name.ends_with(".metainfo.xml") || name.ends_with(".appdata.xml");
}

std::string text(const FileContents& contents)
{
    return {contents.bytes.begin(), contents.bytes.end()};
}

}  // namespace

std::optional<std::string> InstalledApplications::refresh()
{
    if (scan_ && scan_->isComplete && scan_->isSettled && isCurrent()) {
        sawAll_ = !scan_->isCut;
        return scan_->complaint;
    }
    Scan scan;
    scanEntries(entriesFolder, "", 0, scan);
    if (contents_ == Contents::entriesAndMetadata) {
        scanMetadata(scan);
    }
    sawAll_ = scan.isComplete && !scan.isCut;
    auto complaint = scan.complaint;
    if (scan.isComplete || !scan_) {
        scan_ = std::move(scan);
    }
    return complaint;
}

bool InstalledApplications::isCurrent() const
{
    for (const auto& [path, before] : scan_->directories) {
        const auto directory = where_.openDirectory(path);
        struct stat status {};
        const bool isThere = directory && ::fstat(directory.get(), &status) == 0;
        const bool isKnown = isThere || isAbsence(errno);
        if (!isKnown || (isThere ? std::optional(FileIdentity(status)) : std::nullopt) != before) {
            return false;
        }
    }
    return true;
}

/// Lists a directory and notes its state in the scan.
DirectoryListing InstalledApplications::list(const std::string& path, Scan& scan) const
{
    const auto directory = where_.openDirectory(path);
    const int openError = directory ? 0 : errno;
    auto listing = directory ? listDirectory(directory.get(), mostNames) : DirectoryListing{};
    const int error = directory ? listing.error : openError;
    scan.directories[path] = directory ? std::optional(listing.identity) : std::nullopt;
    scan.isSettled = scan.isSettled && (!directory || listing.isSettled);
    if (error != 0 && !isAbsence(error)) {
        scan.isComplete = false;
        scan.complaint = "cannot list " + path + ": " + errorText(error);
    }
    if (listing.isCut) {
        scan.isCut = true;
        scan.complaint =
            path + " holds more than " + std::to_string(mostNames) + " names; the rest is ignored";
    }
    return listing;
}

/// Below the first level an entry's identifier begins with the names of its directories, joined by "-".
void InstalledApplications::scanEntries(const std::string& path, const std::string& identifierPrefix,
                                        int depth, Scan& scan) const
{
    if (depth == deepest || scan.directories.size() == mostDirectories) {
        scan.isCut = true;
        scan.complaint = "directories too deep or too many at " + path + "; they are ignored";
        return;
    }
    const auto listing = list(path, scan);
    for (const std::string_view name : listing.files) {
        const bool fits = scan.entries.size() < mostNames;
        scan.isCut = scan.isCut || !fits;
        if (fits && name.ends_with(entrySuffix) && name.size() > entrySuffix.size()) {
            const auto stem = name.substr(0, name.size() - entrySuffix.size());
            scan.entries.emplace(identifierPrefix + std::string(stem), path + "/" + std::string(name));
        }
    }
    for (const auto& name : listing.directories) {
        scanEntries(path + "/" + name, identifierPrefix + name + "-", depth + 1, scan);
    }
}

void InstalledApplications::scanMetadata(Scan& scan)
{
    const std::string folder = "metainfo";
    std::int64_t budget = where_.isUsers ? mostMetadataBytesOfUser : mostMetadataBytesInAll;
    std::map<std::string, Metadata> kept;
    for (const auto& name : list(folder, scan).files) {
        if (!isMetadata(name)) {
            continue;
        }
        const auto path = folder + "/" + name;
        const auto& metadata = metadataIn(path);
        if ((budget -= metadata.bytes) < 0) {
            scan.complaint = folder + " is too large; what comes after " + name + " is ignored";
            break;
        }
        if (metadata.contents) {
            scan.metadata.emplace(metadata.contents->identifier, path);
        }
        kept.emplace(path, metadata);
    }
    metadata_ = std::move(kept);
}

const InstalledApplications::Metadata& InstalledApplications::metadataIn(const std::string& path)
{
    auto& known = metadata_[path];
    const auto opened = where_.openFile(path);
    const FileIdentity identity(opened.status);
    if (opened.error == 0 && identity == known.identity) {
        return known;
    }
    // A file that changed just now may change again unseen; then it is read again the next time.
    const bool isSettled = identity.isSettled();
    known = Metadata();
    if (opened.error == 0) {
        const auto contents = readWhole(opened.file.get(), mostMetadataBytes);
        known.contents = contents.error == 0 ? parseAppStreamMetadata(text(contents)) : std::nullopt;
        known.bytes = identity.size;
        known.identity = isSettled ? identity : FileIdentity();
    }
    return known;
}

std::optional<DesktopEntry> InstalledApplications::entry(const std::string& bundleIdentifier) const
{
    if (!scan_ || !scan_->entries.contains(bundleIdentifier)) {
        return std::nullopt;
    }
    const auto contents = contentsOfEntry(scan_->entries.at(bundleIdentifier));
    return contents.error == 0 ? parseDesktopEntry(text(contents)) : std::nullopt;
}

bool InstalledApplications::isKnownToBeAbsent(const std::string& bundleIdentifier) const
{
    if (!scan_ || !sawAll_ || where_.isAway()) {
        return false;
    }
    if (!scan_->entries.contains(bundleIdentifier)) {
        return true;
    }
    const auto contents = contentsOfEntry(scan_->entries.at(bundleIdentifier));
    if (contents.error != 0) {
        return !isPassing(contents.error) && !isDenial(contents.error);
    }
    const auto entry = parseDesktopEntry(text(contents));
    return !entry || entry->isPlaceholder;
}

FileContents InstalledApplications::contentsOfEntry(const std::string& path) const
{
    const auto opened = where_.openFile(path);
    if (opened.error != 0) {
        return {.bytes = {}, .error = opened.error};
    }
    return readWhole(opened.file.get(), mostEntryBytes);
}

std::set<std::string> InstalledApplications::identifiers() const
{
    std::set<std::string> identifiers;
    if (!scan_) {
        return identifiers;
    }
    for (const auto& [identifier, path] : scan_->entries) {
        const auto contents = contentsOfEntry(path);
        // What the machine could not do just now says nothing about the application.
        if (contents.error == 0 ? parseDesktopEntry(text(contents)).has_value() : isPassing(contents.error)) {
            identifiers.insert(identifier);
        }
    }
    return identifiers;
}

std::vector<std::string> InstalledApplications::entryDirectories() const
{
    std::vector<std::string> directories;
    if (!scan_) {
        return directories;
    }
    for (const auto& [path, identity] : scan_->directories) {
        if (identity && (path == entriesFolder || path.starts_with(std::string(entriesFolder) + "/"))) {
            directories.push_back(path);
        }
    }
    return directories;
}

std::optional<std::string> InstalledApplications::version(const std::string& bundleIdentifier)
{
    for (const auto& identifier : {bundleIdentifier, bundleIdentifier + std::string(entrySuffix)}) {
        if (!scan_ || !scan_->metadata.contains(identifier)) {
            continue;
        }
        const auto& metadata = metadataIn(scan_->metadata.at(identifier));
        if (metadata.contents && metadata.contents->identifier == identifier) {
            return metadata.contents->version;
        }
    }
    return std::nullopt;
}

}  // namespace typhon
