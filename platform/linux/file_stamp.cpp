#include "platform/linux/file_stamp.h"

#include <ctime>

#include <fcntl.h>
#include <sys/stat.h>

namespace typhon {

namespace {

FileStamp stampOf(const struct stat& status)
{
    return {status.st_dev,         status.st_ino,          status.st_ctim.tv_sec, status.st_ctim.tv_nsec,
            status.st_mtim.tv_sec, status.st_mtim.tv_nsec, status.st_size};
}

}  // namespace

bool FileStamp::isSettled() const
{
    constexpr std::int64_t step = 50'000'000;
    timespec now{};
    ::clock_gettime(CLOCK_REALTIME, &now);
    const auto age = (now.tv_sec - changeSeconds) * 1'000'000'000 + (now.tv_nsec - changeNanoseconds);
    return age > step;
}

std::optional<FileStamp> stampOfPath(const std::string& path)
{
    struct stat status;
    return ::lstat(path.c_str(), &status) == 0 ? std::optional(stampOf(status)) : std::nullopt;
}

std::optional<FileStamp> stampOfRegularFile(int descriptor)
{
    struct stat status;
    const bool isRegular = ::fstat(descriptor, &status) == 0 && S_ISREG(status.st_mode);
    return isRegular ? std::optional(stampOf(status)) : std::nullopt;
}

}  // namespace typhon
