#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/suites/Applications.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class InstallProgressContract : public DeviceContract {
  protected:
    /// Of an install that has just begun.
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> progressOfAPlaceholder() {
        EXPECT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
        return progress(kA);
    }
};

APPSYNC_CONTRACT_SUITE(InstallProgressContract, devicePorts());

TEST_P(InstallProgressContract, OnlyAnInstallUnderWayHasARecord) {
    checks("platform/AppRegistry.h", "null when no install is under way for it.");
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_EQ(progress(kA), nullptr);
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    EXPECT_NE(progress(kB), nullptr);
}

TEST_P(InstallProgressContract, AnInstallBeginsByLoading) {
    checks("platform/AppRegistry.h",
           "An install begins waiting (0) or active (1), in the phase loading (0), with nothing "
           "completed;");
    const auto record = progressOfAPlaceholder();
    ASSERT_NE(record, nullptr);
    EXPECT_LT(record->installState(), std::uint64_t{kInstallStatePaused});
    EXPECT_EQ(record->installPhase(), std::uint64_t{kInstallPhaseLoading});
    EXPECT_EQ(record->completedUnitCount(), 0);
}

TEST_P(InstallProgressContract, AChangeIsSeenByEverybodyAtOnce) {
    checks("platform/InstallProgressRecord.h",
           "Every call takes effect at once for everybody who looks.");
    const auto one = progressOfAPlaceholder();
    const auto other = progress(kA);
    ASSERT_NE(one, nullptr);
    one->setInstallState(kInstallStateActive);
    one->setInstallPhase(kInstallPhaseRestoringData);
    one->setTotalUnitCount(1000);
    one->setCompletedUnitCount(456);
    EXPECT_EQ(other->installState(), std::uint64_t{kInstallStateActive});
    EXPECT_EQ(other->installPhase(), std::uint64_t{kInstallPhaseRestoringData});
    EXPECT_EQ(other->totalUnitCount(), 1000);
    EXPECT_EQ(other->completedUnitCount(), 456);
}

TEST_P(InstallProgressContract, FinishingTheLoadingPhaseBeginsTheInstalling) {
    checks("platform/AppRegistry.h",
           "Ends the install phase that the record is in: loading is over, installing begins.");
    const auto record = progressOfAPlaceholder();
    ASSERT_NE(record, nullptr);
    registry_.finishInstallPhase(*record);
    EXPECT_EQ(record->installPhase(), std::uint64_t{kInstallPhaseInstalling});
}

TEST_P(InstallProgressContract, CancellingSaysSo) {
    checks("platform/InstallProgressRecord.h",
           "Cancels the install: its state becomes canceled (3).");
    const auto record = progressOfAPlaceholder();
    ASSERT_NE(record, nullptr);
    record->cancel();
    EXPECT_EQ(record->installState(), std::uint64_t{kInstallStateCanceled});
    EXPECT_TRUE(preferred(kA).value().state.placeholder);
}

TEST_P(InstallProgressContract, ARecordHasADescription) {
    checks("platform/InstallProgressRecord.h", "One line for a log.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const std::string description = progress(kA)->description();
    EXPECT_FALSE(description.empty());
    EXPECT_EQ(description.find('\n'), std::string::npos);
}

TEST_P(InstallProgressContract, ARecordWhoseInstallIsOverChangesNothingAnyMore) {
    checks("platform/InstallProgressRecord.h",
           "from then on the record keeps its values and changes nothing any more.");
    const auto record = progressOfAPlaceholder();
    ASSERT_NE(record, nullptr);
    record->setCompletedUnitCount(456);
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    const std::uint64_t state = record->installState();
    record->setCompletedUnitCount(789);
    record->setInstallState(kInstallStateActive);
    record->cancel();
    EXPECT_EQ(record->completedUnitCount(), 456);
    EXPECT_EQ(record->installState(), state);
}

TEST_P(InstallProgressContract, ANewInstallHasANewRecord) {
    checks("platform/AppRegistry.h",
           "An install begins waiting (0) or active (1), in the phase loading (0), with nothing "
           "completed;");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    progress(kA)->setCompletedUnitCount(456);
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    EXPECT_EQ(progress(kA)->completedUnitCount(), 0);
}

TEST_P(InstallProgressContract, ASecondPlaceholderBeginsItsInstallAnew) {
    checks("platform/AppRegistry.h",
           "a placeholder that stands already is replaced, and its install begins anew, with a new "
           "record.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto first = progress(kA);
    ASSERT_NE(first, nullptr);
    first->setCompletedUnitCount(456);
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    const auto second = progress(kA);
    ASSERT_NE(second, nullptr);
    EXPECT_EQ(second->completedUnitCount(), 0);
    first->setCompletedUnitCount(789);
    EXPECT_EQ(second->completedUnitCount(), 0);
}

TEST_P(InstallProgressContract, NoInstallIsUnderWayForADemotedApplication) {
    checks("platform/AppRegistry.h",
           "The placeholder of a demoted application (`InstallType` 7, 8) awaits no install.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeDowngrade));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeIntentionalDowngrade));
    EXPECT_EQ(progress(kA), nullptr);
    EXPECT_EQ(progress(kB), nullptr);
}

TEST_P(InstallProgressContract, InstallingThePackageEndsTheInstall) {
    checks("platform/InstallProgressRecord.h",
           "When the install ends, the state becomes finished (5), failed (4) or canceled (3);");
    const auto record = progressOfAPlaceholder();
    ASSERT_NE(record, nullptr);
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_EQ(progress(kA), nullptr);
    EXPECT_EQ(record->installState(), std::uint64_t{kInstallStateFinished});
}

}  // namespace

void linkInstallProgressContract() {}

}  // namespace appsync
