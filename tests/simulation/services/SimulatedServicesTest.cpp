#include <memory>

#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

// What the contracts of these services promise is tested for every implementation; here stands what
// only the simulation does.
class SimulatedServicesTest : public SimulationFixture {};

TEST_F(SimulatedServicesTest, TheHomeScreenMayBeOutOfReach) {
    platform_.homeScreen.setReachable(false);
    EXPECT_EQ(platform_.homeScreen.blockableConnection(), nullptr);
}

TEST_F(SimulatedServicesTest, AFlattenedLayoutIsScriptable) {
    const auto connection = platform_.homeScreen.blockableConnection();
    platform_.homeScreen.setFlattenedIconState(Bytes{1, 2});
    EXPECT_EQ(connection->flattenedIconState(1), (Bytes{1, 2}));
    platform_.homeScreen.setFlattenedIconState(std::nullopt);
    EXPECT_EQ(connection->flattenedIconState(1), std::nullopt);
}

TEST_F(SimulatedServicesTest, TerminationOutcomesAreUsedUpInOrder) {
    platform_.registry.addApplication(kA);
    platform_.homeScreen.scriptTermination(kA, {1, 2, 77});
    for (const int outcome : {1, 2, 77, 0}) {
        EXPECT_EQ(platform_.homeScreen.takeTerminationAssertion(kA, 0).outcome, outcome);
    }
}

TEST_F(SimulatedServicesTest, HeldAssertionsAreKnownUntilTheyAreReleased) {
    platform_.registry.addApplication(kA);
    auto result = platform_.homeScreen.takeTerminationAssertion(kA, 0);
    EXPECT_THAT(platform_.homeScreen.heldAssertions(), UnorderedElementsAre(kA));
    result.assertion.reset();
    EXPECT_THAT(platform_.homeScreen.heldAssertions(), IsEmpty());
    EXPECT_EQ(platform_.calls().back(), "TerminationAssertion.release(com.example.a)");
}

TEST_F(SimulatedServicesTest, AnAssertionIsMadeUnlessThereIsNoSuchApplication) {
    for (const int outcome : {0, 1, 77}) {
        platform_.homeScreen.scriptTermination(kA, {outcome});
        EXPECT_NE(platform_.homeScreen.takeTerminationAssertion(kA, 0).assertion, nullptr);
    }
    platform_.homeScreen.scriptTermination(kA, {2});
    EXPECT_EQ(platform_.homeScreen.takeTerminationAssertion(kA, 0).assertion, nullptr);
}

TEST_F(SimulatedServicesTest, ArgumentsThatAreAlwaysTheSameAreChecked) {
    EXPECT_NE(failureOf([&] { (void)platform_.homeScreen.takeTerminationAssertion(kA, 1); }),
              "no failure");
    const auto connection = platform_.homeScreen.blockableConnection();
    EXPECT_NE(failureOf([&] { (void)connection->flattenedIconState(2); }), "no failure");
}

TEST_F(SimulatedServicesTest, AnIconIsItsBundlesPath) {
    Bytes buffer;
    const auto bundle = platform_.icons.openBundle(FileURL::fromPath("/a.app", true).value());
    const auto image = platform_.icons.homeScreenIcon(*bundle);
    const auto destination = platform_.icons.createImageDestination("public.png", 1, buffer);
    destination->addImage(*image);
    EXPECT_TRUE(destination->finalize());
    EXPECT_EQ(buffer, SimulatedIconRenderer::imageOf("/a.app"));
    EXPECT_EQ(platform_.icons.liveObjects(), 3U);
}

TEST_F(SimulatedServicesTest, EachStepOfAnIconCanFail) {
    Bytes buffer;
    SimulatedIconRenderer& icons = platform_.icons;
    const FileURL url = FileURL::fromPath("/a.app", true).value();
    const auto bundle = icons.openBundle(url);
    const auto destination = icons.createImageDestination("public.png", 1, buffer);
    destination->addImage(*icons.homeScreenIcon(*bundle));
    icons.failAt(IconStep::OpenBundle);
    EXPECT_EQ(icons.openBundle(url), nullptr);
    icons.failAt(IconStep::HomeScreenIcon);
    EXPECT_EQ(icons.homeScreenIcon(*bundle), nullptr);
    icons.failAt(IconStep::CreateImageDestination);
    EXPECT_EQ(icons.createImageDestination("public.png", 1, buffer), nullptr);
    icons.failAt(IconStep::Finalize);
    EXPECT_FALSE(destination->finalize());
    EXPECT_THAT(buffer, IsEmpty());
}

