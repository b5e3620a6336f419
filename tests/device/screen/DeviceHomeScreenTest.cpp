#include "platform/HomeScreenService.h"

#include <chrono>

#include "device/database/Database.h"
#include "device/values/DevicePaths.h"
#include "platform/PropertyListSerialization.h"
#include "tests/device/DevicePlatformFixture.h"

namespace appsync {
namespace {

class DeviceHomeScreenTest : public DevicePlatformFixture {
  protected:
    HomeScreenService& screen() { return platform().homeScreen; }

    Bytes encode(const PropertyList& value) {
        return *device().propertyLists().serialize(value, PropertyListFormat::Xml);
    }
    bool setLayout(const PropertyList& layout) {
        return screen().blockableConnection()->setIconState(encode(layout));
    }
    PropertyList layout() {
        const std::optional<Bytes> state = screen().blockableConnection()->flattenedIconState(1);
        return state ? *device().propertyLists().parse(*state) : PropertyList();
    }
    int takeAssertion(const std::string& identifier) {
        return screen().takeTerminationAssertion(identifier, 0).outcome;
    }
};

TEST_F(DeviceHomeScreenTest, anEmptyDeviceHasAnEmptyLayout) {
    EXPECT_EQ(layout(), PropertyList::array());
}

TEST_F(DeviceHomeScreenTest, theLayoutComesFirstThenWhatItLacksInOrderOfArrival) {
    ASSERT_TRUE(succeeded(install(kCrane)));
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook)));
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(setLayout(PropertyList::array({"com.example.absent", kAtlas})));
    EXPECT_EQ(layout(), PropertyList::array({"com.example.absent", kAtlas, kCrane, kBrook}));
}

TEST_F(DeviceHomeScreenTest, anUpdateKeepsItsPlace) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    EXPECT_EQ(layout(), PropertyList::array({kAtlas, kBrook}));
}

TEST_F(DeviceHomeScreenTest, aRepeatedIdentifierHasItsFirstPlace) {
    ASSERT_TRUE(setLayout(PropertyList::array({kAtlas, kBrook, kAtlas, "../escape"})));
    EXPECT_EQ(layout(), PropertyList::array({kAtlas, kBrook}));
}

TEST_F(DeviceHomeScreenTest, aDamagedLayoutIsNone) {
    ASSERT_TRUE(succeeded(install(kBrook)));
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(setLayout(PropertyList::array({kAtlas})));
    const auto database = Database::open(devicePath(kDatabaseName), Database::Mode::Existing);
    ASSERT_TRUE((*database)->execute("UPDATE icon_layout SET state = X'62706C697374303041'"));
    EXPECT_EQ(layout(), PropertyList::array({kBrook, kAtlas}));
    EXPECT_TRUE(device().homeScreen().ok());
}

TEST_F(DeviceHomeScreenTest, theLayoutOutlivesTheSession) {
    ASSERT_TRUE(setLayout(PropertyList::array({kBrook, kAtlas})));
    endSession();
    EXPECT_EQ(layout(), PropertyList::array({kBrook, kAtlas}));
}

TEST_F(DeviceHomeScreenTest, aStateOfAnotherFormIsRefusedAndTheOldOneStays) {
    ASSERT_TRUE(setLayout(PropertyList::array({kAtlas})));
    EXPECT_FALSE(setLayout(PropertyList::map({{"order", kBrook}})));
    EXPECT_FALSE(setLayout(PropertyList::array({kBrook, 7})));
    const Bytes garbage = {0, 1, 2, 3};
    EXPECT_FALSE(screen().blockableConnection()->setIconState(garbage));
    EXPECT_FALSE(screen().blockableConnection()->setIconState({}));
    EXPECT_EQ(layout(), PropertyList::array({kAtlas}));
}

