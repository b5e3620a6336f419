#include "host/timeline/TimelineOfDevice.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace appsync {
namespace {

using std::chrono::seconds;

HistoryRecord placeholderRecord(const char* identifier, int second) {
    HistoryRecord record;
    record.kind = HistoryRecord::Kind::Scenario;
    record.scenario = "Install placeholder";
    record.success = true;
    record.identifier = identifier;
    record.time = WallTime(seconds(1'000'000 + second));
    return record;
}

std::vector<std::string> namesBefore(const std::vector<HistoryRecord>& records,
                                     std::optional<int> second = std::nullopt) {
    std::optional<WallTime> time;
    if (second) time = WallTime(seconds(1'000'000 + *second));
    std::vector<std::string> names;
    for (const TimedEvent& each : eventsBefore(records, time)) {
        names.push_back(each.event.identifier);
    }
    return names;
}

TEST(TimelineOfHistory, HasAllRecordsOfASessionAlsoWhereTheirTimesDoNotRise) {
    const std::vector<HistoryRecord> records = {
        placeholderRecord("a", 5), placeholderRecord("b", 9), placeholderRecord("c", 2),
        placeholderRecord("d", 2), placeholderRecord("e", 7)};
    EXPECT_THAT(namesBefore(records), testing::ElementsAre("a", "b", "c", "d", "e"));
    EXPECT_THAT(namesBefore(records, 8), testing::ElementsAre("a", "c", "d", "e"));
}

TEST(TimelineOfHistory, LeavesOutWhatIsFurtherAway) {
    const std::vector<HistoryRecord> records = {
        placeholderRecord("a", 0), placeholderRecord("b", 61), placeholderRecord("c", 121)};
    EXPECT_THAT(namesBefore(records), testing::ElementsAre("b", "c"));
    EXPECT_THAT(namesBefore(records, 182), testing::IsEmpty());
}

// The clock was set back by an hour after the first.
TEST(TimelineOfHistory, LeavesOutAnEarlierSessionThatIsLaterByTheClock) {
    const std::vector<HistoryRecord> records = {
        placeholderRecord("a", 3600), placeholderRecord("b", 30), placeholderRecord("c", 31)};
    EXPECT_THAT(namesBefore(records), testing::ElementsAre("b", "c"));
}

}  // namespace
}  // namespace appsync
