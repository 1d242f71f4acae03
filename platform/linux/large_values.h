#pragma once

#include "platform/linux/file_descriptor.h"
#include "platform/property_list.h"

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>

namespace typhon {

/// Values of an outermost dictionary that are too large, or nested too deeply, to travel inside a message.
/// Each is encoded once, for as long as the value lives, into a sealed memory file that all its receivers
/// share. Any thread.
class LargeValues {
public:
    /// A value whose binary property list is larger than this, or that holds containers nested deeper than
    /// that, is large.
    static constexpr std::size_t largestInlineBytes = 64U << 10;
    static constexpr unsigned deepestInline = 8;

    /// Keeps at most `maximumFiles` encodings, of `maximumBytes` in all (but always the latest).
    explicit LargeValues(std::size_t maximumFiles = 64, std::size_t maximumBytes = 256U << 20)
        : maximumFiles_(maximumFiles), maximumBytes_(maximumBytes)
    {}

    /// The cache that all connections of the process share.
    static LargeValues& shared();

    /// A memory file with the value's binary property list, opened anew for one receiver; none when the
    /// value is not large (or the system has no memory files), and so travels inline.
    FileDescriptor memoryFileFor(const PropertyList& value);

    /// Encodings held at present.
    std::size_t count() const;

private:
    struct Encoding {
        std::once_flag once;
        FileDescriptor file;
        std::size_t bytes = 0;
        std::uint64_t lastUse = 0;
    };
    using Identity = std::weak_ptr<const void>;

    std::shared_ptr<Encoding> encodingOf(const PropertyList& value, bool create);
    void trim(const Encoding& keep);

    const std::size_t maximumFiles_;
    const std::size_t maximumBytes_;
    mutable std::mutex mutex_;
    std::map<Identity, std::shared_ptr<Encoding>, std::owner_less<>> encodings_;
    std::uint64_t uses_ = 0;
};

}  // namespace typhon
