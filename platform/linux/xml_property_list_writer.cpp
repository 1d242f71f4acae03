#include "platform/linux/base64.h"
#include "platform/linux/carried_text.h"
#include "platform/linux/property_list_text.h"
#include "platform/linux/property_list_writer.h"

#include <algorithm>
#include <string>
#include <string_view>
#include <vector>

namespace typhon {
namespace {

using Kind = PropertyList::Kind;

constexpr std::string_view prologue = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
                                      "<!DOCTYPE plist>\n"
                                      "<plist version=\"1.0\">\n";
constexpr std::string_view epilogue = "</plist>\n";

/// Deeper levels are not indented further: the text would grow with the square of the depth.
constexpr std::size_t mostIndentation = 32;
/// 76 characters a line.
constexpr std::size_t bytesOfDataLine = 57;

/// Writes a value without recursion: the containers that are open are kept on a stack.
class XmlPropertyListWriter {
public:
    std::string write(const PropertyList& value);

private:
    struct Open {
        const PropertyList::Array* array = nullptr;
        std::size_t next = 0;
        const PropertyList::Dictionary* dictionary = nullptr;
        PropertyList::Dictionary::const_iterator entry{};
    };

    void indent();
    void element(std::string_view name, std::string_view text);
    void escaped(std::string_view text);
    void data(const Data& data);
    void value(const PropertyList& value);
    void begin(std::string_view name, bool isEmpty, Open open);
    void end(std::string_view name);
    void next();

    std::string text_{prologue};
    std::vector<Open> open_;
    CarriedKeys carriedKeys_{CarriedText::xml};
};

void XmlPropertyListWriter::indent()
{
    text_.append(std::min(open_.size(), mostIndentation), '\t');
}

void XmlPropertyListWriter::escaped(std::string_view text)
{
    if (!isCarried(text, CarriedText::xml))
        return escaped(replacingUncarried(text, CarriedText::xml));
    for (auto special = text.find_first_of("<>&\r"); special != text.npos;
         special = text.find_first_of("<>&\r")) {
        text_ += text.substr(0, special);
        switch (text[special]) {
        case '<':
            text_ += "&lt;";
            break;
        case '>':
            text_ += "&gt;";
            break;
        case '&':
            text_ += "&amp;";
            break;
        default:
            // A plain carriage return would be read as a line feed.
            text_ += "&#13;";
        }
        text.remove_prefix(special + 1);
    }
    text_ += text;
}

void XmlPropertyListWriter::element(std::string_view name, std::string_view text)
{
    indent();
    (text_ += '<') += name;
    text_ += '>';
    escaped(text);
    (text_ += "</") += name;
    text_ += ">\n";
}

void XmlPropertyListWriter::data(const Data& data)
{
    indent();
    text_ += "<data>\n";
    for (std::span<const std::uint8_t> rest(data.bytes); !rest.empty();) {
        const auto line = rest.first(std::min(rest.size(), bytesOfDataLine));
        indent();
        appendBase64(text_, line);
        text_ += '\n';
        rest = rest.subspan(line.size());
    }
    indent();
    text_ += "</data>\n";
}

void XmlPropertyListWriter::value(const PropertyList& value)
{
    switch (value.kind()) {
    case Kind::boolean:
        indent();
        text_ += *value.asBoolean() ? "<true/>\n" : "<false/>\n";
        return;
    case Kind::integer:
        return element("integer", std::to_string(*value.asInteger()));
    case Kind::real:
        return element("real", textFromReal(*value.asReal()));
    case Kind::string:
        return element("string", *value.asString());
    case Kind::data:
        return data(*value.asData());
    case Kind::date:
        return element("date", textFromDate(*value.asDate()));
    case Kind::array:
        return begin("array", value.asArray()->empty(), {value.asArray()});
    case Kind::dictionary: {
        const auto& dictionary = carriedKeys_(*value.asDictionary());
        return begin("dict", dictionary.empty(), {nullptr, 0, &dictionary, dictionary.begin()});
    }
    }
}

void XmlPropertyListWriter::begin(std::string_view name, bool isEmpty, Open open)
{
    indent();
    (text_ += '<') += name;
    text_ += isEmpty ? "/>\n" : ">\n";
    if (!isEmpty)
        open_.push_back(open);
}

void XmlPropertyListWriter::end(std::string_view name)
{
    open_.pop_back();
    indent();
    (text_ += "</") += name;
    text_ += ">\n";
}

/// Writes the next element of the innermost container, or its end.
void XmlPropertyListWriter::next()
{
    auto& open = open_.back();
    if (open.array != nullptr) {
        if (open.next == open.array->size())
            return end("array");
        return value((*open.array)[open.next++]);
    }
    if (open.entry == open.dictionary->end())
        return end("dict");
    const auto& [key, member] = *open.entry++;
    element("key", key);
    value(member);
}

std::string XmlPropertyListWriter::write(const PropertyList& outermost)
{
    value(outermost);
    while (!open_.empty())
        next();
    text_ += epilogue;
    return std::move(text_);
}

}  // namespace

std::string writeXmlPropertyList(const PropertyList& value)
{
    return XmlPropertyListWriter().write(value);
}

}  // namespace typhon
