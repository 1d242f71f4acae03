// A property list is one shared, immutable node; containers hold further values. Nodes are released and
// compared without recursion that the data could deepen: a value built in memory, or read with generous
// limits, may be nested deeper than the stack is long.

#include "platform/property_list.h"

#include <cmath>
#include <type_traits>

namespace typhon {
namespace {

using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;

/// Destroys nested containers: plainly down to a fixed depth, and whatever is deeper afterwards, from the
/// outermost call. One a thread; trivially destructible, since static values are released after
/// thread-local objects are gone.
class Disposal {
public:
    template <typename Container>
    static void dispose(Container& container)
    {
        if (container.empty())
            return;
        if (current_.depth == maximumDepth) {
            current_.postponed->emplace_back(std::move(container));
            return;
        }
        if (current_.depth == 0)
            disposeOutermost(container);
        else
            clear(container);
    }

private:
    static constexpr unsigned maximumDepth = 64;
    using Postponed = std::vector<std::variant<Array, Dictionary>>;

    template <typename Container>
    static void clear(Container& container)
    {
        ++current_.depth;
        container.clear();
        --current_.depth;
    }

    template <typename Container>
    static void disposeOutermost(Container& container)
    {
        Postponed postponed;
        current_.postponed = &postponed;
        clear(container);
        while (!postponed.empty()) {
            auto next = std::move(postponed.back());
            postponed.pop_back();
            std::visit([](auto& deeper) { clear(deeper); }, next);
        }
        current_.postponed = nullptr;
    }

