#include "host/session/SyncOutcome.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "host/plan/SyncPlan.h"
#include "host/watch/SessionFacts.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class SyncOutcome : public testing::Test {
  protected:
    void present(const char* identifier, const char* version) {
        ApplicationRecord record;
        record.identifier = identifier;
        record.version = version;
        record.type = "User";
        aftermath.present.push_back(record);
    }

    void planInstall(const char* identifier, const char* version) {
        plan.install.push_back({identifier, "", "", version, 0, 0});
    }

    SyncSummary summary() const { return summarize(plan, facts, aftermath); }

    SyncPlan plan;
    SessionFacts facts;
    SessionAftermath aftermath;
};

TEST_F(SyncOutcome, TellsInstalledUpdatedAndRemovedApart) {
    planInstall("com.a", "1");
    plan.update.push_back({"com.b", "", "1", "2", 0, 0});
    plan.remove = {"com.c"};
    facts.requested("com.a");
    facts.installed("com.a");
    facts.installed("com.b");
    facts.removed("com.c");
    present("com.a", "1");
    present("com.b", "2");
    EXPECT_THAT(summary().requested, ElementsAre("com.a"));
    EXPECT_THAT(summary().installed, ElementsAre("com.a"));
    EXPECT_THAT(summary().updated, ElementsAre("com.b"));
    EXPECT_THAT(summary().removed, ElementsAre("com.c"));
    EXPECT_FALSE(summary().incomplete);
}

TEST_F(SyncOutcome, SkipsWhatAnotherClientHasInHand) {
    planInstall("com.a", "1");
    facts.heldByClient("com.a", 7);
    EXPECT_THAT(summary().failed, IsEmpty());
    ASSERT_EQ(summary().skipped.size(), 1U);
    EXPECT_THAT(summary().skipped[0].why, HasSubstr("client 7"));
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, NamesWhatAnInterruptedSessionHadBrought) {
    facts.installed("com.a");
    present("com.a", "1");
    EXPECT_THAT(summary().installed, ElementsAre("com.a"));
    EXPECT_FALSE(summary().incomplete);
}

TEST_F(SyncOutcome, AnInterruptionCountsWhatTheDeviceHasDoneUnseen) {
    planInstall("com.a", "1");
    planInstall("com.b", "1");
    plan.update.push_back({"com.c", "", "1", "2", 0, 0});
    plan.update.push_back({"com.d", "", "1", "2", 0, 0});
    plan.remove = {"com.e", "com.f"};
    present("com.a", "1");
    present("com.c", "2");
    present("com.d", "1");
    present("com.f", "1");
    aftermath.isInterrupted = true;
    EXPECT_THAT(summary().installed, ElementsAre("com.a"));
    EXPECT_THAT(summary().updated, ElementsAre("com.c"));
    EXPECT_THAT(summary().removed, ElementsAre("com.e"));
    std::vector<std::string> open;
    for (const SyncFailure& each : summary().failed) open.push_back(each.identifier);
    EXPECT_THAT(open, ElementsAre("com.f", "com.b", "com.d"));
}

TEST_F(SyncOutcome, AStopThatComesWhenAllIsDoneLeavesNothingOpen) {
    planInstall("com.a", "1");
    present("com.a", "1");
    facts.reconciled();
    facts.installed("com.a");
    aftermath.isInterrupted = true;
    EXPECT_THAT(summary().installed, ElementsAre("com.a"));
    EXPECT_THAT(summary().failed, IsEmpty());
    EXPECT_FALSE(summary().incomplete);
    EXPECT_FALSE(summarizeInterrupted(plan, facts).incomplete);
}

