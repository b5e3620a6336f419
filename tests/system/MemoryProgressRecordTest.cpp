#include "system/MemoryProgressRecord.h"

#include <gmock/gmock.h>

namespace appsync {
namespace {

class MemoryProgressRecordTest : public ::testing::Test {
  protected:
    int changes_ = 0;
    MemoryProgressRecord record_{"com.example.a", [this] { ++changes_; }};
};

TEST_F(MemoryProgressRecordTest, BeginsWaitingAndLoading) {
    EXPECT_EQ(record_.installState(), std::uint64_t{kInstallStateWaiting});
    EXPECT_EQ(record_.installPhase(), std::uint64_t{kInstallPhaseLoading});
    EXPECT_EQ(record_.completedUnitCount(), 0);
}

TEST_F(MemoryProgressRecordTest, TellsOfItsStateAndOfNothingElse) {
    record_.setInstallPhase(kInstallPhaseInstalling);
    record_.setTotalUnitCount(1000);
    record_.setCompletedUnitCount(7);
    EXPECT_EQ(changes_, 0);
    record_.setInstallState(kInstallStatePaused);
    EXPECT_EQ(changes_, 1);
    EXPECT_EQ(record_.description(), "com.example.a state=2 phase=1 7/1000");
}

TEST_F(MemoryProgressRecordTest, MayBeCancelledAndGoOn) {
    record_.cancel();
    EXPECT_EQ(record_.installState(), std::uint64_t{kInstallStateCanceled});
    record_.setInstallState(kInstallStateActive);
    EXPECT_EQ(record_.installState(), std::uint64_t{kInstallStateActive});
}

TEST_F(MemoryProgressRecordTest, ChangesNothingOnceItIsOver) {
    record_.end(kInstallStateFinished);
    record_.end(kInstallStateFailed);
    record_.setInstallState(kInstallStateActive);
    record_.setInstallPhase(kInstallPhaseInstalling);
    record_.setTotalUnitCount(1000);
    record_.setCompletedUnitCount(7);
    record_.cancel();
    EXPECT_EQ(record_.description(), "com.example.a state=5 phase=0 0/0");
    EXPECT_EQ(changes_, 0);
}

}  // namespace
}  // namespace appsync
