#include <algorithm>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <functional>
#include <sstream>
#include <stdexcept>

#include "client/Paths.h"
#include "simulation/DeviceImage.h"
#include "tests/reliability/DeviceState.h"
#include "tests/reliability/Scenarios.h"
#include "tests/reliability/SeedRange.h"

namespace appsync {

namespace {

using testing::IsEmpty;

/// "scenario:operation:seed", once or, for a crash during the recovery, with a second
/// ":operation:seed".
constexpr const char* kOneCrash = "APPSYNC_CRASH";
/// How many seeds each instant is tried with, and the first of them.
constexpr const char* kManyCrashSeeds = "APPSYNC_CRASH_SEEDS";
constexpr const char* kFirstCrashSeed = "APPSYNC_CRASH_BASE";
/// The scenarios whose recovery crashes at every instant, too, and the seeds of both crashes.
constexpr const char* kCrashedTwice[] = {"DirectSync", "CoordinatedSync"};
constexpr std::uint64_t kSeedsToCrash = kIsSanitized ? 2 : 32;
constexpr std::uint64_t kSeedsOfVariants = kIsSanitized ? 2 : 12;
constexpr std::uint64_t kSeedsOfPairs = kIsSanitized ? 1 : 3;

using Violations = std::vector<std::string>;

/// An instant at which a run was crashed, and which crash it was.
struct Crash {
    std::size_t operation = 0;  // after how many
    std::uint64_t seed = 0;
};

struct Crashed {
    Crash crash;
    std::string after;  // the operation
    DeviceImage image;
};

/// Which seeds to crash with after an operation.
using SeedsOf = std::function<std::vector<std::uint64_t>(std::size_t operation)>;

SeedsOf seedsFrom(std::uint64_t first, std::uint64_t count) {
    return [=](std::size_t) {
        std::vector<std::uint64_t> seeds;
        for (std::uint64_t seed = first; seed < first + count; ++seed) seeds.push_back(seed);
        return seeds;
    };
}

SeedsOf onlyAt(const Crash& crash) {
    return [crash](std::size_t operation) {
        return operation == crash.operation ? std::vector<std::uint64_t>{crash.seed}
                                            : std::vector<std::uint64_t>{};
    };
}

SeedsOf never() {
    return [](std::size_t) { return std::vector<std::uint64_t>{}; };
}

/// Keeps what crashes of a run would leave, while the run goes on.
class Camera {
  public:
    Camera(SimulatedPlatform& platform, SeedsOf seeds)
        : crashes_(platform), seeds_(std::move(seeds)) {
        crashes_.onChange([this](std::string_view what) { look(what); });
    }

    [[nodiscard]] std::size_t operations() const { return operations_; }
    [[nodiscard]] const std::vector<Crashed>& pictures() const { return pictures_; }

  private:
    void look(std::string_view what) {
        ++operations_;
        for (const std::uint64_t seed : seeds_(operations_)) {
            pictures_.push_back({{operations_, seed}, std::string(what), crashes_.imageOf(seed)});
        }
    }

    CrashRecorder crashes_;
    const SeedsOf seeds_;
    std::size_t operations_ = 0;
    std::vector<Crashed> pictures_;
};

/// A world as the scenario finds it, or as a crash has left it, in which the host plans.
struct Stage {
    explicit Stage(const Scenario& scenario) {
        world.hostPlans = true;
        scenario.setUp(world);
        scenario.arrange(world);
        world.platform.coordination.setEnabled(scenario.coordinated);
    }
    Stage(const Scenario& scenario, const DeviceImage& image) {
        world.hostPlans = true;
        scenario.setUp(world);
        world.reopen(image);
    }

