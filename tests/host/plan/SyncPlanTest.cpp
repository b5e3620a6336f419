#include "host/plan/SyncPlan.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <set>

#include "device/values/DeviceRecords.h"
#include "host/plan/Library.h"
#include "platform/InstallProgressRecord.h"
#include "platform/PropertyList.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

Library libraryOf(std::initializer_list<std::pair<const char*, const char*>> packages) {
    Library library;
    for (const auto& [identifier, version] : packages) {
        library.packages.push_back({identifier, version, "Name", "file", 100, 300});
    }
    return library;
}

ApplicationRecord installed(const char* identifier, const char* version) {
    ApplicationRecord record;
    record.identifier = identifier;
    record.version = version;
    record.type = "User";
    record.bytes = 50;
    return record;
}

ApplicationRecord placeholder(const char* identifier, std::uint64_t installType) {
    ApplicationRecord record = installed(identifier, "1");
    record.isPlaceholder = true;
    record.installType = installType;
    return record;
}

std::vector<std::string> identifiersOf(const std::vector<PlannedInstall>& installs) {
    std::vector<std::string> identifiers;
    for (const PlannedInstall& each : installs) identifiers.push_back(each.identifier);
    return identifiers;
}

// A library that has a package of each of these, version 3.
StagedPlanOptions packagesOf(std::set<std::string> identifiers, bool bringsOffloaded = false) {
    StagedPlanOptions options;
    options.bringsOffloaded = bringsOffloaded;
    options.packageOf = [=](const std::string& identifier) -> Result<LibraryPackage> {
        if (!identifiers.contains(identifier)) return ErrorRecord::make("test", 1, "no package");
        return LibraryPackage{identifier, "3", "Name", "file", 100, 300};
    };
    return options;
}

PropertyList entry(PropertyList identifier, const char* operation) {
    return PropertyList::map({{"identifier", std::move(identifier)}, {"operation", operation}});
}

TEST(SyncPlan, InstallsWhatIsAbsentAndUpdatesWhatDiffers) {
    const SyncPlan plan = makePlan(libraryOf({{"com.a", "1"}, {"com.b", "2"}, {"com.c", "3"}}),
                                   {installed("com.b", "1"), installed("com.c", "3")}, {});
    EXPECT_THAT(identifiersOf(plan.install), ElementsAre("com.a"));
    ASSERT_THAT(identifiersOf(plan.update), ElementsAre("com.b"));
    EXPECT_EQ(plan.update[0].oldVersion, "1");
    EXPECT_EQ(plan.update[0].newVersion, "2");
    EXPECT_THAT(plan.remove, IsEmpty());
}

TEST(SyncPlan, ALowerVersionInTheLibraryIsAnUpdateToo) {
    const SyncPlan plan = makePlan(libraryOf({{"com.a", "1"}}), {installed("com.a", "2")}, {});
    EXPECT_THAT(identifiersOf(plan.update), ElementsAre("com.a"));
}

TEST(SyncPlan, CountsWhatTravelsAndWhatItNeeds) {
    const SyncPlan plan =
        makePlan(libraryOf({{"com.a", "1"}, {"com.b", "2"}}),
                 {installed("com.b", "1"), installed("com.c", "1")}, {{"com.c"}, false});
    EXPECT_EQ(plan.bytes(), 200U);
    EXPECT_EQ(plan.needed(), 800U);
    EXPECT_EQ(plan.reclaimed, 50U);
}

TEST(SyncPlan, RemovesWhatIsNamedAndDoesNotInstallItToo) {
    const SyncPlan plan = makePlan(libraryOf({{"com.a", "2"}}), {installed("com.a", "1")},
                                   {{"com.a", "com.a"}, false});
    EXPECT_THAT(plan.remove, ElementsAre("com.a"));
    EXPECT_THAT(plan.update, IsEmpty());
}

TEST(SyncPlan, SaysThatWhatIsNamedForRemovalIsNotThere) {
    const SyncPlan plan = makePlan({}, {}, {{"com.a"}, false});
    EXPECT_TRUE(plan.empty());
    ASSERT_EQ(plan.skipped.size(), 1U);
    EXPECT_EQ(plan.skipped[0].why, "it is not on the device");
}

