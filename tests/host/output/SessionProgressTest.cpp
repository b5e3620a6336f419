#include "host/output/SessionProgress.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

using namespace std::chrono_literals;

class SessionProgressTest : public testing::Test {
  protected:
    SessionProgressTest() { progress.expect({4, 1000}); }

    void add(SyncEventKind kind, SyncPhase phase, const char* identifier, std::uint64_t done = 0,
             SyncState state = SyncState::Active) {
        progress.add({kind, phase, identifier, done, 500, state, std::nullopt, ""}, now);
    }
    void send(const char* identifier, std::uint64_t done) {
        add(SyncEventKind::Progress, SyncPhase::Transfer, identifier, done);
    }
    void end(SyncPhase phase, const char* identifier, SyncState state = SyncState::Finished) {
        add(SyncEventKind::Ended, phase, identifier, 0, state);
    }

    SessionProgress progress;
    SessionProgress::Clock::time_point now{100s};
};

TEST_F(SessionProgressTest, CountsApplicationsOnceAndBytesAsTheyTravel) {
    send("a", 100);
    send("b", 50);
    send("a", 300);
    EXPECT_EQ(progress.bytes(), 350U);
    end(SyncPhase::Transfer, "a");
    EXPECT_EQ(progress.applications(), 0U) << "it is still to be installed";
    end(SyncPhase::Install, "a");
    end(SyncPhase::Install, "a");
    end(SyncPhase::Remove, "c");
    EXPECT_EQ(progress.applications(), 2U);
}

TEST_F(SessionProgressTest, WhatCannotBeSentIsOverToo) {
    end(SyncPhase::Transfer, "a", SyncState::Failed);
    end(SyncPhase::Install, "b", SyncState::Failed);
    EXPECT_EQ(progress.applications(), 2U);
    EXPECT_EQ(progress.bytes(), 0U);
}

TEST_F(SessionProgressTest, NeverGoesBackNorPastTheEnd) {
    unsigned percent = 0;
    for (const char* each : {"a", "b", "c", "d", "e"}) {
        for (const std::uint64_t done :
             {std::uint64_t{0}, std::uint64_t{200}, std::uint64_t{400}}) {
            send(each, done);
            EXPECT_GE(progress.percent(), percent);
            percent = progress.percent();
        }
        end(SyncPhase::Transfer, each);
        end(SyncPhase::Install, each);
        EXPECT_GE(progress.percent(), percent);
        percent = progress.percent();
    }
    EXPECT_EQ(percent, 100U);
}

TEST_F(SessionProgressTest, OfRemovalsAloneTheNumberCounts) {
    progress.expect({4, 0});
    end(SyncPhase::Remove, "a");
    EXPECT_EQ(progress.percent(), 25U);
}

TEST_F(SessionProgressTest, TheRateIsThatOfTheLastSeconds) {
    EXPECT_FALSE(progress.rate(now));
    for (std::uint64_t second = 0; second <= 20; ++second) {
        send("a", second < 10 ? 0 : (second - 10) * 40);
        now += 1s;
    }
    now -= 1s;
    EXPECT_EQ(progress.rate(now), 40U);
    EXPECT_FALSE(progress.rate(now + 6s)) << "nothing travels any more";
}

TEST_F(SessionProgressTest, WhatIsLeftIsNotGuessedTooSoon) {
    send("a", 0);
    EXPECT_FALSE(progress.left(now));
    now += 10s;
    EXPECT_FALSE(progress.left(now)) << "nothing is done yet";
    send("a", 500);
    EXPECT_EQ(progress.left(now), 30s);
    now += 10s;
    for (const char* each : {"a", "b", "c", "d"}) {
        send(each, 250);
        end(SyncPhase::Install, each);
    }
    EXPECT_FALSE(progress.left(now)) << "it is over";
}

TEST_F(SessionProgressTest, ThePreparationIsNoPartOfIt) {
    progress.add(
        {SyncEventKind::Ended, SyncPhase::Prepare, "", 3, 3, SyncState::Finished, std::nullopt, ""},
        now);
    EXPECT_EQ(progress.applications(), 0U);
}

}  // namespace
}  // namespace appsync
