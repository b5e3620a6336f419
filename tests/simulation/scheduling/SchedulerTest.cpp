#include "simulation/scheduling/Scheduler.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <memory>
#include <set>
#include <stdexcept>
#include <string>
#include <vector>

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

std::string failureOf(const std::function<void()>& action) {
    try {
        action();
    } catch (const std::exception& failure) {
        return failure.what();
    }
    return "no failure";
}

TEST(SchedulerTest, TasksRunWhileTheHostIsBlocked) {
    Scheduler scheduler(Scheduling::runToCompletion());
    bool done = false;
    scheduler.spawn("task", [&] { done = true; });
    EXPECT_FALSE(done);
    scheduler.wait("the task", [&] { return done; });
    EXPECT_TRUE(done);
}

TEST(SchedulerTest, WithoutSeedEachTaskRunsUntilItBlocks) {
    Scheduler scheduler(Scheduling::runToCompletion());
    std::string trace;
    bool open = false;
    scheduler.spawn("a", [&] {
        trace += "a";
        scheduler.switchPoint();
        trace += "a";
        scheduler.wait("the gate", [&] { return open; });
        trace += "a";
    });
    scheduler.spawn("b", [&] {
        trace += "b";
        open = true;
        trace += "b";
    });
    scheduler.runUntilIdle();
    EXPECT_EQ(trace, "aabba");
}

TEST(SchedulerTest, AdvancingPastTheLimitWithWorkDueBehindItIsAFailure) {
    Scheduler scheduler(Scheduling::runToCompletion());
    scheduler.setTimeLimit(10s);
    bool done = false;
    scheduler.spawnAfter(20s, "late", [&] { done = true; });
    scheduler.advance(5s);
    EXPECT_THAT(failureOf([&] { scheduler.advance(30s); }), HasSubstr("limit of 10 s"));
    EXPECT_FALSE(done);
}

TEST(SchedulerTest, TimeJumpsToTheNextDelayedTask) {
    Scheduler scheduler(Scheduling::runToCompletion());
    std::vector<SimulatedTime> times;
    scheduler.spawnAfter(30s, "late", [&] { times.push_back(scheduler.now()); });
    scheduler.spawnAfter(10s, "early", [&] { times.push_back(scheduler.now()); });
    scheduler.wait("both", [&] { return times.size() == 2; });
    EXPECT_THAT(times, ElementsAre(10s, 30s));
}

TEST(SchedulerTest, DelayedTasksOfOneMomentRunInTheOrderOfSubmission) {
    Scheduler scheduler(Scheduling::runToCompletion());
    std::string trace;
    for (const char* name : {"1", "2", "3"})
        scheduler.spawnAfter(5s, name, [&trace, name] { trace += name; });
    scheduler.advance(5s);
    EXPECT_EQ(trace, "123");
}

TEST(SchedulerTest, AWaitEndsAtItsTimeout) {
    Scheduler scheduler(Scheduling::runToCompletion());
    EXPECT_FALSE(scheduler.waitFor("nothing", 5s, [] { return false; }));
    EXPECT_EQ(scheduler.now(), 5s);
}

TEST(SchedulerTest, AWaitThatIsFulfilledInTimeDoesNotLastUntilItsTimeout) {
    Scheduler scheduler(Scheduling::runToCompletion());
    bool done = false;
    scheduler.spawnAfter(2s, "task", [&] { done = true; });
    EXPECT_TRUE(scheduler.waitFor("the task", 5s, [&] { return done; }));
    EXPECT_EQ(scheduler.now(), 2s);
}

TEST(SchedulerTest, ATimeoutThatWasNotNeededEndsNoLaterWait) {
    Scheduler scheduler(Scheduling::runToCompletion());
    EXPECT_TRUE(scheduler.waitFor("nothing", 1s, [] { return true; }));
    bool done = false;
    scheduler.spawnAfter(5s, "task", [&] { done = true; });
    scheduler.wait("the task", [&] { return done; });
    EXPECT_TRUE(done);
    EXPECT_EQ(scheduler.now(), 5s);
}