TEST_F(SimulatedServicesTest, TheHostAnswersAsTold) {
    EXPECT_EQ(platform_.host.mainBundleIdentifier(), "com.korvu.trd");
    platform_.host.setMainBundleIdentifier("com.example.other");
    EXPECT_EQ(platform_.host.mainBundleIdentifier(), "com.example.other");
    const auto error = ErrorRecord::make("Transport", 1, "broken");
    EXPECT_FALSE(platform_.host.isRecoverableError(error));
    platform_.host.setRecoverableTest([](const ErrorRecord& e) { return e.domain == "Transport"; });
    EXPECT_TRUE(platform_.host.isRecoverableError(error));
}

TEST_F(SimulatedServicesTest, TheInstallerMayNotAnswerOrNotClear) {
    platform_.installer.addUninstalled(kA);
    platform_.installer.setClearable(false);
    EXPECT_FALSE(platform_.installer.clearUninstalled(std::vector<std::string>{kA}));
    EXPECT_EQ(platform_.installer.uninstalled()->size(), 1U);
    platform_.installer.setUninstalled(std::nullopt);
    EXPECT_EQ(platform_.installer.lookupUninstalled(), std::nullopt);
}

TEST_F(SimulatedServicesTest, CancelledRestoresAreKept) {
    platform_.backup.addRestoreData(kA);
    platform_.backup.makeManager()->cancelApplicationRestore(kA);
    EXPECT_THAT(platform_.backup.cancelled(), ElementsAre(kA));
}

TEST_F(SimulatedServicesTest, TheTransactionLogKeepsStepsAndScenarios) {
    platform_.transactions.initialize(*platform_.log.makeHandle("subsystem", "category"));
    platform_.transactions.logScenario("Asset install", 0, true, kA, "assertion succeeded");
    platform_.transactions.logStep(3, 1, 2, false, kA, "text");
    EXPECT_EQ(platform_.transactions.handle(), "subsystem/category");
    EXPECT_THAT(platform_.transactions.records(),
                ElementsAre("Asset install|0|yes|com.example.a|assertion succeeded",
                            "step 3|1|2|no|com.example.a|text"));
}

TEST_F(SimulatedServicesTest, RegistrationsForStatesFailWhenTold) {
    platform_.notifications.setRegistrationStatus(5);
    EXPECT_EQ(platform_.notifications.registerForState("name").status, 5U);
    EXPECT_EQ(failureOf([&] { platform_.notifications.setState(1, 1); }), "no token 1");
}

TEST_F(SimulatedServicesTest, PostsAreKeptWithTheirStates) {
    const auto registration = platform_.notifications.registerForState("name");
    platform_.notifications.setState(registration.token, 1);
    platform_.notifications.post("name");
    platform_.notifications.setState(registration.token, 0);
    platform_.notifications.post("name");
    EXPECT_THAT(platform_.notifications.posts(), ElementsAre("name=1", "name=0"));
}

TEST_F(SimulatedServicesTest, RemovingAnObserverThatIsNoneIsAFailure) {
    const int observer = 0;
    EXPECT_NE(failureOf([&] { platform_.notificationCenter.removeObserver(&observer, "name"); }),
              "no failure");
}

TEST_F(SimulatedServicesTest, PropertyListsFailWhenTold) {
    const auto error = ErrorRecord::make(kPropertyListErrorDomain, 1, "scripted");
    platform_.propertyLists.failNextSerialize(error);
    EXPECT_EQ(platform_.propertyLists.serialize(1, PropertyListFormat::Binary).error(), error);
    const auto bytes = platform_.propertyLists.serialize(1, PropertyListFormat::Binary);
    ASSERT_TRUE(bytes);
    platform_.propertyLists.failNextParse(error);
    EXPECT_EQ(platform_.propertyLists.parse(*bytes).error(), error);
    EXPECT_EQ(*platform_.propertyLists.parse(*bytes), PropertyList(1));
}

}  // namespace
}  // namespace appsync
