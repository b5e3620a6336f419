#include "host/plan/InterruptedStaging.h"

#include <filesystem>

#include "client/Paths.h"
#include "host/plan/StagingArea.h"
#include "host/plan/SyncPlan.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

PropertyList stagedEntry(const std::string& identifier, const char* operation) {
    return PropertyList::map({{"identifier", identifier}, {"operation", operation}});
}

class InterruptedStaging : public HostFixture {
  protected:
    void stage(const PropertyList& list) {
        std::filesystem::create_directories(root + std::string(kStagingArea));
        save(std::string(kStagingArea) + "/ApplicationsSync.plist", list);
    }

    void save(const std::string& path, const PropertyList& list) {
        const auto opened = open(DeviceAccess::Look);
        const auto bytes = opened->propertyLists().serialize(list, PropertyListFormat::Binary);
        ASSERT_TRUE(bytes && opened->files().writeFileAtomically(path, *bytes));
    }

    // What a session does up to the moment at which it is killed.
    void interrupt(const PropertyList& staged, const PropertyList& now) {
        stage(staged);
        EXPECT_TRUE(beginStagedSession(*open(DeviceAccess::Look), staged));
        std::filesystem::create_directories(root + std::string(kWorkArea));
        std::filesystem::remove_all(root + std::string(kTodoDirectory));
        std::filesystem::rename(root + std::string(kStagingArea),
                                root + std::string(kTodoDirectory));
        save(std::string(kTodoListPath), now);
    }

    [[nodiscard]] bool isLeft() {
        return interruptedTodoList(*open(DeviceAccess::Look)).has_value();
    }
};

