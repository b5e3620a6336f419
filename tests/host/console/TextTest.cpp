#include "host/console/Text.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <ctime>

#include "host/console/Table.h"

namespace appsync {
namespace {

TEST(FormatBytes, UsesTheUnitThatReadsWell) {
    EXPECT_EQ(formatBytes(0), "0 bytes");
    EXPECT_EQ(formatBytes(1), "1 byte");
    EXPECT_EQ(formatBytes(1023), "1023 bytes");
    EXPECT_EQ(formatBytes(1536), "1.5 KiB");
    EXPECT_EQ(formatBytes(1024 * 1024 - 1), "1.0 MiB");
    EXPECT_EQ(formatBytes(UINT64_MAX), "16.0 EiB");
}

TEST(FormatTime, IsIso8601InUtc) {
    EXPECT_EQ(formatTime(std::chrono::system_clock::time_point{}), "1970-01-01T00:00:00Z");
}

TEST(Printable, KeepsTextOfAnyLanguage) {
    EXPECT_EQ(printable("Gr\u00fc\u00dfe \u65e5\u672c \U0001F680"),
              "Gr\u00fc\u00dfe \u65e5\u672c \U0001F680");
}

TEST(Printable, ReplacesControlCharactersAndBrokenSequences) {
    EXPECT_EQ(printable("a\x1b[2J\n"), "a?[2J?");
    EXPECT_EQ(printable("\xc2\x9b"), "?");  // a control character of eight bits
    EXPECT_EQ(printable("\xe6\x97"), "??");
    EXPECT_EQ(printable("\xff"
                        "a"),
              "?a");
}

TEST(Fitted, FillsUpOrCutsByCharacters) {
    EXPECT_EQ(fitted("ab", 4), "ab  ");
    EXPECT_EQ(fitted("abcdef", 4), "abc~");
    EXPECT_EQ(fitted("\u00fc\u00fc\u00fc", 2), "\u00fc~");
    EXPECT_EQ(fitted("abc", 0), "");
}

TEST(Table, MakesColumnsAsWideAsTheyMustBe) {
    Table table({"A", "B"});
    table.add({"long\n", "x"});
    EXPECT_EQ(table.text(), "A      B\nlong?  x\n");
}

TEST(Printable, ReplacesWhatReordersText) {
    for (const char* mark : {"\u200E", "\u200F", "\u202A", "\u202B", "\u202C", "\u202D", "\u202E",
                             "\u2066", "\u2067", "\u2068", "\u2069", "\u061C", "\u2028"}) {
        EXPECT_EQ(printable(std::string("a") + mark + "b"), "a?b");
    }
    EXPECT_EQ(printable("\u0645\u06CC\u200C\u062E"), "\u0645\u06CC\u200C\u062E");  // joins letters
}

TEST(Printable, ReplacesWhatIsNoCharacter) {
    EXPECT_EQ(printable("\xe0\x80\x9b"), "?");      // longer than it need be
    EXPECT_EQ(printable("\xed\xa0\x80"), "?");      // half of a pair
    EXPECT_EQ(printable("\xf4\x90\x80\x80"), "?");  // behind the last one
}

TEST(Table, CutsTheWidestColumnsWhereItMustFit) {
    Table table({"A", "B", "C"});
    table.add({std::string(300, 'x'), "y", std::string(20, 'z')});
    table.fitInto(17);
    EXPECT_EQ(table.text(), "A       B  C\nxxxxx~  y  zzzzz~\n");
    table.fitInto(1);
    EXPECT_EQ(table.text(), "A     B  C\nxxx~  y  zzz~\n") << "no cell is cut to nothing";
}

TEST(Table, KeepsTheEndsOfAColumnWhereThatIsSaid) {
    Table table({"ID", "B", "C"});
    table.keepEndsOf(0);
    table.keepEndsOf(2);
    table.add({"com.example.app00", "y", "abcdefgh"});
    table.add({"a", "y", "z"});
    table.fitInto(17);
    EXPECT_EQ(table.text(), "ID      B  C\n~app00  y  ~defgh\na       y  z\n");
}

TEST(Text, TheEndOfATextIsCountedInCharacters) {
    EXPECT_EQ(endOf("abc", 2), "bc");
    EXPECT_EQ(endOf("abc", 9), "abc");
    EXPECT_EQ(endOf("abc", 0), "");
    EXPECT_EQ(endOf("\xc3\xa4\xc3\xb6\xc3\xbc", 2), "\xc3\xb6\xc3\xbc");
}

TEST(Text, AWordForTheShellIsQuotedWhereItMustBe) {
    EXPECT_EQ(shellWord("../my-device/a_1.zip"), "../my-device/a_1.zip");
    EXPECT_EQ(shellWord("my device"), "'my device'");
    EXPECT_EQ(shellWord("it's"), "'it'\\''s'");
    EXPECT_EQ(shellWord("$HOME"), "'$HOME'");
    EXPECT_EQ(shellWord(""), "''");
    EXPECT_EQ(shellWord("a\nb"), "'a?b'");
}

class LocalTime : public testing::Test {
  protected:
    LocalTime() { setZone("XYZ-5:30"); }
    ~LocalTime() override { setZone(nullptr); }
    LocalTime(const LocalTime&) = delete;
    LocalTime& operator=(const LocalTime&) = delete;

    static void setZone(const char* zone) {
        if (zone != nullptr) {
            ::setenv("TZ", zone, 1);
        } else {
            ::unsetenv("TZ");
        }
        ::tzset();
    }
};

TEST_F(LocalTime, IsTheMachinesWithItsOffset) {
    const std::chrono::system_clock::time_point time{std::chrono::seconds{1'700'000'000}};
    EXPECT_EQ(formatTime(time), "2023-11-14T22:13:20Z");
    EXPECT_EQ(formatLocalTime(time), "2023-11-15 03:43:20 +0530");
    EXPECT_EQ(formatClock(time), "03:43:20 +0530");
}

TEST_F(LocalTime, OfWhatIsWrittenDownKeepsTheFraction) {
    EXPECT_EQ(localTimeOf("2023-11-14T22:13:20Z"), "2023-11-15 03:43:20 +0530");
    EXPECT_EQ(localTimeOf("2023-11-14T22:13:20.123456Z"), "2023-11-15 03:43:20.123456 +0530");
    for (const char* other : {"", "yesterday", "2023-11-14T22:13:20", "2023-11-14T22:13:20.Z",
                              "2023-11-14T22:13:20+01:00", "2023-99-14T22:13:20Z"}) {
        EXPECT_EQ(localTimeOf(other), other);
    }
    EXPECT_EQ(localTimeOf("\x1b[2J"), "?[2J");
}

}  // namespace
}  // namespace appsync
