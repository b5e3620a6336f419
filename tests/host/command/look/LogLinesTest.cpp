#include "host/command/look/LogLines.h"

#include <gtest/gtest.h>

#include <sstream>

#include "host/console/Console.h"

namespace appsync {
namespace {

TEST(NamesApplication, WhereTheIdentifierStandsByItself) {
    for (const char* text :
         {"com.a", "com.a.", "me|com.a", "com.a is here", "(com.a)", "/x/com.a.zip",
          "/x/com.a.app/Info.plist", "/x/com.a.zip.", "com.a.b and com.a", "com.a: x"}) {
        EXPECT_TRUE(namesApplication(text, "com.a")) << text;
    }
}

TEST(NamesApplication, NotWhereItIsAPartOfAnother) {
    for (const char* text : {"", "com.a.b", "xcom.a", "org.com.a", "com.ab", "com.a-b", "com.a_b",
                             "com.a.zipper", "com.a.application", "com.A"}) {
        EXPECT_FALSE(namesApplication(text, "com.a")) << text;
    }
}

TEST(NamesApplication, WhoseNameEndsLikeAFile) {
    EXPECT_TRUE(namesApplication("x/com.app.zip.zip", "com.app.zip"));
    EXPECT_TRUE(namesApplication("com.app is here", "com.app"));
    EXPECT_FALSE(namesApplication("com.app.app2", "com.app"));
}

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
