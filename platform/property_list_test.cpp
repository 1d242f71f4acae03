#include "platform/property_list.h"

#include <atomic>
#include <cmath>
#include <limits>
#include <thread>

#include <gmock/gmock.h>

namespace typhon {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using Array = PropertyList::Array;
using Dictionary = PropertyList::Dictionary;
using Kind = PropertyList::Kind;

constexpr int deeperThanTheStack = 200'000;

PropertyList nestedArrays(int depth, PropertyList innermost)
{
    for (int level = 0; level < depth; ++level)
        innermost = Array{std::move(innermost)};
    return innermost;
}

PropertyList nestedDictionaries(int depth)
{
    PropertyList value(1);
    for (int level = 0; level < depth; ++level) {
        Dictionary outer;
        outer.emplace("inner", std::move(value));
        value = std::move(outer);
    }
    return value;
}

bool sameIdentity(const PropertyList& left, const PropertyList& right)
{
    const auto one = left.identity();
    const auto other = right.identity();
    return !one.owner_before(other) && !other.owner_before(one);
}

TEST(PropertyListTest, DefaultIsTheEmptyDictionary)
{
    const PropertyList value;
    EXPECT_EQ(value.kind(), Kind::dictionary);
    ASSERT_NE(value.asDictionary(), nullptr);
    EXPECT_TRUE(value.asDictionary()->empty());
    EXPECT_EQ(value, PropertyList(Dictionary{}));
}

TEST(PropertyListTest, EveryKindReadsBackAsItselfOnly)
{
    EXPECT_TRUE(*PropertyList(true).asBoolean());
    EXPECT_FALSE(*PropertyList(false).asBoolean());
    EXPECT_EQ(*PropertyList(-7).asInteger(), -7);
    EXPECT_EQ(*PropertyList(std::numeric_limits<std::int64_t>::min()).asInteger(),
              std::numeric_limits<std::int64_t>::min());
    EXPECT_EQ(*PropertyList(2.5).asReal(), 2.5);
    EXPECT_EQ(*PropertyList("text").asString(), "text");
    EXPECT_EQ(*PropertyList(std::string_view("te\0t", 4)).asString(), std::string("te\0t", 4));
    EXPECT_EQ(PropertyList(Data{{1, 2}}).asData()->bytes, (std::vector<std::uint8_t>{1, 2}));
    EXPECT_EQ(PropertyList(Date{-1.5}).asDate()->seconds, -1.5);
    EXPECT_EQ(PropertyList(Array{1, 2}).asArray()->size(), 2u);
    EXPECT_EQ(PropertyList(1).asBoolean(), nullptr);
    EXPECT_EQ(PropertyList(true).asInteger(), nullptr);
    EXPECT_EQ(PropertyList(1).asReal(), nullptr);
    EXPECT_EQ(PropertyList(Data{}).asString(), nullptr);
    EXPECT_EQ(PropertyList("text").asDictionary(), nullptr);
}

TEST(PropertyListTest, KindNamesEachAlternative)
{
    EXPECT_EQ(PropertyList(true).kind(), Kind::boolean);
    EXPECT_EQ(PropertyList(1).kind(), Kind::integer);
    EXPECT_EQ(PropertyList(1.0).kind(), Kind::real);
    EXPECT_EQ(PropertyList("").kind(), Kind::string);
    EXPECT_EQ(PropertyList(Data{}).kind(), Kind::data);
    EXPECT_EQ(PropertyList(Date{}).kind(), Kind::date);
    EXPECT_EQ(PropertyList(Array{}).kind(), Kind::array);
    EXPECT_EQ(PropertyList(Dictionary{}).kind(), Kind::dictionary);
}

TEST(PropertyListTest, EqualityComparesContentsAndKindsStrictly)
{
    const PropertyList one(Dictionary{{"a", Array{1, "x", 2.0}}, {"b", Data{{9}}}});
    const PropertyList same(Dictionary{{"b", Data{{9}}}, {"a", Array{1, "x", 2.0}}});
    EXPECT_EQ(one, same);
    EXPECT_FALSE(one == PropertyList(Dictionary{{"a", Array{1, "x", 2.5}}, {"b", Data{{9}}}}));
    EXPECT_FALSE(one == PropertyList(Dictionary{{"a", Array{1, "x", 2.0}}, {"c", Data{{9}}}}));
    EXPECT_FALSE(PropertyList(Array{1}) == PropertyList(Array{1, 1}));
    EXPECT_FALSE(PropertyList(true) == PropertyList(1));
    EXPECT_FALSE(PropertyList(1) == PropertyList(1.0));
    EXPECT_FALSE(PropertyList(1.0) == PropertyList(Date{1.0}));
    EXPECT_FALSE(PropertyList(Array{}) == PropertyList(Dictionary{}));
}

TEST(PropertyListTest, EqualRealsAreThoseThatAreWrittenAlike)
{
    EXPECT_EQ(PropertyList(std::nan("")), PropertyList(std::nan("1")));
    EXPECT_EQ(PropertyList(0.0), PropertyList(0.0));
    EXPECT_FALSE(PropertyList(0.0) == PropertyList(-0.0));
    EXPECT_FALSE(PropertyList(0.0) == PropertyList(std::nan("")));
}

TEST(PropertyListTest, CopiesShareTheirContents)
{
    const PropertyList value(std::string("shared"));
    const PropertyList copy = value;
    EXPECT_EQ(value.asString(), copy.asString());
    EXPECT_TRUE(sameIdentity(value, copy));
    EXPECT_FALSE(sameIdentity(value, PropertyList(std::string("shared"))));
}

TEST(PropertyListTest, IdentityExpiresWithTheLastCopy)
{
    auto value = std::make_optional<PropertyList>(Array{1});
    const auto identity = value->identity();
    auto copy = value;
    value.reset();
    EXPECT_FALSE(identity.expired());
    copy.reset();
    EXPECT_TRUE(identity.expired());
}

TEST(PropertyListTest, MovedFromReadsAsTheEmptyDictionary)
{
    PropertyList value("text");
    const PropertyList taken = std::move(value);
    EXPECT_EQ(value, PropertyList());  // NOLINT(bugprone-use-after-move): this is what is tested
    EXPECT_EQ(value.kind(), Kind::dictionary);
    EXPECT_EQ(value.asString(), nullptr);
    EXPECT_EQ(*taken.asString(), "text");
}

TEST(PropertyListTest, ATakenDictionaryIsCopiedOnlyWhenItIsShared)
{
    PropertyList value = Dictionary{{"entry", 1}};
    const PropertyList shared = value;
    const auto* const entries = shared.asDictionary();
    auto taken = std::move(value).takeDictionary();
    taken.at("entry") = 2;
    EXPECT_EQ(shared, PropertyList(Dictionary{{"entry", 1}}));
    EXPECT_NE(&taken.begin()->first, &entries->begin()->first);

    PropertyList sole = Dictionary{{"entry", 1}};
    const auto* const key = &sole.asDictionary()->begin()->first;
    const auto moved = std::move(sole).takeDictionary();
    EXPECT_EQ(&moved.begin()->first, key);
    EXPECT_EQ(sole, PropertyList());  // NOLINT(bugprone-use-after-move): it says what is left
    EXPECT_TRUE(PropertyList("text").takeDictionary().empty());
    EXPECT_TRUE(PropertyList().takeDictionary().empty());
}

TEST(PropertyListTest, FindLooksOnlyIntoDictionaries)
{
    const PropertyList value(Dictionary{{"present", "here"}});
    ASSERT_NE(value.find("present"), nullptr);
    EXPECT_EQ(*value.find("present"), PropertyList("here"));
    EXPECT_EQ(value.find("absent"), nullptr);
    EXPECT_EQ(PropertyList(Array{"present"}).find("present"), nullptr);
}

TEST(PropertyListTest, OnlyTheBooleanTrueIsTrue)
{
    EXPECT_TRUE(PropertyList(true).isTrue());
    EXPECT_FALSE(PropertyList(false).isTrue());
    EXPECT_FALSE(PropertyList(1).isTrue());
    EXPECT_FALSE(PropertyList("true").isTrue());
    EXPECT_FALSE(PropertyList().isTrue());
}

TEST(PropertyListTest, StringsOfLeavesOutWhatIsNotAString)
{
    EXPECT_THAT(stringsOf(Array{"a", 1, "b", Array{"c"}}), ElementsAre("a", "b"));
    EXPECT_THAT(stringsOf(PropertyList("a")), IsEmpty());
    EXPECT_EQ(arrayOfStrings({"a", "b"}), PropertyList(Array{"a", "b"}));
}

TEST(PropertyListTest, DictionariesAreWalkedInByteOrder)
{
    const PropertyList value(Dictionary{{"b", 1}, {"\xC3\xA4", 2}, {"B", 3}, {"", 4}});
    std::vector<std::string> keys;
    for (const auto& [key, member] : *value.asDictionary())
        keys.push_back(key);
    EXPECT_THAT(keys, ElementsAre("", "B", "b", "\xC3\xA4"));
}

TEST(PropertyListTest, DeepValuesAreReleasedWithoutDeepRecursion)
{
    auto arrays = nestedArrays(deeperThanTheStack, 1);
    auto dictionaries = nestedDictionaries(deeperThanTheStack);
    arrays = PropertyList(1);
    dictionaries = PropertyList(1);
    EXPECT_EQ(arrays, dictionaries);
}

TEST(PropertyListTest, EveryPartOfADeepValueIsReleased)
{
    PropertyList innermost(std::string("watched"));
    const auto identity = innermost.identity();
    auto deep = PropertyList(Array{nestedArrays(1000, innermost), nestedArrays(500, innermost)});
    innermost = PropertyList();
    EXPECT_FALSE(identity.expired());
    deep = PropertyList();
    EXPECT_TRUE(identity.expired());
}

TEST(PropertyListTest, DeepValuesAreComparedWithoutDeepRecursion)
{
    const auto left = nestedArrays(deeperThanTheStack, 1);
    EXPECT_EQ(left, nestedArrays(deeperThanTheStack, 1));
    EXPECT_FALSE(left == nestedArrays(deeperThanTheStack, 2));
    EXPECT_FALSE(left == nestedArrays(deeperThanTheStack - 1, 1));
}

TEST(PropertyListTest, CopiesMayBeReadAndReleasedByAnyThread)
{
    const PropertyList value(Dictionary{{"entry", Array{1, "two", true}}});
    std::vector<std::thread> threads;
    std::atomic<int> equal{0};
    for (int thread = 0; thread < 4; ++thread)
        threads.emplace_back([copy = value, &equal] {
            for (int turn = 0; turn < 1000; ++turn) {
                const PropertyList another = copy;
                equal += another == PropertyList(Dictionary{{"entry", Array{1, "two", true}}}) ? 1 : 0;
            }
        });
    for (auto& thread : threads)
        thread.join();
    EXPECT_EQ(equal, 4000);
}

}  // namespace
}  // namespace typhon
