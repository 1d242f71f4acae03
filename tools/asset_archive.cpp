#include "tools/asset_archive.h"

#include "platform/linux/file_descriptor.h"
#include "platform/linux/regular_file.h"
#include "platform/linux/visible_text.h"
#include "tools/archive_frames.h"
#include "tools/archive_reader.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <set>
#include <utility>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace typhon {

namespace {

constexpr std::uint64_t mostBytes = std::uint64_t{2} << 30;
constexpr std::size_t longestReason = 500;

/// The process that reads the archive.
class Reader {
public:
    Reader(const FileDescriptor& archive, const std::string& assetId)
    {
        std::array<int, 2> ends{-1, -1};
        if (::pipe2(ends.data(), O_CLOEXEC) != 0) {
            return;
        }
        pipe_ = FileDescriptor(ends[0]);
        const FileDescriptor theirs(ends[1]);
        process_ = ::fork();
        if (process_ == 0) {
            readArchive(archive.get(), theirs.get(), assetId);
        }
    }
    ~Reader()
    {
        if (process_ > 0) {
            ::kill(process_, SIGKILL);
            while (::waitpid(process_, nullptr, 0) < 0 && errno == EINTR) {
            }
        }
    }
    Reader(const Reader&) = delete;
    Reader& operator=(const Reader&) = delete;

    std::optional<ArchiveFrame> next() const
    {
        return process_ > 0 ? readArchiveFrame(pipe_.get()) : std::nullopt;
    }

private:
    FileDescriptor pipe_;
    pid_t process_ = -1;
};

/// Writes what comes to the files it belongs to, and to no others.
class Unpacking {
public:
    Unpacking(int directory, const ListedAsset& listed) : directory_(directory), listed_(listed) {}

    /// Why it does not go on; null when it does.
    std::optional<std::string> take(const ArchiveFrame& frame)
    {
        switch (frame.kind) {
        case ArchiveFrameKind::file:
            return begin(frame.bytes);
        case ArchiveFrameKind::data:
            return write(frame.bytes);
        case ArchiveFrameKind::error:
            return visibleText(frame.bytes, longestReason);
        case ArchiveFrameKind::end:
            break;
        }
        return std::nullopt;
    }

private:
    std::optional<std::string> begin(const std::string& name)
    {
        if (!listed_.files.contains(name)) {
            return "it holds " + visibleText(name, longestReason) +
                   ", which the catalogue does not list for this asset";
        }
        if (!begun_.insert(name).second) {
            return "it holds " + visibleText(name) + " twice";
        }
        bytesOfFile_ = 0;
        file_ = FileDescriptor(
            ::openat(directory_, name.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
        return file_ ? std::nullopt
                     : std::optional("cannot make " + visibleText(name) + ": " + errorText(errno));
    }

    std::optional<std::string> write(const std::string& bytes)
    {
        bytesOfFile_ += bytes.size();
        bytes_ += bytes.size();
        if (!file_ || bytesOfFile_ > largestAssetFile || bytes_ > mostBytes) {
            return "it holds more than an asset may have";
        }
        std::string_view rest = bytes;
        while (!rest.empty()) {
            const auto written = ::write(file_.get(), rest.data(), rest.size());
            if (written <= 0 && errno != EINTR) {
                return "cannot unpack it: " + errorText(errno);
            }
            rest.remove_prefix(written > 0 ? static_cast<std::size_t>(written) : 0);
        }
        return std::nullopt;
    }

    const int directory_;
    const ListedAsset& listed_;
    std::set<std::string> begun_;
    FileDescriptor file_;
    std::uint64_t bytesOfFile_ = 0;
    std::uint64_t bytes_ = 0;
};

std::optional<std::string> unpack(const std::string& path, const std::string& assetId, int directory,
                                  const ListedAsset& listed)
{
    const auto archive = openRegularFile(path);
    if (archive.error != 0) {
        return archive.errorText();
    }
    const Reader reader(archive.file, assetId);
    Unpacking unpacking(directory, listed);
    while (const auto frame = reader.next()) {
        if (frame->kind == ArchiveFrameKind::end) {
            return std::nullopt;
        }
        if (auto error = unpacking.take(*frame)) {
            return error;
        }
    }
    return "it crashes what reads it, or takes too long or too much memory";
}

}  // namespace

FillAsset fromArchive(std::string archive, std::string assetId)
{
    return [archive = std::move(archive), assetId = std::move(assetId)](int directory,
                                                                        const ListedAsset& listed) {
        auto error = unpack(archive, assetId, directory, listed);
        return error ? std::optional(visibleText(archive) + ": " + *error) : std::nullopt;
    };
}

}  // namespace typhon