    struct State {
        unsigned depth;
        Postponed* postponed;
    };
    static constinit thread_local State current_;
};

constinit thread_local Disposal::State Disposal::current_{};

template <typename Contents>
struct Node {
    // Nodes are neither copied nor moved.
    template <typename Value>
    explicit Node(Value&& value)  // NOLINT(bugprone-forwarding-reference-overload)
        : contents(std::forward<Value>(value))
    {}
    Node(const Node&) = delete;
    Node& operator=(const Node&) = delete;
    ~Node()
    {
        if (auto* array = std::get_if<Array>(&contents))
            Disposal::dispose(*array);
        else if (auto* dictionary = std::get_if<Dictionary>(&contents))
            Disposal::dispose(*dictionary);
    }
    Contents contents;
};

/// One allocation for the contents and their reference count.
template <typename Contents, typename Value>
std::shared_ptr<const Contents> share(Value&& value)
{
    auto node = std::make_shared<Node<Contents>>(std::forward<Value>(value));
    const Contents* contents = &node->contents;
    return {std::move(node), contents};
}

// Never destroyed, so that values may be made while the process exits.
const PropertyList& sharedEmptyDictionary()
{
    static const auto& shared = *new PropertyList(Dictionary());
    return shared;
}

template <typename Contents>
const std::shared_ptr<const Contents>& sharedBoolean(bool value)
{
    static const auto& yes = *new auto(share<Contents>(true));
    static const auto& no = *new auto(share<Contents>(false));
    return value ? yes : no;
}

/// A moved-from value reads as the empty dictionary.
template <typename Kind, typename Contents>
const Kind* contentsAs(const std::shared_ptr<const Contents>& contents) noexcept
{
    if (contents)
        return std::get_if<Kind>(contents.get());
    if constexpr (std::is_same_v<Kind, Dictionary>)
        return sharedEmptyDictionary().asDictionary();
    else
        return nullptr;
}

// Zero and minus zero differ, and "not a number" equals itself: what is equal is also written alike.
bool equal(double left, double right)
{
    return (left == right && std::signbit(left) == std::signbit(right)) ||
           (std::isnan(left) && std::isnan(right));
}

bool equal(const Date& left, const Date& right)
{
    return left.seconds == right.seconds || (std::isnan(left.seconds) && std::isnan(right.seconds));
}

template <typename Value>
bool equal(const Value& left, const Value& right)
{
    return left == right;
}

using Pairs = std::vector<std::pair<const PropertyList*, const PropertyList*>>;

/// Compares two containers, except for the values in them, whose pairs it adds to `pairs`.
bool compareShape(const Array& left, const Array& right, Pairs& pairs)
{
    if (left.size() != right.size())
        return false;
    for (std::size_t index = 0; index < left.size(); ++index)
        pairs.emplace_back(&left[index], &right[index]);
    return true;
}

bool compareShape(const Dictionary& left, const Dictionary& right, Pairs& pairs)
{
    if (left.size() != right.size())
        return false;
    for (auto one = left.begin(), other = right.begin(); one != left.end(); ++one, ++other) {
        if (one->first != other->first)
            return false;
        pairs.emplace_back(&one->second, &other->second);
    }
    return true;
}

/// The same for two values of any kind.
bool compareShallowly(const PropertyList& left, const PropertyList& right, Pairs& pairs)
{
    using Kind = PropertyList::Kind;
    if (left.kind() != right.kind())
        return false;
    switch (left.kind()) {
    case Kind::boolean:
        return *left.asBoolean() == *right.asBoolean();
    case Kind::integer:
        return *left.asInteger() == *right.asInteger();
    case Kind::real:
        return equal(*left.asReal(), *right.asReal());
    case Kind::string:
        return *left.asString() == *right.asString();
    case Kind::data:
        return *left.asData() == *right.asData();
    case Kind::date:
        return equal(*left.asDate(), *right.asDate());
    case Kind::array:
        return compareShape(*left.asArray(), *right.asArray(), pairs);
    case Kind::dictionary:
        return compareShape(*left.asDictionary(), *right.asDictionary(), pairs);
    }
    return false;
}

}  // namespace

PropertyList::PropertyList() : PropertyList(sharedEmptyDictionary()) {}
PropertyList::PropertyList(bool value) : contents_(sharedBoolean<Contents>(value)) {}
PropertyList::PropertyList(int value) : PropertyList(std::int64_t{value}) {}
PropertyList::PropertyList(std::int64_t value) : contents_(share<Contents>(value)) {}
PropertyList::PropertyList(double value) : contents_(share<Contents>(value)) {}
PropertyList::PropertyList(const char* value) : PropertyList(std::string(value)) {}
PropertyList::PropertyList(std::string_view value) : PropertyList(std::string(value)) {}
PropertyList::PropertyList(std::string value) : contents_(share<Contents>(std::move(value))) {}
PropertyList::PropertyList(Data value) : contents_(share<Contents>(std::move(value))) {}
PropertyList::PropertyList(Date value) : contents_(share<Contents>(value)) {}
PropertyList::PropertyList(Array value) : contents_(share<Contents>(std::move(value))) {}
PropertyList::PropertyList(Dictionary value) : contents_(share<Contents>(std::move(value))) {}

PropertyList::Kind PropertyList::kind() const noexcept
{
    return contents_ ? static_cast<Kind>(contents_->index()) : Kind::dictionary;
}

const bool* PropertyList::asBoolean() const noexcept
{
    return contentsAs<bool>(contents_);
}
const std::int64_t* PropertyList::asInteger() const noexcept
{
    return contentsAs<std::int64_t>(contents_);
}
const double* PropertyList::asReal() const noexcept
{
    return contentsAs<double>(contents_);
}
const std::string* PropertyList::asString() const noexcept
{
    return contentsAs<std::string>(contents_);
}
const Data* PropertyList::asData() const noexcept
{
    return contentsAs<Data>(contents_);
}
const Date* PropertyList::asDate() const noexcept
{
    return contentsAs<Date>(contents_);
}
const Array* PropertyList::asArray() const noexcept
{
    return contentsAs<Array>(contents_);
}
const Dictionary* PropertyList::asDictionary() const noexcept
{
    return contentsAs<Dictionary>(contents_);
}

const PropertyList* PropertyList::find(std::string_view key) const noexcept
{
    const auto* dictionary = asDictionary();
    if (dictionary == nullptr)
        return nullptr;
    const auto found = dictionary->find(key);
    return found == dictionary->end() ? nullptr : &found->second;
}

Dictionary PropertyList::takeDictionary() &&
{
    const auto contents = std::move(contents_);
    const auto* dictionary = contentsAs<Dictionary>(contents);
    if (dictionary == nullptr)
        return {};
    if (contents.use_count() != 1)
        return *dictionary;
    // Another thread may only just have let go of its copy: to count up and down waits for what it still
    // read.
    std::shared_ptr<const Contents>(contents).reset();
    return std::move(*const_cast<Dictionary*>(dictionary));
}

bool PropertyList::isTrue() const noexcept
{
    const bool* boolean = asBoolean();
    return boolean != nullptr && *boolean;
}

std::weak_ptr<const void> PropertyList::identity() const noexcept
{
    return contents_;
}

bool PropertyList::operator==(const PropertyList& other) const
{
    Pairs pairs{{this, &other}};
    while (!pairs.empty()) {
        const auto [left, right] = pairs.back();
        pairs.pop_back();
        if (left->contents_ != right->contents_ && !compareShallowly(*left, *right, pairs))
            return false;
    }
    return true;
}

std::vector<std::string> stringsOf(const PropertyList& array)
{
    std::vector<std::string> strings;
    const auto* elements = array.asArray();
    if (elements == nullptr)
        return strings;
    strings.reserve(elements->size());
    for (const auto& element : *elements) {
        if (const auto* string = element.asString())
            strings.push_back(*string);
    }
    return strings;
}

PropertyList arrayOfStrings(const std::vector<std::string>& strings)
{
    return Array(strings.begin(), strings.end());
}

}  // namespace typhon
