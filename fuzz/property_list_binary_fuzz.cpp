// Any bytes as a binary property list. What is accepted must survive the binary form; the XML form may have
// to replace some of it, but then carries the result.

#include "platform/linux/binary_property_list_reader.h"
#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "require.h"

#include <cstddef>
#include <cstdint>
#include <span>

namespace typhon {
namespace {

constexpr PropertyListLimits limits{.bytes = 1u << 20, .depth = 32, .values = 20'000};

void check(std::span<const std::uint8_t> bytes)
{
    const auto reading = readBinaryPropertyList(bytes, limits);
    require(reading.value.has_value() == reading.error.empty(), "a value or an error");
    if (!reading.value)
        return;
    const auto written = writeBinaryPropertyList(*reading.value);
    const auto binary = readPropertyList(written);
    require(binary.value == reading.value, "the binary form carries the value");
    require(writeBinaryPropertyList(*binary.value) == written, "equal values give equal bytes");
    const auto text = writeXmlPropertyList(*reading.value);
    const auto xml = readPropertyList({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
    require(xml.value.has_value(), "the XML form can be read");
    require(writeXmlPropertyList(*xml.value) == text, "the XML form carries what it can");
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::check({data, size});
    return 0;
}
