#include "platform/linux/signature_store.h"

#include "platform/linux/code_signature.h"
#include "platform/linux/mount_identifier.h"
#include "platform/linux/trusted_directory.h"

#include <fcntl.h>
#include <sys/vfs.h>

namespace typhon {

namespace {

constexpr std::uint64_t executableLimit = std::uint64_t{1} << 30;
/// A file system in user space answers whenever and whatever its owner likes.
constexpr long fuse = 0x65735546;

std::string fileNameFor(const Sha256& executable)
{
    return hexOf(executable) + ".plist";
}

/// The statement of a signature file, if it counts.
Result<CodeStatement> believedStatement(const Bytes& bytes, const Sha256& executable,
                                        const std::vector<TrustedKey>& keys)
{
    const auto signature = decodeSignature(bytes);
    if (!signature.value) {
        return {std::nullopt, signature.error};
    }
    auto statement = verifiedStatement(*signature.value);
    if (!statement.value) {
        return statement;
    }
    if (statement.value->executable != executable) {
        return {std::nullopt, "it is for another executable"};
    }
    if (!isTrusted(keys, signature.value->key, *statement.value)) {
        return {std::nullopt, "its key is not trusted to sign it"};
    }
    return statement;
}

}  // namespace

CodeSigningTask SignatureStore::read(const Sha256& executable, const std::vector<TrustedKey>& keys)
{
    const auto name = fileNameFor(executable);
    const auto directory = TrustedDirectory::open(root_, signaturesDirectory);
    const auto bytes = directory.value ? directory.value->read(name, signatureFileLimit)
                                       : Result<Bytes>{std::nullopt, directory.error};
    auto statement = bytes.value ? believedStatement(*bytes.value, executable, keys)
                                 : Result<CodeStatement>{std::nullopt, bytes.error};
    if (!statement.value) {
        TYLog_Error(log_, "signature " + name + " does not count: " + statement.error);
        return {};
    }
    return {std::move(statement.value->identifier), std::move(statement.value->entitlements)};
}

CodeSigningTask SignatureStore::taskOfExecutable(const Sha256& executable)
{
    struct stat status;
    const auto path = root_.real(signaturesDirectory) + "/" + fileNameFor(executable);
    if (::lstat(path.c_str(), &status) != 0) {
        return {};
    }
    const FileIdentity file(status);
    const bool isSettled = file.isSettled();
    const auto keys = keys_.current();
    {
        const std::lock_guard lock(mutex_);
        auto known = known_.find(executable);
        if (known && known->file == file && known->keys == keys) {
            return std::move(known->task);
        }
    }
    auto task = read(executable, *keys);
    if (isSettled) {
        const std::lock_guard lock(mutex_);
        known_.store(executable, {file, keys, task});
    }
    return task;
}

std::optional<SignatureStore::FileOnMount> SignatureStore::executableAt(int directory, const char* name)
{
    struct statx status;
    const int flags = *name == '\0' ? AT_EMPTY_PATH : 0;
    if (::statx(directory, name, flags, STATX_BASIC_STATS | STATX_MNT_ID_UNIQUE, &status) != 0 ||
        !S_ISREG(status.stx_mode) || status.stx_size > executableLimit) {
        return std::nullopt;
    }
    const bool hasMount = (status.stx_mask & STATX_MNT_ID_UNIQUE) != 0;
    return FileOnMount{FileIdentity(status), hasMount ? status.stx_mnt_id : 0};
}

std::optional<Sha256> SignatureStore::knownDigest(const FileOnMount& executable)
{
    const std::lock_guard lock(mutex_);
    return digests_.find(executable);
}

SignatureStore::Executable SignatureStore::executableOf(int processDirectory)
{
    // Without opening it, which takes longer than all the rest. A mount that has a known file is none of
    // those that the digest of a file is never kept of.
    const auto seen = executableAt(processDirectory, "exe");
    auto known = seen && seen->mount != 0 ? knownDigest(*seen) : std::nullopt;
    if (known) {
        return {known, {}};
    }
    return {std::nullopt,
            FileDescriptor(::openat(processDirectory, "exe", O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY))};
}

std::optional<Sha256> SignatureStore::digestOf(const Executable& executable)
{
    return executable.digest || !executable.file ? executable.digest
                                                 : digestOfExecutable(executable.file.get());
}

std::optional<Sha256> SignatureStore::digestOfExecutable(int descriptor)
{
    struct statfs fileSystem;
    if (::fstatfs(descriptor, &fileSystem) != 0 || fileSystem.f_type == fuse) {
        return std::nullopt;
    }
    const auto seen = executableAt(descriptor, "");
    if (!seen) {
        return std::nullopt;
    }
    const bool isSettled = seen->file.isSettled();
    if (const auto known = knownDigest(*seen)) {
        return known;
    }
    const auto digest = sha256OfFile(descriptor);
    if (!digest || executableAt(descriptor, "") != seen) {
        return std::nullopt;
    }
    if (isSettled) {
        const std::lock_guard lock(mutex_);
        digests_.store(*seen, *digest);
    }
    return digest;
}

}  // namespace typhon
