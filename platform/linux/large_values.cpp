// Deciding is cheap where it happens often: a container that was encoded before is found by its identity, not
// by its contents; other values mostly end within a few kilobytes. Only what lies between is measured
// further, and only as far as the limit.

#include "platform/linux/large_values.h"

#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_writer.h"

#include <algorithm>

namespace typhon {

namespace {

constexpr std::size_t clearlySmallBytes = 4U << 10;
/// Header and trailer of a binary property list.
constexpr std::size_t frameBytes = 40;
/// At most: marker and length of an object, its place in the offset table, one reference to it.
constexpr std::size_t objectBytes = 10 + 4 + 4;

/// Counts an upper bound of the size of a value's binary property list, no further than it has to.
class Measurement {
public:
    explicit Measurement(std::size_t limit) : limit_(limit) {}

    /// True when `value` surely fits the limit and is not nested too deeply.
    bool fits(const PropertyList& value) { return add(value, 0); }
    /// True when counting ended because of the nesting.
    bool isTooDeep() const { return tooDeep_; }

private:
    bool add(const PropertyList& value, unsigned depth);
    bool addText(const std::string& text) { return addBytes(objectBytes + 2 * text.size()); }
    bool addBytes(std::size_t bytes)
    {
        bytes_ += bytes;
        return bytes_ <= limit_;
    }

    const std::size_t limit_;
    std::size_t bytes_ = frameBytes;
    bool tooDeep_ = false;
};

bool Measurement::add(const PropertyList& value, unsigned depth)
{
    if (const auto* text = value.asString()) {
        return addText(*text);
    }
    if (const auto* data = value.asData()) {
        return addBytes(objectBytes + data->bytes.size());
    }
    const auto* elements = value.asArray();
    const auto* entries = value.asDictionary();
    if (elements == nullptr && entries == nullptr) {
        return addBytes(objectBytes);
    }
    if (depth == LargeValues::deepestInline) {
        tooDeep_ = true;
        return false;
    }
    if (!addBytes(objectBytes)) {
        return false;
    }
    if (elements != nullptr) {
        return std::all_of(elements->begin(), elements->end(),
                           [&](const auto& element) { return add(element, depth + 1); });
    }
    return std::all_of(entries->begin(), entries->end(), [&](const auto& entry) {
        return addText(entry.first) && add(entry.second, depth + 1);
    });
}

bool isTooDeep(const PropertyList& value)
{
    Measurement measurement(SIZE_MAX);
    return !measurement.fits(value) && measurement.isTooDeep();
}

}  // namespace

LargeValues& LargeValues::shared()
{
    static LargeValues values;
    return values;
}

FileDescriptor LargeValues::memoryFileFor(const PropertyList& value)
{
    const bool isContainer = value.asArray() != nullptr || value.asDictionary() != nullptr;
    auto encoding = isContainer ? encodingOf(value, false) : nullptr;
    if (!encoding) {
        if (Measurement(clearlySmallBytes).fits(value)) {
            return {};
        }
        encoding = encodingOf(value, false);
    }
    if (!encoding) {
        if (Measurement(largestInlineBytes).fits(value)) {
            return {};
        }
        encoding = encodingOf(value, true);
    }
    std::call_once(encoding->once, [&] {
        const auto bytes = writeBinaryPropertyList(value);
        if (bytes.size() > largestInlineBytes || isTooDeep(value)) {
            encoding->file = sealedMemoryFile(bytes);
            const std::lock_guard lock(mutex_);
            encoding->bytes = bytes.size();
            trim(*encoding);
        }
    });
    return encoding->file ? reopenedReadOnly(encoding->file.get()) : FileDescriptor{};
}

std::size_t LargeValues::count() const
{
    const std::lock_guard lock(mutex_);
    return encodings_.size();
}

std::shared_ptr<LargeValues::Encoding> LargeValues::encodingOf(const PropertyList& value, bool create)
{
    const auto identity = value.identity();
    const std::lock_guard lock(mutex_);
    auto found = encodings_.find(identity);
    if (found == encodings_.end()) {
        if (!create) {
            return nullptr;
        }
        std::erase_if(encodings_, [](const auto& entry) { return entry.first.expired(); });
        found = encodings_.emplace(identity, std::make_shared<Encoding>()).first;
    }
    found->second->lastUse = ++uses_;
    return found->second;
}

/// Forgets the encodings used least recently until the bounds hold. The caller holds the lock.
void LargeValues::trim(const Encoding& keep)
{
    std::size_t bytes = 0;
    for (const auto& [identity, encoding] : encodings_) {
        bytes += encoding->bytes;
    }
    while (encodings_.size() > 1 && (encodings_.size() > maximumFiles_ || bytes > maximumBytes_)) {
        const auto oldest = std::min_element(encodings_.begin(), encodings_.end(), [&](auto& a, auto& b) {
            const auto rank = [&](const auto& e) { return &e == &keep ? UINT64_MAX : e.lastUse; };
            return rank(*a.second) < rank(*b.second);
        });
        bytes -= oldest->second->bytes;
        encodings_.erase(oldest);
    }
}

}  // namespace typhon
