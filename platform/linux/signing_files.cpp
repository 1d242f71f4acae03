#include "platform/linux/durable_file.h"
#include "platform/linux/signing.h"

// Where typhonctl puts what it signs and trusts. The daemon only reads these.

namespace typhon {

namespace {

Result<std::string> store(const RootDirectory& root, const std::string& directory, const std::string& name,
                          std::span<const std::uint8_t> contents)
{
    if (auto error = makeDirectories(root.real(directory), 0755)) {
        return {std::nullopt, *error};
    }
    const FileLock lock(root.real(directory) + "/.lock");
    if (lock.error()) {
        return {std::nullopt, *lock.error()};
    }
    auto logicalPath = directory + "/" + name;
    if (auto error = replaceFile(root.real(logicalPath), contents, 0644)) {
        return {std::nullopt, *error};
    }
    return {std::move(logicalPath), {}};
}

}  // namespace

Result<std::string> writeSignature(const RootDirectory& root, const SigningKey& key,
                                   const CodeStatement& statement)
{
    const auto signature = makeSignature(key, statement);
    if (!signature.value) {
        return {std::nullopt, signature.error};
    }
    return store(root, signaturesDirectory, hexOf(statement.executable) + ".plist", *signature.value);
}

Result<std::string> writeTrustedKey(const RootDirectory& root, const TrustedKey& key)
{
    const auto text = encodeTrustedKey(key);
    return store(root, trustedKeysDirectory, hexOf(key.key.bytes) + ".plist",
                 {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
}

}  // namespace typhon
