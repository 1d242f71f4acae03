#include "platform/linux/durable_file.h"

#include "platform/linux/regular_file.h"

#include <array>
#include <cerrno>
#include <ctime>
#include <thread>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

// Small files that are replaced, never changed in place: a reader, also one after a power cut, finds the old
// contents or the new ones. The order matters: the contents reach the disk before the name points at them,
// and the name reaches the disk before anybody is told that the change is durable.

namespace typhon {

namespace {

std::string failure(const std::string& what, const std::string& path)
{
    const int error = errno;
    return "cannot " + what + " " + path + ": " + errorText(error);
}

bool writeAll(int file, std::span<const std::uint8_t> contents)
{
    while (!contents.empty()) {
        const auto count = ::write(file, contents.data(), contents.size());
        if (count < 0 && errno != EINTR) {
            return false;
        }
        contents = contents.subspan(count < 0 ? 0 : static_cast<std::size_t>(count));
    }
    return true;
}

/// Dates the contents to a moment before now, by the kernel's clock for the times of files, which moves on by
/// a tick now and then: every later change gives them another time, even one within the same tick.
void dateBeforeNow(int file)
{
    timespec before{};
    ::clock_gettime(CLOCK_REALTIME_COARSE, &before);
    before = before.tv_nsec > 0 ? timespec{before.tv_sec, before.tv_nsec - 1}
                                : timespec{before.tv_sec - 1, 999'999'999};
    const std::array<timespec, 2> times{timespec{0, UTIME_OMIT}, before};
    // Failing, it costs those who look for changes another reading.
    (void)::futimens(file, times.data());
}

std::optional<std::string> writeNewFile(const std::string& path, std::span<const std::uint8_t> contents,
                                        mode_t permissions)
{
    ::unlink(path.c_str());
    const FileDescriptor file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!file) {
        return failure("create", path);
    }
    if (::fchmod(file.get(), permissions) != 0 || !giveToOwnerOfDirectory(path) ||
        !writeAll(file.get(), contents)) {
        return failure("write", path);
    }
    dateBeforeNow(file.get());
    if (::fsync(file.get()) != 0) {
        return failure("write", path);
    }
    return std::nullopt;
}

std::optional<std::string> makeDirectory(const std::string& path, mode_t permissions)
{
    if (::mkdir(path.c_str(), permissions) == 0) {
        ::chmod(path.c_str(), permissions);
        giveToOwnerOfDirectory(path);
        return flushDirectory(directoryOf(path));
    }
    struct stat status {};
    if (errno == EEXIST && ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) {
        return std::nullopt;
    }
    return failure("create directory", path);
}

}  // namespace

FileLock::FileLock(const std::string& path, std::chrono::milliseconds patience)
    : file_(::open(path.c_str(), O_RDONLY | O_CREAT | O_CLOEXEC | O_NOFOLLOW, S_IRUSR | S_IWUSR))
{
    if (!file_) {
        error_ = failure("open lock file", path);
        return;
    }
    giveToOwnerOfDirectory(path);
    const auto deadline = std::chrono::steady_clock::now() + patience;
    // flock cannot wait for a limited time, and a holder that was stopped must not stop its neighbours.
    while (::flock(file_.get(), LOCK_EX | LOCK_NB) != 0) {
        if (errno != EWOULDBLOCK && errno != EINTR) {
            error_ = failure("lock", path);
            return;
        }
        if (std::chrono::steady_clock::now() >= deadline) {
            error_ = "another process holds the lock " + path;
            return;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
}

std::optional<std::string> makeDirectories(const std::string& path, mode_t permissions)
{
    for (auto slash = path.find('/', 1); slash != std::string::npos; slash = path.find('/', slash + 1)) {
        if (auto error = makeDirectory(path.substr(0, slash), permissions)) {
            return error;
        }
    }
    return makeDirectory(path, permissions);
}

std::optional<std::string> prepareReplacement(const std::string& path, std::span<const std::uint8_t> contents,
                                              mode_t permissions)
{
    const auto temporary = replacementOf(path);
    auto error = writeNewFile(temporary, contents, permissions);
    if (error) {
        ::unlink(temporary.c_str());
    }
    return error;
}

std::optional<std::string> finishReplacement(const std::string& path)
{
    const auto temporary = replacementOf(path);
    if (::rename(temporary.c_str(), path.c_str()) != 0) {
        auto error = failure("replace", path);
        ::unlink(temporary.c_str());
        return error;
    }
    return flushDirectory(directoryOf(path));
}

std::string replacementOf(const std::string& path)
{
    return path + ".new";
}

std::optional<std::string> replaceFile(const std::string& path, std::span<const std::uint8_t> contents,
                                       mode_t permissions)
{
    auto error = prepareReplacement(path, contents, permissions);
    return error ? error : finishReplacement(path);
}

std::optional<std::string> flushDirectory(const std::string& path)
{
    const FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory || ::fsync(directory.get()) != 0) {
        return failure("flush directory", path);
    }
    return std::nullopt;
}

bool giveToOwnerOfDirectory(const std::string& path)
{
    struct stat directory {};
    if (::geteuid() != 0 || ::stat(directoryOf(path).c_str(), &directory) != 0 || directory.st_uid == 0) {
        return true;
    }
    return ::lchown(path.c_str(), directory.st_uid, directory.st_gid) == 0;
}

std::string directoryOf(const std::string& path)
{
    const auto slash = path.rfind('/');
    return slash == 0 || slash == std::string::npos ? "/" : path.substr(0, slash);
}

}  // namespace typhon
