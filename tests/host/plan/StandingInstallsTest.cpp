#include "host/plan/StandingInstalls.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <fstream>
#include <iterator>
#include <map>
#include <optional>
#include <string>

#include "device/values/DeviceRecords.h"
#include "host/plan/StagingArea.h"
#include "host/plan/SyncPlan.h"
#include "platform/PropertyList.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class StandingInstallsTest : public testing::Test {
  protected:
    StandingInstallsTest() {
        rules.arrivedVersion = versionIn(arrived);
        rules.libraryVersion = versionIn(library);
    }

    using Versions = std::map<std::string, std::string>;
    static StandingRules::Version versionIn(const Versions& versions) {
        return [&versions](const std::string& identifier) {
            const auto found = versions.find(identifier);
            return found == versions.end() ? std::nullopt : std::optional(found->second);
        };
    }

    // A coordinator of the sync client, by default of a first install; its package, where it has
    // one, is of version 2.
    CoordinatorRecord& stands(const char* identifier, bool hasPackage) {
        if (hasPackage) arrived[identifier] = "2";
        CoordinatorRecord record;
        record.identifier = identifier;
        record.kind = "initiating";
        record.client = SyncClientID;
        record.promises = {{std::string(identifier) + "-Asset", hasPackage, hasPackage ? 1.0 : 0.5,
                            SyncClientID, false}};
        record.isComplete = hasPackage;
        return coordinators.emplace_back(record);
    }

    void installed(const char* identifier) {
        ApplicationRecord record;
        record.identifier = identifier;
        record.version = "1";
        present.push_back(record);
    }

    void planInstall(const char* identifier, const char* version) {
        plan.install.push_back({identifier, "", "", version, 100, 300});
    }

    StandingInstalls taken() { return takeUp(plan, coordinators, present, rules); }

    Versions arrived;
    Versions library;
    StandingRules rules;
    SyncPlan plan;
    std::vector<CoordinatorRecord> coordinators;
    std::vector<ApplicationRecord> present;
};

TEST_F(StandingInstallsTest, APackageThatHasArrivedTravelsNoMore) {
    planInstall("com.a", "2");
    stands("com.a", true);
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.arrived, ElementsAre("com.a"));
    EXPECT_THAT(standing.obsolete, IsEmpty());
    EXPECT_EQ(plan.bytes(), 0U);
    EXPECT_EQ(plan.needed(), 300U);
    EXPECT_EQ(*todoListOf(plan).elements()[0].findString("operation"), "DOWNLOADED");
}

TEST_F(StandingInstallsTest, WhatLacksAnotherPieceIsAskedForAgainButNotSent) {
    planInstall("com.a", "2");
    stands("com.a", true).isComplete = false;
    EXPECT_THAT(taken().arrived, ElementsAre("com.a"));
    EXPECT_EQ(*todoListOf(plan).elements()[0].findString("operation"), "install");
}

TEST_F(StandingInstallsTest, APackageOfAnotherVersionIsObsolete) {
    planInstall("com.a", "3");
    stands("com.a", true);
    EXPECT_THAT(taken().obsolete, ElementsAre("com.a"));
    EXPECT_EQ(plan.bytes(), 100U);
}

TEST_F(StandingInstallsTest, APackageThatCannotBeReadIsObsolete) {
    planInstall("com.a", "2");
    stands("com.a", true);
    arrived.clear();
    EXPECT_THAT(taken().obsolete, ElementsAre("com.a"));
}

TEST_F(StandingInstallsTest, APackageWithoutAVersionIsNotOfAnyVersion) {
    planInstall("com.a", "");
    stands("com.a", true);
    EXPECT_THAT(taken().obsolete, ElementsAre("com.a"));
}

