#include "client/TodoList.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

PropertyList entry(const PropertyList& identifier, const PropertyList& operation) {
    return PropertyList::map({{kTodoIdentifierKey, identifier}, {kTodoOperationKey, operation}});
}

TEST(TodoList, FindsTheFirstEntryOfAnIdentifier) {
    const auto list =
        PropertyList::array({entry("com.example.b", "install"), entry("com.example.a", "remove"),
                             entry("com.example.a", "install")});
    EXPECT_EQ(indexOfEntry(list, "com.example.a"), 1U);
    EXPECT_EQ(indexOfEntry(list, "com.example.c"), std::nullopt);
    EXPECT_EQ(TodoIndex(list).find("com.example.a"), list.at(1));
    EXPECT_EQ(TodoIndex(list).find("com.example.c"), nullptr);
}

TEST(TodoList, PassesOverWhatIsNoEntry) {
    const auto list = PropertyList::array(
        {"com.example.a", 7, entry(7, "remove"), PropertyList::array(), entry("com.example.a", 3)});
    EXPECT_EQ(indexOfEntry(list, "com.example.a"), 4U);
    EXPECT_EQ(TodoIndex(list).find("com.example.a"), list.at(4));
    EXPECT_THAT(identifiersToRemove(list), IsEmpty());
}

TEST(TodoList, RemovesWhatIsSafeAndMarkedExactly) {
    const auto list = PropertyList::array(
        {entry("com.example.b", "remove"), entry("com.example.c", "Remove"),
         entry("x/../y", "remove"), entry(12, "remove"), entry("com.example.a", "remove"),
         entry("com.example.d", "install"), PropertyList::map({{"identifier", "com.example.e"}})});
    EXPECT_THAT(identifiersToRemove(list), ElementsAre("com.example.b", "com.example.a"));
}

TEST(TodoList, ComparesOperationsExactly) {
    EXPECT_TRUE(hasOperation(entry("a", "install"), kTodoInstall));
    EXPECT_FALSE(hasOperation(entry("a", "INSTALL"), kTodoInstall));
    EXPECT_FALSE(hasOperation(entry("a", "install "), kTodoInstall));
    EXPECT_FALSE(hasOperation(PropertyList::map(), kTodoInstall));
    EXPECT_FALSE(hasOperation("install", kTodoInstall));
}

}  // namespace
}  // namespace appsync
