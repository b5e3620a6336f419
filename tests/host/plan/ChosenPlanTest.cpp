#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "device/values/DeviceRecords.h"
#include "host/output/JsonSync.h"
#include "host/output/PlanText.h"
#include "host/plan/Library.h"
#include "host/plan/SyncPlan.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

class ChosenPlan : public testing::Test {
  protected:
    ChosenPlan() {
        library.folder = "folder";
        for (const char* identifier : {"com.a", "com.b", "com.c"}) {
            library.packages.push_back(
                {identifier, "2", "Name", std::string("folder/") + identifier + ".zip", 100, 300});
        }
    }

    [[nodiscard]] SyncPlan planOf(std::vector<std::string> only) const {
        PlanOptions options;
        options.only = std::move(only);
        return makePlan(library, present, options);
    }

    void install(const char* identifier, const char* version) {
        ApplicationRecord record;
        record.identifier = identifier;
        record.version = version;
        record.type = "User";
        present.push_back(record);
    }

    Library library;
    std::vector<ApplicationRecord> present;
};

std::vector<std::string> namesOf(const std::vector<PlannedInstall>& installs) {
    std::vector<std::string> names;
    for (const PlannedInstall& each : installs) names.push_back(each.identifier);
    return names;
}

TEST_F(ChosenPlan, LeavesTheOthersAlone) {
    install("com.c", "1");
    const SyncPlan plan = planOf({"com.b", "com.b"});
    EXPECT_THAT(namesOf(plan.install), ElementsAre("com.b"));
    EXPECT_THAT(plan.update, IsEmpty());
    EXPECT_THAT(plan.failed, IsEmpty());
}

TEST_F(ChosenPlan, FailsOfWhatTheLibraryLacks) {
    const SyncPlan plan = planOf({"com.b", "com.gone"});
    EXPECT_THAT(namesOf(plan.install), ElementsAre("com.b"));
    ASSERT_EQ(plan.failed.size(), 1U);
    EXPECT_EQ(plan.failed[0].identifier, "com.gone");
    EXPECT_THAT(plan.failed[0].error, HasSubstr("folder"));
}

TEST_F(ChosenPlan, WhatCannotBeReadMattersWhereAPackageIsLacking) {
    library.faults.push_back({"broken.zip", "no package"});
    EXPECT_THAT(planOf({"com.b"}).failed, IsEmpty());
    EXPECT_EQ(planOf({"com.b", "com.gone"}).failed.size(), 2U);
    EXPECT_EQ(planOf({}).failed.size(), 1U);
}

TEST_F(ChosenPlan, SaysWhatIsADowngradeAndWhatIsLost) {
    install("com.a", "10");
    install("com.b", "1.9");
    PlanOptions options;
    options.remove = {"com.b"};
    const SyncPlan plan = makePlan(library, present, options);
    const std::string text = planText(plan, {});
    EXPECT_THAT(text, HasSubstr("update   com.a 10 -> 2 (100 bytes; a downgrade)\n"));
    EXPECT_THAT(text, HasSubstr("\n1 removal, 1 downgrade\n"));
    EXPECT_THAT(jsonText(plan, {}, JsonLayout::Indented), HasSubstr("\"downgrade\": true"));
}

TEST_F(ChosenPlan, AnUpdateIsNoDowngrade) {
    install("com.a", "1.10");
    const SyncPlan plan = planOf({});
    EXPECT_THAT(planText(plan, {}), Not(HasSubstr("downgrade")));
    EXPECT_THAT(jsonText(plan, {}, JsonLayout::Indented), HasSubstr("\"downgrade\": false"));
}

TEST_F(ChosenPlan, JsonHasTheVersionTheFileAndTheSizesOfEachPackage) {
    install("com.a", "1");
    EXPECT_THAT(jsonText(planOf({"com.a"}), {}, JsonLayout::EventLine),
                HasSubstr(R"("packages":[{"identifier":"com.a","version":"2",)"
                          R"("file":"folder/com.a.zip","bytes":100,"unpackedBytes":300}])"));
}

TEST_F(ChosenPlan, APackageThatHasArrivedTravelsNoMore) {
    SyncPlan plan = planOf({"com.a"});
    plan.install[0].hasArrived = true;
    EXPECT_THAT(jsonText(plan, {}, JsonLayout::EventLine),
                HasSubstr(R"("file":null,"bytes":0,"unpackedBytes":300})"));
}

}  // namespace
}  // namespace appsync
