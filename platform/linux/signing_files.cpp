#include "platform/linux/file_descriptor.h"
#include "platform/linux/signing.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

// Where typhonctl puts what it signs and trusts. The daemon only reads these.

namespace typhon {

namespace {

std::string lastError(const std::string& path)
{
    return path + ": " + std::strerror(errno);
}

/// Creates the directories of a logical path that are missing, each for everybody to read.
std::optional<std::string> makeDirectories(const RootDirectory& root, const std::string& logicalPath)
{
    for (auto end = logicalPath.find('/', 1);; end = logicalPath.find('/', end + 1)) {
        const auto path = root.real(logicalPath.substr(0, end));
        if (::mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) {
            return lastError(path);
        }
        if (end == std::string::npos) {
            return std::nullopt;
        }
    }
}

bool writeAll(int file, std::span<const std::uint8_t> bytes)
{
    while (!bytes.empty()) {
        const auto count = ::write(file, bytes.data(), bytes.size());
        if (count < 0 && errno != EINTR) {
            return false;
        }
        bytes = bytes.subspan(static_cast<std::size_t>(count > 0 ? count : 0));
    }
    return ::fchmod(file, 0644) == 0 && ::fsync(file) == 0;
}

/// Replaces `directory`/`name` at once; a reader sees the old file or the new one.
Result<std::string> replaceFile(const RootDirectory& root, const std::string& directory,
                                const std::string& name, std::span<const std::uint8_t> bytes)
{
    if (auto error = makeDirectories(root, directory)) {
        return {std::nullopt, *error};
    }
    const auto logicalPath = directory + "/" + name;
    const auto path = root.real(logicalPath);
    auto temporary = root.real(directory) + "/.new-XXXXXX";
    const FileDescriptor file(::mkostemp(temporary.data(), O_CLOEXEC));
    if (!file) {
        return {std::nullopt, lastError(temporary)};
    }
    if (!writeAll(file.get(), bytes) || ::rename(temporary.c_str(), path.c_str()) != 0) {
        auto error = lastError(path);
        ::unlink(temporary.c_str());
        return {std::nullopt, std::move(error)};
    }
    const FileDescriptor parent(::open(root.real(directory).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (::fsync(parent.get()) != 0) {
        return {std::nullopt, lastError(root.real(directory))};
    }
    return {logicalPath, {}};
}

}  // namespace

Result<std::string> writeSignature(const RootDirectory& root, const SigningKey& key,
                                   const CodeStatement& statement)
{
    const auto signature = makeSignature(key, statement);
    if (!signature.value) {
        return {std::nullopt, signature.error};
    }
    return replaceFile(root, signaturesDirectory, hexOf(statement.executable) + ".plist", *signature.value);
}

Result<std::string> writeTrustedKey(const RootDirectory& root, const TrustedKey& key)
{
    const auto text = encodeTrustedKey(key);
    return replaceFile(root, trustedKeysDirectory, hexOf(key.key.bytes) + ".plist",
                       {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
}

}  // namespace typhon
