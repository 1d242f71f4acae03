#include "tools/archive_reader.h"

#include "platform/linux/asset_installation.h"
#include "platform/linux/syscall_filter.h"
#include "tools/archive_frames.h"

#include <array>
#include <cerrno>
#include <clocale>
#include <limits>
#include <memory>
#include <optional>

#include <archive.h>
#include <archive_entry.h>
#include <linux/capability.h>
#include <sys/mman.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

// Archives come from anywhere, and so does whoever has taken over what reads one: it is left with a
// descriptor of the archive, a pipe, and memory. The rules about names here are for telling people what is
// wrong; that a file is one of the asset's is decided at the other end of the pipe.

namespace typhon {

namespace {

using Kind = SyscallFilter::Condition::Kind;

constexpr int archiveDescriptor = 0;
constexpr int pipeDescriptor = 1;
constexpr rlim_t mostMemory = rlim_t{512} << 20;
constexpr rlim_t mostSeconds = 60;

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool isSanitized = true;
#else
constexpr bool isSanitized = false;
#endif

bool limit(int resource, rlim_t value)
{
    const rlimit limits{value, value};
    return ::setrlimit(static_cast<__rlimit_resource_t>(resource), &limits) == 0;
}

/// Their runtimes have locks and stacks for signals of their own.
void allowSanitizers(SyscallFilter& filter)
{
    if (!isSanitized) {
        return;
    }
    for (const long call : {SYS_sigaltstack, SYS_rt_sigprocmask, SYS_rt_sigaction, SYS_gettid, SYS_getpid,
                            SYS_sched_yield, SYS_nanosleep, SYS_clock_nanosleep}) {
        filter.allow(call);
    }
}

bool confine(int archive, int pipe)
{
    __user_cap_header_struct header{_LINUX_CAPABILITY_VERSION_3, 0};
    __user_cap_data_struct nothing[_LINUX_CAPABILITY_U32S_3]{};
    const bool isBare = ::dup2(archive, archiveDescriptor) >= 0 && ::dup2(pipe, pipeDescriptor) >= 0 &&
                        ::close_range(pipeDescriptor + 1, std::numeric_limits<unsigned>::max(), 0) == 0 &&
                        ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
                        ::prctl(PR_SET_DUMPABLE, 0, 0, 0, 0) == 0 &&
                        ::syscall(SYS_capset, &header, nothing) == 0;
    // The sanitizers reserve terabytes for their books.
    const bool isLimited = (isSanitized || limit(RLIMIT_AS, mostMemory)) && limit(RLIMIT_CPU, mostSeconds) &&
                           limit(RLIMIT_FSIZE, 0) && limit(RLIMIT_CORE, 0) && limit(RLIMIT_NOFILE, 0);
    SyscallFilter filter;
    filter.allow(SYS_pread64, {{0, Kind::equals, archiveDescriptor}})
        .allow(SYS_write, {{0, Kind::equals, pipeDescriptor}})
        .allow(SYS_mmap, {{2, Kind::hasNone, PROT_EXEC}, {3, Kind::hasAll, MAP_ANONYMOUS}});
    for (const long call :
         {SYS_brk, SYS_munmap, SYS_mremap, SYS_madvise, SYS_futex, SYS_sysinfo, SYS_exit_group}) {
        filter.allow(call);
    }
    allowSanitizers(filter);
    return isBare && isLimited && filter.installRefusing() == 0;
}

/// What the library reads, from wherever it is.
struct Input {
    off_t at = 0;
    std::array<char, 64 << 10> block{};
};

la_ssize_t onRead(archive*, void* data, const void** block)
{
    auto& input = *static_cast<Input*>(data);
    const auto got = ::pread64(archiveDescriptor, input.block.data(), input.block.size(), input.at);
    input.at += got > 0 ? got : 0;
    *block = input.block.data();
    return got;
}

void say(ArchiveFrameKind kind, std::string_view bytes)
{
    if (!writeArchiveFrame(pipeDescriptor, kind, bytes.substr(0, longestArchiveFrame))) {
        ::_exit(1);
    }
}

[[noreturn]] void giveUp(const std::string& why)
{
    say(ArchiveFrameKind::error, why);
    ::_exit(1);
}

/// The plain name of an entry: without "./" before it, and without the folder of the asset.
std::string nameWithin(std::string path, const std::string& assetId)
{
    while (path.starts_with("./")) {
        path.erase(0, 2);
    }
    while (path.ends_with('/')) {
        path.pop_back();
    }
    if (path == "." || path == assetId) {
        return {};
    }
    return path.starts_with(assetId + "/") ? path.substr(assetId.size() + 1) : path;
}

void checkEntry(archive_entry* entry, const std::string& path, const std::string& name)
{
    if (path.starts_with('/') || name.find('/') != std::string::npos || name == "..") {
        giveUp("it holds " + path + ", which is in another folder");
    }
    const bool isPlain =
        ::archive_entry_filetype(entry) == AE_IFREG && ::archive_entry_hardlink(entry) == nullptr;
    if (!isPlain) {
        giveUp("it holds " + path + ", which is no plain file");
    }
    if (::archive_entry_size_is_set(entry) != 0 &&
        static_cast<std::uint64_t>(::archive_entry_size(entry)) > largestAssetFile) {
        giveUp("it holds " + path + ", which is too large");
    }
}

void copyData(archive* reader)
{
    std::array<char, 32 << 10> block;
    while (true) {
        const auto got = ::archive_read_data(reader, block.data(), block.size());
        if (got < 0) {
            giveUp(std::string("it is broken: ") + ::archive_error_string(reader));
        }
        if (got == 0) {
            return;
        }
        say(ArchiveFrameKind::data, {block.data(), static_cast<std::size_t>(got)});
    }
}

void copyEntries(archive* reader, const std::string& assetId)
{
    archive_entry* entry = nullptr;
    int result = ARCHIVE_OK;
    while ((result = ::archive_read_next_header(reader, &entry)) == ARCHIVE_OK || result == ARCHIVE_WARN) {
        const char* text = ::archive_entry_pathname(entry);
        const std::string path = text != nullptr ? text : "a file without a name";
        const auto name = nameWithin(path, assetId);
        if (name.empty() && ::archive_entry_filetype(entry) == AE_IFDIR) {
            continue;
        }
        checkEntry(entry, path, name);
        say(ArchiveFrameKind::file, name);
        copyData(reader);
    }
    if (result != ARCHIVE_EOF) {
        const char* text = ::archive_error_string(reader);
        giveUp(std::string("it is no tar archive, or broken: ") + (text != nullptr ? text : "unknown"));
    }
    say(ArchiveFrameKind::end, {});
}

}  // namespace

void readArchive(int archive, int pipe, const std::string& assetId)
{
    // Names in archives are UTF-8; the library would otherwise convert them to the alphabet of the locale.
    std::setlocale(LC_CTYPE, "C.UTF-8");
    const std::unique_ptr<::archive, decltype(&::archive_read_free)> reader(::archive_read_new(),
                                                                            ::archive_read_free);
    Input input;
    if (!reader || !confine(archive, pipe)) {
        writeArchiveFrame(pipe, ArchiveFrameKind::error, "what reads it cannot confine itself");
        ::_exit(1);
    }
    ::archive_read_support_format_tar(reader.get());
    ::archive_read_support_filter_gzip(reader.get());
    ::archive_read_support_filter_bzip2(reader.get());
    ::archive_read_support_filter_xz(reader.get());
    ::archive_read_support_filter_zstd(reader.get());
    if (::archive_read_open(reader.get(), &input, nullptr, onRead, nullptr) != ARCHIVE_OK) {
        giveUp(std::string("it is no tar archive: ") + ::archive_error_string(reader.get()));
    }
    copyEntries(reader.get(), assetId);
    ::_exit(0);
}

}  // namespace typhon
