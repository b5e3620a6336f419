#include "host/plan/Versions.h"

#include <gtest/gtest.h>

#include <string_view>
#include <utility>

namespace appsync {
namespace {

using Pair = std::pair<std::string_view, std::string_view>;

class LowerVersion : public testing::TestWithParam<Pair> {};

TEST_P(LowerVersion, ComesBeforeTheHigherOne) {
    const auto [lower, higher] = GetParam();
    EXPECT_TRUE(compareVersions(lower, higher) < 0);
    EXPECT_TRUE(compareVersions(higher, lower) > 0);
}

INSTANTIATE_TEST_SUITE_P(Versions, LowerVersion,
                         testing::Values(Pair{"1.9", "1.10"}, Pair{"1", "1.0.1"}, Pair{"", "1"},
                                         Pair{"1.0b2", "1.0"}, Pair{"1.0.beta", "1.0.1"},
                                         Pair{"1.0a", "1.0b"}, Pair{"2", "10"},
                                         Pair{"99999999999999999998", "99999999999999999999"}));

class SameVersion : public testing::TestWithParam<Pair> {};

TEST_P(SameVersion, IsNeitherHigherNorLower) {
    EXPECT_TRUE(compareVersions(GetParam().first, GetParam().second) == 0);
}

INSTANTIATE_TEST_SUITE_P(Versions, SameVersion,
                         testing::Values(Pair{"", ""}, Pair{"2", "2.0"}, Pair{"1.02", "1.2"},
                                         Pair{"1-2", "1.2"}, Pair{"1.0.0.0", "1"},
                                         Pair{"..1", "1"}));

}  // namespace
}  // namespace appsync