TEST_F(SyncOutcome, AStopBeforeTheDeviceHasTakenTheSyncOverIsNamedEvenWhenNothingIsOpen) {
    aftermath.isInterrupted = true;
    ASSERT_EQ(summary().failed.size(), 1U);
    EXPECT_EQ(summary().failed[0].identifier, "session");
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, NamesTheFirstCauseOfWhatIsNotThere) {
    planInstall("com.a", "1");
    facts.failed("com.a", "the package is damaged");
    facts.failed("com.a", "something that followed from it");
    ASSERT_EQ(summary().failed.size(), 1U);
    EXPECT_EQ(summary().failed[0].error, "the package is damaged");
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, AFailureOnTheWayDoesNotCountWhenTheApplicationIsThere) {
    planInstall("com.a", "1");
    facts.failed("com.a", "the placeholder was refused");
    facts.installed("com.a");
    present("com.a", "1");
    EXPECT_THAT(summary().failed, IsEmpty());
    EXPECT_FALSE(summary().incomplete);
}

TEST_F(SyncOutcome, WhatTheDeviceDidNotAskForHasFailed) {
    planInstall("com.a", "1");
    ASSERT_EQ(summary().failed.size(), 1U);
    EXPECT_THAT(summary().failed[0].error, HasSubstr("did not ask"));
}

TEST_F(SyncOutcome, AnOlderVersionThatStayedIsNoUpdate) {
    plan.update.push_back({"com.b", "", "1", "2", 0, 0});
    present("com.b", "1");
    EXPECT_THAT(summary().updated, IsEmpty());
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, WhatPolicyForbidsIsSkippedAndMakesTheSessionIncomplete) {
    planInstall("com.a", "1");
    plan.remove = {"com.c"};
    present("com.c", "1");
    aftermath.installationAllowed = false;
    aftermath.removalAllowed = false;
    ASSERT_EQ(summary().skipped.size(), 2U);
    EXPECT_THAT(summary().skipped[0].why, HasSubstr("policy"));
    EXPECT_THAT(summary().failed, IsEmpty());
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, AnApplicationThatIsStillThereWasNotRemoved) {
    plan.remove = {"com.c"};
    present("com.c", "1");
    EXPECT_THAT(summary().removed, IsEmpty());
    ASSERT_EQ(summary().failed.size(), 1U);
    EXPECT_EQ(summary().failed[0].error, "it is still there: sync again, or see appsync log");
}

TEST_F(SyncOutcome, RemovalAndInstallOfOneIdentifierAreBothDone) {
    planInstall("com.a", "1");
    plan.remove = {"com.a"};
    facts.removed("com.a");
    facts.installed("com.a");
    present("com.a", "1");
    EXPECT_THAT(summary().removed, ElementsAre("com.a"));
    EXPECT_THAT(summary().installed, ElementsAre("com.a"));
    EXPECT_FALSE(summary().incomplete);
}

TEST_F(SyncOutcome, WhatIsDeliberatelyLeftAloneDoesNotMakeItIncomplete) {
    plan.skipped.push_back({"com.a", "it is not on the device", false});
    EXPECT_EQ(summary().skipped.size(), 1U);
    EXPECT_FALSE(summary().incomplete);
}

TEST_F(SyncOutcome, WhatIsAskedForAndCannotBeBroughtMakesItIncomplete) {
    plan.skipped.push_back({"com.a", "it is offloaded", true});
    EXPECT_EQ(summary().skipped.size(), 1U);
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, WhatCannotBeReadInTheLibraryHasFailed) {
    plan.failed.push_back({"broken.zip", "cut off"});
    EXPECT_EQ(summary().failed.size(), 1U);
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, AnInterruptionIsNamedForEachThatIsMissing) {
    planInstall("com.a", "1");
    aftermath.isInterrupted = true;
    ASSERT_EQ(summary().failed.size(), 1U);
    EXPECT_THAT(summary().failed[0].error, HasSubstr("run the same command again"));
}

TEST_F(SyncOutcome, AFailureOfTheWholeSessionIsNamedEvenWhenNothingWasPlanned) {
    aftermath.failure = "the database failed";
    ASSERT_EQ(summary().failed.size(), 1U);
    EXPECT_EQ(summary().failed[0].error, "the database failed");
    EXPECT_TRUE(summary().incomplete);
}