TEST_F(DeviceHomeScreenTest, theScreenShowsEachApplicationOnce) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook)));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    const auto record = progressOf(kAtlas);
    record->setCompletedUnitCount(500);
    ASSERT_TRUE(setLayout(PropertyList::array({kBrook, kAtlas, kCrane})));
    const auto items = device().homeScreen();
    ASSERT_EQ(items->size(), 2U);
    EXPECT_EQ(items->at(0).identifier, kBrook);
    EXPECT_FALSE(items->at(0).isPlaceholder);
    EXPECT_TRUE(items->at(1).isPlaceholder);
    EXPECT_EQ(items->at(1).progress, 0.25);
    EXPECT_EQ(items->at(1).name, "Name of com.example.atlas");
}

TEST_F(DeviceHomeScreenTest, whatIsNotInstalledHasNothingToHold) {
    EXPECT_EQ(takeAssertion(kAtlas), TerminationAssertionResult::kNoSuchApplication);
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_EQ(takeAssertion(kAtlas), TerminationAssertionResult::kNoSuchApplication);
    EXPECT_TRUE(refusedBy(device().run(kAtlas), RegistryErrorCode::NothingInstalled));
}

TEST_F(DeviceHomeScreenTest, aRunningApplicationIsDeniedUntilItQuits) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(look()->run(kAtlas)));
    EXPECT_EQ(takeAssertion(kAtlas), TerminationAssertionResult::kDenied);
    ASSERT_TRUE(succeeded(look()->quit(kAtlas)));
    EXPECT_EQ(takeAssertion(kAtlas), TerminationAssertionResult::kGranted);
}

TEST_F(DeviceHomeScreenTest, aDenialSaysWhenTheNextTryComesUntilOneIsGranted) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().run(kAtlas)));
    ASSERT_EQ(takeAssertion(kAtlas), TerminationAssertionResult::kDenied);
    const std::optional<TerminationDenial> denial = look()->status(kAtlas)->denial;
    ASSERT_TRUE(denial);
    EXPECT_EQ(denial->nextTry - denial->when, std::chrono::seconds(30));
    ASSERT_TRUE(succeeded(device().quit(kAtlas)));
    ASSERT_EQ(takeAssertion(kAtlas), TerminationAssertionResult::kGranted);
    EXPECT_FALSE(look()->status(kAtlas)->denial);
}

TEST_F(DeviceHomeScreenTest, aDenialIsForgottenWithItsSession) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    ASSERT_TRUE(succeeded(device().run(kAtlas)));
    ASSERT_EQ(takeAssertion(kAtlas), TerminationAssertionResult::kDenied);
    endSession();
    EXPECT_FALSE(look()->status(kAtlas)->denial);
}

TEST_F(DeviceHomeScreenTest, whatIsHeldMayNotRunUntilItIsReleased) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    auto first = screen().takeTerminationAssertion(kAtlas, 0);
    auto second = screen().takeTerminationAssertion(kAtlas, 0);
    ASSERT_EQ(first.outcome, TerminationAssertionResult::kGranted);
    EXPECT_TRUE(refusedBy(look()->run(kAtlas), RegistryErrorCode::InstallUnderWay, "try again"));
    first.assertion.reset();
    EXPECT_TRUE(look()->status(kAtlas)->isHeld);
    EXPECT_FALSE(look()->run(kAtlas));
    second.assertion.reset();
    EXPECT_TRUE(succeeded(look()->run(kAtlas)));
}

TEST_F(DeviceHomeScreenTest, anAssertionThatACrashLeftHoldsNothing) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    endSession();
    sql("INSERT INTO assertions (identifier, count) VALUES ('com.example.atlas', 1)");
    EXPECT_FALSE(look()->status(kAtlas)->isHeld);
    EXPECT_TRUE(succeeded(look()->run(kAtlas)));
}

TEST_F(DeviceHomeScreenTest, quittingWhatDoesNotRunIsNoFailure) {
    ASSERT_TRUE(succeeded(install(kAtlas)));
    EXPECT_TRUE(succeeded(device().quit(kAtlas)));
    EXPECT_TRUE(refusedBy(device().quit(kBrook), RegistryErrorCode::NothingInstalled));
}

}  // namespace
}  // namespace appsync
