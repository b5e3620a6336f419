#include "host/watch/PreparationEvents.h"

#include <gtest/gtest.h>

#include "host/watch/SyncEvents.h"

namespace appsync {
namespace {

class ShownPreparation : public SyncDisplay {
  public:
    void show(const SyncEvent& event) override { events.push_back(event); }
    void complain(std::string_view) override {}
    void finish(const SyncSummary&) override {}
    std::vector<SyncEvent> events;
};

class PreparationEventsTest : public testing::Test {
  protected:
    void prepare(std::size_t packages, std::size_t applications) {
        for (std::size_t done = 0; done <= packages; ++done) preparation.read(done, packages);
        for (std::size_t done = 0; done <= applications; ++done) {
            preparation.staged(done, applications);
        }
        for (std::size_t done = 0; done < applications; ++done) preparation.asked(applications);
        preparation.finish();
    }

    ShownPreparation display;
    SyncEvents events{display};
    PreparationEvents preparation{&events};
};

TEST_F(PreparationEventsTest, GoOnAndReachTheTotalAtTheEndOnly) {
    prepare(1000, 7);
    ASSERT_GT(display.events.size(), 2U);
    EXPECT_EQ(display.events.front().kind, SyncEventKind::Started);
    EXPECT_EQ(display.events.front().done, 0U);
    EXPECT_EQ(display.events.back().kind, SyncEventKind::Ended);
    EXPECT_EQ(display.events.back().state, SyncState::Finished);
    std::uint64_t done = 0;
    for (const SyncEvent& event : display.events) {
        EXPECT_EQ(event.phase, SyncPhase::Prepare);
        EXPECT_EQ(event.identifier, "");
        EXPECT_EQ(event.total, 3000U);
        EXPECT_GE(event.done, done);
        done = event.done;
    }
    EXPECT_EQ(done, 3000U);
}

TEST_F(PreparationEventsTest, AreNoMoreThanOneForEachPerCentBesideBeginningAndEnd) {
    prepare(10'000, 10'000);
    EXPECT_EQ(display.events.size(), 102U);
}

TEST_F(PreparationEventsTest, OfAFewPackagesAreBeginningAndEnd) {
    prepare(99, 99);
    ASSERT_EQ(display.events.size(), 2U);
    EXPECT_EQ(display.events[1].done, 297U);
}

TEST_F(PreparationEventsTest, NeverPassTheTotalWhereMoreIsAskedForThanWasCounted) {
    for (std::size_t done = 0; done <= 100; ++done) preparation.read(done, 100);
    for (int number = 0; number < 500; ++number) preparation.asked(200);
    EXPECT_EQ(display.events.back().done, 300U);
}

TEST_F(PreparationEventsTest, OfAnEmptyLibraryHaveATotalToo) {
    prepare(0, 0);
    ASSERT_EQ(display.events.size(), 2U);
    EXPECT_EQ(display.events[1].total, 1U);
    EXPECT_EQ(display.events[1].done, 1U);
}

TEST_F(PreparationEventsTest, AreOverWithTheFirstEnd) {
    preparation.read(0, 200);
    preparation.fail("no space");
    preparation.finish();
    preparation.staged(100, 200);
    ASSERT_EQ(display.events.size(), 2U);
    EXPECT_EQ(display.events[1].state, SyncState::Failed);
    EXPECT_EQ(display.events[1].text, "no space");
    EXPECT_EQ(display.events[1].done, 0U);
}

TEST_F(PreparationEventsTest, AreNoneBeforeThePackagesAreCounted) {
    preparation.fail("there is no library");
    EXPECT_TRUE(display.events.empty());
}

}  // namespace
}  // namespace appsync
