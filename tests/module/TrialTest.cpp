#include "host/module/Trial.h"

#include <gtest/gtest.h>

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>

namespace appsync {
namespace {

Result<TrialOutcome> tryToTell(std::size_t size, std::chrono::milliseconds limit) {
    return tryInAnotherProcess([size] { return std::string(size, 'x'); }, limit);
}

TEST(Trial, OfALongAnswerIsHeardOut) {
    const Result<TrialOutcome> outcome = tryToTell(60'000, std::chrono::minutes(1));
    ASSERT_TRUE(outcome.ok());
    EXPECT_FALSE(outcome->isOverdue);
    EXPECT_EQ(outcome->answer, std::string(60'000, 'x'));
}

TEST(Trial, OfAnAnswerWithoutEndIsGivenUp) {
    const Result<TrialOutcome> outcome = tryToTell(300'000, std::chrono::milliseconds(100));
    ASSERT_TRUE(outcome.ok());
    EXPECT_TRUE(outcome->isOverdue);
    EXPECT_EQ(outcome->answer, std::nullopt);
}

}  // namespace
}  // namespace appsync
