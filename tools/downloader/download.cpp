#include "tools/downloader/download.h"

#include "platform/linux/download_wire.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/regular_file.h"
#include "tools/downloader/confinement.h"
#include "tools/downloader/fetch.h"
#include "tools/downloader/url_rules.h"

#include <array>
#include <cerrno>
#include <cstdint>

#include <poll.h>
#include <unistd.h>

// Files that were asked for are opened first, since afterwards nothing more can be: the source, when it is a
// file, and the certificates.

namespace typhon {

namespace {

constexpr std::size_t mostCertificates = 4 << 20;
constexpr std::uint32_t mostProcessorSeconds = 120;

struct Work {
    DownloadUrl url;
    FileDescriptor source;
    FileDescriptor result;
    FetchOptions options;
};

/// True when whoever asked is gone.
bool isGone(int socket)
{
    pollfd event{socket, POLLIN, 0};
    return ::poll(&event, 1, 0) > 0 && (event.revents & (POLLHUP | POLLERR)) != 0;
}

std::string openSource(Work& work)
{
    if (work.url.kind != DownloadUrl::Kind::file) {
        return {};
    }
    auto opened = openRegularFile(work.url.path);
    if (opened.error != 0) {
        return work.url.path + ": " + opened.errorText();
    }
    work.source = std::move(opened.file);
    return {};
}

std::string readCertificates(Work& work, const std::string& path)
{
    if (path.empty()) {
        return {};
    }
    const auto opened = openRegularFile(path);
    auto contents = opened.error == 0 ? readWhole(opened.file.get(), mostCertificates) : FileContents{};
    if (opened.error != 0 || contents.error != 0) {
        return path + ": " + errorText(opened.error != 0 ? opened.error : contents.error);
    }
    work.options.certificates = std::move(contents.bytes);
    return {};
}

std::string prepare(Work& work, const DownloadRequest& request)
{
    auto reading = readUrl(request.url);
    if (!reading.url) {
        return reading.error;
    }
    work.url = *std::move(reading.url);
    work.options.mostBytes = request.mostBytes;
    work.options.bytesPerSecond = request.bytesPerSecond;
    work.options.stallSeconds = request.stallSeconds;
    work.options.totalSeconds = request.totalSeconds;
    if (auto error = openSource(work); !error.empty()) {
        return error;
    }
    if (auto error = readCertificates(work, request.certificates); !error.empty()) {
        return error;
    }
    work.result = emptyMemoryFile();
    return work.result ? std::string() : "there is no memory for it";
}

/// A file grows while it is read, or is on a slow disk; it is read to where it ends.
std::string copyFile(const Work& work)
{
    std::array<char, 64 * 1024> block;
    std::uint64_t kept = 0;
    while (true) {
        const auto count = ::read(work.source.get(), block.data(), block.size());
        if (count <= 0) {
            return count == 0 ? std::string() : errorText(errno);
        }
        kept += static_cast<std::uint64_t>(count);
        if (kept > work.options.mostBytes) {
            return "it is larger than " + std::to_string(work.options.mostBytes) + " bytes";
        }
        if (::write(work.result.get(), block.data(), static_cast<std::size_t>(count)) != count) {
            return "there is no memory for it";
        }
    }
}

}  // namespace

void serveDownload(int socket)
{
    if (!shedInheritance()) {
        return;
    }
    const auto request = receiveDownloadRequest(socket);
    if (!request) {
        return;
    }
    Work work;
    auto error = prepare(work, *request);
    const DownloadLimits limits{.fileBytes = request->mostBytes,
                                .processorSeconds = mostProcessorSeconds,
                                .isPatient = request->bytesPerSecond != 0};
    if (error.empty() && !confineDownload(limits)) {
        error = "the downloader cannot confine itself: " + errorText(errno);
    }
    if (error.empty()) {
        work.options.isUnwanted = [socket] { return isGone(socket); };
        error = work.source ? copyFile(work) : fetch(work.url, work.options, work.result.get());
    }
    sendDownloadAnswer(socket, error, error.empty() ? work.result.get() : -1);
}

}  // namespace typhon
