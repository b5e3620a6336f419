#include "device/values/WallClock.h"

#include <gtest/gtest.h>

#include <limits>

namespace appsync {
namespace {

TEST(WallClock, KeepsATimeToTheMillisecond) {
    EXPECT_EQ(milliseconds(wallTime(1'769'860'800'123)), 1'769'860'800'123);
}

TEST(WallClock, EndsAtTheEndsOfItsRange) {
    constexpr std::int64_t kEnd = std::numeric_limits<std::int64_t>::max();
    EXPECT_EQ(milliseconds(wallTime(kEnd)), kEnd / 1'000'000);
    EXPECT_EQ(milliseconds(wallTime(-kEnd - 1)), -(kEnd / 1'000'000));
}

}  // namespace
}  // namespace appsync