TEST_F(SyncOutcome, ARequestThatWasNotPlannedAndFailedIsNamedOnce) {
    plan.failed.push_back({"a/b", "it is not a legal identifier"});
    for (const char* identifier : {"a/b", "com.x", ""}) {
        facts.requested(identifier);
        facts.failed(identifier, "refused");
    }
    ASSERT_EQ(summary().failed.size(), 2U);
    EXPECT_EQ(summary().failed[1].identifier, "com.x");
}

TEST_F(SyncOutcome, AnInterruptionTellsWhatWasSeenToHappenWithoutTheDevice) {
    planInstall("com.a", "1");
    planInstall("com.b", "1");
    planInstall("com.c", "1");
    plan.remove = {"com.d"};
    facts.installed("com.a");
    facts.removed("com.d");
    facts.failed("com.b", "refused");
    facts.sent(12);
    const SyncSummary interrupted = summarizeInterrupted(plan, facts);
    EXPECT_THAT(interrupted.installed, ElementsAre("com.a"));
    EXPECT_THAT(interrupted.removed, ElementsAre("com.d"));
    ASSERT_EQ(interrupted.failed.size(), 2U);
    EXPECT_EQ(interrupted.failed[0].error, "refused");
    EXPECT_THAT(interrupted.failed[1].error, HasSubstr("interrupted: run the same command again"));
    EXPECT_EQ(interrupted.bytes, 12U);
    EXPECT_TRUE(interrupted.incomplete);
}

TEST_F(SyncOutcome, ADeviceThatCannotBeLookedAtAnyMoreIsNamedForEachThatIsOpen) {
    planInstall("com.a", "1");
    const SyncSummary failed =
        summarizeFailed(plan, facts, ErrorRecord::make("Device", 5, "the database is damaged"));
    ASSERT_EQ(failed.failed.size(), 2U);
    EXPECT_EQ(failed.failed[0].identifier, "com.a");
    EXPECT_EQ(failed.failed[0].error, "the database is damaged");
}

TEST_F(SyncOutcome, WhatWasInstalledAndThenUninstalledSaysSo) {
    planInstall("com.a", "1");
    facts.requested("com.a");
    facts.installed("com.a");
    ASSERT_EQ(summary().failed.size(), 1U);
    EXPECT_THAT(summary().failed[0].error, HasSubstr("uninstalled on the device meanwhile"));
}

TEST_F(SyncOutcome, WhatAPersonRemovedBeforeTheSyncCouldIsLeftAlone) {
    plan.remove = {"com.c"};
    facts.failed("com.c", "com.c is not installed");
    EXPECT_THAT(summary().failed, IsEmpty());
    ASSERT_EQ(summary().skipped.size(), 1U);
    EXPECT_THAT(summary().skipped[0].why, HasSubstr("uninstalled on the device meanwhile"));
    EXPECT_FALSE(summary().incomplete);
}

TEST_F(SyncOutcome, AnInterruptedRemovalIsNotTakenForDone) {
    plan.remove = {"com.c"};
    const SyncSummary interrupted = summarizeInterrupted(plan, facts);
    ASSERT_EQ(interrupted.failed.size(), 1U);
    EXPECT_THAT(interrupted.failed[0].error, HasSubstr("interrupted"));
}

TEST(SessionFacts, TheLastAnswerOfPolicyIsTheOneThatCounted) {
    SessionFacts facts;
    EXPECT_FALSE(facts.wasForbidden(PolicyFeature::AppInstallationAllowed));
    facts.policyAnswered(PolicyFeature::AppInstallationAllowed, PolicyAnswer::Yes);
    facts.policyAnswered(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    EXPECT_TRUE(facts.wasForbidden(PolicyFeature::AppInstallationAllowed));
    EXPECT_FALSE(facts.wasForbidden(PolicyFeature::AppRemovalAllowed));
    facts.policyAnswered(PolicyFeature::AppInstallationAllowed, PolicyAnswer::Unset);
    EXPECT_FALSE(facts.wasForbidden(PolicyFeature::AppInstallationAllowed));
}

}  // namespace
}  // namespace appsync
