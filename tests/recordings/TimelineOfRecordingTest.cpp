#include "host/timeline/TimelineOfRecording.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>
#include <set>

#include "host/timeline/TimelinePage.h"
#include "tests/recordings/SeededRecording.h"

namespace appsync {
namespace {

std::vector<std::string> storedSessions() {
    std::vector<std::string> paths;
    for (const auto& each : std::filesystem::directory_iterator(RECORDINGS)) {
        paths.push_back(each.path().string());
    }
    std::sort(paths.begin(), paths.end());
    return paths;
}

// Each span lies within its lane, and each lane within the session.
void expectOrder(const Timeline& timeline, const std::string& what) {
    for (const TimelineLane& lane : timeline.lanes) {
        EXPECT_LE(lane.asked, lane.end) << what << lane.identifier;
        EXPECT_LE(lane.end, timeline.length) << what << lane.identifier;
        for (const TimelineSpan& span : lane.spans) {
            EXPECT_LE(span.begin, span.end) << what << lane.identifier;
            EXPECT_GE(span.begin, lane.asked) << what << lane.identifier;
            EXPECT_LE(span.end, timeline.length) << what << lane.identifier;
        }
    }
    for (const TimelinePhase& phase : timeline.phases) EXPECT_LE(phase.begin, phase.end) << what;
}

// The assets of which the host has reported that their transfer succeeded, by the registry's word.
std::size_t transfersIn(const RecordedSession& session) {
    return static_cast<std::size_t>(
        std::count_if(session.lines.begin(), session.lines.end(), [](const RecordLine& line) {
            return line.kind == RecordKind::Host && line.name == "assetTransferSucceeded";
        }));
}

bool hasTransfer(const TimelineLane& lane) {
    return std::any_of(lane.spans.begin(), lane.spans.end(),
                       [](const TimelineSpan& span) { return span.kind == SpanKind::Transfer; });
}

TEST(TimelineOfRecording, WhatStandsThereIsDrawnInOrder) {
    std::size_t transferred = 0;
    std::size_t reported = 0;
    for (const std::string& path : storedSessions()) {
        const Result<RecordedSession> session = readRecordingFile(path);
        ASSERT_TRUE(session.ok()) << path;
        const Timeline timeline = timelineOfRecording(*session, "stored");
        expectOrder(timeline, path);
        EXPECT_FALSE(timeline.calls.empty()) << path;
        reported += transfersIn(*session);
        transferred += static_cast<std::size_t>(
            std::count_if(timeline.lanes.begin(), timeline.lanes.end(), hasTransfer));
    }
    // Some applications are transferred twice, into one lane.
    EXPECT_GT(transferred, reported / 2);
    EXPECT_GT(reported, 20U);
}

TEST(TimelineOfRecording, AnyCutOfASessionIsDrawn) {
    const std::string text = SeededRecording(11).record();
    const std::size_t header = text.find('\n') + 1;
    for (std::size_t end = header; end < text.size(); end += 997) {
        const Result<RecordedSession> session = readRecording(text.substr(0, end));
        ASSERT_TRUE(session.ok()) << end;
        const Timeline timeline = timelineOfRecording(*session, "cut");
        expectOrder(timeline, std::to_string(end));
        EXPECT_THAT(timeline.notes, testing::SizeIs(1)) << end;
        EXPECT_THAT(timelinePage(timeline), testing::HasSubstr("cut off"));
    }
}

TEST(TimelineOfRecording, AnAnonymousOneTellsTheSameOutcomes) {
    const auto outcomesOf = [](bool isAnonymous) {
        SeededRecording::Choices choices;
        choices.isAnonymous = isAnonymous;
        const Result<RecordedSession> session = readRecording(SeededRecording(5, choices).record());
        std::multiset<LaneOutcome> outcomes;
        for (const TimelineLane& lane : timelineOfRecording(*session, "").lanes) {
            outcomes.insert(lane.outcome);
        }
        return outcomes;
    };
    EXPECT_FALSE(outcomesOf(false).empty());
    EXPECT_EQ(outcomesOf(true), outcomesOf(false));
}

}  // namespace
}  // namespace appsync
