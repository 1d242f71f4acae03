#pragma once

#include "platform/linux/base64.h"
#include "platform/linux/property_list_builder.h"
#include "platform/linux/property_list_reader.h"

#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <vector>

struct XML_ParserStruct;

namespace typhon {

/// Reads the XML form of a property list as it arrives. Does not look at `limits.bytes`.
class XmlPropertyListReader {
public:
    explicit XmlPropertyListReader(const PropertyListLimits& limits);
    XmlPropertyListReader(const XmlPropertyListReader&) = delete;
    XmlPropertyListReader& operator=(const XmlPropertyListReader&) = delete;

    /// Takes the next bytes of the document. False when it is refused: then `finish` says why.
    bool feed(std::span<const std::uint8_t> block);
    /// The result, once all of the document has been fed.
    PropertyListReading finish();

private:
    enum class Element { none, plist, dict, array, key, string, data, date, integer, real, yes, no };
    struct Handlers;
    struct Release {
        void operator()(XML_ParserStruct* parser) const;
    };

    static Element elementNamed(std::string_view name);
    void start(std::string_view name);
    void startInside(std::string_view name);
    void end();
    void text(std::string_view text);
    void countAttributeDeclaration();
    const char* addLeaf(Element leaf);
    template <typename Value>
    const char* addParsed(std::optional<Value> value, const char* error);
    void check(const char* error);
    void refuse(std::string_view error);
    bool parse(std::span<const std::uint8_t> block, bool isLast);

    PropertyListBuilder builder_;
    std::unique_ptr<XML_ParserStruct, Release> parser_;
    bool insidePlist_ = false;
    /// The element without children that is open.
    Element leaf_ = Element::none;
    std::string text_;
    Base64Decoder base64_;
    std::vector<std::uint8_t> data_;
    std::size_t attributeDeclarations_ = 0;
    std::uint64_t fed_ = 0;
    std::string error_;
};

}  // namespace typhon
