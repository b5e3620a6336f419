#include "client/Paths.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(FormatPath, ReplacesEachPlaceHolderByTheNextPart) {
    EXPECT_EQ(formatPath("%s/%@.png", {"/icons", "com.example.a"}), "/icons/com.example.a.png");
    EXPECT_EQ(formatPath("%@/Info.plist", {"/a"}), "/a/Info.plist");
    EXPECT_EQ(formatPath("/fixed", {}), "/fixed");
}

TEST(FormatPath, LeavesPlaceHoldersInsideThePartsAlone) {
    EXPECT_EQ(formatPath("%s/%@", {"/%@", "%s"}), "/%@/%s");
}

TEST(FormatPath, LeavesNothingForAPartThatIsMissing) {
    EXPECT_EQ(formatPath("%s/%@", {"/a"}), "/a/");
    EXPECT_EQ(formatPath("%s", {"/a", "/b"}), "/a");
}

}  // namespace
}  // namespace appsync