TEST(SchedulerTest, AdvanceRunsOnlyWhatFallsDue) {
    Scheduler scheduler(Scheduling::runToCompletion());
    std::string trace;
    scheduler.spawnAfter(10s, "a", [&] {
        trace += "a";
        scheduler.spawnAfter(10s, "b", [&] { trace += "b"; });
    });
    scheduler.advance(19s);
    EXPECT_EQ(trace, "a");
    EXPECT_EQ(scheduler.now(), 19s);
    scheduler.advance(1s);
    EXPECT_EQ(trace, "ab");
}

TEST(SchedulerTest, RunUntilIdleLetsNoTimePass) {
    Scheduler scheduler(Scheduling::runToCompletion());
    scheduler.spawnAfter(1s, "later", [] {});
    scheduler.runUntilIdle();
    EXPECT_EQ(scheduler.now(), 0s);
    EXPECT_EQ(scheduler.delayedTasks(), 1U);
}

TEST(SchedulerTest, AStandstillNamesWhoWaitsForWhat) {
    Scheduler scheduler(Scheduling::runToCompletion());
    scheduler.spawn("operation 1", [&] { scheduler.wait("Lock#2", [] { return false; }); });
    const std::string failure =
        failureOf([&] { scheduler.wait("WaitGroup#1", [] { return false; }); });
    EXPECT_THAT(failure, HasSubstr("nothing can run any more"));
    EXPECT_THAT(failure, HasSubstr("host waits for WaitGroup#1;"));
    EXPECT_THAT(failure, HasSubstr("operation 1 waits for Lock#2."));
}

TEST(SchedulerTest, AfterAFailureWaitsReturnAtOnceAndNothingRuns) {
    Scheduler scheduler(Scheduling::runToCompletion());
    EXPECT_THROW(scheduler.wait("nothing", [] { return false; }), SimulationFailure);
    bool ran = false;
    scheduler.spawn("task", [&] { ran = true; });
    scheduler.wait("the task", [&] { return ran; });
    EXPECT_FALSE(ran);
}

TEST(SchedulerTest, WhatRetriesForEverMeetsTheTimeLimit) {
    Scheduler scheduler(Scheduling::runToCompletion());
    std::function<void()> retry = [&] { scheduler.spawnAfter(30s, "retry", retry); };
    retry();
    const std::string failure = failureOf([&] { scheduler.wait("the end", [] { return false; }); });
    EXPECT_THAT(failure, HasSubstr("limit of 86400 s"));
}

TEST(SchedulerTest, WhatATaskThrowsReachesTheHost) {
    Scheduler scheduler(Scheduling::runToCompletion());
    scheduler.spawn("task", [] { throw std::runtime_error("broken"); });
    EXPECT_EQ(failureOf([&] { scheduler.runUntilIdle(); }), "broken");
}

TEST(SchedulerTest, EachFlowOfControlHandlesItsOwnExceptions) {
    Scheduler scheduler(Scheduling::runToCompletion());
    bool open = false;
    std::string caught;
    scheduler.spawn("a", [&] {
        try {
            throw std::runtime_error("of a");
        } catch (...) {
            scheduler.wait("the gate", [&] { return open; });
            caught += failureOf([] { throw; });
        }
    });
    scheduler.spawn("b", [&] {
        caught += failureOf([] { throw std::runtime_error("of b, "); });
        open = true;
    });
    scheduler.runUntilIdle();
    EXPECT_EQ(caught, "of b, of a");
}

TEST(SchedulerTest, BlockedTasksAreNamed) {
    Scheduler scheduler(Scheduling::runToCompletion());
    EXPECT_THAT(scheduler.blockedTasks(), IsEmpty());
    bool open = false;
    scheduler.spawn("task", [&] { scheduler.wait("the gate", [&] { return open; }); });
    scheduler.runUntilIdle();
    EXPECT_THAT(scheduler.blockedTasks(), ElementsAre("task waits for the gate"));
    open = true;
    scheduler.runUntilIdle();
}

