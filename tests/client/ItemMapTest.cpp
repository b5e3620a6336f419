#include "client/ItemMap.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

std::vector<std::string> itemsOf(const ItemMap& map) {
    std::vector<std::string> items;
    map.forEach([&](const std::string& identifier, const PropertyList& item) {
        items.push_back(identifier + "=" + std::to_string(item.asInteger().value_or(-1)));
    });
    return items;
}

TEST(ItemMap, KeepsTheOrderInWhichItemsCame) {
    ItemMap map;
    EXPECT_TRUE(map.add("c", 1));
    EXPECT_TRUE(map.add("a", 2));
    EXPECT_TRUE(map.add("b", 3));
    EXPECT_EQ(map.size(), 3U);
    EXPECT_THAT(itemsOf(map), ElementsAre("c=1", "a=2", "b=3"));
    EXPECT_EQ(map.size(), 3U) << "they are only shown";
    EXPECT_THAT(itemsOf(ItemMap()), IsEmpty());
}

TEST(ItemMap, KeepsTheFirstItemOfAnIdentifier) {
    ItemMap map;
    EXPECT_TRUE(map.add("a", 1));
    EXPECT_FALSE(map.add("a", 2));
    EXPECT_EQ(map.description(), PropertyList::map({{"a", 1}}));
}

TEST(ItemMap, HandsAnItemOverOnce) {
    ItemMap map;
    map.add("a", 1);
    map.add("b", 2);
    EXPECT_EQ(map.take("a"), std::optional<PropertyList>(1));
    EXPECT_EQ(map.take("a"), std::nullopt);
    EXPECT_FALSE(map.contains("a"));
    EXPECT_TRUE(map.contains("b"));
    EXPECT_EQ(map.description(), PropertyList::map({{"b", 2}}));
}

TEST(ItemMap, PutsAnItemThatWasTakenAtTheEndWhenItComesBack) {
    ItemMap map;
    map.add("a", 1);
    map.add("b", 2);
    ASSERT_TRUE(map.take("a"));
    map.add("a", 3);
    EXPECT_THAT(itemsOf(map), ElementsAre("b=2", "a=3"));
}

}  // namespace
}  // namespace appsync