TEST(SyncPlan, MirrorRemovesUserApplicationsThatTheLibraryLacks) {
    ApplicationRecord system = installed("com.system", "1");
    system.type = "System";
    const SyncPlan plan = makePlan(libraryOf({{"com.a", "1"}}),
                                   {installed("com.a", "1"), installed("com.b", "1"), system,
                                    placeholder("com.offloaded", kInstallTypeIntentionalDowngrade),
                                    placeholder("com.restoring", kInstallTypeRestore)},
                                   {{}, true});
    EXPECT_THAT(plan.remove, ElementsAre("com.b", "com.offloaded"));
}

TEST(SyncPlan, MirrorKeepsEverythingWhileAPackageCannotBeRead) {
    Library library = libraryOf({{"com.a", "1"}});
    library.faults.push_back({"broken.zip", "cut off"});
    const SyncPlan plan = makePlan(library, {installed("com.b", "1")}, {{}, true});
    EXPECT_THAT(plan.remove, IsEmpty());
    ASSERT_EQ(plan.failed.size(), 1U);
    EXPECT_EQ(plan.failed[0].identifier, "broken.zip");
}

TEST(SyncPlan, NamesTheOneCommandThatBringsWhatItLeavesAlone) {
    ApplicationRecord system = placeholder("com.system", kInstallTypeDowngrade);
    system.type = "System";
    const Library library = libraryOf({{"com.restoring", "2"}, {"com.system", "2"}});
    const std::vector<ApplicationRecord> present = {
        placeholder("com.restoring", kInstallTypeRestore), system};
    const SyncPlan direct = makePlan(library, present, {});
    ASSERT_EQ(direct.skipped.size(), 2U);
    EXPECT_THAT(direct.skipped[0].why,
                HasSubstr("appsync send DEVICE com.restoring FILE --restore brings"));
    EXPECT_THAT(direct.skipped[1].why, HasSubstr(" FILE brings it back"));
    PlanOptions options;
    options.bringsOffloaded = true;
    const SyncPlan coordinated = makePlan(library, present, options);
    ASSERT_EQ(coordinated.skipped.size(), 2U);
    EXPECT_THAT(coordinated.skipped[0].why, HasSubstr("see appsync store"));
    EXPECT_THAT(coordinated.skipped[0].why, Not(HasSubstr("--restore")));
}

TEST(SyncPlan, LeavesSystemAndOffloadedApplicationsAlone) {
    ApplicationRecord system = installed("com.system", "1");
    system.type = "System";
    const SyncPlan plan =
        makePlan(libraryOf({{"com.offloaded", "2"}, {"com.system", "2"}}),
                 {placeholder("com.offloaded", kInstallTypeDowngrade), system}, {});
    EXPECT_TRUE(plan.empty());
    ASSERT_EQ(plan.skipped.size(), 2U);
    EXPECT_THAT(plan.skipped[0].why, HasSubstr("offloaded"));
    EXPECT_THAT(plan.skipped[1].why, HasSubstr("system"));
    EXPECT_TRUE(plan.skipped[0].isUnmet && plan.skipped[1].isUnmet);
}

TEST(SyncPlan, ThePlaceholderOfAnInterruptedSyncStandsForNothing) {
    const SyncPlan plan = makePlan(libraryOf({{"com.a", "1"}, {"com.b", "2"}}),
                                   {placeholder("com.a", kInstallTypeSync), installed("com.b", "1"),
                                    placeholder("com.b", kInstallTypeSync)},
                                   {});
    EXPECT_THAT(identifiersOf(plan.install), ElementsAre("com.a"));
    EXPECT_THAT(identifiersOf(plan.update), ElementsAre("com.b"));
}

TEST(SyncPlan, WhatPolicyForbidsIsSkippedAndNeedsNothing) {
    const SyncPlan plan = makePlan(libraryOf({{"com.a", "1"}, {"com.b", "2"}}),
                                   {installed("com.b", "1"), installed("com.c", "1")}, {{}, true});
    DeviceSettings settings;
    settings.installation = PolicyAnswer::No;
    const SyncPlan removes = allowedBy(settings, plan);
    EXPECT_EQ(removes.needed(), 0U);
    EXPECT_THAT(removes.remove, ElementsAre("com.c"));
    ASSERT_EQ(removes.skipped.size(), 2U);
    EXPECT_EQ(removes.skipped[0].identifier, "com.a");
    EXPECT_EQ(removes.skipped[0].why, kInstallationForbidden);
    EXPECT_TRUE(removes.skipped[0].isUnmet);
    settings.removal = PolicyAnswer::No;
    const SyncPlan nothing = allowedBy(settings, plan);
    EXPECT_TRUE(nothing.empty());
    EXPECT_EQ(nothing.reclaimed, 0U);
    EXPECT_EQ(nothing.skipped[0].why, kRemovalForbidden);
}

