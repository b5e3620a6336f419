#include "host/console/LiveLine.h"

#include <gtest/gtest.h>

#include <atomic>
#include <sstream>
#include <thread>

#include "host/console/Console.h"

namespace appsync {
namespace {

class LiveLineTest : public testing::Test {
  protected:
    std::ostringstream out;
    std::ostringstream err;
    Console terminal{out, err, true, 30};
};

TEST_F(LiveLineTest, SaysAtOnceWhatIsBeingDoneAndGoesAway) {
    LiveLine line(terminal);
    line.say("reading", 3, 9);
    line.clear();
    EXPECT_EQ(out.str().substr(0, 20), "\rreading, 3 of 9  0:");
    EXPECT_TRUE(out.str().ends_with("\r\x1b[K"));
    const std::string all = out.str();
    line.say("too late");
    line.clear();
    EXPECT_EQ(out.str(), all);
}

TEST_F(LiveLineTest, StaysInItsLineWhateverTheText) {
    LiveLine line(terminal);
    line.say("something that is longer than the line\n");
    line.clear();
    EXPECT_EQ(out.str().substr(0, 30), "\rsomething that is longer t...");
}

TEST_F(LiveLineTest, OnANarrowTerminalTheCountIsWhatStays) {
    LiveLine line(terminal);
    line.say("asking the device again", 790, 1000);
    line.clear();
    EXPECT_EQ(out.str().substr(0, 20), "\rasking 790 of 1000 ");
    EXPECT_EQ(workWithin("asking, 790 of 1000", 12), "790 of 1000");
    EXPECT_EQ(workWithin("asking the device", 12), "asking the device");
}

TEST_F(LiveLineTest, IsNotThereWhereNothingWasSaid) {
    LiveLine(terminal).clear();
    EXPECT_EQ(out.str(), "");
}

TEST_F(LiveLineTest, SaysNothingToATerminalThatTakesNothing) {
    terminal.hasRoom = [] { return false; };
    LiveLine line(terminal);
    line.say("never");
    line.clear();
    EXPECT_EQ(out.str(), "");
}

TEST_F(LiveLineTest, SaysNothingWhereNoTerminalIs) {
    const Console file{out, err, false, 80};
    LiveLine line(file);
    line.say("never");
    line.clear();
    EXPECT_EQ(out.str(), "");
}

/// Counts how often something is flushed to it.
class CountedBuffer : public std::stringbuf {
  public:
    [[nodiscard]] int flushes() const { return flushes_; }

  private:
    int sync() override {
        ++flushes_;
        return 0;
    }
    std::atomic<int> flushes_ = 0;
};

TEST_F(LiveLineTest, TellsThatTimeGoesBy) {
    CountedBuffer buffer;
    std::ostream stream(&buffer);
    const Console console{stream, err, true, 80};
    LiveLine line(console);
    line.say("waiting");
    // Once by the call, and then by a thread of its own.
    while (buffer.flushes() < 3) std::this_thread::yield();
}

}  // namespace
}  // namespace appsync
