// Reads a property list on standard input and writes it to standard output, as XML or in the binary form. For
// comparison with other readers and writers of the format. Input and output are a series of documents, each
// after its length (eight bytes, big-endian); a document that is refused gets an empty answer, and the reason
// goes to standard error.

#include "platform/linux/property_list_reader.h"
#include "platform/linux/property_list_writer.h"

#include <array>
#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {
namespace {

using Bytes = std::vector<std::uint8_t>;

bool readDocument(Bytes& document)
{
    std::array<std::uint8_t, 8> length{};
    if (std::fread(length.data(), 1, length.size(), stdin) != length.size())
        return false;
    std::uint64_t size = 0;
    for (const auto byte : length)
        size = size << 8 | byte;
    document.resize(size);
    return std::fread(document.data(), 1, size, stdin) == size;
}

void writeDocument(const Bytes& document)
{
    std::array<std::uint8_t, 8> length{};
    for (std::size_t index = 0; index < length.size(); ++index)
        length[index] = static_cast<std::uint8_t>(document.size() >> (56 - index * 8));
    std::fwrite(length.data(), 1, length.size(), stdout);
    if (!document.empty())
        std::fwrite(document.data(), 1, document.size(), stdout);
    std::fflush(stdout);
}

Bytes echo(const Bytes& document, bool isBinary)
{
    const auto reading = readPropertyList(document);
    if (!reading.value) {
        std::fprintf(stderr, "%s\n", reading.error.c_str());
        return {};
    }
    if (isBinary)
        return writeBinaryPropertyList(*reading.value);
    const auto text = writeXmlPropertyList(*reading.value);
    return {text.begin(), text.end()};
}

}  // namespace
}  // namespace typhon

int main(int count, char** arguments)
{
    const std::string_view form = count == 2 ? arguments[1] : "";
    if (form != "xml" && form != "binary") {
        std::fprintf(stderr, "usage: plist_echo xml|binary\n");
        return 2;
    }
    for (typhon::Bytes document; typhon::readDocument(document);)
        typhon::writeDocument(typhon::echo(document, form == "binary"));
    return 0;
}
