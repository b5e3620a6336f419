#include "system/file/RandomBytes.h"

#include <gtest/gtest.h>

#include <array>
#include <set>

namespace appsync {
namespace {

TEST(RandomBytesTest, NoneComeTwice) {
    std::set<std::array<std::uint8_t, 16>> seen;
    for (int times = 0; times < 1000; ++times) {
        std::array<std::uint8_t, 16> bytes{};
        ASSERT_TRUE(fillWithRandomBytes(bytes));
        EXPECT_TRUE(seen.insert(bytes).second);
    }
}

TEST(RandomBytesTest, AllThatFitComeAtOnceAndNoMore) {
    std::array<std::uint8_t, 257> bytes{};
    EXPECT_TRUE(fillWithRandomBytes(std::span(bytes).first(256)));
    EXPECT_NE(bytes, (std::array<std::uint8_t, 257>{}));
    EXPECT_FALSE(fillWithRandomBytes(bytes));
}

}  // namespace
}  // namespace appsync
