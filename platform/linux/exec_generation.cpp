#include "platform/linux/exec_generation.h"

#include "platform/linux/file_descriptor.h"

#include <array>
#include <charconv>
#include <cstring>
#include <string_view>

#include <elf.h>
#include <fcntl.h>
#include <sodium.h>
#include <sys/uio.h>
#include <unistd.h>

// An exec leaves the process identifier, the pidfd and the start time as they are. What it renews is the
// auxiliary vector (addresses under randomisation) and the 16 random bytes that AT_RANDOM points to. Both go
// into the value: some language run-times wipe the random bytes once they have used them, and the vector is
// the kernel's copy, which a stray write into the program's own memory does not reach.
//
// Both are read anew at every look, of the memory that the process has then. A descriptor of its memory that
// was kept would go on reading the memory of before the exec, as long as a child shares it. And the vector
// must be read as well as the bytes: a program can see to it that the next one has known bytes at the address
// where its own random ones were, but not that the kernel points there.

namespace typhon {

namespace {

constexpr std::size_t randomLength = 16;

/// Reads a file of /proc that fits the buffer; the number of bytes read.
std::size_t readFile(int directory, const char* name, char* buffer, std::size_t size)
{
    const FileDescriptor file(::openat(directory, name, O_RDONLY | O_CLOEXEC));
    const auto count = file ? ::read(file.get(), buffer, size) : 0;
    return count > 0 ? static_cast<std::size_t>(count) : 0;
}

/// Reads the memory of a process; false unless all of it can be.
bool readMemory(pid_t process, int directory, std::uint64_t address, char* buffer, std::size_t size)
{
    const iovec here{buffer, size};
    // An address in another process, which means nothing in this one.
    const iovec there{reinterpret_cast<void*>(address), size};  // NOLINT(performance-no-int-to-ptr)
    if (::process_vm_readv(process, &here, 1, &there, 1, 0) == static_cast<ssize_t>(size)) {
        return true;
    }
    // Some filters on system calls forbid that one.
    const FileDescriptor memory(::openat(directory, "mem", O_RDONLY | O_CLOEXEC));
    return memory &&
           ::pread(memory.get(), buffer, size, static_cast<off_t>(address)) == static_cast<ssize_t>(size);
}

/// The address under AT_RANDOM in a vector of (type, value) pairs of `Word`, or 0.
template <class Word>
std::uint64_t randomAddress(const char* vector, std::size_t length)
{
    for (std::size_t at = 0; at + 2 * sizeof(Word) <= length; at += 2 * sizeof(Word)) {
        std::array<Word, 2> entry;
        std::memcpy(entry.data(), vector + at, sizeof entry);
        if (entry[0] == AT_NULL) {
            break;
        }
        if (entry[0] == AT_RANDOM) {
            return entry[1];
        }
    }
    return 0;
}

using HashKey = std::array<unsigned char, crypto_shorthash_KEYBYTES>;

std::uint64_t hashOf(const char* bytes, std::size_t length, const HashKey& key)
{
    std::uint64_t value = 0;
    static_assert(crypto_shorthash_BYTES == sizeof value);
    crypto_shorthash(reinterpret_cast<unsigned char*>(&value), reinterpret_cast<const unsigned char*>(bytes),
                     length, key.data());
    return value;
}

/// Nobody outside can look for two programs with the same value, or tell from a value what it is of.
const HashKey& secretKey()
{
    static const HashKey key = [] {
        HashKey bytes;
        randombytes_buf(bytes.data(), bytes.size());
        return bytes;
    }();
    return key;
}

}  // namespace

std::uint64_t execGeneration(pid_t processIdentifier, int processDirectory)
{
    std::array<char, 1024 + randomLength> bytes;
    const auto length = readFile(processDirectory, "auxv", bytes.data(), bytes.size() - randomLength);
    auto address = randomAddress<std::uint64_t>(bytes.data(), length);
    if (address == 0) {
        address = randomAddress<std::uint32_t>(bytes.data(), length);
    }
    if (address == 0 ||
        !readMemory(processIdentifier, processDirectory, address, bytes.data() + length, randomLength)) {
        return 0;
    }
    const auto value = hashOf(bytes.data(), length + randomLength, secretKey());
    sodium_memzero(bytes.data(), bytes.size());
    return value == 0 ? 1 : value;
}

std::optional<std::uint64_t> startTime(int processDirectory)
{
    std::array<char, 1024> buffer;
    const std::string_view text(buffer.data(),
                                readFile(processDirectory, "stat", buffer.data(), buffer.size()));
    // The second field is the program's name in brackets, which may hold anything; the start time is the
    // twentieth field after it.
    auto at = text.rfind(')');
    for (int field = 0; field < 20 && at != std::string_view::npos; ++field) {
        at = text.find(' ', at + 1);
    }
    std::uint64_t value = 0;
    if (at == std::string_view::npos ||
        std::from_chars(text.data() + at + 1, text.data() + text.size(), value).ec != std::errc{}) {
        return std::nullopt;
    }
    return value;
}

std::uint32_t bootEpoch()
{
    static const std::uint32_t epoch = [] {
        std::array<char, 64> buffer;
        const auto length =
            readFile(AT_FDCWD, "/proc/sys/kernel/random/boot_id", buffer.data(), buffer.size());
        const auto value = static_cast<std::uint32_t>(hashOf(buffer.data(), length, {}));
        return value == 0 ? 1u : value;
    }();
    return epoch;
}

}  // namespace typhon
