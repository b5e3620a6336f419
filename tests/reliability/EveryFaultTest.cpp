#include <cstdio>
#include <exception>

#include "tests/reliability/Scenarios.h"
#include "tests/reliability/SeedRange.h"

namespace appsync {

namespace {

using testing::IsEmpty;

struct Aim {
    std::size_t call = 0;
    std::size_t way = 0;
    FaultExtent extent = FaultExtent::Once;
};

/// What came of a run.
struct Outcome {
    std::vector<std::string> violations;
    std::vector<std::string> shortcomings;
    std::vector<FaultPlan::Opportunity> opportunities;
    std::string firstFault = "(none)";
    std::size_t injected = 0;
};

void goThrough(const Scenario& scenario, World& world, Invariants& invariants) {
    scenario.run(world, invariants);
    invariants.sessionHasEnded();
    invariants.clientGoes();
}

/// Once more, with a new client and without a fault.
void goThroughAgain(const Scenario& scenario, World& world, Outcome& outcome) {
    world.faults.stop();
    world.platform.clearRecording();
    world.startClient();
    // An application whose placeholder could not be taken away either is asked for again only when
    // the host has cleared what was kept for syncing.
    if (world.faults.hasInjected("AppRegistry.uninstallApplication(")) {
        world.client->clearSyncData();
    }
    Invariants invariants(world);
    goThrough(scenario, world, invariants);
    for (const std::string& each : invariants.violations()) {
        outcome.shortcomings.push_back(each);
    }
    for (std::string& each : scenario.shortcomings(world)) {
        outcome.shortcomings.push_back(std::move(each));
    }
}

void tryFault(const Scenario& scenario, const std::optional<Aim>& aim, Outcome& outcome) {
    World world;
    scenario.setUp(world);
    scenario.arrange(world);
    Invariants invariants(world);
    if (aim) world.faults.failAt(aim->call, aim->way, aim->extent);
    try {
        world.startClient();
        goThrough(scenario, world, invariants);
        outcome.opportunities = world.faults.opportunities();
        outcome.injected = world.faults.injected().size();
        if (outcome.injected != 0) outcome.firstFault = world.faults.injected().front();
        outcome.violations = invariants.violations();
        if (!aim) outcome.shortcomings = scenario.shortcomings(world);
        if (aim && scenario.heals) goThroughAgain(scenario, world, outcome);
    } catch (const std::exception& failure) {
        outcome.violations = invariants.violations();
        outcome.violations.push_back(failure.what());
        if (!world.faults.injected().empty()) outcome.firstFault = world.faults.injected().front();
    }
}

/// Of the calls that a fault which lasts begins with, each one of so many. One that does not last
/// is tried at each call.
constexpr std::size_t kStepOfLastingFaults = kIsSanitized ? 3 : 1;

class EveryFault : public testing::TestWithParam<Scenario> {
  protected:
    void failEach(const Outcome& plain, FaultExtent extent) {
        std::size_t injected = 0;
        std::size_t runs = 0;
        const std::size_t step = extent == FaultExtent::Once ? 1 : kStepOfLastingFaults;
        for (std::size_t call = 0; call < plain.opportunities.size(); call += step) {
            const std::size_t ways =
                extent == FaultExtent::Everything ? 1 : plain.opportunities[call].ways;
            for (std::size_t way = 0; way < ways; ++way) {
                Outcome outcome;
                tryFault(GetParam(), Aim{call, way, extent}, outcome);
                EXPECT_THAT(outcome.violations, IsEmpty()) << call << ": " << outcome.firstFault;
                EXPECT_THAT(outcome.shortcomings, IsEmpty())
                    << "the next session, after " << call << ": " << outcome.firstFault;
                EXPECT_GT(outcome.injected, 0U) << call << " was not met";
                injected += outcome.injected;
                ++runs;
            }
        }
        RecordProperty("runs", static_cast<int>(runs));
        RecordProperty("faults", static_cast<int>(injected));
    }
    [[nodiscard]] Outcome plainRun() const {
        Outcome outcome;
        tryFault(GetParam(), std::nullopt, outcome);
        return outcome;
    }
};

TEST_P(EveryFault, NoneAtAllLeavesNothingToBeDesired) {
    const Outcome outcome = plainRun();
    EXPECT_THAT(outcome.violations, IsEmpty());
    EXPECT_THAT(outcome.shortcomings, IsEmpty());
    EXPECT_GT(outcome.opportunities.size(), 3U);
    EXPECT_EQ(outcome.injected, 0U);
}

TEST_P(EveryFault, OnceIsSurvived) { failEach(plainRun(), FaultExtent::Once); }

TEST_P(EveryFault, OfOneCallForEverIsSurvived) { failEach(plainRun(), FaultExtent::SameCall); }

TEST_P(EveryFault, OfEverythingFromThenOnIsSurvived) {
    failEach(plainRun(), FaultExtent::Everything);
}

INSTANTIATE_TEST_SUITE_P(Of, EveryFault, testing::ValuesIn(scenarios()),
                         [](const auto& tested) { return tested.param.name; });

}  // namespace
}  // namespace appsync