TEST_F(StandingInstallsTest, WhereTheLibraryHasNoPackageTheOneThatArrivedIsAsGood) {
    planInstall("com.a", "");
    plan.install[0].doubt = "there is none";
    stands("com.a", true);
    EXPECT_THAT(taken().arrived, ElementsAre("com.a"));
    EXPECT_EQ(plan.install[0].newVersion, "2");
}

TEST_F(StandingInstallsTest, WhatIsStillToBeSentGoesOnWhateverTheVersion) {
    planInstall("com.a", "3");
    stands("com.a", false);
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.arrived, IsEmpty());
    EXPECT_THAT(standing.obsolete, IsEmpty());
}

TEST_F(StandingInstallsTest, WhatNobodyAsksForIsObsoleteThoughItHasArrived) {
    stands("com.a", false);
    stands("com.b", true);
    installed("com.c");
    stands("com.c", true).kind = "updating";
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.obsolete, ElementsAre("com.a", "com.b", "com.c"));
    EXPECT_THAT(standing.arrived, IsEmpty());
    EXPECT_TRUE(plan.empty());
}

TEST_F(StandingInstallsTest, WhatIsToBeRemovedIsObsolete) {
    plan.remove = {"com.a"};
    installed("com.a");
    stands("com.a", true).kind = "updating";
    EXPECT_THAT(taken().obsolete, ElementsAre("com.a"));
}

TEST_F(StandingInstallsTest, ASessionThatLeavesOthersNamesWhatTheDeviceInstallsUnasked) {
    rules.leavesOthers = true;
    stands("com.a", true);
    installed("com.b");
    stands("com.b", true).kind = "updating";
    stands("com.c", true).isComplete = false;
    stands("com.d", false);
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.arrived, ElementsAre("com.a", "com.b", "com.c"));
    EXPECT_THAT(standing.obsolete, ElementsAre("com.d"));
    ASSERT_EQ(plan.install.size(), 1U);
    EXPECT_EQ(plan.install[0].identifier, "com.a");
    EXPECT_EQ(plan.install[0].newVersion, "2");
    ASSERT_EQ(plan.update.size(), 1U);
    EXPECT_EQ(plan.update[0].identifier, "com.b");
    EXPECT_EQ(plan.update[0].oldVersion, "1");
    EXPECT_EQ(plan.update[0].newVersion, "2");
    EXPECT_EQ(plan.needed(), 0U);
    EXPECT_THAT(todoListOf(plan).elements(), IsEmpty());
}

TEST_F(StandingInstallsTest, NothingGoesOnWhereInstallingIsForbidden) {
    planInstall("com.a", "2");
    stands("com.a", true);
    installed("com.b");
    stands("com.b", true).kind = "updating";
    stands("com.c", true).kind = "restoring";
    rules.isForbidden = true;
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.obsolete, ElementsAre("com.a", "com.b"));
    EXPECT_THAT(standing.arrived, IsEmpty());
    EXPECT_FALSE(plan.install[0].hasArrived);
}

TEST_F(StandingInstallsTest, ACoordinatorOfTheWrongKindIsObsolete) {
    plan.update.push_back({"com.a", "", "1", "2", 100, 300});
    installed("com.a");
    stands("com.a", false);
    planInstall("com.b", "1");
    stands("com.b", false).kind = "updating";
    EXPECT_THAT(taken().obsolete, ElementsAre("com.a", "com.b"));
}

TEST_F(StandingInstallsTest, WhatAnotherClientHasInHandIsSkipped) {
    planInstall("com.a", "1");
    planInstall("com.b", "1");
    stands("com.a", false).client = 7;
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.obsolete, IsEmpty());
    ASSERT_EQ(plan.install.size(), 1U);
    EXPECT_EQ(plan.install[0].identifier, "com.b");
    ASSERT_EQ(plan.skipped.size(), 1U);
    EXPECT_TRUE(plan.skipped[0].isUnmet);
    EXPECT_THAT(plan.skipped[0].why, HasSubstr("client 7"));
}

