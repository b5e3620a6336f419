#include "host/watch/WaitLimit.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace appsync {
namespace {

using std::chrono::seconds;
using testing::ElementsAre;
using testing::IsEmpty;

// Looks every second.
class WaitLimitTest : public testing::Test {
  protected:
    std::vector<std::string> lookAfter(int looks) {
        std::vector<std::string> last;
        for (int look = 0; look < looks && last.empty(); ++look) {
            now_ += seconds(1);
            last = limit.givenUpAt(now_);
        }
        return last;
    }

    void begin(seconds longest) {
        limit.set(longest);
        limit.isUnderWay("com.a");
        limit.nothingMoreIsSent();
    }

  private:
    WaitLimit::TimePoint now_;

  protected:
    WaitLimit limit{now_};
};

TEST_F(WaitLimitTest, IsOverWhenItHasBeenWaitedForSoLong) {
    begin(seconds(5));
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(4), IsEmpty());
    EXPECT_THAT(lookAfter(1), ElementsAre("com.a"));
}

TEST_F(WaitLimitTest, IsOverOnce) {
    begin(seconds(0));
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(1), ElementsAre("com.a"));
    EXPECT_THAT(lookAfter(10), IsEmpty());
}

TEST_F(WaitLimitTest, IsNeverOverWithoutALimit) {
    limit.isUnderWay("com.a");
    limit.nothingMoreIsSent();
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(100'000), IsEmpty());
}

TEST_F(WaitLimitTest, DoesNotCountWhileSomethingElseIsToBeDone) {
    limit.set(seconds(0));
    limit.isUnderWay("com.a");
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(10), IsEmpty());  // packages are still sent
    limit.isUnderWay("com.b");
    limit.nothingMoreIsSent();
    EXPECT_THAT(lookAfter(10), IsEmpty());  // com.b is being installed
    limit.hasEnded("com.b");
    EXPECT_THAT(lookAfter(1), ElementsAre("com.a"));
}

TEST_F(WaitLimitTest, CountsAllWaitsTogether) {
    begin(seconds(10));
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(6), IsEmpty());
    limit.goesOn("com.a");
    EXPECT_THAT(lookAfter(100), IsEmpty());
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(3), IsEmpty());
    EXPECT_THAT(lookAfter(1), ElementsAre("com.a"));
}

TEST_F(WaitLimitTest, ATryThatIsRefusedAgainBeginsNothingAnew) {
    begin(seconds(10));
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(9), IsEmpty());
    limit.waits("com.a");
    EXPECT_THAT(lookAfter(1), ElementsAre("com.a"));
}

TEST_F(WaitLimitTest, WhatHasEndedIsWaitedForNoMore) {
    begin(seconds(2));
    limit.isUnderWay("com.b");
    limit.waits("com.a");
    limit.waits("com.b");
    EXPECT_THAT(lookAfter(1), IsEmpty());
    limit.hasEnded("com.a");
    EXPECT_THAT(lookAfter(1), ElementsAre("com.b"));
    limit.hasEnded("com.b");
    EXPECT_THAT(lookAfter(100), IsEmpty());
}

}  // namespace
}  // namespace appsync
