#include "host/output/FailureText.h"

#include <gtest/gtest.h>

#include "platform/Error.h"

namespace appsync {
namespace {

std::string told(const std::string& description) {
    return failureText("com.a", ErrorRecord::make("domain", 1, description));
}

TEST(FailureText, LeavesThePathOutThatThePackageHadOnTheDevice) {
    EXPECT_EQ(told("package '/var/mobile/com.a.zip': entry 'com.a.zip': damaged; make it again"),
              "its package: entry 'com.a.zip': damaged; make it again");
    EXPECT_EQ(told("cannot open /var/mobile/com.a.zip: No such file"),
              "cannot open its package: No such file");
    EXPECT_EQ(told("cannot move '/tmp/com.a.zip' over '/var/com.a.zip'"),
              "cannot move its package over its package");
}

TEST(FailureText, KeepsEveryOtherPath) {
    for (const char* text :
         {"a file is damaged", "cannot open '/var/com.b.zip'", "cannot open '/var/com.a.zip.part'",
          "cannot open '/var/xcom.a.zip'", "'lib/com.a.zip' is damaged", "/com.a.zi", ""}) {
        EXPECT_EQ(told(text), text);
    }
}

}  // namespace
}  // namespace appsync
