// The XML form, over a streaming parser. A document brings nothing but its elements and their text: entities
// may not be declared, nothing outside the document is ever loaded, and the parser is told to stop at the
// first thing that is out of place. What the parser itself could be made to do too often (default attributes,
// rescanning a token that never ends) is bounded here.

#include "platform/linux/xml_property_list_reader.h"

#include "platform/linux/property_list_text.h"

#include <algorithm>
#include <new>
#include <utility>

#include <expat.h>

namespace typhon {
namespace {

/// Declared attributes are gone through at every element.
constexpr std::size_t mostAttributeDeclarations = 64;
/// The parser scans an unfinished comment, tag or instruction again with each block.
constexpr std::uint64_t longestToken = 1u << 20;
constexpr std::size_t longestBlock = 1u << 20;

bool isBlank(std::string_view text)
{
    return text.find_first_not_of(" \t\n\r") == text.npos;
}

/// An element name as it may stand in a log line.
std::string shown(std::string_view name)
{
    std::string shown(name.substr(0, 32));
    std::replace_if(
        shown.begin(), shown.end(), [](unsigned char byte) { return byte >= 0x7F; }, '?');
    return shown;
}

}  // namespace

/// What the parser calls; C linkage aside, these only forward.
struct XmlPropertyListReader::Handlers {
    static XmlPropertyListReader& reader(void* data) { return *static_cast<XmlPropertyListReader*>(data); }

