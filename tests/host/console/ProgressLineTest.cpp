#include "host/console/ProgressLine.h"

#include <gtest/gtest.h>

#include <sstream>

#include "host/console/Console.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;

class ProgressLineTest : public testing::Test {
  protected:
    void showAt(std::chrono::milliseconds time, const std::string& text) {
        now = ProgressLine::Clock::time_point(time);
        line.show([&] { return text; });
    }

    ProgressLine::Clock::time_point now{};
    std::ostringstream out;
    std::ostringstream err;
    Console terminal{out, err, true, 10};
    ProgressLine line{terminal, [this] { return now; }};
};

TEST_F(ProgressLineTest, SaysNothingOfWhatIsDoneSoon) {
    showAt(249ms, "soon");
    line.clear();
    EXPECT_EQ(out.str(), "");
}

TEST_F(ProgressLineTest, IsRedrawnNowAndThenAndGoes) {
    showAt(250ms, "one");
    showAt(349ms, "between");
    showAt(350ms, "two");
    EXPECT_EQ(out.str(), "\rone      \rtwo      ");
    line.clear();
    EXPECT_EQ(out.str(), "\rone      \rtwo      \r\x1b[K");
}

TEST_F(ProgressLineTest, StaysInItsLineWhateverTheText) {
    showAt(250ms, "longer than that\n");
    EXPECT_EQ(out.str(), "\rlonger...");
}

TEST_F(ProgressLineTest, SaysNothingWhereNoTerminalIs) {
    const Console file{out, err, false, 80};
    ProgressLine silent(file, [this] { return now; });
    now += 10s;
    silent.show([] { return std::string("never"); });
    EXPECT_EQ(out.str(), "");
}

}  // namespace
}  // namespace appsync