TEST(StagedPlan, FollowsTheTodoListOnceForEachIdentifier) {
    const PropertyList list = PropertyList::array(
        {entry("com.a", "install"), entry("com.a", "install"), entry("com.b", "install"),
         entry("com.c", "remove"), entry("com.d", "remove"), entry("com.e", "INSTALLED")});
    const SyncPlan plan = makeStagedPlan(list, {installed("com.b", "1"), installed("com.c", "1")},
                                         packagesOf({"com.a"}));
    ASSERT_THAT(identifiersOf(plan.install), ElementsAre("com.a"));
    EXPECT_EQ(plan.install[0].newVersion, "3");
    EXPECT_THAT(identifiersOf(plan.update), ElementsAre("com.b"));
    EXPECT_THAT(plan.remove, ElementsAre("com.c"));
    ASSERT_EQ(plan.skipped.size(), 1U);
    EXPECT_EQ(plan.skipped[0].identifier, "com.d");
    EXPECT_THAT(plan.failed, IsEmpty());
}

TEST(StagedPlan, NamesEachEntryThatItCanMakeNothingOf) {
    const std::string withNul("a\0b", 3);
    const PropertyList list =
        PropertyList::array({"text", PropertyList::map(), entry(7, "install"), entry("", "remove"),
                             entry("../x", "install"), entry(std::string(300, 'x'), "install"),
                             entry(withNul, "remove")});
    const SyncPlan plan = makeStagedPlan(list, {}, packagesOf({}));
    EXPECT_TRUE(plan.empty());
    ASSERT_EQ(plan.failed.size(), 7U);
    EXPECT_EQ(plan.failed[0].identifier, "entry 1 of the todo list");
    EXPECT_EQ(plan.failed[2].error, "its identifier is not a string");
    EXPECT_EQ(plan.failed[4].identifier, "../x");
}

TEST(StagedPlan, WhatHasNoGoodPackageHasFailedAndNeedsNothing) {
    const PropertyList list = PropertyList::array(
        {entry("com.a", "install"), entry("com.b", "install"), entry("com.c", "install")});
    SyncPlan plan = makeStagedPlan(list, {installed("com.b", "1")}, packagesOf({"com.a"}));
    EXPECT_EQ(identifiersOf(plan.install).size() + plan.update.size(), 3U)
        << "the device asks for them all the same";
    const SyncPlan shown = allowedBy({}, plan);
    EXPECT_THAT(identifiersOf(shown.install), ElementsAre("com.a"));
    EXPECT_THAT(shown.update, IsEmpty());
    ASSERT_EQ(shown.failed.size(), 2U);
    EXPECT_EQ(shown.failed[0].identifier, "com.c");
    EXPECT_EQ(shown.failed[0].error, "no package");
    EXPECT_EQ(shown.bytes(), 100U);
    EXPECT_EQ(shown.needed(), 400U);
    plan.install.back().hasArrived = true;
    EXPECT_THAT(identifiersOf(allowedBy({}, plan).install), ElementsAre("com.a", "com.c"));
}

TEST(StagedPlan, SkipsWhatTheDeviceDoesNotAskForAsItHasAPlaceholder) {
    const PropertyList list =
        PropertyList::array({entry("com.off", "install"), entry("com.restored", "install"),
                             entry("com.gone", "install"), entry("com.gone", "remove")});
    const std::vector<ApplicationRecord> present = {
        placeholder("com.off", kInstallTypeDowngrade),
        placeholder("com.restored", kInstallTypeRestore),
        placeholder("com.gone", kInstallTypeIntentionalDowngrade)};
    const auto options = packagesOf({"com.off", "com.restored", "com.gone"});
    const SyncPlan direct = makeStagedPlan(list, present, options);
    EXPECT_THAT(identifiersOf(direct.install), ElementsAre("com.gone")) << "it is removed first";
    ASSERT_EQ(direct.skipped.size(), 2U);
    EXPECT_THAT(direct.skipped[0].why, HasSubstr("offloaded"));
    EXPECT_TRUE(direct.skipped[0].isUnmet && direct.skipped[1].isUnmet);
    const auto coordinated = packagesOf({"com.off", "com.restored", "com.gone"}, true);
    EXPECT_THAT(identifiersOf(makeStagedPlan(list, present, coordinated).install),
                ElementsAre("com.off", "com.gone"));
}

