#include "tests/reliability/Reduction.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <stdexcept>

namespace appsync {
namespace {

constexpr std::uint64_t kSeed = 8;

/// A fault to be found: a move of a file that failed, in a session that also removes something.
bool isTheFault(const RandomSession& session) {
    const auto has = [&](std::string_view text) {
        return std::ranges::any_of(session.trace(), [&](const std::string& line) {
            return line.find(text) != std::string::npos;
        });
    };
    return session.faults() > 0 && has("AppRegistry.uninstall");
}

bool hasTheFault(std::uint64_t seed, const SessionChanges& changes) {
    RandomSession session(seed, changes);
    session.run();
    return isTheFault(session);
}

std::uint64_t firstSeedWithTheFault() {
    std::uint64_t seed = 0;
    while (!hasTheFault(seed, {})) ++seed;
    return seed;
}

TEST(Reduction, AllThatHasUnrestIsTheWholeSession) {
    RandomSession whole(kSeed);
    whole.run();
    RandomSession same(kSeed, whole.unrest());
    same.run();
    EXPECT_EQ(same.trace(), whole.trace());
    EXPECT_EQ(textOf(same.unrest()), textOf(whole.unrest()));
}

TEST(Reduction, AtRestNothingIsDoneAndNothingFails) {
    RandomSession rest(kSeed, changesOf("choices:;faults:;turns:"));
    EXPECT_TRUE(rest.run().empty());
    EXPECT_EQ(rest.faults(), 0U);
    EXPECT_EQ(textOf(rest.unrest()), "choices:;faults:;turns:");
}

TEST(Reduction, NoDrawOfWhatIsLeftCanBeLeftOut) {
    const std::uint64_t seed = firstSeedWithTheFault();
    RandomSession whole(seed);
    whole.run();
    const auto fails = [seed](const SessionChanges& part) { return hasTheFault(seed, part); };
    const SessionChanges changes = reduced(whole.unrest(), fails);
    ASSERT_TRUE(fails(changes));
    EXPECT_EQ(changes.faults.kept->size(), 1U);
    EXPECT_EQ(changes.turns.kept->size(), 0U);
    EXPECT_LT(changes.choices.kept->size(), whole.unrest().choices.kept->size() / 2);
    for (const std::size_t draw : *changes.choices.kept) {
        SessionChanges less = changes;
        less.choices.kept->erase(draw);
        EXPECT_FALSE(fails(less)) << draw;
    }
}

TEST(Reduction, AFaultThatWasPutInIsPutToRestToo) {
    SessionChanges changes;
    for (std::size_t draw = 0; draw < 60; ++draw) changes.faults.replaced[draw] = 0;
    RandomSession faulty(kSeed, changes);
    faulty.run();
    EXPECT_GT(faulty.faults(), 1U);
    changes.faults.kept.emplace();
    RandomSession rest(kSeed, changes);
    rest.run();
    EXPECT_EQ(rest.faults(), 0U);
}

TEST(Reduction, WhatIsReplacedAndAtRestIsNotNamed) {
    SessionChanges changes;
    changes.faults.replaced = {{3, 0}, {9, 0}};
    RandomSession session(kSeed, changes);
    session.run();
    const SessionChanges least = reduced(
        session.unrest(), [](const SessionChanges& some) { return some.faults.kept->contains(3); });
    EXPECT_EQ(textOf(least), "choices:;faults:3;new-faults:3=0;turns:");
}

TEST(Reduction, ASessionThatHoldsIsNotReduced) {
    const ReducedSession session = reducedSession(kSeed);
    EXPECT_TRUE(session.violations.empty());
    EXPECT_EQ(session.tries, 0U);
}

TEST(Reduction, ChangesAreWrittenAndReadBack) {
    for (const char* text : {"choices:1,5;faults:;turns:12", "faults:0", "choices:", "",
                             "new-choices:4=77,9=18446744073709551615;fault-seed:5;turn-seed:9",
                             "faults:1;new-faults:2=0;new-turns:3=4"}) {
        EXPECT_EQ(textOf(changesOf(text)), text);
    }
    for (const char* text :
         {"choices:a", "choices:1,,2", "draws:1", "choices:-1", "new-turns:4", "turn-seed:"}) {
        EXPECT_THROW(static_cast<void>(changesOf(text)), std::invalid_argument) << text;
    }
}

}  // namespace
}  // namespace appsync
