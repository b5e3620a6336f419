#include "host/output/LogRecord.h"

#include <gtest/gtest.h>

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

TEST(LogRecordFilter, FindsATextWhateverItsCase) {
    const LogRecord record{"", "info", "Install of com.a Failed", 8};
    EXPECT_TRUE(isWanted(record, {.text = "of COM.A fail"}));
    EXPECT_TRUE(isWanted(record, {.text = ""}));
    EXPECT_FALSE(isWanted(record, {.text = "failed."}));
}

TEST(LogRecordFilter, TakesALevelAndThoseAbove) {
    const LogRecord record{"", "error", "", std::nullopt};
    EXPECT_TRUE(isWanted(record, {.level = LogLevel::Info}));
    EXPECT_TRUE(isWanted(record, {.level = LogLevel::Error}));
    EXPECT_FALSE(isWanted(record, {.level = LogLevel::Fault}));
}

TEST(LogRecordFilter, KnowsTheNamesOfLevels) {
    EXPECT_EQ(levelNamed("fault"), LogLevel::Fault);
    EXPECT_EQ(levelNamed("faults"), std::nullopt);
}

}  // namespace
}  // namespace appsync