TEST(StagedPlan, WhatIsRemovedFirstIsInstalledAndNotUpdated) {
    const PropertyList list =
        PropertyList::array({entry("com.a", "remove"), entry("com.a", "install")});
    const SyncPlan plan = makeStagedPlan(list, {installed("com.a", "1")}, packagesOf({"com.a"}));
    EXPECT_THAT(plan.remove, ElementsAre("com.a"));
    EXPECT_THAT(identifiersOf(plan.install), ElementsAre("com.a"));
    EXPECT_THAT(plan.update, IsEmpty());
}

class StagedVersions : public testing::Test {
  protected:
    // An area with the version 1 of com.a; the library has 3.
    SyncPlan planWith(const char* listed, const char* onDevice) {
        PropertyList asked = entry("com.a", "install");
        if (listed != nullptr) asked.set("version", listed);
        StagedPlanOptions options = packagesOf({"com.a"});
        options.stagedVersionOf = [](const std::string&) {
            return std::optional<std::string>("1");
        };
        return makeStagedPlan(PropertyList::array({asked}), {installed("com.a", onDevice)},
                              options);
    }
};

TEST_F(StagedVersions, AnotherPackageThanWasAskedForComesAndIsToldOf) {
    for (const char* listed : {static_cast<const char*>(nullptr), "1"}) {
        const SyncPlan plan = planWith(listed, "2");
        ASSERT_THAT(identifiersOf(plan.update), ElementsAre("com.a"));
        EXPECT_EQ(plan.update[0].refusal, "");
        EXPECT_THAT(plan.warnings, ElementsAre(HasSubstr("com.a 3 instead of 1")));
    }
}

TEST_F(StagedVersions, WhatTheDeviceHasAlreadyIsNoAnswerToWhatWasAskedFor) {
    const SyncPlan plan = planWith("1", "3");
    ASSERT_THAT(identifiersOf(plan.update), ElementsAre("com.a"));
    EXPECT_THAT(plan.update[0].refusal, HasSubstr("which is on the device already"));
    EXPECT_THAT(plan.warnings, IsEmpty());
    EXPECT_THAT(allowedBy({}, plan).update, IsEmpty());
    EXPECT_EQ(allowedBy({}, plan).failed[0].error, plan.update[0].refusal);
}

TEST_F(StagedVersions, TheListHasTheLastWord) {
    const SyncPlan plan = planWith("3", "3");
    EXPECT_EQ(plan.update[0].refusal, "");
    EXPECT_THAT(plan.warnings, IsEmpty());
}

TEST(StagedPlan, AListThatIsNoneAsksForNothing) {
    EXPECT_TRUE(makeStagedPlan(PropertyList::map(), {}, packagesOf({})).empty());
    EXPECT_TRUE(makeStagedPlan(PropertyList(), {}, packagesOf({})).empty());
}

TEST(StagedPlan, TakesTwoHundredThousandEntries) {
    PropertyList list = PropertyList::array(200'000);
    for (int number = 0; number < 200'000; ++number) {
        list.append(entry("com.app" + std::to_string(number), "install"));
    }
    EXPECT_EQ(makeStagedPlan(list, {}, packagesOf({})).install.size(), 200'000U);
}

TEST(SpaceCheck, SaysWhatIsNeededWhatIsFreeAndHowMuchIsMissing) {
    const SpaceCheck space{3 * 1024, 1024, 512};
    EXPECT_FALSE(space.fits());
    EXPECT_EQ(space.missing(), 1536U);
    EXPECT_THAT(space.description(), HasSubstr("needs 3.0 KiB, the device has 1.0 KiB free"));
    EXPECT_THAT(space.description(), HasSubstr("1.5 KiB are missing"));
}

TEST(SpaceCheck, FitsWhenRemovalsMakeRoom) { EXPECT_TRUE((SpaceCheck{1000, 500, 500}).fits()); }

}  // namespace
}  // namespace appsync
