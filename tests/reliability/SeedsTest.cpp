#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <vector>

#include "tests/reliability/RandomSession.h"
#include "tests/reliability/Reduction.h"
#include "tests/reliability/SeedRange.h"

namespace appsync {
namespace {

using testing::IsEmpty;

/// The environment variable that asks for the least of a seed that fails.
constexpr const char* kSmall = "APPSYNC_SMALL";
constexpr std::uint64_t kSeedsToTry = kIsSanitized ? 250 : 2000;
constexpr std::uint64_t kParts = 8;

std::string firstDifference(const std::vector<std::string>& one,
                            const std::vector<std::string>& other) {
    for (std::size_t i = 0; i < std::min(one.size(), other.size()); ++i) {
        if (one[i] != other[i]) return one[i] + " / " + other[i];
    }
    return one.size() == other.size() ? "" : "one goes on for longer";
}

/// How many calls were made to fail.
std::size_t trySeed(std::uint64_t seed, const SessionChanges& changes = {}) {
    SCOPED_TRACE(std::string(kOneSeed) + "=" + std::to_string(seed) +
                 " build/release/tests/test_reliability --gtest_filter=Seeds.One");
    RandomSession first(seed, changes);
    EXPECT_THAT(first.run(), IsEmpty());
    RandomSession second(seed, changes);
    second.run();
    EXPECT_EQ(firstDifference(first.trace(), second.trace()), "");
    return first.faults();
}

/// A part of the seeds, so that a long run shows how far it is.
class ManySeeds : public testing::TestWithParam<std::uint64_t> {};

TEST_P(ManySeeds, KeepTheInvariantsAndRepeatThemselves) {
    const std::uint64_t first = numberIn(kFirstSeed).value_or(0);
    const std::uint64_t count = numberIn(kManySeeds).value_or(kSeedsToTry);
    std::size_t seeds = 0;
    std::size_t faults = 0;
    for (std::uint64_t i = GetParam(); i < count; i += kParts, ++seeds)
        faults += trySeed(first + i);
    RecordProperty("seeds", static_cast<int>(seeds));
    RecordProperty("faults", static_cast<int>(faults));
}

INSTANTIATE_TEST_SUITE_P(Part, ManySeeds, testing::Range(std::uint64_t{0}, kParts));

SessionChanges givenChanges() {
    const char* text = std::getenv(kChanges);
    return changesOf(text != nullptr ? text : "");
}

void printSmall(std::uint64_t seed) {
    const ReducedSession small = reducedSession(seed, givenChanges());
    if (small.violations.empty()) return;
    std::printf(
        "small: %zu applications, %zu choices, %zu faults, %zu switches, in %zu sessions: %s\n",
        small.applications, small.changes.choices.kept->size(), small.changes.faults.kept->size(),
        small.changes.turns.kept->size(), small.tries, small.violations.front().c_str());
    std::printf(
        "again: %s=%llu %s='%s' build/release/tests/test_reliability --gtest_filter=Seeds.One\n",
        kOneSeed, static_cast<unsigned long long>(seed), kChanges, textOf(small.changes).c_str());
}

/// With APPSYNC_TRACE it also prints what crossed platform/; with APPSYNC_SMALL, where it fails,
/// the least of it that does, too.
TEST(Seeds, One) {
    const std::uint64_t seed = numberIn(kOneSeed).value_or(1);
    trySeed(seed, givenChanges());
    if (std::getenv(kSmall) != nullptr) printSmall(seed);
    if (std::getenv("APPSYNC_TRACE") == nullptr) return;
    RandomSession session(seed, givenChanges());
    session.run();
    for (const std::string& line : session.trace()) std::puts(line.c_str());
}

// What longer runs have stumbled over: an install of an earlier session that is told of between the
// taking over of the next list and its reading; a restore from elsewhere whose end is marked beside
// that of the session's own install; a placeholder of a restore or an update that comes late,
// and that an uninstall takes.
TEST(Seeds, ThatWereFound) {
    for (const std::uint64_t seed : {2644U, 8968U, 14216U, 17069U, 24793U, 24953U, 46102U, 48892U})
        trySeed(seed);
}

TEST(Seeds, MakeSessionsThatDiffer) {
    RandomSession first(2);
    RandomSession second(4);
    first.run();
    second.run();
    EXPECT_NE(firstDifference(first.trace(), second.trace()), "");
}

TEST(Seeds, DemandThatThePlugInGetsThingsDone) {
    std::size_t demands = 0;
    for (std::uint64_t seed = 0; seed < 40; ++seed) {
        RandomSession session(seed);
        EXPECT_THAT(session.run(), IsEmpty());
        demands += session.demands();
    }
    EXPECT_GT(demands, 40U);
}

TEST(Seeds, LetCallsFail) {
    std::size_t faults = 0;
    for (std::uint64_t seed = 0; seed < 20; ++seed) {
        RandomSession session(seed);
        session.run();
        faults += session.faults();
    }
    EXPECT_GT(faults, 20U);
}

}  // namespace
}  // namespace appsync
