#include "platform/PropertyList.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <memory>
#include <string>
#include <vector>

namespace appsync {
namespace {

PropertyList nested(std::size_t depth) {
    PropertyList value = "core";
    for (std::size_t i = 0; i < depth; ++i) value = PropertyList::array({value});
    return value;
}

std::string keyNumber(int number) { return "key" + std::to_string(number); }

PropertyList largeMap(int count) {
    PropertyList map = PropertyList::map();
    for (int i = 0; i < count; ++i) map.set(keyNumber(i), i);
    return map;
}

TEST(PropertyListKinds, EachValueKnowsItsKind) {
    using Kind = PropertyList::Kind;
    EXPECT_EQ(PropertyList().kind(), Kind::Null);
    EXPECT_EQ(PropertyList(true).kind(), Kind::Boolean);
    EXPECT_EQ(PropertyList(-1).kind(), Kind::Integer);
    EXPECT_EQ(PropertyList(1U).kind(), Kind::Unsigned);
    EXPECT_EQ(PropertyList(1.0).kind(), Kind::Real);
    EXPECT_EQ(PropertyList(PropertyList::Date{1}).kind(), Kind::Date);
    EXPECT_EQ(PropertyList(Bytes{1}).kind(), Kind::Data);
    EXPECT_EQ(PropertyList("text").kind(), Kind::String);
    EXPECT_EQ(PropertyList::array().kind(), Kind::Array);
    EXPECT_EQ(PropertyList::map().kind(), Kind::Map);
}

TEST(PropertyListKinds, AValueIsOnlyGivenAsItsOwnKind) {
    const PropertyList text = "1";
    EXPECT_FALSE(text.asBoolean() || text.asInteger() || text.asUnsigned() || text.asReal());
    EXPECT_FALSE(text.asDate().has_value());
    EXPECT_EQ(text.asData(), nullptr);
    EXPECT_EQ(PropertyList(1).asString(), nullptr);
    EXPECT_FALSE(PropertyList(1).asReal().has_value());
    EXPECT_FALSE(PropertyList(true).asInteger().has_value());
}

TEST(PropertyListIntegers, AreGivenInEitherKindWhenTheyFit) {
    EXPECT_EQ(PropertyList(7U).asInteger(), 7);
    EXPECT_EQ(PropertyList(7).asUnsigned(), 7U);
    EXPECT_FALSE(PropertyList(-7).asUnsigned().has_value());
    EXPECT_FALSE(PropertyList(UINT64_MAX).asInteger().has_value());
    EXPECT_EQ(PropertyList(UINT64_MAX).asUnsigned(), UINT64_MAX);
    EXPECT_EQ(PropertyList(INT64_MIN).asInteger(), INT64_MIN);
}

TEST(PropertyListEquality, IntegersCompareByValue) {
    EXPECT_EQ(PropertyList(5), PropertyList(5U));
    EXPECT_NE(PropertyList(-1), PropertyList(UINT64_MAX));
    EXPECT_NE(PropertyList(-1), PropertyList(-2));
    EXPECT_EQ(PropertyList(UINT64_MAX), PropertyList(UINT64_MAX));
    EXPECT_NE(PropertyList(UINT64_MAX), PropertyList(UINT64_MAX - 1));
    EXPECT_NE(PropertyList(1), PropertyList(1.0));
    EXPECT_NE(PropertyList(1), PropertyList(true));
}

TEST(PropertyListEquality, NotANumberEqualsItself) {
    const double nan = std::numeric_limits<double>::quiet_NaN();
    EXPECT_EQ(PropertyList(nan), PropertyList(nan));
    EXPECT_EQ(PropertyList(PropertyList::Date{nan}), PropertyList(PropertyList::Date{nan}));
    EXPECT_NE(PropertyList(nan), PropertyList(0.0));
}

TEST(PropertyListEquality, MapsCompareWithoutTheirOrder) {
    const auto one = PropertyList::map({{"a", 1}, {"b", 2}});
    EXPECT_EQ(one, PropertyList::map({{"b", 2}, {"a", 1}}));
    EXPECT_NE(one, PropertyList::map({{"a", 1}, {"b", 3}}));
    EXPECT_NE(one, PropertyList::map({{"a", 1}, {"c", 2}}));
    EXPECT_NE(one, PropertyList::map({{"a", 1}}));
}

TEST(PropertyListEquality, ArraysCompareInOrder) {
    EXPECT_EQ(PropertyList::array({1, "x"}), PropertyList::array({1, "x"}));
    EXPECT_NE(PropertyList::array({1, "x"}), PropertyList::array({"x", 1}));
    EXPECT_NE(PropertyList::array({1}), PropertyList::array({1, 1}));
    EXPECT_NE(PropertyList::array(), PropertyList::map());
}

TEST(PropertyListEquality, SharedTextEqualsOwnText) {
    const auto text = std::make_shared<const std::string>("text");
    EXPECT_EQ(PropertyList::shared(text), PropertyList("text"));
    EXPECT_EQ(PropertyList::shared(text).kind(), PropertyList::Kind::String);
    EXPECT_EQ(PropertyList::shared(text).asString(), text.get());
}

TEST(PropertyListMoves, LeaveTheNullMarkerBehind) {
    PropertyList from = PropertyList::array({1, 2});
    const PropertyList* first = from.at(0);
    PropertyList to = std::move(from);
    EXPECT_TRUE(from.isNull());  // NOLINT(bugprone-use-after-move): this is what is promised
    EXPECT_EQ(to.at(0), first);
    PropertyList assigned;
    assigned = std::move(to);
    EXPECT_TRUE(to.isNull());  // NOLINT(bugprone-use-after-move)
    EXPECT_EQ(assigned.size(), 2U);
}

TEST(PropertyListCopies, AreIndependent) {
    const auto original = PropertyList::map({{"list", PropertyList::array({1})}});
    PropertyList copy = original;
    copy.set("list", "other");
    EXPECT_EQ(*original.find("list"), PropertyList::array({1}));
    PropertyList part = original;
    part = *part.find("list");
    EXPECT_EQ(part, PropertyList::array({1}));
}

TEST(PropertyListArrays, OneNumberInBracesIsAnElement) {
    EXPECT_EQ(PropertyList::array({7}).size(), 1U);
    EXPECT_EQ(PropertyList::array(7).size(), 0U);
    EXPECT_EQ(PropertyList::array().size(), 0U);
}

TEST(PropertyListArrays, AnswerOutOfRangeWithNothing) {
    PropertyList array = PropertyList::array({1});
    EXPECT_EQ(array.at(1), nullptr);
    EXPECT_FALSE(array.set(1, 2));
    EXPECT_TRUE(array.take(1).isNull());
    EXPECT_EQ(array, PropertyList::array({1}));
}

TEST(PropertyListArrays, GiveTheirElementsOutAndTakeThemBack) {
    PropertyList array = PropertyList::array({PropertyList::array({1}), 2});
    PropertyList inner = array.take(0);
    EXPECT_TRUE(array.at(0)->isNull());
    inner.append(3);
    EXPECT_TRUE(array.set(0, std::move(inner)));
    EXPECT_EQ(array, PropertyList::array({PropertyList::array({1, 3}), 2}));
}

TEST(PropertyListArrays, EditsOfOtherKindsAreRefused) {
    PropertyList text = "text";
    PropertyList map = PropertyList::map();
    EXPECT_FALSE(text.append(1) || map.append(1) || text.set("key", 1) || text.set(0, 1));
    EXPECT_FALSE(PropertyList::array({1}).set("key", 1));
    EXPECT_FALSE(text.erase("key"));
    EXPECT_TRUE(text.take("key").isNull());
    EXPECT_EQ(text, PropertyList("text"));
    EXPECT_EQ(text.size(), 0U);
}

TEST(PropertyListMaps, KeepTheOrderOfInsertion) {
    auto map = PropertyList::map({{"z", 1}, {"a", 2}, {"m", 3}});
    map.set("a", 4);
    ASSERT_EQ(map.size(), 3U);
    EXPECT_EQ(map.entries()[0].key, "z");
    EXPECT_EQ(map.entries()[1].key, "a");
    EXPECT_EQ(map.entries()[1].value, PropertyList(4));
    EXPECT_EQ(map.entries()[2].key, "m");
}

TEST(PropertyListMaps, OfEqualKeysTheLastOneCounts) {
    EXPECT_EQ(PropertyList::map({{"a", 1}, {"a", 2}}), PropertyList::map({{"a", 2}}));
}

TEST(PropertyListMaps, TakingAValueKeepsItsPlace) {
    auto map = PropertyList::map({{"a", PropertyList::array({1})}, {"b", 2}});
    EXPECT_EQ(map.take("a"), PropertyList::array({1}));
    EXPECT_TRUE(map.find("a")->isNull());
    EXPECT_EQ(map.entries()[0].key, "a");
    EXPECT_TRUE(map.take("none").isNull());
}

TEST(PropertyListMaps, FindStringIgnoresOtherKinds) {
    const auto map = PropertyList::map({{"text", "x"}, {"number", 1}});
    EXPECT_EQ(*map.findString("text"), "x");
    EXPECT_EQ(map.findString("number"), nullptr);
    EXPECT_EQ(map.findString("none"), nullptr);
}

TEST(PropertyListMaps, AFlagIsWhatTheValueConvertsTo) {
    const auto map = PropertyList::map(
        {{"yes", true}, {"one", 1}, {"no", false}, {"list", PropertyList::array({1})}});
    EXPECT_TRUE(map.findFlag("yes"));
    EXPECT_TRUE(map.findFlag("one"));
    EXPECT_FALSE(map.findFlag("no"));
    EXPECT_FALSE(map.findFlag("list"));
    EXPECT_FALSE(map.findFlag("none"));
}

TEST(PropertyListMaps, KeysMayHoldAnything) {
    auto map = PropertyList::map();
    map.set(std::string_view("a\0b", 3), 1);
    map.set("", 2);
    EXPECT_EQ(map.find("a"), nullptr);
    EXPECT_EQ(*map.find(std::string_view("a\0b", 3)), PropertyList(1));
    EXPECT_EQ(*map.find(""), PropertyList(2));
}

TEST(PropertyListLargeMaps, FindEveryKey) {
    const PropertyList map = largeMap(5000);
    for (int i = 0; i < 5000; ++i) ASSERT_EQ(*map.find(keyNumber(i)), PropertyList(i));
    EXPECT_EQ(map.find("key5000"), nullptr);
}

TEST(PropertyListLargeMaps, ReplaceInPlace) {
    PropertyList map = largeMap(100);
    EXPECT_TRUE(map.set("key50", "new"));
    EXPECT_EQ(map.size(), 100U);
    EXPECT_EQ(*map.findString("key50"), "new");
    EXPECT_EQ(map.entries()[50].key, "key50");
}

TEST(PropertyListLargeMaps, EraseAnyEntry) {
    PropertyList map = largeMap(300);
    for (int i = 0; i < 300; i += 3) ASSERT_TRUE(map.erase(keyNumber(i)));
    EXPECT_EQ(map.size(), 200U);
    for (int i = 0; i < 300; ++i) ASSERT_EQ(map.find(keyNumber(i)) != nullptr, i % 3 != 0) << i;
    EXPECT_FALSE(map.erase("key0"));
    EXPECT_EQ(map.entries()[0].key, "key1");
}

TEST(PropertyListLargeMaps, ShrinkToNothingAndGrowAgain) {
    PropertyList map = largeMap(20);
    for (int i = 0; i < 15; ++i) map.erase(keyNumber(i));
    map.set("key0", "again");
    EXPECT_EQ(*map.findString("key0"), "again");
    for (int i = 0; i < 20; ++i) map.erase(keyNumber(i));
    EXPECT_TRUE(map.empty());
    for (int i = 0; i < 40; ++i) map.set(keyNumber(i), i);
    EXPECT_EQ(map, largeMap(40));
}

TEST(PropertyListLargeMaps, CopiesFindTheirOwnEntries) {
    const PropertyList original = largeMap(100);
    PropertyList copy = original;
    copy.erase("key10");
    EXPECT_EQ(copy.find("key10"), nullptr);
    EXPECT_EQ(*original.find("key10"), PropertyList(10));
    EXPECT_EQ(*copy.find("key99"), PropertyList(99));
}

TEST(PropertyListDepth, CountsContainersInContainers) {
    EXPECT_EQ(PropertyList("text").depth(), 0U);
    EXPECT_EQ(PropertyList::array().depth(), 1U);
    EXPECT_EQ(PropertyList::map({{"a", PropertyList::array()}, {"b", 1}}).depth(), 2U);
    EXPECT_EQ(nested(128).depth(), 128U);
}

TEST(PropertyListDepth, EveryEditStopsAtTheLimit) {
    const PropertyList deepest = nested(PropertyList::kMaximumDepth);
    PropertyList array = PropertyList::array({1});
    PropertyList map = PropertyList::map({{"a", 1}});
    EXPECT_FALSE(array.append(deepest));
    EXPECT_FALSE(array.set(0, deepest));
    EXPECT_FALSE(map.set("a", deepest));
    EXPECT_FALSE(map.set("b", deepest));
    EXPECT_EQ(array, PropertyList::array({1}));
    EXPECT_EQ(map, PropertyList::map({{"a", 1}}));
    EXPECT_TRUE(array.append(nested(PropertyList::kMaximumDepth - 1)));
}

TEST(PropertyListDepth, WhatTakesAnothersPlaceCounts) {
    PropertyList array = PropertyList::array({1});
    EXPECT_TRUE(array.set(0, nested(4)));
    EXPECT_EQ(array.depth(), 5U);
}

TEST(PropertyListDepth, WhatWasTakenOutNoLongerCounts) {
    PropertyList array = PropertyList::array({nested(127), 1});
    EXPECT_EQ(array.depth(), 128U);
    EXPECT_FALSE(array.take(0).isNull());
    PropertyList outer = PropertyList::array();
    EXPECT_TRUE(outer.append(std::move(array)));
    EXPECT_EQ(outer.depth(), 2U);
}

TEST(PropertyListBooleanConversion, TakesBooleansNumbersAndWords) {
    for (const PropertyList& yes :
         {PropertyList(true), PropertyList(1), PropertyList(-2), PropertyList(UINT64_MAX),
          PropertyList(0.5), PropertyList("yes"), PropertyList("True"), PropertyList("1"),
          PropertyList("Y")}) {
        EXPECT_EQ(yes.booleanConversion(), true);
    }
    for (const PropertyList& no : {PropertyList(false), PropertyList(0), PropertyList(0U),
                                   PropertyList(0.0), PropertyList("NO"), PropertyList("FALSE"),
                                   PropertyList("false"), PropertyList("0"), PropertyList("f")}) {
        EXPECT_EQ(no.booleanConversion(), false);
    }
}

TEST(PropertyListBooleanConversion, GivesNothingForAnythingElse) {
    for (const PropertyList& other :
         {PropertyList(), PropertyList("perhaps"), PropertyList(""), PropertyList("yess"),
          PropertyList(Bytes{1}), PropertyList(PropertyList::Date{1}), PropertyList::array({true}),
          PropertyList::map()}) {
        EXPECT_FALSE(other.booleanConversion().has_value());
    }
}

TEST(PropertyListEquality, DataComparesByItsBytes) {
    const auto bytes = std::make_shared<const Bytes>(Bytes{1, 2});
    EXPECT_EQ(PropertyList::shared(bytes), PropertyList(Bytes{1, 2}));
    EXPECT_EQ(PropertyList::shared(bytes).asData(), bytes.get());
    EXPECT_NE(PropertyList::shared(bytes), PropertyList(Bytes{1, 3}));
    EXPECT_NE(PropertyList::shared(bytes), PropertyList(Bytes{1}));
}

TEST(PropertyListEquality, ScalarsCompareByValueAndKind) {
    EXPECT_EQ(PropertyList(), PropertyList());
    EXPECT_NE(PropertyList(), PropertyList(false));
    EXPECT_NE(PropertyList(true), PropertyList(false));
    EXPECT_EQ(PropertyList(0.5), PropertyList(0.5));
    EXPECT_NE(PropertyList(0.5), PropertyList(0.25));
    EXPECT_NE(PropertyList(0.5), PropertyList(std::numeric_limits<double>::quiet_NaN()));
    EXPECT_EQ(PropertyList(PropertyList::Date{5}), PropertyList(PropertyList::Date{5}));
    EXPECT_NE(PropertyList(PropertyList::Date{5}), PropertyList(PropertyList::Date{6}));
    EXPECT_NE(PropertyList("a"), PropertyList("b"));
}

TEST(PropertyListIntegers, AreMadeOfEveryWidth) {
    EXPECT_EQ(PropertyList(-5LL), PropertyList(-5));
    EXPECT_EQ(PropertyList(5ULL), PropertyList(5));
    EXPECT_EQ(PropertyList(5ULL).kind(), PropertyList::Kind::Unsigned);
    EXPECT_EQ(PropertyList(0).asUnsigned(), 0U);
}

TEST(PropertyListCopies, OntoThemselvesChangeNothing) {
    PropertyList list = PropertyList::array({1, 2});
    PropertyList& same = list;
    list = same;
    EXPECT_EQ(list, PropertyList::array({1, 2}));
    list = std::move(same);
    EXPECT_EQ(list, PropertyList::array({1, 2}));
}

TEST(PropertyListArrays, GiveNothingOutOfOtherKinds) {
    PropertyList map = PropertyList::map({{"a", 1}});
    EXPECT_TRUE(map.take(0).isNull());
    EXPECT_EQ(map.at(0), nullptr);
    EXPECT_EQ(map, PropertyList::map({{"a", 1}}));
}

TEST(PropertyListReaders, MakeAnArrayOfItsParts) {
    std::vector<PropertyList> parts = {1, PropertyList::array()};
    PropertyList value;
    EXPECT_TRUE(value.becomeArray(parts));
    EXPECT_EQ(value, PropertyList::array({1, PropertyList::array()}));
    EXPECT_EQ(value.depth(), 2U);
}

TEST(PropertyListReaders, MakeAMapOfItsParts) {
    std::vector<PropertyList::Entry> parts;
    for (int i = 0; i < 40; ++i) parts.push_back({keyNumber(i), i});
    parts[0].value = PropertyList::array();
    PropertyList value;
    EXPECT_TRUE(value.becomeMap(parts));
    ASSERT_EQ(value.size(), 40U);
    EXPECT_EQ(*value.find("key39"), PropertyList(39));
    EXPECT_EQ(value.find("key40"), nullptr);
    EXPECT_EQ(value.depth(), 2U);
}

TEST(PropertyListReaders, MakeContainersOfScalarsOneDeep) {
    std::vector<PropertyList> elements = {1, "x"};
    std::vector<PropertyList::Entry> entries;
    entries.push_back({"a", 1});
    PropertyList array;
    PropertyList map;
    EXPECT_TRUE(array.becomeArray(elements));
    EXPECT_TRUE(map.becomeMap(entries));
    EXPECT_EQ(array.depth(), 1U);
    EXPECT_EQ(map.depth(), 1U);
}

TEST(PropertyListReaders, AreRefusedWhatIsTooDeep) {
    std::vector<PropertyList> elements = {1, nested(PropertyList::kMaximumDepth)};
    std::vector<PropertyList::Entry> entries;
    entries.push_back({"a", nested(PropertyList::kMaximumDepth)});
    PropertyList value = "unchanged";
    EXPECT_FALSE(value.becomeArray(elements));
    EXPECT_FALSE(value.becomeMap(entries));
    EXPECT_EQ(value, PropertyList("unchanged"));
    EXPECT_EQ(elements.size(), 2U);
    EXPECT_EQ(entries[0].value.depth(), PropertyList::kMaximumDepth);
}

TEST(PropertyListReaders, TellKeysApartThatDifferInTheMiddleOnly) {
    std::vector<PropertyList::Entry> entries;
    for (const char* key : {"kay", "key", "kny"}) entries.push_back({key, key});
    PropertyList value;
    ASSERT_TRUE(value.becomeMap(entries));
    EXPECT_EQ(value.size(), 3U);
    EXPECT_EQ(*value.findString("key"), "key");
}

/// Few keys are compared one after the other, many are looked up by their hashes.
class PropertyListRepeatedKeys : public testing::TestWithParam<int> {
  protected:
    [[nodiscard]] std::vector<PropertyList::Entry> entries() const {
        std::vector<PropertyList::Entry> result;
        for (int i = 0; i < GetParam(); ++i) result.push_back({keyNumber(i), i});
        return result;
    }
};

TEST_P(PropertyListRepeatedKeys, AreFoundWhereTheyStand) {
    auto some = entries();
    EXPECT_EQ(PropertyList::findRepeatedKey(some), std::nullopt);
    some.push_back({keyNumber(GetParam() - 1), 0});
    some.push_back({keyNumber(0), 0});
    EXPECT_EQ(PropertyList::findRepeatedKey(some), static_cast<std::size_t>(GetParam()));
}

TEST_P(PropertyListRepeatedKeys, MakeNoMap) {
    auto some = entries();
    some.push_back({keyNumber(0), 0});
    PropertyList value = "unchanged";
    EXPECT_FALSE(value.becomeMap(some));
    EXPECT_EQ(value, PropertyList("unchanged"));
}

INSTANTIATE_TEST_SUITE_P(FewAndMany, PropertyListRepeatedKeys,
                         testing::Values(1, 14, 15, 16, 17, 40));

TEST(PropertyListDepth, OfAMapCountsWhatIsStillInIt) {
    PropertyList map = PropertyList::map({{"deep", nested(127)}, {"a", PropertyList::array()}});
    EXPECT_EQ(map.depth(), 128U);
    EXPECT_TRUE(map.erase("deep"));
    PropertyList outer = PropertyList::map();
    EXPECT_TRUE(outer.set("inner", std::move(map)));
    EXPECT_EQ(outer.depth(), 3U);
}

}  // namespace
}  // namespace appsync