class StandingRestoreTest : public StandingInstallsTest {
  protected:
    CoordinatorRecord& restored(const char* identifier, bool hasPackage) {
        CoordinatorRecord& record = stands(identifier, hasPackage);
        record.kind = "restoring";
        record.hasPlaceholder = record.placeholderStands = true;
        return record;
    }
};

TEST_F(StandingRestoreTest, IsLeftAloneUntilItsPackageHasCome) {
    restored("com.a", false);
    restored("com.b", false).kind = "restoring demoted";
    coordinators.back().isComplete = true;  // there is nothing more to come of it
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.obsolete, IsEmpty());
    EXPECT_THAT(standing.arrived, IsEmpty());
    EXPECT_TRUE(plan.empty());
}

TEST_F(StandingRestoreTest, IsNamedWhereTheStoreHasDeliveredItsPackage) {
    restored("com.a", true);
    const StandingInstalls standing = taken();
    EXPECT_THAT(standing.arrived, ElementsAre("com.a"));
    ASSERT_EQ(plan.install.size(), 1U);
    EXPECT_TRUE(plan.install[0].isInstalledUnasked);
    DeviceSettings settings;
    settings.installation = PolicyAnswer::No;
    EXPECT_EQ(allowedBy(settings, plan).install.size(), 1U) << "no policy keeps it from coming";
}

TEST_F(StandingRestoreTest, IsSkippedNoMoreWhereThatIsWhatTheLibraryHolds) {
    for (const char* identifier : {"com.a", "com.b"}) {
        restored(identifier, true);
        plan.skipped.push_back({identifier, "a restore brought it back", true});
    }
    library = {{"com.a", "2"}, {"com.b", "3"}};
    EXPECT_THAT(taken().arrived, ElementsAre("com.a", "com.b"));
    ASSERT_EQ(plan.skipped.size(), 1U);
    EXPECT_EQ(plan.skipped[0].identifier, "com.b");
}

TEST_F(StandingRestoreTest, IsNotNamedWhereItIsToBeRemoved) {
    restored("com.a", true);
    plan.remove = {"com.a"};
    EXPECT_THAT(taken().arrived, IsEmpty());
    EXPECT_THAT(plan.install, IsEmpty());
}

TEST_F(StandingRestoreTest, ThatACrashHasLeftWithoutAPlaceholderIsInTheWayOfAnInstall) {
    planInstall("com.a", "2");
    for (const char* identifier : {"com.a", "com.b"}) {
        restored(identifier, false).placeholderStands = false;
    }
    EXPECT_THAT(taken().obsolete, ElementsAre("com.a"));
}

class ArrivedPackage : public HostFixture {
  protected:
    ArrivedPackage() : HostFixture(true) {}
    /// What stands where the package of com.a arrives.
    void arrives(const std::string& contents) {
        write(root + "/var/mobile/Media/PublicStaging/com.a.zip", contents);
    }
    [[nodiscard]] std::string packageOf(const std::string& identifier) {
        addPackage(identifier, "3.1");
        std::ifstream file(library + "/" + identifier + ".zip", std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }
};

TEST_F(ArrivedPackage, SaysItsVersion) {
    const std::unique_ptr<Device> opened = open(DeviceAccess::Look);
    EXPECT_EQ(versionOfArrived(*opened, "com.a"), std::nullopt);
    arrives(packageOf("com.a"));
    EXPECT_EQ(versionOfArrived(*opened, "com.a"), "3.1");
}

TEST_F(ArrivedPackage, OfAnotherApplicationOrNoneSaysNothing) {
    const std::unique_ptr<Device> opened = open(DeviceAccess::Look);
    for (const std::string& contents : {packageOf("com.b"), std::string("no package")}) {
        arrives(contents);
        EXPECT_EQ(versionOfArrived(*opened, "com.a"), std::nullopt);
    }
}

}  // namespace
}  // namespace appsync
