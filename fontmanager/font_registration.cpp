#include "fontmanager/font_registration.h"

#include "fontmanager/font_paths.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"

#include <algorithm>
#include <cerrno>
#include <span>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

// A passed file can change, shrink or grow while it is read, and its owner may be the reader of what becomes
// of it. So it is copied first, within limits, and everything afterwards is about the copy, which nobody else
// can write to.

namespace typhon {

namespace {

constexpr mode_t filePermissions = 0644;
constexpr std::size_t blockSize = 256 * 1024;
constexpr std::size_t readingsAtOnce = 4;
constexpr std::size_t longestShownName = 300;

std::string failure(const std::string& what)
{
    const int error = errno;
    return "cannot " + what + ": " + errorText(error);
}

std::optional<std::string> objectionTo(int file, std::uint64_t limit)
{
    struct stat status {};
    if (::fstat(file, &status) != 0 || !S_ISREG(status.st_mode)) {
        return "it is not a regular file";
    }
    const int flags = ::fcntl(file, F_GETFL);
    if (flags < 0 || (flags & O_PATH) != 0 || (flags & O_ACCMODE) == O_WRONLY) {
        return "it is not open for reading";
    }
    // Reading waits for as long as a file system in user space wants it to.
    constexpr long userSpaceFileSystem = 0x65735546;
    struct statfs fileSystem {};
    if (::fstatfs(file, &fileSystem) != 0 || fileSystem.f_type == userSpaceFileSystem) {
        return "it lies on a file system in user space; copy it to a local disk first";
    }
    if (static_cast<std::uint64_t>(status.st_size) > limit) {
        return "it is larger than " + std::to_string(limit) + " bytes";
    }
    return std::nullopt;
}

std::optional<std::string> writeBlock(int file, std::span<const char> block)
{
    while (!block.empty()) {
        const auto count = ::write(file, block.data(), block.size());
        if (count < 0 && errno != EINTR) {
            return failure("write its copy");
        }
        block = block.subspan(count < 0 ? 0 : static_cast<std::size_t>(count));
    }
    return std::nullopt;
}

void giveToOwner(int directory, int file)
{
    struct stat above {};
    if (::geteuid() == 0 && ::fstat(directory, &above) == 0 && above.st_uid != 0 &&
        ::fchown(file, above.st_uid, above.st_gid) != 0) {
        // The copy is world-readable none the less.
    }
}

}  // namespace

FontRegistration::FontRegistration(std::unique_ptr<ProviderDirectories::Lease> lease, bool enabled,
                                   std::uint64_t serial, ReadFontNames readNames, RegistrationLimits limits)
    : lease_(std::move(lease)), enabled_(enabled), serial_(serial), readNames_(std::move(readNames)),
      limits_(limits)
{}

FontRegistration::~FontRegistration()
{
    for (const auto& staged : fonts_) {
        ::unlinkat(directory(), staged.temporary.c_str(), 0);
    }
}

std::optional<std::string> FontRegistration::add(const std::string& name, int file)
{
    auto error = font_paths::objectionToFontFileName(name);
    if (!error && fonts_.size() >= limits_.files) {
        error = "a registration takes " + std::to_string(limits_.files) + " files at most";
    }
    if (!error && !names_.insert(name).second) {
        error = "two of the files have this name";
    }
    if (!error) {
        error = objectionTo(file, limits_.fileBytes);
    }
    if (!error) {
        error = stage(name, file);
    }
    if (error) {
        return visibleText(name, longestShownName) + ": " + *error;
    }
    return readings_.size() > readingsAtOnce ? takeNames() : std::nullopt;
}

std::string FontRegistration::nameOf(const StagedFont& staged) const
{
    return visibleText(staged.font.path.substr(staged.font.path.rfind('/') + 1), longestShownName);
}

/// Waits for the oldest reading.
std::optional<std::string> FontRegistration::takeNames()
{
    auto& staged = fonts_[readings_.front().font];
    auto reading = readings_.front().names.get();
    readings_.pop_front();
    if (!reading.familyNames) {
        return nameOf(staged) + ": " + reading.error;
    }
    staged.font.familyNames = std::move(*reading.familyNames);
    return std::nullopt;
}

std::optional<std::string> FontRegistration::finish()
{
    while (!readings_.empty()) {
        if (auto error = takeNames()) {
            return error;
        }
    }
    for (; flushed_ < fonts_.size(); ++flushed_) {
        const auto& staged = fonts_[flushed_];
        const FileDescriptor file(
            ::openat(directory(), staged.temporary.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
        if (!file || ::fdatasync(file.get()) != 0) {
            return nameOf(staged) + ": " + failure("flush its copy");
        }
    }
    return std::nullopt;
}

std::optional<std::string> FontRegistration::stage(const std::string& name, int file)
{
    StagedFont staged{.temporary =
                          temporaryPrefix + std::to_string(serial_) + "-" + std::to_string(fonts_.size()),
                      .font = {.path = std::string(font_paths::fontFiles) + lease_->name() + "/" + name,
                               .familyNames = {},
                               .disabled = !enabled_}};
    FileDescriptor target(::openat(directory(), staged.temporary.c_str(),
                                   O_RDWR | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!target) {
        return failure("make its copy");
    }
    fonts_.push_back(std::move(staged));
    giveToOwner(directory(), target.get());
    if (::fchmod(target.get(), filePermissions) != 0) {
        return failure("make its copy readable");
    }
    if (auto error = copy(file, target.get())) {
        return error;
    }
    readings_.push_back(
        {fonts_.size() - 1, std::async(std::launch::async, [this, copied = std::move(target)] {
             return readNames_(copied.get());
         })});
    return std::nullopt;
}

std::optional<std::string> FontRegistration::copy(int from, int to)
{
    std::vector<char> block(blockSize);
    std::uint64_t copied = 0;
    while (true) {
        const auto count = ::pread(from, block.data(), block.size(), static_cast<off_t>(copied));
        if (count < 0 && errno != EINTR) {
            return failure("read it");
        }
        if (count == 0) {
            // Not waited for: the disk is busy with it while the next file comes.
            ::sync_file_range(to, 0, 0, SYNC_FILE_RANGE_WRITE);
            return std::nullopt;
        }
        const auto bytes = count < 0 ? 0 : static_cast<std::size_t>(count);
        copied += bytes;
        bytes_ += bytes;
        if (copied > limits_.fileBytes) {
            return "it is larger than " + std::to_string(limits_.fileBytes) + " bytes";
        }
        if (bytes_ > limits_.allBytes) {
            return "the files of one registration are larger than " + std::to_string(limits_.allBytes) +
                   " bytes together";
        }
        if (auto error = writeBlock(to, std::span(block).first(bytes))) {
            return error;
        }
    }
}

}  // namespace typhon
