// From the wire to values. Nothing is believed: every value is counted against the limits before it is built,
// and whatever does not fit its type makes the whole message invalid.

#include "platform/argument_types.h"
#include "platform/linux/bus_message.h"
#include "platform/linux/bus_message_codec.h"
#include "platform/linux/memory_file.h"
#include "platform/linux/property_list_reader.h"

#include <array>
#include <cmath>
#include <cstring>
#include <string_view>

#include <fcntl.h>

namespace typhon {

namespace {

/// About what one value takes in memory besides its text or data.
constexpr std::size_t valueOverhead = 96;

class MessageReader {
public:
    MessageReader(sd_bus_message* message, const std::optional<AuditToken>& sender,
                  const MessageLimits& limits)
        : message_(message), sender_(sender), limits_(limits), valuesLeft_(limits.values),
          bytesLeft_(limits.bytes), descriptorsLeft_(limits.descriptors),
          memoryFileBytesLeft_(limits.memoryFileBytes)
    {}

    std::optional<Arguments> arguments(std::string_view types);
    std::size_t memory() const
    {
        return (limits_.values - valuesLeft_) * valueOverhead + (limits_.bytes - bytesLeft_) +
               4 * (limits_.memoryFileBytes - memoryFileBytesLeft_);
    }

private:
    using Value = std::optional<PropertyList>;
    /// A dictionary whose values may be memory files, or anything inside a variant.
    enum class Place { outermost, nested };

    std::optional<Argument> argument(std::string_view type);
    Value value(std::string_view type, Place place, std::size_t depth);
    Value basic(char type);
    Value variant(Place place, std::size_t depth);
    Value array(std::string_view elementType, Place place, std::size_t depth);
    Value data();
    Value dictionary(std::string_view entryType, Place place, std::size_t depth);
    Value structure(std::string_view fields, std::size_t depth);
    Value memoryFile();
    std::shared_ptr<TransferredFile> transferredFile();

    template <class T>
    std::optional<T> read(char type)
    {
        T result{};
        return sd_bus_message_read_basic(message_, type, &result) > 0 ? std::optional(result) : std::nullopt;
    }
    template <class T>
    Value integer(char type)
    {
        const auto number = read<T>(type);
        if (!number || !std::in_range<std::int64_t>(*number)) {
            return std::nullopt;
        }
        return PropertyList(static_cast<std::int64_t>(*number));
    }
    std::optional<std::string> text(char type);
    bool countValue() { return valuesLeft_ != 0 && valuesLeft_-- != 0; }
    static bool take(std::size_t& left, std::size_t amount)
    {
        const bool enough = amount <= left;
        left -= enough ? amount : 0;
        return enough;
    }
    bool enter(char type, std::string_view contents)
    {
        return sd_bus_message_enter_container(message_, type, std::string(contents).c_str()) > 0;
    }
    bool exit() { return sd_bus_message_exit_container(message_) >= 0; }
    bool isAtEnd() { return sd_bus_message_at_end(message_, false) != 0; }

