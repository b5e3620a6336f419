#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cmath>
#include <set>

#include "host/timeline/TimelineGroups.h"
#include "host/timeline/TimelineLayout.h"
#include "host/timeline/TimelinePage.h"
#include "host/timeline/TimelinePng.h"
#include "host/timeline/TimelineScale.h"
#include "host/timeline/TimelineStacks.h"
#include "host/timeline/TimelineSvg.h"

namespace appsync {
namespace {

using std::chrono::milliseconds;
using testing::HasSubstr;
using testing::Not;
using testing::SizeIs;

TimelineLane laneWith(std::size_t number, LaneOutcome outcome = LaneOutcome::Installed) {
    TimelineLane lane;
    lane.identifier = "com.example.app" + std::to_string(number);
    lane.asked = milliseconds(number);
    lane.end = milliseconds(number + 10);
    lane.spans.push_back({SpanKind::Install, lane.asked, lane.end, false, 0});
    lane.outcome = outcome;
    return lane;
}

Timeline timelineWith(std::size_t lanes) {
    Timeline timeline;
    timeline.source = "device test";
    timeline.kind = "sync";
    timeline.length = milliseconds(lanes + 10);
    for (std::size_t i = 0; i < lanes; ++i) timeline.lanes.push_back(laneWith(i));
    return timeline;
}

std::size_t lanesIn(const std::vector<LaneGroup>& groups) {
    std::size_t count = 0;
    for (const LaneGroup& group : groups) count += group.lanes.size();
    return count;
}

std::set<std::string> singleIn(const GroupedLanes& grouped) {
    std::set<std::string> identifiers;
    for (const LaneGroup& group : grouped.single) {
        for (const TimelineLane* lane : group.lanes) identifiers.insert(lane->identifier);
    }
    return identifiers;
}

TEST(TimelineGroups, AFewStandByThemselves) {
    const Timeline timeline = timelineWith(kMostSingleLanes);
    const GroupedLanes grouped = groupedLanes(timeline);
    EXPECT_EQ(lanesIn(grouped.single), kMostSingleLanes);
    EXPECT_THAT(grouped.together, testing::IsEmpty());
}

TEST(TimelineGroups, OfManyAllAreThereInABoundedNumberOfLanes) {
    for (const std::size_t count : {kMostSingleLanes + 1, std::size_t{1000}, std::size_t{5000}}) {
        Timeline timeline = timelineWith(count);
        for (std::size_t i = 0; i < count; i += 2) {
            timeline.lanes[i].outcome = i % 4 == 0 ? LaneOutcome::Failed : LaneOutcome::Waiting;
        }
        const GroupedLanes grouped = groupedLanes(timeline);
        EXPECT_EQ(lanesIn(grouped.single) + lanesIn(grouped.together), count);
        EXPECT_LE(lanesIn(grouped.single), kMostSingleLanes);
        EXPECT_LE(grouped.together.size(), kMostGroups);
    }
}

TEST(TimelineGroups, WhatFailedOrTookLongStandsByItself) {
    Timeline timeline = timelineWith(2000);
    timeline.lanes[500].outcome = LaneOutcome::Failed;
    timeline.lanes[501].outcome = LaneOutcome::Waiting;
    timeline.lanes[502].spans.front().end += milliseconds(100);
    timeline.lanes[503].spans.push_back({SpanKind::Turn, milliseconds(0), milliseconds(2000)});
    const std::set<std::string> single = singleIn(groupedLanes(timeline));
    for (const std::size_t index : {500U, 501U, 502U}) {
        EXPECT_TRUE(single.contains(timeline.lanes[index].identifier)) << index;
    }
    // To wait for others is no doing of its own.
    EXPECT_FALSE(single.contains(timeline.lanes[503].identifier));
}

TEST(TimelineStacks, TheHeightIsThatOfTheMostAtOnce) {
    Timeline timeline = timelineWith(3);
    std::vector<const TimelineLane*> lanes;
    for (TimelineLane& lane : timeline.lanes) {
        lane.spans.front() = {SpanKind::Install, milliseconds(0), timeline.length, false, 0};
        lanes.push_back(&lane);
    }
    const StackPlace place{{0, 100, timeline.length}, 50, 20};
    const std::vector<AreaShape> areas = stackedAreas(lanes, {SpanKind::Install}, place);
    ASSERT_THAT(areas, SizeIs(1));
    for (const PicturePoint& point : areas.front().points) {
        EXPECT_TRUE(std::abs(point.y - 30) < 0.1 || std::abs(point.y - 50) < 0.1) << point.y;
    }
    EXPECT_THAT(stackedAreas(lanes, {SpanKind::Queue}, place), testing::IsEmpty());
}

TEST(TimelineScale, TicksAreFewAndRound) {
    for (const std::int64_t length :
         {std::int64_t{0}, std::int64_t{1}, std::int64_t{999}, std::int64_t{123'456'789},
          std::int64_t{31'000'000'000}, std::int64_t{900'000'000'000'000'000},
          TimelineMoment::max().count()}) {
        const std::vector<TimelineTick> some = ticksOf(TimelineMoment(length));
        EXPECT_LE(some.size(), 11U) << length;
        for (const TimelineTick& tick : some) EXPECT_GE(tick.at.count(), 0) << length;
    }
    const std::vector<TimelineTick> ticks = ticksOf(std::chrono::seconds(31));
    ASSERT_THAT(ticks, SizeIs(7));
    EXPECT_EQ(ticks[1].text, "5 s");
}

// The contrast that people need to read text: 4.5 to 1.
double brightnessOf(const PictureColor& color) {
    const auto part = [](unsigned value) {
        const double share = value / 255.0;
        return share <= 0.04045 ? share / 12.92 : std::pow((share + 0.055) / 1.055, 2.4);
    };
    return 0.2126 * part(color.red) + 0.7152 * part(color.green) + 0.0722 * part(color.blue);
}

double contrastOf(const PictureColor& left, const PictureColor& right) {
    const auto [darker, lighter] = std::minmax({brightnessOf(left), brightnessOf(right)});
    return (lighter + 0.05) / (darker + 0.05);
}

TEST(TimelineDrawing, TextCanBeReadOnLightAndOnDarkGround) {
    for (const bool onDark : {false, true}) {
        for (const Pen text : {Pen::Text, Pen::Faint, Pen::Good, Pen::Bad}) {
            for (const Pen ground : {Pen::Ground, Pen::Stripe}) {
                EXPECT_GE(contrastOf(colorOf(text, onDark), colorOf(ground, onDark)), 4.5)
                    << static_cast<int>(text) << onDark;
            }
        }
        EXPECT_GE(contrastOf(colorOf(Pen::Text, onDark), colorOf(Pen::Phase, onDark)), 4.5);
    }
}

TEST(TimelineDrawing, KindsDifferInMoreThanColour) {
    std::set<char> letters;
    for (std::size_t i = 0; i < kSpanKinds; ++i) {
        const SpanLook& look = lookOf(static_cast<SpanKind>(i));
        letters.insert(look.letter);
        const Pen ink = look.isDark ? Pen::OnDeep : Pen::OnPale;
        EXPECT_GE(contrastOf(colorOf(ink, false), look.color), 4.5) << i;
        EXPECT_EQ(isWait(static_cast<SpanKind>(i)) || i == 7,
                  look.pattern != PicturePattern::Plain);
    }
    EXPECT_THAT(letters, SizeIs(kSpanKinds));
}

TEST(TimelineSvg, NamesOfAnyKindStayText) {
    Timeline timeline = timelineWith(1);
    timeline.lanes[0].identifier = "<script>alert('1')</script>&\x01\x1b[31m\xff";
    timeline.lanes[0].name = std::string(4000, 'x') + "\xE2\x80\xAE";
    timeline.lanes[0].reason = "\"]]>\xEF\xBF\xBF";
    timeline.source = "device \xE2\x80\xAE<b>";
    for (const std::string& text : {timelineSvg(timeline), timelinePage(timeline)}) {
        EXPECT_THAT(text, Not(HasSubstr("<script")));
        EXPECT_THAT(text, HasSubstr("&lt;script&gt;"));
        EXPECT_THAT(text, Not(HasSubstr("<b>")));
        EXPECT_THAT(text, Not(HasSubstr("\xE2\x80\xAE")));
        EXPECT_THAT(text, Not(HasSubstr(std::string(400, 'x'))));
        EXPECT_THAT(text, Not(HasSubstr("\xEF\xBF\xBF")));
        EXPECT_THAT(text, Not(testing::ContainsRegex("[\x01-\x08\x1b\xff]")));
    }
}

TEST(TimelinePage, TimesThatAreTooLongForASumHaveNone) {
    Timeline timeline = timelineWith(2 * kMostSingleLanes);
    timeline.length = TimelineMoment::max();
    for (TimelineLane& lane : timeline.lanes) {
        lane.end = timeline.length;
        for (const SpanKind kind : {SpanKind::Transfer, SpanKind::Transfer, SpanKind::Store}) {
            lane.spans.push_back({kind, lane.asked, lane.end, true, 0});
        }
        timeline.waits.push_back({lane.identifier, "its turn", lane.asked, lane.end, true});
    }
    EXPECT_THAT(timelinePage(timeline), Not(testing::ContainsRegex("(: |>|, )-[0-9]")));
}

TEST(TimelineSvg, LikeFailuresAreToldOnce) {
    Timeline timeline = timelineWith(40);
    for (const std::size_t index : {3U, 4U, 5U, 9U}) {
        timeline.lanes[index].outcome = LaneOutcome::Failed;
        timeline.lanes[index].reason = index == 9 ? "no room" : "damaged";
    }
    const std::string svg = timelineSvg(timeline);
    EXPECT_THAT(svg, HasSubstr("3 applications (com.example.app3 ...) failed: damaged"));
    EXPECT_THAT(svg, HasSubstr("com.example.app9 failed: no room"));
}

TEST(TimelineSvg, APictureOfNoSessionSaysSo) {
    Timeline timeline;
    timeline.source = "device new";
    EXPECT_THAT(timelineSvg(timeline), HasSubstr("No session yet."));
    EXPECT_TRUE(timelinePng(timeline).ok());
    EXPECT_THAT(timelinePage(timeline), Not(HasSubstr("<table")));
}

TEST(TimelineLayout, APictureOfThousandsIsNoHigherThanThatOfAThousand) {
    EXPECT_LE(layOutTimeline(timelineWith(5000)).height, layOutTimeline(timelineWith(1000)).height);
}

}  // namespace
}  // namespace appsync