TEST_F(InterruptedStaging, TheSameCommandDoesWhatIsLeft) {
    for (const char* each : {"com.a", "com.b", "com.c", "com.d"}) addPackage(each, "1");
    interrupt(
        PropertyList::array({stagedEntry("com.a", "install"), stagedEntry("com.b", "install"),
                             stagedEntry("com.c", "install"), stagedEntry("com.d", "install")}),
        PropertyList::array({stagedEntry("com.a", "INSTALLED"), stagedEntry("com.b", "DOWNLOADED"),
                             stagedEntry("com.c", "install"), stagedEntry("com.d", "FAILED")}));
    EXPECT_EQ(run({"plan", device, library, "--staged", "--json"}), 0);
    EXPECT_THAT(out.str(), Not(HasSubstr("\"com.a\"")));
    EXPECT_THAT(out.str(), HasSubstr("takes up the session that was interrupted"));
    EXPECT_EQ(sync({"--staged"}), 0) << out.str();
    EXPECT_THAT(applications(), ElementsAre("com.b 1", "com.c 1", "com.d 1"));
    EXPECT_FALSE(isLeft());
    EXPECT_EQ(sync({"--staged"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"requested\": []"));
}

TEST_F(InterruptedStaging, WhatWasInstalledWithoutANoteIsNotSentAgain) {
    addPackage("com.a", "1");
    interrupt(PropertyList::array({stagedEntry("com.a", "install")}),
              PropertyList::array({stagedEntry("com.a", "DOWNLOADED")}));
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip"}), 0);
    EXPECT_EQ(sync({"--staged"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"requested\": []"));
}

TEST_F(InterruptedStaging, ARemovalThatWasFollowedByItsInstallIsNotDoneAgain) {
    addPackage("com.a", "1");
    EXPECT_EQ(sync(), 0);
    interrupt(
        PropertyList::array({stagedEntry("com.a", "remove"), stagedEntry("com.a", "install")}),
        PropertyList::array({stagedEntry("com.a", "INSTALLED"), stagedEntry("com.a", "install")}));
    EXPECT_EQ(sync({"--staged"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"removed\": []"));
    EXPECT_THAT(out.str(), HasSubstr("\"requested\": []"));
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(InterruptedStaging, AnAreaThatWaitsComesBeforeIt) {
    addPackage("com.a", "1");
    addPackage("com.b", "1");
    interrupt(PropertyList::array({stagedEntry("com.a", "install")}),
              PropertyList::array({stagedEntry("com.a", "install")}));
    stage(PropertyList::array({stagedEntry("com.b", "install")}));
    EXPECT_EQ(sync({"--staged"}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.b 1"));
    EXPECT_FALSE(isLeft());
}

TEST_F(InterruptedStaging, AListThatSomebodyHasChangedIsNotTakenUp) {
    interrupt(PropertyList::array({stagedEntry("com.a", "install")}),
              PropertyList::array({stagedEntry("com.b", "install")}));
    EXPECT_FALSE(isLeft());
    interrupt(PropertyList::array({stagedEntry("com.a", "install")}), PropertyList::array({}));
    EXPECT_FALSE(isLeft());
    EXPECT_EQ(sync({"--staged"}), 0);
}

TEST_F(InterruptedStaging, ForgettingEverythingForgetsItToo) {
    interrupt(PropertyList::array({stagedEntry("com.a", "install")}),
              PropertyList::array({stagedEntry("com.a", "install")}));
    EXPECT_TRUE(isLeft());
    EXPECT_EQ(run({"reset", device}), 0);
    EXPECT_FALSE(isLeft());
}

TEST_F(InterruptedStaging, ASyncOfTheLibrarySaysThatItGivesUpWhatAHostHasStaged) {
    addPackage("com.a", "1");
    interrupt(PropertyList::array({stagedEntry("com.b", "install")}),
              PropertyList::array({stagedEntry("com.b", "install")}));
    EXPECT_EQ(run({"plan", device, library}), 0);
    EXPECT_THAT(out.str(), HasSubstr("interrupted sync --staged"));
    stage(PropertyList::array({stagedEntry("com.b", "install")}));
    EXPECT_EQ(sync(), 0);
    EXPECT_THAT(err.str(), HasSubstr("the staging area that waits on the device is given up"));
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
    EXPECT_EQ(sync(), 0);
    EXPECT_THAT(err.str(), IsEmpty());
}

TEST_F(InterruptedStaging, TheAreaOfASyncThatWasKilledIsNobodysLoss) {
    addPackage("com.a", "1");
    Library own;
    ASSERT_TRUE(writeStagingArea(*open(DeviceAccess::Session), SyncPlan(), own));
    EXPECT_EQ(sync(), 0);
    EXPECT_THAT(err.str(), IsEmpty());
}

TEST_F(InterruptedStaging, APlanSeesWhatHasLostItsBundle) {
    addPackage("com.a", "1");
    addPackage("com.b", "1");
    EXPECT_EQ(sync(), 0);
    std::string container;
    {
        const auto records = open(DeviceAccess::Look)->applications();
        ASSERT_TRUE(records);
        container = records->front().container;
    }
    std::filesystem::remove_all(root + container);
    EXPECT_EQ(run({"plan", device, library, "--json"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"install\": [\n    \"com.a\"\n  ]"));
    EXPECT_EQ(sync(), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"installed\": [\n    \"com.a\"\n  ]"));
}

TEST_F(InterruptedStaging, APlanOfAStagingAreaKnowsPackagesThatAreNamedByIdentifier) {
    addPackage("com.b", "1");
    addPackage("com.a", "1");
    std::filesystem::copy(library + "/com.a.zip", library + "/com.x.zip");
    write(library + "/com.y.zip", "no package");
    stage(PropertyList::array({stagedEntry("com.a", "install"), stagedEntry("com.x", "install"),
                               stagedEntry("com.y", "install"), stagedEntry("com.z", "install")}));
    EXPECT_EQ(run({"plan", device, library, "--staged"}), 1);
    EXPECT_THAT(out.str(), HasSubstr("install  com.a 1"));
    EXPECT_THAT(out.str(), HasSubstr("failed   com.x: " + library + "/com.x.zip is a package of"));
    EXPECT_THAT(out.str(), HasSubstr("failed   com.y: "));
    EXPECT_THAT(out.str(), HasSubstr("failed   com.z: the library has no package of com.z"));
    EXPECT_THAT(out.str(), HasSubstr("1 package to send"));
}

}  // namespace
}  // namespace appsync