    sd_bus_message* const message_;
    const std::optional<AuditToken>& sender_;
    const MessageLimits& limits_;
    std::size_t valuesLeft_;
    std::size_t bytesLeft_;
    std::size_t descriptorsLeft_;
    std::size_t memoryFileBytesLeft_;
};

std::optional<Arguments> MessageReader::arguments(std::string_view types)
{
    Arguments result;
    while (!types.empty()) {
        auto next = argument(takeCompleteType(types));
        if (!next) {
            return std::nullopt;
        }
        result.push_back(std::move(*next));
    }
    return result;
}

std::optional<Argument> MessageReader::argument(std::string_view type)
{
    if (type == "h") {
        auto file = transferredFile();
        return file ? std::optional<Argument>(std::move(file)) : std::nullopt;
    }
    auto plain = value(type, Place::outermost, 0);
    return plain ? std::optional<Argument>(std::move(*plain)) : std::nullopt;
}

MessageReader::Value MessageReader::value(std::string_view type, Place place, std::size_t depth)
{
    if (type.empty() || !countValue() || depth > limits_.depth) {
        return std::nullopt;
    }
    switch (type.front()) {
    case 'v':
        return variant(place, depth + 1);
    case 'a':
        return array(type.substr(1), place, depth + 1);
    case '(':
        return structure(type.substr(1, type.size() - 2), depth + 1);
    default:
        return basic(type.front());
    }
}

MessageReader::Value MessageReader::basic(char type)
{
    switch (type) {
    case 'b': {
        const auto flag = read<int>(type);
        return flag ? Value(*flag != 0) : std::nullopt;
    }
    case 'y':
        return integer<std::uint8_t>(type);
    case 'n':
        return integer<std::int16_t>(type);
    case 'q':
        return integer<std::uint16_t>(type);
    case 'i':
        return integer<std::int32_t>(type);
    case 'u':
        return integer<std::uint32_t>(type);
    case 'x':
        return integer<std::int64_t>(type);
    case 't':
        return integer<std::uint64_t>(type);
    case 'd': {
        const auto number = read<double>(type);
        return number ? Value(*number) : std::nullopt;
    }
    case 's':
    case 'o':
    case 'g': {
        auto string = text(type);
        return string ? Value(std::move(*string)) : std::nullopt;
    }
    default:
        return std::nullopt;
    }
}

std::optional<std::string> MessageReader::text(char type)
{
    const auto string = read<const char*>(type);
    if (!string || *string == nullptr) {
        return std::nullopt;
    }
    const auto length = std::strlen(*string);
    return take(bytesLeft_, length) ? std::optional(std::string(*string, length)) : std::nullopt;
}

MessageReader::Value MessageReader::variant(Place place, std::size_t depth)
{
    char type = 0;
    const char* peeked = nullptr;
    if (sd_bus_message_peek_type(message_, &type, &peeked) <= 0 || type != 'v' || peeked == nullptr) {
        return std::nullopt;
    }
    const std::string contents = peeked;
    if (!enter('v', contents)) {
        return std::nullopt;
    }
    auto inner =
        contents == "h" && place == Place::outermost ? memoryFile() : value(contents, Place::nested, depth);
    return exit() ? inner : std::nullopt;
}

MessageReader::Value MessageReader::array(std::string_view elementType, Place place, std::size_t depth)
{
    if (elementType == "y") {
        return data();
    }
    if (elementType.front() == '{') {
        return dictionary(elementType.substr(1, elementType.size() - 2), place, depth);
    }
    if (sd_bus_message_enter_container(message_, 'a', std::string(elementType).c_str()) < 0) {
        return std::nullopt;
    }
    PropertyList::Array elements;
    while (!isAtEnd()) {
        auto element = value(elementType, place, depth);
        if (!element) {
            return std::nullopt;
        }
        elements.push_back(std::move(*element));
    }
    return exit() ? Value(std::move(elements)) : std::nullopt;
}

MessageReader::Value MessageReader::data()
{
    const void* bytes = nullptr;
    std::size_t size = 0;
    if (sd_bus_message_read_array(message_, 'y', &bytes, &size) < 0 || !take(bytesLeft_, size)) {
        return std::nullopt;
    }
    const auto* first = static_cast<const std::uint8_t*>(bytes);
    return PropertyList(size == 0 ? Data{} : Data{{first, first + size}});
}

MessageReader::Value MessageReader::dictionary(std::string_view entryType, Place place, std::size_t depth)
{
    // A variant element of an array is not an entry of the outermost dictionary, hence the check.
    const auto valuePlace = entryType == "sv" ? place : Place::nested;
    const char keyType = entryType.front();
    if (std::string_view("sog").find(keyType) == std::string_view::npos ||
        sd_bus_message_enter_container(message_, 'a', ("{" + std::string(entryType) + "}").c_str()) < 0) {
        return std::nullopt;
    }
    PropertyList::Dictionary entries;
    while (!isAtEnd()) {
        if (!enter('e', entryType) || !countValue()) {
            return std::nullopt;
        }
        auto key = text(keyType);
        auto entry = key ? value(entryType.substr(1), valuePlace, depth) : std::nullopt;
        if (!entry || !exit() || !entries.emplace(std::move(*key), std::move(*entry)).second) {
            return std::nullopt;
        }
    }
    return exit() ? Value(std::move(entries)) : std::nullopt;
}

MessageReader::Value MessageReader::structure(std::string_view fields, std::size_t depth)
{
    if (!enter('r', fields)) {
        return std::nullopt;
    }
    if (fields == "d") {
        const auto seconds = read<double>('d');
        return seconds && std::isfinite(*seconds) && exit() ? Value(Date{*seconds}) : std::nullopt;
    }
    PropertyList::Array elements;
    while (!fields.empty()) {
        auto element = value(takeCompleteType(fields), Place::nested, depth);
        if (!element) {
            return std::nullopt;
        }
        elements.push_back(std::move(*element));
    }
    return exit() ? Value(std::move(elements)) : std::nullopt;
}

MessageReader::Value MessageReader::memoryFile()
{
    const auto descriptor = read<int>('h');
    if (!descriptor || !take(descriptorsLeft_, 1)) {
        return std::nullopt;
    }
    constexpr std::string_view magic = "bplist00";
    const auto bytes = contentsOfSealedMemoryFile(*descriptor, memoryFileBytesLeft_);
    if (!bytes || !take(memoryFileBytesLeft_, bytes->size()) || bytes->size() < magic.size() ||
        std::memcmp(bytes->data(), magic.data(), magic.size()) != 0) {
        return std::nullopt;
    }
    PropertyListLimits limits;
    limits.values = limits_.memoryFileValues;
    return readPropertyList(*bytes, limits).value;
}

std::shared_ptr<TransferredFile> MessageReader::transferredFile()
{
    const auto descriptor = read<int>('h');
    if (!descriptor || !take(descriptorsLeft_, 1)) {
        return nullptr;
    }
    FileDescriptor own(::fcntl(*descriptor, F_DUPFD_CLOEXEC, 3));
    return own ? std::make_shared<LinuxTransferredFile>(std::move(own), sender_) : nullptr;
}

}  // namespace

MessageReading readMessage(sd_bus_message* message, const std::string& types,
                           const std::optional<AuditToken>& sender, const MessageLimits& limits)
{
    const char* signature = sd_bus_message_get_signature(message, true);
    if (signature == nullptr || types != signature) {
        return {};
    }
    MessageReader reader(message, sender, limits);
    auto arguments = reader.arguments(types);
    return {std::move(arguments), reader.memory()};
}

std::optional<Arguments> readArguments(sd_bus_message* message, const std::string& types,
                                       const std::optional<AuditToken>& sender)
{
    return readMessage(message, types, sender, {}).arguments;
}

}  // namespace typhon
