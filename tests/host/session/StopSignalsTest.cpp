#include "host/session/StopSignals.h"

#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <chrono>
#include <future>

namespace appsync {
namespace {

constexpr std::chrono::hours kForEver{1};

TEST(StopSignals, AskForAStopOnlyWhenASignalComes) {
    const StopSignals signals(
        kForEver, [] { FAIL() << "stopping"; }, [] { FAIL() << "gave up"; });
    EXPECT_FALSE(signals.stopRequested());
}

TEST(StopSignals, GiveUpWhenTheSessionDoesNotEndInTime) {
    std::promise<void> gaveUp;
    const StopSignals signals(
        std::chrono::milliseconds(0), [] {}, [&] { gaveUp.set_value(); });
    ::kill(::getpid(), SIGTERM);
    gaveUp.get_future().wait();
    EXPECT_TRUE(signals.stopRequested());
}

TEST(StopSignals, GiveUpAtTheSecondSignal) {
    std::promise<void> gaveUp;
    const StopSignals signals(
        kForEver, [] {}, [&] { gaveUp.set_value(); });
    ::kill(::getpid(), SIGTERM);
    while (!signals.stopRequested()) std::this_thread::yield();
    ::kill(::getpid(), SIGTERM);
    gaveUp.get_future().wait();
    SUCCEED();
}

TEST(StopSignals, SayAtOnceThatTheSessionIsStopping) {
    std::promise<void> stopping;
    const StopSignals signals(
        kForEver, [&] { stopping.set_value(); }, [] { FAIL() << "gave up"; });
    ::kill(::getpid(), SIGTERM);
    stopping.get_future().wait();
    EXPECT_TRUE(signals.stopRequested());
}

}  // namespace
}  // namespace appsync
