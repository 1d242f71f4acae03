#include "platform/linux/memory_file.h"

#include <cerrno>
#include <string>

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>

namespace typhon {

namespace {

constexpr int requiredSeals = F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_WRITE;
constexpr unsigned notExecutable = 0x0008U;  // MFD_NOEXEC_SEAL, which older headers lack

bool writeAll(int file, std::span<const std::uint8_t> bytes)
{
    while (!bytes.empty()) {
        const auto written = ::write(file, bytes.data(), bytes.size());
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written <= 0) {
            return false;
        }
        bytes = bytes.subspan(static_cast<std::size_t>(written));
    }
    return true;
}

bool readAll(int file, std::span<std::uint8_t> bytes)
{
    std::size_t offset = 0;
    while (offset < bytes.size()) {
        const auto got =
            ::pread(file, bytes.data() + offset, bytes.size() - offset, static_cast<off_t>(offset));
        if (got < 0 && errno == EINTR) {
            continue;
        }
        if (got <= 0) {
            return false;
        }
        offset += static_cast<std::size_t>(got);
    }
    return true;
}

}  // namespace

FileDescriptor emptyMemoryFile()
{
    constexpr unsigned flags = MFD_CLOEXEC | MFD_ALLOW_SEALING;
    int file = ::memfd_create("typhon", flags | notExecutable);
    if (file < 0 && errno == EINVAL) {
        file = ::memfd_create("typhon", flags);
    }
    return FileDescriptor(file);
}

bool sealMemoryFile(int memoryFile)
{
    return ::fcntl(memoryFile, F_ADD_SEALS, requiredSeals | F_SEAL_SEAL) == 0;
}

FileDescriptor sealedMemoryFile(std::span<const std::uint8_t> bytes)
{
    auto file = emptyMemoryFile();
    if (!file || !writeAll(file.get(), bytes) || !sealMemoryFile(file.get())) {
        return {};
    }
    return file;
}

FileDescriptor reopenedReadOnly(int memoryFile)
{
    const auto path = "/proc/self/fd/" + std::to_string(memoryFile);
    return FileDescriptor(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
}

std::optional<std::vector<std::uint8_t>> contentsOfSealedMemoryFile(int descriptor, std::size_t limit)
{
    // Only memory files have seals at all. Sealed, the size cannot change between here and the reading.
    const int seals = ::fcntl(descriptor, F_GET_SEALS);
    struct stat status = {};
    if (seals < 0 || (seals & requiredSeals) != requiredSeals || ::fstat(descriptor, &status) != 0 ||
        status.st_size < 0 || static_cast<std::uint64_t>(status.st_size) > limit) {
        return std::nullopt;
    }
    std::vector<std::uint8_t> bytes(static_cast<std::size_t>(status.st_size));
    if (!readAll(descriptor, bytes)) {
        return std::nullopt;
    }
    return bytes;
}

void logMissingMemoryFiles(Log& log)
{
    if (!emptyMemoryFile()) {
        TYLog_Error(log, "no memory files on this system: large views travel inside messages, which is slow "
                         "(allow the service the call memfd_create)");
    }
}

}  // namespace typhon
