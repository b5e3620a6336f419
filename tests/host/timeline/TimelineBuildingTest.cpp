#include "host/timeline/TimelineBuilding.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "host/timeline/TimelineLog.h"

namespace appsync {
namespace {

using enum TimelineEventKind;
using std::chrono::milliseconds;
using testing::HasSubstr;
using testing::SizeIs;

/// Events a millisecond apart, unless told otherwise.
class TimelineBuildingTest : public testing::Test {
  protected:
    void tell(TimelineEventKind kind, const std::string& identifier = "",
              const std::string& detail = "") {
        TimelineEvent event;
        event.kind = kind;
        event.identifier = identifier;
        event.detail = detail;
        event.at = milliseconds(now_++);
        building_.add(std::move(event));
    }
    void wait(int time) { now_ += time; }
    [[nodiscard]] Timeline finish(bool goesOn = false) {
        return building_.finish(milliseconds(now_), goesOn);
    }

    static std::vector<SpanKind> kindsOf(const TimelineLane& lane) {
        std::vector<SpanKind> kinds;
        kinds.reserve(lane.spans.size());
        for (const TimelineSpan& span : lane.spans) kinds.push_back(span.kind);
        return kinds;
    }

    TimelineBuilding building_;
    int now_ = 0;
};

TEST_F(TimelineBuildingTest, AnInstallHasAllThatItTookInItsOrder) {
    tell(SyncBegins);
    tell(AskingBegins);
    tell(Asked, "com.a", "Name");
    tell(PlaceholderBegins, "com.a");
    tell(PlaceholderEnds, "com.a");
    tell(TransferGoesOn, "com.a");
    tell(TransferEnds, "com.a");
    tell(InstallQueued, "com.a");
    tell(InstallBegins, "com.a");
    tell(InstallEnds, "com.a");
    tell(SessionEnds);
    const Timeline timeline = finish();
    ASSERT_THAT(timeline.lanes, SizeIs(1));
    const TimelineLane& lane = timeline.lanes.front();
    EXPECT_THAT(kindsOf(lane), testing::ElementsAre(SpanKind::Placeholder, SpanKind::Transfer,
                                                    SpanKind::Queue, SpanKind::Install));
    EXPECT_EQ(lane.outcome, LaneOutcome::Installed);
    EXPECT_EQ(lane.name, "Name");
    EXPECT_EQ(lane.length(), milliseconds(7));
    EXPECT_EQ(timeline.kind, "sync");
    ASSERT_THAT(timeline.phases, SizeIs(3));
    EXPECT_EQ(timeline.phases[2].name, "transfer");
    EXPECT_EQ(timeline.phases[2].begin, milliseconds(4));
}

TEST_F(TimelineBuildingTest, WhoIsTransferredLaterWaitsForItsTurn) {
    tell(Asked, "com.a");
    tell(Asked, "com.b");
    wait(5);
    tell(TransferEnds, "com.a");
    wait(5);
    tell(TransferEnds, "com.b");
    const Timeline timeline = finish();
    const TimelineLane& second = timeline.lanes.at(1);
    EXPECT_THAT(kindsOf(second), testing::ElementsAre(SpanKind::Turn, SpanKind::Transfer));
    EXPECT_EQ(second.spans[0].end, timeline.lanes[0].spans.back().end);
    ASSERT_THAT(timeline.waits, SizeIs(2));
    EXPECT_EQ(timeline.waits[1].who, "com.b");
}

TEST_F(TimelineBuildingTest, ARunningApplicationIsWaitedForUntilTheInstallIsTriedAgain) {
    tell(InstallQueued, "com.a");
    tell(InstallBegins, "com.a");
    tell(TerminationDenied, "com.a");
    wait(1000);
    tell(InstallQueued, "com.a");
    tell(InstallBegins, "com.a");
    tell(InstallEnds, "com.a");
    const Timeline timeline = finish();
    const TimelineLane& lane = timeline.lanes.front();
    EXPECT_THAT(kindsOf(lane), testing::ElementsAre(SpanKind::Queue, SpanKind::Termination,
                                                    SpanKind::Queue, SpanKind::Install));
    EXPECT_EQ(lane.spans[1].length(), milliseconds(1002));
    EXPECT_EQ(sumsOfWaits(timeline).front().who, "com.a");
    EXPECT_THAT(sumsOfWaits(timeline).front().what, HasSubstr("running"));
}

TEST_F(TimelineBuildingTest, WhatStillWaitsAtTheEndOfASessionSaysSo) {
    tell(SyncBegins);
    tell(InstallBegins, "com.a");
    tell(TerminationDenied, "com.a");
    wait(20);
    tell(SessionEnds);
    const Timeline timeline = finish();
    const TimelineLane& lane = timeline.lanes.front();
    EXPECT_EQ(lane.outcome, LaneOutcome::Waiting);
    EXPECT_EQ(outcomeText(lane), "waits, as it runs");
    EXPECT_TRUE(lane.spans.back().isOpen);
    EXPECT_EQ(lane.spans.back().end, timeline.length);
}

TEST_F(TimelineBuildingTest, AFailureTakesItsReasonAlongAndALaterSuccessTakesItAway) {
    tell(TransferEnds, "com.a", "the cable is out");
    tell(InstallEnds, "com.b", "damaged");
    tell(Asked, "com.b");
    tell(InstallEnds, "com.b");
    const Timeline timeline = finish();
    EXPECT_EQ(outcomeText(timeline.lanes[0]), "failed: the cable is out");
    EXPECT_EQ(outcomeText(timeline.lanes[1]), "installed");
}

TEST_F(TimelineBuildingTest, ARestoreIsOverWithItsPlaceholdersAndItsApplicationsWaitForTheStore) {
    tell(RestoreBegins);
    for (const char* each : {"com.a", "com.b"}) {
        tell(Asked, each);
        tell(PlaceholderBegins, each);
        tell(PlaceholderEnds, each);
    }
    tell(StoreAwaited, "com.b");
    tell(PlaceholdersAwaited);
    tell(PlaceholdersThere);
    const Timeline timeline = finish();
    EXPECT_EQ(timeline.kind, "restore");
    EXPECT_EQ(timeline.lanes[0].outcome, LaneOutcome::Restored);
    EXPECT_EQ(timeline.lanes[1].outcome, LaneOutcome::Waiting);
    EXPECT_EQ(timeline.waits.back().who, "");
}

TEST_F(TimelineBuildingTest, ARemovalThatNobodyToldTheFailureOfIsOverWithTheReconciliation) {
    tell(SyncBegins);
    tell(RemovalBegins, "com.a");
    tell(RemovalBegins, "com.b");
    tell(RemovalEnds, "com.b", "it could not be removed");
    tell(ReconciliationEnds);
    tell(SessionEnds);
    const Timeline timeline = finish();
    EXPECT_EQ(timeline.lanes[0].outcome, LaneOutcome::Removed);
    EXPECT_EQ(timeline.lanes[0].end, milliseconds(4));
    EXPECT_EQ(timeline.lanes[1].outcome, LaneOutcome::Failed);
}

TEST_F(TimelineBuildingTest, WhatIsCutOffIsNotOver) {
    tell(SyncBegins);
    tell(Asked, "com.a");
    tell(PlaceholderBegins, "com.a");
    tell(Asked, "com.b");
    const Timeline timeline = finish(true);
    EXPECT_EQ(timeline.lanes[0].outcome, LaneOutcome::Open);
    EXPECT_TRUE(timeline.lanes[0].spans.back().isOpen);
    EXPECT_EQ(timeline.lanes[1].outcome, LaneOutcome::Waiting);  // for its turn
}

TEST_F(TimelineBuildingTest, AClockThatWasSetBackMakesNoSpanEndBeforeItsBeginning) {
    tell(InstallBegins, "com.a");
    now_ = -500;
    tell(InstallEnds, "com.a");
    const Timeline timeline = finish();
    EXPECT_GE(timeline.lanes[0].spans[0].length(), milliseconds(0));
}

TEST(TimelineEvents, ArgumentsAreFoundAgainInTheMessage) {
    EXPECT_THAT(argumentsOfMessage("%s|%{public}@ install failed unrecoverably: %{public}@",
                                   "own|com.a install failed unrecoverably: no: reason"),
                testing::ElementsAre("own", "com.a", "no: reason"));
    EXPECT_THAT(argumentsOfMessage("%s|Uninstall of %{public}@ failed.",
                                   "own|Uninstall of com.a.b failed."),
                testing::ElementsAre("own", "com.a.b"));
    EXPECT_THAT(argumentsOfMessage("%s|finished transferring %lf for %{public}@", "something else"),
                SizeIs(testing::Le(1)));
    EXPECT_THAT(argumentsOfMessage("%s|Wait completed", ""), testing::IsEmpty());
}

TEST(TimelineEvents, AnErrorIsToldByItsSentence) {
    const TimelineMessage* message =
        messageOfFormat("%s|%{public}@ install failed unrecoverably: %{public}@");
    ASSERT_NE(message, nullptr);
    const auto reasonOf = [&](const std::string& error) {
        return eventOfMessage(*message, {"own", "com.a", error}).detail;
    };
    EXPECT_EQ(reasonOf("Error Domain=A Code=6 \"it is \"damaged\"\""), "it is \"damaged\"");
    EXPECT_EQ(reasonOf("Error Domain=A Code=6 \"it is cut"), "it is cut\u2026");
    EXPECT_EQ(reasonOf("Error Domain=A Code=6 \"(null)\""), "Error Domain=A Code=6 ");
    EXPECT_EQ(reasonOf("(null)"), "");
}

std::string lineOfLog(int second, const std::string& format, const std::string& message) {
    return R"({"time":"2026-01-02T03:04:0)" + std::to_string(second) +
           R"(.000005Z","category":8,"level":"default","message":"own|)" + message +
           R"(","format":"%s|)" + format + "\"}\n";
}

TEST(TimelineLog, SessionsAreToldApart) {
    const std::string begin = lineOfLog(1, "starting to reconcile sync with new anchor %{public}@",
                                        "starting to reconcile sync");
    const std::string transfer =
        lineOfLog(2, "finished transferring %lf for %{public}@", "finished transferring 1 for a");
    const std::string end =
        lineOfLog(3, "sync ended with success: %c", "sync ended with success: y");
    const std::string text = "rubbish\n" + begin + end + transfer + end + begin + "{\"time\":";
    const std::vector<LoggedSession> sessions = sessionsInLog(text);
    ASSERT_THAT(sessions, SizeIs(3));
    EXPECT_THAT(sessions[0].lines, SizeIs(2));
    EXPECT_THAT(sessions[1].lines, SizeIs(2));
    EXPECT_THAT(sessions[2].lines, SizeIs(1));
    EXPECT_FALSE(sessions[0].lacksBeginning);
}

std::string askedFor(const std::string& identifier) {
    return lineOfLog(
        2,
        "Asset %{public}@ (pretty=%{public}@, version=%{public}@) prepped with icon %{public}@, at "
        "%{public}@, meta at %{public}@, info at %{public}@, storePid=%lld, isRestore=%c",
        "Asset " + identifier +
            " (pretty=A, version=1) prepped with icon i, at a, meta at m, info at n, storePid=0, "
            "isRestore=n");
}

std::string transferOf(const std::string& identifier) {
    return lineOfLog(3, "finished transferring %lf for %{public}@",
                     "finished transferring 1.000000 for " + identifier);
}

// A sync that is killed says nothing more.
TEST(TimelineLog, WhatIsSentAfterASyncThatWasKilledIsNoPartOfIt) {
    const std::string begin = lineOfLog(1, "starting to reconcile sync with new anchor %{public}@",
                                        "starting to reconcile sync");
    const std::string transferred =
        lineOfLog(4, "asset transfer ended withsuccess: %c", "asset transfer ended withsuccess: y");
    const std::string sync = begin + askedFor("com.a") + askedFor("com.b") + transferOf("com.a");
    EXPECT_THAT(sessionsInLog(sync + transferOf("com.b")), SizeIs(1));
    for (const std::string& text : {sync + transferOf("com.c") + transferOf("com.c"),
                                    sync + transferred + transferOf("com.b")}) {
        const std::vector<LoggedSession> sessions = sessionsInLog(text);
        ASSERT_THAT(sessions, SizeIs(2));
        EXPECT_FALSE(sessions[1].lacksBeginning);
    }
}

// Its transfer alone would look like the one that the killed sync was about to make.
TEST(TimelineLog, WhatIsSentOfWhatAKilledSyncWasTransferringIsNoPartOfIt) {
    const std::string sync = lineOfLog(1, "starting to reconcile sync with new anchor %{public}@",
                                       "starting to reconcile sync") +
                             askedFor("com.a") + transferOf("com.a");
    const std::string sent =
        R"({"time":"2026-01-02T03:04:05.000005Z","category":0,"level":"default","message":)"
        R"("com.korvu.trd sends com.a, which the device has not asked for","format":)"
        R"("%s sends %{public}@, which the device has not asked for"})"
        "\n";
    const std::string text = sync + sent + transferOf("com.a");
    const std::vector<LoggedSession> sessions = sessionsInLog(text);
    ASSERT_THAT(sessions, SizeIs(2));
    EXPECT_FALSE(sessions[1].lacksBeginning);
    ASSERT_THAT(sessions[1].lines, SizeIs(2));
    const std::optional<TimedEvent> begin = eventOfLine(sessions[1].lines.front());
    ASSERT_TRUE(begin);
    EXPECT_EQ(begin->event.kind, TimelineEventKind::DeliveryBegins);
    EXPECT_EQ(begin->event.identifier, "com.a");
}

TEST(TimelineLog, ALogThatBeginsWithinASessionSaysSo) {
    const std::string text =
        lineOfLog(1, "Performing install for %{public}@", "Performing install for com.a");
    const std::vector<LoggedSession> sessions = sessionsInLog(text);
    ASSERT_THAT(sessions, SizeIs(1));
    EXPECT_TRUE(sessions[0].lacksBeginning);
    const std::optional<TimedEvent> event = eventOfLine(sessions[0].lines.front());
    ASSERT_TRUE(event);
    EXPECT_EQ(event->event.identifier, "com.a");
    EXPECT_EQ(event->time.time_since_epoch() % std::chrono::seconds(1),
              std::chrono::microseconds(5));
}

TEST(TimelineLog, ALineWithoutATimeTellsNothing) {
    const TimelineMessage* message = messageOfFormat("%s|Wait completed");
    for (const char* line :
         {"", "[]", R"({"time":"yesterday"})", R"({"time":"2026-13-02T03:04:05.000005Z"})",
          R"({"time":"9999-01-02T03:04:05.000005Z"})", R"({"time":"1969-01-02T03:04:05.000005Z"})",
          R"({"time":7,"message":"own|Wait completed"})"}) {
        EXPECT_FALSE(eventOfLine({line, message})) << line;
    }
}

}  // namespace
}  // namespace appsync
