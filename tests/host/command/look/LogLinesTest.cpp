#include "host/command/look/LogLines.h"

#include <gtest/gtest.h>

#include <sstream>

#include "host/console/Console.h"

namespace appsync {
namespace {

class LogLinesTest : public testing::Test {
  protected:
    static std::string line(const std::string& message) {
        return R"({"time":"T","category":8,"level":"info","message":")" + message + "\"}\n";
    }

    std::ostringstream out;
    std::ostringstream err;
    Console console{out, err, false, 80};
    LogArguments arguments;
};

TEST_F(LogLinesTest, KeepsOnlyTheLastUntilTheyAreAskedFor) {
    arguments.last = 2;
    LogLines lines(arguments, console);
    lines.add(line("one") + line("two") + line("three"));
    EXPECT_EQ(out.str(), "");
    lines.showLast();
    EXPECT_EQ(out.str(), "T info    8  two\nT info    8  three\n");
    out.str("");
    lines.add(line("four"));
    EXPECT_EQ(out.str(), "T info    8  four\n");
}

TEST_F(LogLinesTest, ALineThatWasBegunInAnotherFileIsDropped) {
    LogLines lines(arguments, console);
    lines.add(line("one") + "{\"message\":\"begu");
    lines.beginFile("next");
    lines.add(line("two"));
    EXPECT_EQ(out.str(), "T info    8  one\nT info    8  two\n");
}

}  // namespace
}  // namespace appsync
