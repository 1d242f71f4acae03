// From values to the wire. Text that D-Bus cannot carry (a zero character, bytes that are not UTF-8) would
// make the peer drop the connection, so it is replaced by U+FFFD: one odd name in a registry must not cost a
// client its whole view.

#include "platform/argument_types.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/bus_message_codec.h"
#include "platform/linux/large_values.h"
#include "platform/linux/wire_text.h"

#include <cerrno>
#include <limits>
#include <string_view>

namespace typhon {

namespace {

class MessageAppender {
public:
    MessageAppender(sd_bus_message* message, bool descriptorsAllowed)
        : message_(message), descriptorsAllowed_(descriptorsAllowed)
    {}

    int argument(std::string_view type, const Argument& argument);
    MessageAppending outcome(int result) const { return {result, bytes_, descriptors_}; }

private:
    /// A dictionary whose values may travel as memory files, or anything inside a variant.
    enum class Place { outermost, nested };

    int value(std::string_view type, const PropertyList& value, Place place);
    int basic(char type, const PropertyList& value);
    int variant(const PropertyList& value);
    int array(std::string_view elementType, const PropertyList& value, Place place);
    int data(const PropertyList& value);
    int dictionary(std::string_view entryType, const PropertyList& value, Place place);
    int entry(std::string_view entryType, const std::string& key, const PropertyList& value, Place place);
    int structure(std::string_view fields, const PropertyList& value);
    int memoryFile(const FileDescriptor& file);
    int text(const std::string& text);
    int descriptor(int descriptor);

    template <class T>
    int append(char type, T value)
    {
        bytes_ += 8;
        return sd_bus_message_append_basic(message_, type, &value);
    }
    template <class T>
    int integer(char type, const PropertyList& value)
    {
        const auto* number = value.asInteger();
        return number == nullptr || !std::in_range<T>(*number) ? -EINVAL
                                                               : append(type, static_cast<T>(*number));
    }
    /// Opens a container, fills it, closes it.
    template <class Fill>
    int contained(char type, std::string_view contents, Fill fill)
    {
        bytes_ += 8;
        int result = sd_bus_message_open_container(message_, type, std::string(contents).c_str());
        if (result >= 0) {
            result = fill();
        }
        return result < 0 ? result : sd_bus_message_close_container(message_);
    }