    static void XMLCALL start(void* data, const XML_Char* name, const XML_Char**)
    {
        reader(data).start(name);
    }
    static void XMLCALL end(void* data, const XML_Char*) { reader(data).end(); }
    static void XMLCALL text(void* data, const XML_Char* text, int length)
    {
        reader(data).text({text, static_cast<std::size_t>(length)});
    }
    static void XMLCALL entity(void* data, const XML_Char*, int, const XML_Char*, int, const XML_Char*,
                               const XML_Char*, const XML_Char*, const XML_Char*)
    {
        reader(data).refuse("an entity declaration");
    }
    static void XMLCALL skippedEntity(void* data, const XML_Char*, int)
    {
        reader(data).refuse("an undeclared entity");
    }
    static void XMLCALL attribute(void* data, const XML_Char*, const XML_Char*, const XML_Char*,
                                  const XML_Char*, int)
    {
        reader(data).countAttributeDeclaration();
    }
};

void XmlPropertyListReader::Release::operator()(XML_ParserStruct* parser) const
{
    XML_ParserFree(parser);
}

XmlPropertyListReader::XmlPropertyListReader(const PropertyListLimits& limits)
    : builder_(limits), parser_(XML_ParserCreate(nullptr))
{
    if (!parser_)
        throw std::bad_alloc();
    XML_SetUserData(parser_.get(), this);
    XML_SetElementHandler(parser_.get(), Handlers::start, Handlers::end);
    XML_SetCharacterDataHandler(parser_.get(), Handlers::text);
    XML_SetEntityDeclHandler(parser_.get(), Handlers::entity);
    XML_SetSkippedEntityHandler(parser_.get(), Handlers::skippedEntity);
    XML_SetAttlistDeclHandler(parser_.get(), Handlers::attribute);
}

XmlPropertyListReader::Element XmlPropertyListReader::elementNamed(std::string_view name)
{
    // By length first: this is asked once for every element.
    switch (name.size()) {
    case 3:
        return name == "key" ? Element::key : Element::none;
    case 4:
        return name == "dict"   ? Element::dict
               : name == "true" ? Element::yes
               : name == "real" ? Element::real
               : name == "data" ? Element::data
               : name == "date" ? Element::date
                                : Element::none;
    case 5:
        return name == "false"   ? Element::no
               : name == "array" ? Element::array
               : name == "plist" ? Element::plist
                                 : Element::none;
    case 6:
        return name == "string" ? Element::string : Element::none;
    case 7:
        return name == "integer" ? Element::integer : Element::none;
    default:
        return Element::none;
    }
}

void XmlPropertyListReader::start(std::string_view name)
{
    // A stopped parser still reports the end of an empty element, and so on.
    if (!error_.empty())
        return;
    if (insidePlist_)
        startInside(name);
    else if (elementNamed(name) == Element::plist)
        insidePlist_ = true;
    else
        refuse("the root element is <" + shown(name) + ">, not <plist>");
}

void XmlPropertyListReader::startInside(std::string_view name)
{
    if (leaf_ != Element::none)
        return refuse("an element <" + shown(name) + "> where only text may stand");
    switch (const auto element = elementNamed(name)) {
    case Element::none:
    case Element::plist:
        return refuse("unexpected element <" + shown(name) + ">");
    case Element::dict:
        return check(builder_.beginDictionary());
    case Element::array:
        return check(builder_.beginArray());
    default:
        leaf_ = element;
        text_.clear();
    }
}

void XmlPropertyListReader::end()
{
    if (!error_.empty())
        return;
    if (leaf_ != Element::none)
        check(addLeaf(std::exchange(leaf_, Element::none)));
    else if (builder_.depth() != 0)
        check(builder_.end());
}

template <typename Value>
const char* XmlPropertyListReader::addParsed(std::optional<Value> value, const char* error)
{
    return value ? builder_.value(*value) : error;
}

const char* XmlPropertyListReader::addLeaf(Element leaf)
{
    switch (leaf) {
    case Element::key:
        return builder_.key(text_);
    case Element::string:
        return builder_.value(text_);
    case Element::data:
        return base64_.finish() ? builder_.value(Data{std::exchange(data_, {})}) : "incomplete base64 data";
    case Element::date:
        return addParsed(dateFromText(text_), "a malformed date");
    case Element::integer:
        return addParsed(integerFromText(text_), "an integer that is malformed or beyond 64 bits");
    case Element::real:
        return addParsed(realFromText(text_), "a real that is malformed or out of range");
    default:
        return builder_.value(leaf == Element::yes);
    }
}

void XmlPropertyListReader::text(std::string_view text)
{
    if (!error_.empty())
        return;
    switch (leaf_) {
    case Element::none:
        return check(isBlank(text) ? nullptr : "text between elements");
    case Element::yes:
    case Element::no:
        return check(isBlank(text) ? nullptr : "text in a boolean");
    case Element::data:
        return check(base64_.decode(text, data_) ? nullptr : "malformed base64 data");
    default:
        text_ += text;
    }
}

void XmlPropertyListReader::countAttributeDeclaration()
{
    if (++attributeDeclarations_ > mostAttributeDeclarations)
        refuse("too many attribute declarations");
}

void XmlPropertyListReader::check(const char* error)
{
    if (error != nullptr)
        refuse(error);
}

/// Keeps the first error.
void XmlPropertyListReader::refuse(std::string_view error)
{
    if (!error_.empty())
        return;
    error_ = "line " + std::to_string(XML_GetCurrentLineNumber(parser_.get())) + ": ";
    error_ += error;
    XML_StopParser(parser_.get(), XML_FALSE);
}

bool XmlPropertyListReader::parse(std::span<const std::uint8_t> block, bool isLast)
{
    if (!error_.empty())
        return false;
    const auto* text = reinterpret_cast<const char*>(block.data());
    const auto status = XML_Parse(parser_.get(), text, static_cast<int>(block.size()), isLast);
    fed_ += block.size();
    if (status != XML_STATUS_OK) {
        refuse(XML_ErrorString(XML_GetErrorCode(parser_.get())));
        return false;
    }
    const auto reached = std::max<XML_Index>(XML_GetCurrentByteIndex(parser_.get()), 0);
    if (!isLast && fed_ - static_cast<std::uint64_t>(reached) > longestToken)
        refuse("a comment, tag or instruction is too long");
    return error_.empty();
}

bool XmlPropertyListReader::feed(std::span<const std::uint8_t> block)
{
    while (!block.empty()) {
        const auto part = block.first(std::min(block.size(), longestBlock));
        if (!parse(part, false))
            return false;
        block = block.subspan(part.size());
    }
    return error_.empty();
}

PropertyListReading XmlPropertyListReader::finish()
{
    if (!parse({}, true))
        return {std::nullopt, error_};
    auto value = builder_.take();
    if (!value)
        return {std::nullopt, "there is no value in <plist>"};
    return {std::move(value), {}};
}

}  // namespace typhon
