#include "platform/linux/signing.h"

#include <cerrno>
#include <memory>

#include <sodium.h>
#include <unistd.h>

namespace typhon {

std::optional<Sha256> sha256OfFile(int descriptor)
{
    constexpr std::size_t blockSize = 256 * 1024;
    const auto block = std::make_unique<unsigned char[]>(blockSize);
    crypto_hash_sha256_state state;
    crypto_hash_sha256_init(&state);
    for (off_t offset = 0;;) {
        const auto count = ::pread(descriptor, block.get(), blockSize, offset);
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            return std::nullopt;
        }
        if (count == 0) {
            break;
        }
        crypto_hash_sha256_update(&state, block.get(), static_cast<unsigned long long>(count));
        offset += count;
    }
    Sha256 digest;
    crypto_hash_sha256_final(&state, digest.data());
    return digest;
}

std::string hexOf(std::span<const std::uint8_t> bytes)
{
    std::string text(bytes.size() * 2 + 1, '\0');
    sodium_bin2hex(text.data(), text.size(), bytes.data(), bytes.size());
    text.pop_back();
    return text;
}

}  // namespace typhon
