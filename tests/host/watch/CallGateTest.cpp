#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "host/watch/WatchedCoordination.h"

namespace appsync {
namespace {

TEST(CallGateTest, LetsNobodyInOnceItIsClosed) {
    CallGate gate;
    EXPECT_TRUE(gate.enter());
    gate.leave();
    gate.close();
    EXPECT_FALSE(gate.enter());
    gate.close();
}

TEST(CallGateTest, ClosesWhenTheLastOneHasLeft) {
    CallGate gate;
    ASSERT_TRUE(gate.enter());
    std::atomic<bool> isClosed = false;
    std::thread closer([&] {
        gate.close();
        isClosed = true;
    });
    while (gate.enter()) gate.leave();  // until the other thread has begun to close it
    EXPECT_FALSE(isClosed);
    gate.leave();
    closer.join();
    EXPECT_TRUE(isClosed);
}

}  // namespace
}  // namespace appsync
