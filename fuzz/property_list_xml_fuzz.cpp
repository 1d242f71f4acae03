// Any bytes as an XML property list. What is accepted must survive both forms, and it must not matter where
// the input is cut into blocks.

#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"
#include "platform/linux/xml_property_list_reader.h"
#include "require.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <span>

namespace typhon {
namespace {

constexpr PropertyListLimits limits{.bytes = 1u << 20, .depth = 32, .values = 20'000};

PropertyListReading read(std::span<const std::uint8_t> bytes, std::size_t blockSize)
{
    XmlPropertyListReader reader(limits);
    for (bool isAccepted = true; isAccepted && !bytes.empty();) {
        const auto block = bytes.first(std::min(blockSize, bytes.size()));
        isAccepted = reader.feed(block);
        bytes = bytes.subspan(block.size());
    }
    return reader.finish();
}

void check(std::span<const std::uint8_t> bytes)
{
    const auto reading = read(bytes, limits.bytes);
    require(reading.value.has_value() == reading.error.empty(), "a value or an error");
    require(read(bytes, 7).value == reading.value, "blocks do not matter");
    if (!reading.value)
        return;
    const auto binary = readPropertyList(writeBinaryPropertyList(*reading.value));
    require(binary.value == reading.value, "the binary form carries the value");
    const auto text = writeXmlPropertyList(*reading.value);
    const auto xml = readPropertyList({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
    require(xml.value == reading.value, "the XML form carries the value");
}

}  // namespace
}  // namespace typhon

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    typhon::check({data, size});
    return 0;
}