    World world;
};

/// What is known of a scenario before anything crashes.
struct Expectation {
    std::vector<std::string> installed;  // at first
    DeviceState state;                   // at last
    DeviceState synced;                  // after one more sync
    std::size_t operations = 0;
    std::vector<Crashed> pictures;
};

using Action = std::function<void(World&, Invariants&)>;

/// The host and a new process: a scenario that stages a list starts the client itself.
void perform(const Scenario& scenario, const Action& action, World& world, Invariants& invariants) {
    if (scenario.wanted.isNull()) world.startClient();
    action(world, invariants);
    invariants.sessionHasEnded();
    invariants.clientGoes();
}

Action recoveryOf(const Scenario& scenario) {
    return scenario.resume ? scenario.resume : scenario.run;
}

/// With APPSYNC_TRACE: what has crossed platform/.
void trace(const World& world) {
    if (std::getenv("APPSYNC_TRACE") == nullptr) return;
    for (const std::string& line : world.platform.lines()) std::puts(line.c_str());
}

/// With a new client, which is judged by what it does itself.
void syncOnceMore(const Scenario& scenario, World& world, Invariants& invariants) {
    sync(world, invariants, scenario.wanted.isNull() ? PropertyList::array() : scenario.wanted);
    invariants.sessionHasEnded();
    invariants.clientGoes();
}

Expectation runPlainly(const Scenario& scenario, const SeedsOf& seeds) {
    Stage stage(scenario);
    Expectation expectation;
    expectation.installed = stage.world.platform.registry.installedIdentifiers();
    {
        Camera camera(stage.world.platform, seeds);
        Invariants invariants(stage.world);
        perform(scenario, scenario.run, stage.world, invariants);
        EXPECT_THAT(invariants.violations(), IsEmpty());
        expectation.operations = camera.operations();
        expectation.pictures = camera.pictures();
    }
    if (scenario.resume) {
        stage.world.platform.clearRecording();
        Invariants invariants(stage.world);
        perform(scenario, scenario.resume, stage.world, invariants);
    }
    expectation.state = stateOf(stage.world);
    stage.world.platform.clearRecording();
    Invariants invariants(stage.world);
    syncOnceMore(scenario, stage.world, invariants);
    EXPECT_THAT(invariants.violations(), IsEmpty());
    expectation.synced = stateOf(stage.world);
    if (!scenario.wanted.isNull()) {
        EXPECT_THAT(differencesBetween(expectation.state, expectation.synced), IsEmpty());
    }
    return expectation;
}

/// What was written atomically is whole, whatever was lost.
void checkAtomicFiles(World& world, Invariants& invariants) {
    for (const std::string& path : world.platform.files.paths(std::string(kWorkArea))) {
        const bool isOfHost = path.starts_with(kTodoDirectory);
        if (isOfHost || !path.ends_with(".plist") || world.platform.propertyListAt(path)) continue;
        invariants.violate(path + " is no property list after the crash");
    }
}

/// Everything that was installed before the crash, and that nobody wants removed, is to stay.
void keepInstalled(const Scenario& scenario, const Expectation& expectation,
                   Invariants& invariants) {
    for (const std::string& identifier : expectation.installed) invariants.mustKeep(identifier);
    for (const PropertyList& entry : scenario.wanted.elements()) {
        const std::string* operation = entry.findString("operation");
        if (operation == nullptr || *operation != "remove") continue;
        invariants.mayRemove(*entry.findString("identifier"));
    }
}

void recoverThrowing(const Scenario& scenario, const Expectation& expectation,
                     const Action& recovery, World& world, Violations& violations,
                     std::vector<Crashed>& pictures, const SeedsOf& seeds) {
    {
        Camera camera(world.platform, seeds);
        Invariants invariants(world);
        keepInstalled(scenario, expectation, invariants);
        checkAtomicFiles(world, invariants);
        perform(scenario, recovery, world, invariants);
        violations = invariants.violations();
        pictures = camera.pictures();
    }
    const auto add = [&violations](const char* when, const Violations& more) {
        for (const std::string& each : more) violations.push_back(when + each);
    };
    add("", differencesBetween(expectation.state, stateOf(world)));
    trace(world);
    world.platform.clearRecording();
    Invariants invariants(world);
    syncOnceMore(scenario, world, invariants);
    add("in one more sync: ", invariants.violations());
    add("after one more sync: ", differencesBetween(expectation.synced, stateOf(world)));
}

/// The loss of a package that lay on a placeholder which was there before costs a sync.
Action recoveryOf(const Scenario& scenario, const DeviceImage& image) {
    const Action recovery = recoveryOf(scenario);
    if (!scenario.mayLosePackage || !image.powerWasLost) return recovery;
    return [recovery](World& world, Invariants& invariants) {
        recovery(world, invariants);
        recovery(world, invariants);
    };
}

/// A new process on what a crash has left; gives what is wrong, and keeps what crashes of it leave.
Violations recover(const Scenario& scenario, const Expectation& expectation,
                   const DeviceImage& image, std::vector<Crashed>& pictures,
                   const SeedsOf& seeds = never()) {
    Violations violations;
    Stage stage(scenario, image);
    try {
        recoverThrowing(scenario, expectation, recoveryOf(scenario, image), stage.world, violations,
                        pictures, seeds);
    } catch (const std::exception& failure) {
        violations.emplace_back(failure.what());
    }
    trace(stage.world);
    return violations;
}

std::string replayOf(const Scenario& scenario, const std::vector<const Crashed*>& crashes) {
    std::string name = scenario.name;
    std::string after;
    for (const Crashed* each : crashes) {
        name +=
            ":" + std::to_string(each->crash.operation) + ":" + std::to_string(each->crash.seed);
        after += " after " + each->after;
    }
    return std::string(kOneCrash) + "=" + name +
           " build/release/tests/test_reliability --gtest_filter=Crash.One  #" + after;
}

void expectRecovery(const Scenario& scenario, const Expectation& expectation,
                    const Crashed& crashed) {
    std::vector<Crashed> none;
    EXPECT_THAT(recover(scenario, expectation, crashed.image, none), IsEmpty())
        << replayOf(scenario, {&crashed});
}

class EveryInstant : public testing::TestWithParam<Scenario> {};

TEST_P(EveryInstant, OfACrashIsRecoveredFrom) {
    const std::uint64_t seeds =
        numberIn(kManyCrashSeeds).value_or(GetParam().isVariant ? kSeedsOfVariants : kSeedsToCrash);
    const std::uint64_t first = numberIn(kFirstCrashSeed).value_or(0);
    const Expectation expectation = runPlainly(GetParam(), seedsFrom(first, seeds));
    EXPECT_GT(expectation.operations, 0U);
    for (const Crashed& each : expectation.pictures) {
        expectRecovery(GetParam(), expectation, each);
    }
    RecordProperty("operations", static_cast<int>(expectation.operations));
    std::printf("%s: %zu operations, %zu crashes with the seeds %llu to %llu\n",
                GetParam().name.c_str(), expectation.operations, expectation.pictures.size(),
                static_cast<unsigned long long>(first),
                static_cast<unsigned long long>(first + seeds - 1));
}

INSTANTIATE_TEST_SUITE_P(Of, EveryInstant, testing::ValuesIn(scenarios()),
                         [](const auto& tested) { return tested.param.name; });

/// The recovery crashes, too, and the next one has to bring the device in step.
class EveryPairOfInstants : public testing::TestWithParam<Scenario> {};

std::size_t crashAgain(const Scenario& scenario, const Expectation& expectation,
                       const Crashed& first, const SeedsOf& seeds) {
    std::vector<Crashed> pictures;
    const Violations violations = recover(scenario, expectation, first.image, pictures, seeds);
    EXPECT_THAT(violations, IsEmpty()) << replayOf(scenario, {&first});
    for (const Crashed& second : pictures) {
        std::vector<Crashed> none;
        EXPECT_THAT(recover(scenario, expectation, second.image, none), IsEmpty())
            << replayOf(scenario, {&first, &second});
    }
    return pictures.size();
}

TEST_P(EveryPairOfInstants, OfCrashesIsRecoveredFrom) {
    const std::uint64_t first = numberIn(kFirstCrashSeed).value_or(0);
    const std::uint64_t seeds = numberIn(kManyCrashSeeds).value_or(kSeedsOfPairs);
    const SeedsOf chosen = seedsFrom(first, seeds);
    const Expectation expectation = runPlainly(GetParam(), chosen);
    std::size_t pairs = 0;
    for (const Crashed& each : expectation.pictures) {
        pairs += crashAgain(GetParam(), expectation, each, chosen);
    }
    EXPECT_GT(pairs, 0U);
    std::printf("%s: %zu pairs of crashes with the seeds %llu to %llu\n", GetParam().name.c_str(),
                pairs, static_cast<unsigned long long>(first),
                static_cast<unsigned long long>(first + seeds - 1));
}

const Scenario& scenarioNamed(std::string_view name) {
    for (const Scenario& each : scenarios()) {
        if (each.name == name) return each;
    }
    throw std::invalid_argument("there is no scenario of the name " + std::string(name));
}

std::vector<Scenario> crashedTwice() {
    std::vector<Scenario> result;
    for (const char* name : kCrashedTwice) result.push_back(scenarioNamed(name));
    return result;
}

INSTANTIATE_TEST_SUITE_P(Of, EveryPairOfInstants, testing::ValuesIn(crashedTwice()),
                         [](const auto& tested) { return tested.param.name; });

/// What the end of the process leaves after the first operation of this name.
DeviceImage afterEndOfProcess(const Scenario& scenario, std::string_view operation) {
    const Expectation expectation = runPlainly(scenario, seedsFrom(0, 1));
    for (const Crashed& each : expectation.pictures) {
        if (each.after == operation) return each.image;
    }
    throw std::invalid_argument("there is no operation " + std::string(operation));
}

// What the sweep comes upon among other things.

TEST(Crash, LeavesAPlaceholderForWhichThePlugInAsksNothingUntilTheHostHasTakenItAway) {
    const Scenario& scenario = scenarioNamed("DirectSync");
    const DeviceImage image = afterEndOfProcess(scenario, "the placeholder of com.example.a");
    Stage unplanned(scenario, image);
    unplanned.world.hostPlans = false;
    Invariants invariants(unplanned.world);
    sync(unplanned.world, invariants, scenario.wanted);
    EXPECT_FALSE(unplanned.world.platform.registry.installed("com.example.a"));
    EXPECT_TRUE(unplanned.world.platform.registry.placeholder("com.example.a"));
    unplanned.world.client.reset();

    Stage planned(scenario, image);
    Invariants others(planned.world);
    sync(planned.world, others, scenario.wanted);
    EXPECT_TRUE(planned.world.platform.registry.installed("com.example.a"));
    EXPECT_FALSE(planned.world.platform.registry.placeholder("com.example.a"));
    planned.world.client.reset();
}

TEST(Crash, LeavesADeliveredPackageThatIsInstalledWithoutBeingSentAgain) {
    const Scenario& scenario = scenarioNamed("CoordinatedSync");
    Stage stage(scenario, afterEndOfProcess(scenario, "a promise kept of com.example.a-Asset"));
    EXPECT_FALSE(stage.world.platform.registry.installed("com.example.a"));
    Invariants invariants(stage.world);
    sync(stage.world, invariants, scenario.wanted);
    EXPECT_TRUE(stage.world.platform.registry.installed("com.example.a"));
    for (const std::string& text : stage.world.platform.messages()) {
        EXPECT_THAT(text, testing::Not(testing::StartsWith("Received file at")));
    }
    stage.world.client.reset();
}

/// What APPSYNC_CRASH names; with APPSYNC_TRACE it also prints what crossed platform/ after it.
TEST(Crash, One) {
    const char* text = std::getenv(kOneCrash);
    std::istringstream words(text != nullptr ? text : "DirectSync:1:0");
    std::vector<std::string> parts;
    for (std::string part; std::getline(words, part, ':');) parts.push_back(part);
    ASSERT_TRUE(parts.size() == 3 || parts.size() == 5)
        << kOneCrash << " is scenario:operation:seed, perhaps with a second :operation:seed";
    const Scenario& scenario = scenarioNamed(parts[0]);
    const Crash first{std::stoull(parts[1]), std::stoull(parts[2])};
    const Expectation expectation = runPlainly(scenario, onlyAt(first));
    ASSERT_EQ(expectation.pictures.size(), 1U) << "there is no such operation";
    if (parts.size() == 3) {
        expectRecovery(scenario, expectation, expectation.pictures.front());
        return;
    }
    const Crash second{std::stoull(parts[3]), std::stoull(parts[4])};
    EXPECT_EQ(crashAgain(scenario, expectation, expectation.pictures.front(), onlyAt(second)), 1U);
}

}  // namespace
}  // namespace appsync