TEST(SchedulerTest, WhatHasNotBegunIsDestroyedAtTheEnd) {
    auto owned = std::make_shared<int>(1);
    {
        Scheduler scheduler(Scheduling::runToCompletion());
        scheduler.spawn("ready", [owned] {});
        scheduler.spawnAfter(1s, "later", [owned] {});
        EXPECT_EQ(owned.use_count(), 3);
    }
    EXPECT_EQ(owned.use_count(), 1);
}

TEST(SchedulerTest, ATaskThatNeverEndsIsLeftWhereItIs) {
    auto owned = std::make_shared<int>(1);
    {
        Scheduler scheduler(Scheduling::runToCompletion());
        scheduler.spawn("stuck",
                        [&scheduler, owned] { scheduler.wait("nothing", [] { return false; }); });
        scheduler.runUntilIdle();
    }
    EXPECT_EQ(owned.use_count(), 2);
}

/// What three tasks of four steps each make of a seed.
std::string interleavingOf(Scheduling scheduling) {
    Scheduler scheduler(scheduling);
    std::string trace;
    for (const char name : {'a', 'b', 'c'}) {
        scheduler.spawn("task", [&scheduler, &trace, name] {
            for (int step = 0; step < 4; ++step) {
                trace += name;
                scheduler.switchPoint();
            }
        });
    }
    scheduler.runUntilIdle();
    return trace;
}

TEST(SchedulerTest, TheSameSeedGivesTheSameTurns) {
    for (std::uint64_t seed = 0; seed < 20; ++seed) {
        EXPECT_EQ(interleavingOf(Scheduling::seeded(seed)),
                  interleavingOf(Scheduling::seeded(seed)));
    }
}

TEST(SchedulerTest, SeedsGiveDifferentTurns) {
    std::set<std::string> traces;
    for (std::uint64_t seed = 0; seed < 20; ++seed)
        traces.insert(interleavingOf(Scheduling::seeded(seed)));
    EXPECT_GE(traces.size(), 15U);
}

std::size_t changesIn(const std::string& trace) {
    std::size_t changes = 0;
    for (std::size_t i = 1; i < trace.size(); ++i) changes += trace[i] != trace[i - 1] ? 1U : 0U;
    return changes;
}

TEST(SchedulerTest, WithPrioritiesTurnsChangeWhenATaskEndsAndAtTheChangePoints) {
    std::set<std::string> traces;
    for (std::uint64_t seed = 0; seed < 200; ++seed) {
        EXPECT_EQ(changesIn(interleavingOf(Scheduling::prioritized(seed, 0))), 2U);
        const std::string trace = interleavingOf(Scheduling::prioritized(seed, 2));
        EXPECT_LE(changesIn(trace), 4U);
        EXPECT_EQ(trace, interleavingOf(Scheduling::prioritized(seed, 2)));
        traces.insert(trace);
    }
    EXPECT_GT(traces.size(), 12U);
}

TEST(SchedulerTest, ThousandsOfTasksReuseTheirStacks) {
    Scheduler scheduler(Scheduling::runToCompletion());
    int count = 0;
    for (int round = 0; round < 1000; ++round) {
        for (int task = 0; task < 10; ++task) scheduler.spawn("task", [&] { ++count; });
        scheduler.runUntilIdle();
    }
    EXPECT_EQ(count, 10000);
}

TEST(SchedulerTest, OnlyTheHostRunsTheOthers) {
    Scheduler scheduler(Scheduling::runToCompletion());
    scheduler.spawn("task", [&] { scheduler.runUntilIdle(); });
    EXPECT_EQ(failureOf([&] { scheduler.runUntilIdle(); }), "only the host may run the others");
}

TEST(SchedulerDeathTest, AFailureThatNobodyHeardOfEndsTheProcess) {
    EXPECT_DEATH(
        {
            Scheduler scheduler(Scheduling::runToCompletion());
            scheduler.fail(std::make_exception_ptr(SimulationFailure("unheard")));
        },
        "nobody has waited since: unheard");
}

}  // namespace
}  // namespace appsync
