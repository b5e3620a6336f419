#include "host/watch/SyncEvents.h"

#include <gtest/gtest.h>

#include <functional>
#include <future>
#include <thread>

namespace appsync {
namespace {

class RecordingDisplay : public SyncDisplay {
  public:
    void complain(std::string_view text) override { complaints.emplace_back(text); }
    void show(const SyncEvent& event) override { events.push_back(event); }
    void finish(const SyncSummary&) override { ++finishes; }
    std::vector<SyncEvent> events;
    std::vector<std::string> complaints;
    int finishes = 0;
};

SyncEvent progress(std::uint64_t done, std::uint64_t total) {
    return {SyncEventKind::Progress, SyncPhase::Transfer, "com.a", done, total,
            SyncState::Active,       std::nullopt,        ""};
}

SyncEvent ended(std::uint64_t done, std::uint64_t total) {
    SyncEvent event = progress(done, total);
    event.kind = SyncEventKind::Ended;
    event.state = SyncState::Finished;
    return event;
}

TEST(SyncEvents, ProgressNeverGoesBack) {
    RecordingDisplay display;
    SyncEvents events(display);
    events.report(progress(50, 100));
    events.report(progress(20, 100));
    events.report(ended(10, 100));
    ASSERT_EQ(display.events.size(), 2U);
    EXPECT_EQ(display.events[1].done, 50U);
}

TEST(SyncEvents, ProgressNeverPassesTheTotal) {
    RecordingDisplay display;
    SyncEvents events(display);
    events.report(progress(500, 100));
    EXPECT_EQ(display.events.at(0).done, 100U);
}

TEST(SyncEvents, ATotalThatGrowsDoesNotMakeProgressGoBack) {
    RecordingDisplay display;
    SyncEvents events(display);
    events.report(progress(50, 100));
    events.report(progress(60, 1000));
    EXPECT_EQ(display.events.back().total, 100U);
    EXPECT_EQ(display.events.back().done, 60U);
}

TEST(SyncEvents, WhatWaitsIsActiveAgainWhenItHasComeFurther) {
    RecordingDisplay display;
    SyncEvents events(display);
    events.report(progress(50, 100));
    SyncEvent waiting = progress(50, 100);
    waiting.kind = SyncEventKind::Waiting;
    waiting.state = SyncState::Waiting;
    events.report(waiting);
    events.report(progress(50, 100));
    EXPECT_EQ(display.events.back().state, SyncState::Waiting);
    events.report(progress(51, 100));
    EXPECT_EQ(display.events.back().state, SyncState::Active);
    EXPECT_EQ(display.events.size(), 3U);
}

TEST(SyncEvents, OnlyAWholePerCentIsNews) {
    RecordingDisplay display;
    SyncEvents events(display);
    for (std::uint64_t done = 0; done <= 10'000; ++done) events.report(progress(done, 10'000));
    EXPECT_EQ(display.events.size(), 101U);
}

TEST(SyncEvents, ProgressThatComesAfterTheEndIsDropped) {
    RecordingDisplay display;
    SyncEvents events(display);
    events.report(ended(50, 100));
    events.report(progress(90, 100));
    EXPECT_EQ(display.events.size(), 1U);
}

TEST(SyncEvents, TheSamePhaseOfAnotherApplicationIsCountedByItself) {
    RecordingDisplay display;
    SyncEvents events(display);
    events.report(progress(50, 100));
    SyncEvent other = progress(10, 100);
    other.identifier = "com.b";
    events.report(other);
    EXPECT_EQ(display.events.back().done, 10U);
}

TEST(SyncEvents, ThreadsAreShownOneAfterAnother) {
    RecordingDisplay display;
    SyncEvents events(display);
    std::vector<std::thread> threads;
    for (int number = 0; number < 4; ++number) {
        threads.emplace_back([&events] {
            for (std::uint64_t done = 0; done < 100; ++done) events.report(progress(done, 100));
        });
    }
    for (std::thread& thread : threads) thread.join();
    for (std::size_t index = 1; index < display.events.size(); ++index) {
        EXPECT_GT(display.events[index].done, display.events[index - 1].done);
    }
}

TEST(PercentOf, RoundsDownSoThatOnlyTheEndIsAHundred) {
    EXPECT_EQ(percentOf(0, 3), 0U);
    EXPECT_EQ(percentOf(2, 3), 66U);
    EXPECT_EQ(percentOf(999'999, 1'000'000), 99U);
    EXPECT_EQ(percentOf(UINT64_MAX - 1, UINT64_MAX), 99U);
    EXPECT_EQ(percentOf(3, 3), 100U);
    EXPECT_EQ(percentOf(0, 0), 100U);
}

TEST(SyncEvents, NothingIsShownAfterTheFirstSummary) {
    RecordingDisplay display;
    SyncEvents events(display);
    events.complainSoon("stopping");
    EXPECT_TRUE(events.finishSoon({}));
    events.finish({});
    events.report(progress(50, 100));
    events.complainSoon("too late");
    EXPECT_EQ(display.finishes, 1);
    EXPECT_TRUE(display.events.empty());
    EXPECT_EQ(display.complaints, std::vector<std::string>{"stopping"});
}

class StuckDisplay : public RecordingDisplay {
  public:
    explicit StuckDisplay(std::function<void()> onShow) : onShow_(std::move(onShow)) {}
    void show(const SyncEvent&) override { onShow_(); }

  private:
    const std::function<void()> onShow_;
};

TEST(SyncEvents, WhoeverLeavesDoesNotWaitForAnOutputThatIsStuck) {
    SyncEvents* shown = nullptr;
    StuckDisplay display([&] { std::thread([&] { EXPECT_FALSE(shown->finishSoon({})); }).join(); });
    SyncEvents events(display);
    shown = &events;
    events.report(progress(50, 100));
    EXPECT_EQ(display.finishes, 0);
}

class LiveDisplay : public RecordingDisplay {
  public:
    [[nodiscard]] bool isLive() const override { return true; }
    void tick() override {
        EXPECT_EQ(finishes, 0);
        if (ticks++ == 0) first_.set_value();
    }
    void waitForTick() { first_.get_future().wait(); }
    int ticks = 0;

  private:
    std::promise<void> first_;
};

TEST(SyncEvents, ALiveDisplayIsToldThatTimeGoesByUntilTheEnd) {
    LiveDisplay display;
    SyncEvents events(display);
    events.tellOfTime();
    display.waitForTick();
    events.finish({});
    events.note("too late");
    events.doing("nothing any more");
    EXPECT_EQ(display.finishes, 1);
    EXPECT_TRUE(display.complaints.empty());
}

}  // namespace
}  // namespace appsync