    sd_bus_message* const message_;
    const bool descriptorsAllowed_;
    std::size_t bytes_ = 0;
    std::size_t descriptors_ = 0;
};

int MessageAppender::argument(std::string_view type, const Argument& argument)
{
    const auto* file = std::get_if<std::shared_ptr<TransferredFile>>(&argument);
    if (file == nullptr) {
        return value(type, std::get<PropertyList>(argument), Place::outermost);
    }
    const auto* transferred = dynamic_cast<const LinuxTransferredFile*>(file->get());
    if (type != "h" || transferred == nullptr) {
        return -EINVAL;
    }
    return descriptorsAllowed_ ? descriptor(transferred->descriptor.get()) : -EOPNOTSUPP;
}

int MessageAppender::value(std::string_view type, const PropertyList& value, Place place)
{
    switch (type.empty() ? '\0' : type.front()) {
    case 'v':
        return variant(value);
    case 'a':
        return array(type.substr(1), value, place);
    case '(':
        return structure(type.substr(1, type.size() - 2), value);
    default:
        return basic(type.front(), value);
    }
}

int MessageAppender::basic(char type, const PropertyList& value)
{
    switch (type) {
    case 'b':
        return value.asBoolean() == nullptr ? -EINVAL : append<int>(type, *value.asBoolean() ? 1 : 0);
    case 'y':
        return integer<std::uint8_t>(type, value);
    case 'n':
        return integer<std::int16_t>(type, value);
    case 'q':
        return integer<std::uint16_t>(type, value);
    case 'i':
        return integer<std::int32_t>(type, value);
    case 'u':
        return integer<std::uint32_t>(type, value);
    case 'x':
        return integer<std::int64_t>(type, value);
    case 't':
        return integer<std::uint64_t>(type, value);
    case 'd':
        return value.asReal() == nullptr ? -EINVAL : append(type, *value.asReal());
    case 's':
        return value.asString() == nullptr ? -EINVAL : text(*value.asString());
    default:
        return -EINVAL;
    }
}

int MessageAppender::text(const std::string& text)
{
    bytes_ += text.size() + 8;
    const std::string replaced = isWireText(text) ? std::string() : wireText(text);
    return sd_bus_message_append_basic(message_, 's', (replaced.empty() ? text : replaced).c_str());
}

int MessageAppender::variant(const PropertyList& value)
{
    switch (value.kind()) {
    case PropertyList::Kind::boolean:
        return contained('v', "b", [&] { return basic('b', value); });
    case PropertyList::Kind::integer:
        return contained('v', "x", [&] { return basic('x', value); });
    case PropertyList::Kind::real:
        return contained('v', "d", [&] { return basic('d', value); });
    case PropertyList::Kind::string:
        return contained('v', "s", [&] { return basic('s', value); });
    case PropertyList::Kind::data:
        return contained('v', "ay", [&] { return data(value); });
    case PropertyList::Kind::date:
        return contained('v', "(d)", [&] { return structure("d", value); });
    case PropertyList::Kind::array:
        return contained('v', "av", [&] { return array("v", value, Place::nested); });
    case PropertyList::Kind::dictionary:
        return contained('v', "a{sv}", [&] { return dictionary("sv", value, Place::nested); });
    }
    return -EINVAL;
}

int MessageAppender::array(std::string_view elementType, const PropertyList& value, Place place)
{
    if (elementType == "y") {
        return data(value);
    }
    if (elementType.front() == '{') {
        return dictionary(elementType.substr(1, elementType.size() - 2), value, place);
    }
    const auto* elements = value.asArray();
    if (elements == nullptr) {
        return -EINVAL;
    }
    return contained('a', elementType, [&] {
        int result = 0;
        for (auto element = elements->begin(); result >= 0 && element != elements->end(); ++element) {
            result = this->value(elementType, *element, place);
        }
        return result;
    });
}

int MessageAppender::data(const PropertyList& value)
{
    const auto* data = value.asData();
    if (data == nullptr) {
        return -EINVAL;
    }
    bytes_ += data->bytes.size();
    return sd_bus_message_append_array(message_, 'y', data->bytes.data(), data->bytes.size());
}

int MessageAppender::dictionary(std::string_view entryType, const PropertyList& value, Place place)
{
    const auto* entries = value.asDictionary();
    if (entries == nullptr || entryType.front() != 's') {
        return -EINVAL;
    }
    return contained('a', "{" + std::string(entryType) + "}", [&] {
        int result = 0;
        for (auto next = entries->begin(); result >= 0 && next != entries->end(); ++next) {
            result = entry(entryType, next->first, next->second, place);
        }
        return result;
    });
}

int MessageAppender::entry(std::string_view entryType, const std::string& key, const PropertyList& value,
                           Place place)
{
    FileDescriptor file;
    if (place == Place::outermost && entryType == "sv" && descriptorsAllowed_) {
        file = LargeValues::shared().memoryFileFor(value);
    }
    return contained('e', entryType, [&] {
        const int result = text(key);
        if (result < 0) {
            return result;
        }
        return file ? memoryFile(file) : this->value(entryType.substr(1), value, Place::nested);
    });
}

int MessageAppender::structure(std::string_view fields, const PropertyList& value)
{
    if (fields == "d") {
        const auto* date = value.asDate();
        return date == nullptr ? -EINVAL : contained('r', "d", [&] { return append('d', date->seconds); });
    }
    const auto* elements = value.asArray();
    if (elements == nullptr) {
        return -EINVAL;
    }
    return contained('r', fields, [&] {
        auto rest = fields;
        for (const auto& element : *elements) {
            const int result =
                rest.empty() ? -EINVAL : this->value(takeCompleteType(rest), element, Place::nested);
            if (result < 0) {
                return result;
            }
        }
        return rest.empty() ? 0 : -EINVAL;
    });
}

int MessageAppender::memoryFile(const FileDescriptor& file)
{
    return contained('v', "h", [&] { return descriptor(file.get()); });
}

int MessageAppender::descriptor(int descriptor)
{
    ++descriptors_;
    return append('h', descriptor);
}

}  // namespace

MessageAppending appendMessage(sd_bus_message* message, const std::string& types, const Arguments& arguments,
                               bool descriptorsAllowed)
{
    MessageAppender appender(message, descriptorsAllowed);
    std::string_view rest = types;
    for (const auto& argument : arguments) {
        const int result = rest.empty() ? -EINVAL : appender.argument(takeCompleteType(rest), argument);
        if (result < 0) {
            return appender.outcome(result);
        }
    }
    return appender.outcome(rest.empty() ? 0 : -EINVAL);
}

int appendArguments(sd_bus_message* message, const std::string& types, const Arguments& arguments,
                    bool descriptorsAllowed)
{
    return appendMessage(message, types, arguments, descriptorsAllowed).result;
}

}  // namespace typhon
