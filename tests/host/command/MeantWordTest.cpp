#include "host/command/MeantWord.h"

#include <gtest/gtest.h>

namespace appsync {
namespace {

const std::vector<std::string> kKnown = {"sync", "set", "send", "stage", "status", "uninstall"};

TEST(MeantWord, IsTheOneWithFewSlips) {
    for (const char* typed : {"snyc", "syn", "synk", "Sync", "ync", "ssync"}) {
        EXPECT_EQ(meantWord(typed, kKnown), "sync") << typed;
    }
    EXPECT_EQ(meantWord("stats", kKnown), "status");
    EXPECT_EQ(meantWord("unistall", kKnown), "uninstall");
}

TEST(MeantWord, IsTheOneThatBeginsSo) {
    EXPECT_EQ(meantWord("unin", kKnown), "uninstall");
    EXPECT_EQ(meantWord("sta", kKnown), "") << "two begin so";
}

TEST(MeantWord, IsNoneWhereNoneIsClose) {
    for (const char* typed : {"", "x", "ab", "dance", "remove", "syncsync"}) {
        EXPECT_EQ(meantWord(typed, kKnown), "") << typed;
    }
    EXPECT_EQ(meantWord("sed", kKnown), "") << "set and send are as close";
    EXPECT_EQ(meantWord(std::string(1'000'000, 's'), kKnown), "");
}

}  // namespace
}  // namespace appsync
