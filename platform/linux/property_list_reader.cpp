// Tells the two forms apart and brings in their bytes. XML is read as it arrives; the binary form has its
// directory at the end and is taken in whole.

#include "platform/linux/property_list_reader.h"

#include "platform/linux/binary_property_list_objects.h"
#include "platform/linux/binary_property_list_reader.h"
#include "platform/linux/xml_property_list_reader.h"

#include <algorithm>
#include <cerrno>
#include <optional>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include <unistd.h>

namespace typhon {
namespace {

using Bytes = std::span<const std::uint8_t>;
using Read = std::function<std::ptrdiff_t(std::span<std::uint8_t>)>;

constexpr std::size_t blockSize = 64u << 10;
constexpr std::string_view magic(binaryPropertyListMagic, sizeof binaryPropertyListMagic);

enum class Form { xml, binary, unknownBinary };

/// From at least the first bytes, where there are so many.
Form formOf(Bytes bytes)
{
    const std::string_view text(reinterpret_cast<const char*>(bytes.data()), bytes.size());
    if (text.starts_with(magic))
        return Form::binary;
    return text.starts_with(magic.substr(0, 6)) ? Form::unknownBinary : Form::xml;
}

PropertyListReading refused(std::string error)
{
    return {std::nullopt, std::move(error)};
}

PropertyListReading tooLong(const PropertyListLimits& limits)
{
    return refused("longer than " + std::to_string(limits.bytes) + " bytes");
}

PropertyListReading refusedVersion()
{
    return refused("offset 6: an unknown version of the binary form");
}

/// A bounded input.
class Input {
public:
    Input(const Read& read, std::size_t limit) : read_(read), limit_(limit) {}

    /// Fills as much of `block` as there is; null for an input error.
    std::optional<std::size_t> fill(std::span<std::uint8_t> block)
    {
        std::size_t filled = 0;
        while (filled < block.size()) {
            const auto count = read_(block.subspan(filled));
            if (count < 0)
                return std::nullopt;
            if (count == 0)
                break;
            filled += static_cast<std::size_t>(count);
        }
        total_ += filled;
        return filled;
    }
    bool isTooLong() const { return total_ > limit_; }

private:
    const Read& read_;
    const std::size_t limit_;
    std::size_t total_ = 0;
};

PropertyListReading inputError()
{
    return refused("input error");
}

PropertyListReading readXml(Input& input, std::vector<std::uint8_t> block, const PropertyListLimits& limits)
{
    XmlPropertyListReader reader(limits);
    std::optional<std::size_t> count = block.size();
    while (reader.feed(block) && *count == blockSize) {
        block.resize(blockSize);
        count = input.fill(block);
        if (!count)
            return inputError();
        if (input.isTooLong())
            return tooLong(limits);
        block.resize(*count);
    }
    return reader.finish();
}

PropertyListReading readBinary(Input& input, std::vector<std::uint8_t> bytes,
                               const PropertyListLimits& limits)
{
    bool isAll = bytes.size() < blockSize;
    while (!isAll) {
        const auto filled = bytes.size();
        bytes.resize(filled + std::min(filled, limits.bytes - filled + 1));
        const auto count = input.fill(std::span(bytes).subspan(filled));
        if (!count)
            return inputError();
        if (input.isTooLong())
            return tooLong(limits);
        isAll = filled + *count < bytes.size();
        bytes.resize(filled + *count);
    }
    return readBinaryPropertyList(bytes, limits);
}

}  // namespace

PropertyListReading readPropertyList(std::span<const std::uint8_t> bytes, const PropertyListLimits& limits)
{
    if (bytes.size() > limits.bytes)
        return tooLong(limits);
    switch (formOf(bytes)) {
    case Form::binary:
        return readBinaryPropertyList(bytes, limits);
    case Form::unknownBinary:
        return refusedVersion();
    case Form::xml:
        break;
    }
    XmlPropertyListReader reader(limits);
    reader.feed(bytes);
    return reader.finish();
}

PropertyListReading readPropertyListFromStream(const Read& read, const PropertyListLimits& limits)
{
    Input input(read, limits.bytes);
    std::vector<std::uint8_t> block(blockSize);
    const auto count = input.fill(block);
    if (!count)
        return inputError();
    if (input.isTooLong())
        return tooLong(limits);
    block.resize(*count);
    switch (formOf(block)) {
    case Form::binary:
        return readBinary(input, std::move(block), limits);
    case Form::unknownBinary:
        return refusedVersion();
    case Form::xml:
        break;
    }
    return readXml(input, std::move(block), limits);
}

PropertyListReading readPropertyListFromDescriptor(int descriptor, const PropertyListLimits& limits)
{
    int error = 0;
    const Read read = [&](std::span<std::uint8_t> block) -> std::ptrdiff_t {
        ssize_t count = -1;
        do {
            count = ::read(descriptor, block.data(), block.size());
        } while (count < 0 && errno == EINTR);
        if (count < 0)
            error = errno;
        return count;
    };
    auto reading = readPropertyListFromStream(read, limits);
    if (error != 0)
        reading.error += std::string(": ") + std::system_category().message(error);
    return reading;
}

}  // namespace typhon
