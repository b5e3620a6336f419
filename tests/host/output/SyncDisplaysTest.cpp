#include "host/output/SyncDisplays.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>

#include "host/console/Console.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

using testing::HasSubstr;
using testing::StartsWith;

constexpr std::chrono::system_clock::time_point kNextTry{std::chrono::seconds{1'700'000'000}};

SyncEvent event(SyncEventKind kind, SyncState state, std::uint64_t done = 512,
                std::string text = "") {
    return {kind,  SyncPhase::Install, "com.example.atlas", done, 1024,
            state, std::nullopt,       std::move(text)};
}

SyncEvent waiting() {
    SyncEvent result = event(SyncEventKind::Waiting, SyncState::Waiting, 0, "it is running");
    result.nextTry = kNextTry;
    return result;
}

class SyncDisplays : public testing::Test {
  protected:
    std::string shown(SyncDisplayKind kind, const std::vector<SyncEvent>& events) {
        const std::unique_ptr<SyncDisplay> display = makeSyncDisplay(kind, console);
        for (const SyncEvent& each : events) display->show(each);
        display->finish(summary);
        return out.str();
    }

    std::ostringstream out;
    std::ostringstream err;
    Console console{out, err, false, 80};
    SyncSummary summary;
};

TEST_F(SyncDisplays, PrintsALinePerEventWithoutATerminal) {
    const std::string text =
        shown(SyncDisplayKind::Text, {event(SyncEventKind::Progress, SyncState::Active)});
    EXPECT_THAT(text, StartsWith("install com.example.atlas: 50 % (512 bytes of 1.0 KiB)\n"));
}

TEST_F(SyncDisplays, SaysWhichApplicationHoldsItUpAndWhenTheNextTryComes) {
    EXPECT_EQ(
        eventLine(waiting()),
        "install com.example.atlas: waiting: it is running; next try at " + formatClock(kNextTry));
}

TEST_F(SyncDisplays, NoBarIsWiderThanTheTerminal) {
    SyncEvent wide = waiting();
    wide.identifier = std::string(300, 'y');
    wide.text = std::string(500, 'x');
    EXPECT_LE(displayWidth(eventBar(wide, 79)), 79U);
    wide.state = SyncState::Active;
    EXPECT_LE(displayWidth(eventBar(wide, 79)), 79U);
}

TEST_F(SyncDisplays, ATerminalIsToldOnceWhySomethingFailed) {
    const SyncEvent failed = event(SyncEventKind::Ended, SyncState::Failed, 0, "damaged");
    EXPECT_THAT(eventBar(failed, 79), testing::EndsWith(" failed"));
}

TEST_F(SyncDisplays, NothingThatATerminalObeysGetsThrough) {
    SyncEvent hostile = event(SyncEventKind::Ended, SyncState::Failed, 0, "bad\x1b[2J\nline");
    hostile.identifier = "com\x07.x";
    EXPECT_EQ(eventLine(hostile), "install com?.x: failed: bad?[2J?line");
}

TEST_F(SyncDisplays, PrintsOneObjectPerEventAndTheSummaryLast) {
    summary.requested = {"com.example.atlas"};
    summary.failed.push_back({"com.example.atlas", "damaged"});
    const std::string text = shown(SyncDisplayKind::JsonLines, {waiting()});
    EXPECT_EQ(text,
              R"({"event":"waiting","phase":"install","identifier":"com.example.atlas","done":0,)"
              R"("total":1024,"state":"waiting","nextTry":"2023-11-14T22:13:20Z",)"
              R"("waitsFor":{"what":"termination","who":"com.example.atlas",)"
              R"("nextTry":"2023-11-14T22:13:20Z","promise":null}})"
              "\n"
              R"({"event":"summary","requested":["com.example.atlas"],"installed":[],"updated":[],)"
              R"("removed":[],"failed":[{"identifier":"com.example.atlas","error":"damaged"}],)"
              R"("skipped":[],"bytes":0,"seconds":0.0})"
              "\n");
}

TEST_F(SyncDisplays, PrintsOneObjectInAll) {
    const std::string text =
        shown(SyncDisplayKind::Json, {event(SyncEventKind::Progress, SyncState::Active)});
    EXPECT_THAT(text, StartsWith("{\n  \"requested\": [],"));
}

TEST_F(SyncDisplays, BrokenTextDoesNotBreakTheJson) {
    summary.failed.push_back({"com.\xff", "bad"});
    EXPECT_THAT(shown(SyncDisplayKind::Json, {}), HasSubstr("com.\xEF\xBF\xBD"));
}

TEST_F(SyncDisplays, SaysWhenNothingWasToDo) {
    EXPECT_EQ(summaryText(summary), "Nothing to do: all is in step.\n");
}

TEST_F(SyncDisplays, TellsEachErrorOnceOnTheErrorStreamAndNamesWhatFailedInTheSummary) {
    summary.requested = {"com.a"};
    summary.failed = {{"com.a", "damaged"}, {"com.c", "lost"}, {"com.d", "damaged"}};
    summary.skipped.push_back({"com.b", "offloaded", true});
    for (const auto kind :
         {SyncDisplayKind::Text, SyncDisplayKind::Json, SyncDisplayKind::JsonLines}) {
        err.str("");
        shown(kind, {});
        EXPECT_EQ(err.str(), "appsync: com.a, com.d: damaged\nappsync: com.c: lost\n");
    }
    EXPECT_THAT(summaryText(summary), HasSubstr("Failed 3: com.a com.c com.d\n"));
    EXPECT_THAT(summaryText(summary), HasSubstr("Skipped com.b: offloaded\n"));
}

TEST_F(SyncDisplays, OnlyATerminalGetsTheBeginningOfALongList) {
    for (int number = 0; number < 30; ++number) {
        const std::string identifier = "com.n" + std::to_string(number);
        summary.installed.push_back(identifier);
        summary.failed.push_back({identifier, "lost"});
    }
    EXPECT_THAT(shown(SyncDisplayKind::Text, {}), HasSubstr("com.n28 com.n29\n"));
    EXPECT_THAT(err.str(), HasSubstr("com.n28, com.n29: lost\n"));
    out.str("");
    err.str("");
    console.isTerminal = true;
    EXPECT_THAT(shown(SyncDisplayKind::Text, {}), HasSubstr("com.n19 ...\n"));
    EXPECT_THAT(err.str(), HasSubstr("30 not done: lost (com.n0, "));
}

TEST_F(SyncDisplays, ATerminalIsToldOfLikeReasonsOnce) {
    console.isTerminal = true;
    for (int number = 0; number < 8; ++number) {
        const std::string identifier = "com.n" + std::to_string(number);
        summary.failed.push_back({identifier, identifier + " is running"});
        summary.skipped.push_back(
            {identifier, "send " + identifier + ", then " + identifier, true});
    }
    summary.failed.push_back({"com.other", "damaged"});
    EXPECT_THAT(shown(SyncDisplayKind::Text, {}),
                HasSubstr("Skipped 8: send ID, then ID (com.n0, com.n1, com.n2, com.n3, com.n4 and "
                          "3 more, which --verbose names)\n"));
    EXPECT_EQ(err.str(),
              "appsync: 8 not done: ID is running (com.n0, com.n1, com.n2, com.n3, com.n4 and 3 "
              "more, which --verbose names)\nappsync: com.other: damaged\n");
}

TEST_F(SyncDisplays, AReasonThatIsAloneIsToldAsItIs) {
    console.isTerminal = true;
    for (int number = 0; number < 7; ++number) {
        const std::string identifier = "com.n" + std::to_string(number);
        summary.failed.push_back({identifier, "lost"});
        summary.skipped.push_back({identifier, "left", true});
    }
    summary.failed.push_back({"com.a", "com.a is running"});
    summary.skipped.push_back({"com.b", "send com.b", true});
    EXPECT_THAT(shown(SyncDisplayKind::Text, {}), HasSubstr("Skipped com.b: send com.b\n"));
    EXPECT_THAT(err.str(), HasSubstr("appsync: com.a: com.a is running\n"));
}

TEST_F(SyncDisplays, TheNameOfAnotherIsNoLikeReason) {
    console.isTerminal = true;
    for (const char* other : {"com.a.b", "com.ab", "de.com.a", "com.a-b"}) {
        summary.failed.push_back({"com.a", std::string(other) + " is in its way, com.a."});
        summary.failed.push_back({"com.x", std::string(other) + " is in its way, com.x."});
    }
    shown(SyncDisplayKind::Text, {});
    for (const char* other : {"com.a.b", "com.ab", "de.com.a", "com.a-b"}) {
        EXPECT_THAT(err.str(),
                    HasSubstr("com.a, com.x: " + std::string(other) + " is in its way, ID.\n"));
    }
}

TEST_F(SyncDisplays, AVerboseTerminalGetsAllOfALongList) {
    console.isTerminal = true;
    for (int number = 0; number < 30; ++number) {
        const std::string identifier = "com.n" + std::to_string(number);
        summary.installed.push_back(identifier);
        summary.failed.push_back({identifier, "lost"});
        summary.skipped.push_back({identifier, "left", true});
    }
    makeSyncDisplay(SyncDisplayKind::Text, console, true)->finish(summary);
    EXPECT_THAT(out.str(), HasSubstr("com.n28 com.n29\nSkipped com.n0: left\n"));
    EXPECT_THAT(err.str(), HasSubstr("com.n28, com.n29: lost\n"));
}

SyncEvent waitingForItself() {
    SyncEvent result = waiting();
    result.text = result.identifier + " is running";
    return result;
}

TEST_F(SyncDisplays, EightyColumnsHoldWhatRunsAndWhenTheNextTryComes) {
    const std::string line = eventBar(waitingForItself(), 79);
    EXPECT_LE(displayWidth(line), 79U);
    EXPECT_THAT(line, HasSubstr("com.example.atlas"));
    EXPECT_THAT(line, HasSubstr("is running; next try "));
    EXPECT_THAT(line, testing::EndsWith(formatClock(kNextTry)));
}

TEST_F(SyncDisplays, TheNextTryIsTheLastThatANarrowLineLoses) {
    const std::string time = formatClock(kNextTry);
    for (std::size_t width = 8; width < 100; ++width) {
        const std::string line = eventBar(waitingForItself(), width);
        EXPECT_LE(displayWidth(line), width);
        EXPECT_THAT(line,
                    testing::AnyOf(testing::EndsWith(time), testing::EndsWith(time.substr(0, 8))));
    }
}

TEST_F(SyncDisplays, ProgressIsTheLastThatANarrowLineLoses) {
    for (std::size_t width = 4; width < 100; ++width) {
        const std::string line = eventBar(event(SyncEventKind::Progress, SyncState::Active), width);
        EXPECT_LE(displayWidth(line), width);
        EXPECT_THAT(line, testing::EndsWith("50 %"));
    }
}

TEST_F(SyncDisplays, NoTerminalIsTooNarrow) {
    for (const SyncEvent& each :
         {waitingForItself(), event(SyncEventKind::Progress, SyncState::Active),
          event(SyncEventKind::Ended, SyncState::Failed, 0, std::string(100, 'x'))}) {
        for (std::size_t width = 0; width < 8; ++width) {
            EXPECT_LE(displayWidth(eventBar(each, width)), width);
        }
    }
    console.isTerminal = true;
    console.width = 1;
    EXPECT_THAT(shown(SyncDisplayKind::Text, {event(SyncEventKind::Progress, SyncState::Active)}),
                StartsWith("\n\n\r\x1b[2A\x1b[J"));
}

}  // namespace
}  // namespace appsync
