#include "host/console/Text.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <ctime>
#include <sstream>

#include "host/console/Console.h"
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
    EXPECT_EQ(fitted("abcdef", 4, "~"), "abc~");
    EXPECT_EQ(fitted("\u00fc\u00fc\u00fc", 2, "~"), "\u00fc~");
    EXPECT_EQ(fitted("abc", 0), "");
}

TEST(DisplayWidth, IsTheColumnsOfATerminal) {
    EXPECT_EQ(displayWidth("abc"), 3U);
    EXPECT_EQ(displayWidth("Gr\u00fc\u00dfe"), 5U);
    EXPECT_EQ(displayWidth("\u65e5\u672c\u8a9e"), 6U);
    EXPECT_EQ(displayWidth("\uff21"), 2U);
    EXPECT_EQ(displayWidth("\U0001F680"), 2U);
    EXPECT_EQ(displayWidth("e\u0301"), 1U);
    EXPECT_EQ(displayWidth(""), 0U);
}

TEST(Fitted, CutsWideCharactersWhole) {
    EXPECT_EQ(fitted("\u65e5\u672c\u8a9e", 8), "\u65e5\u672c\u8a9e  ");
    EXPECT_EQ(fitted("\u65e5\u672c\u8a9e", 5, "~"), "\u65e5\u672c~");
    EXPECT_EQ(fitted("\u65e5\u672c\u8a9e", 4, "~"), "\u65e5~ ");
    EXPECT_EQ(fittedAtFront("\u65e5\u672c\u8a9e", 4, "~"), "~\u8a9e ");
    EXPECT_EQ(fitted("\u65e5", 1, "~"), "~");
}

TEST(Fitted, LeavesAccentsOnTheirLetters) {
    EXPECT_EQ(beginOf("ae\u0301b", 2), "ae\u0301");
    EXPECT_EQ(endOf("ae\u0301b", 1), "b");
    EXPECT_EQ(endOf("ae\u0301b", 2), "e\u0301b");
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
    EXPECT_EQ(printable("\xe0\x80\x9b"), "???");       // longer than it need be
    EXPECT_EQ(printable("\xed\xa0\x80"), "???");       // half of a pair
    EXPECT_EQ(printable("\xf4\x90\x80\x80"), "????");  // behind the last one
}

class FittedTable : public testing::Test {
  protected:
    std::string shownIn(std::size_t width, std::string_view cutMark = "~") {
        const Console console{out, out, true, width, {}, cutMark};
        return table.textFor(console);
    }

    std::ostringstream out;
    Table table{{"ID", "B", "C"}};
};

TEST_F(FittedTable, CutsTheWidestColumns) {
    table.add({std::string(300, 'x'), "y", std::string(20, 'z')});
    EXPECT_EQ(shownIn(21), "ID        B  C\nxxxxxxx~  y  zzzzzzz~\n");
    EXPECT_EQ(shownIn(25, "..."), "ID          B  C\nxxxxxxx...  y  zzzzzzz...\n");
}

TEST_F(FittedTable, KeepsTheEndsOfAColumnWhereThatIsSaid) {
    table = Table({"IDENTIFIER", "B", "C"});
    table.keepEndsOf(0);
    table.keepEndsOf(2);
    table.add({"com.example.app00", "y", "abcdefghij"});
    table.add({"a", "y", "z"});
    EXPECT_EQ(shownIn(21), "IDENTIF~  B  C\n~e.app00  y  ~defghij\na         y  z\n");
}

TEST_F(FittedTable, LeavesOutColumnsBeforeNothingOfThemCanBeRead) {
    table.add({"com.example.app00", "1.0.123456", "abcdefgh"});
    EXPECT_EQ(shownIn(28), "ID        B         C\ncom.exa~  1.0.123~  abcdefgh\n");
    EXPECT_EQ(shownIn(27), "ID               B\ncom.example.ap~  1.0.123456\n");
    table.spare({1});
    EXPECT_EQ(shownIn(20), "ID          C\ncom.examp~  abcdefgh\n");
}

TEST_F(FittedTable, NoTerminalIsTooNarrow) {
    table.add({"com.example.app00", "1.0.1234", "\u00fcbergr\u00f6\u00dfe"});
    for (std::size_t width = 1; width < 50; ++width) {
        for (const std::string_view mark : {"...", "\u2026"}) {
            std::istringstream lines(shownIn(width, mark));
            for (std::string line; std::getline(lines, line);) {
                EXPECT_LE(displayWidth(line), width) << line;
            }
        }
    }
}

TEST_F(FittedTable, IsWholeWhereNoTerminalIs) {
    table.add({std::string(300, 'x'), "y", "z"});
    const Console pipe{out, out, false, 20};
    EXPECT_EQ(table.textFor(pipe), table.text());
    EXPECT_NE(table.text().find(std::string(300, 'x')), std::string::npos);
}

TEST(FormatDuration, IsInMinutesAndSeconds) {
    EXPECT_EQ(formatDuration(std::chrono::seconds(5)), "0:05");
    EXPECT_EQ(formatDuration(std::chrono::seconds(7265)), "121:05");
}

TEST(Wrapped, BreaksBetweenWordsAndIndentsWhatFollows) {
    EXPECT_EQ(wrapped("label:  one two three", 14, 8), "label:  one\n        two\n        three");
    EXPECT_EQ(wrapped("one two", 7, 2), "one two");
    EXPECT_EQ(wrapped("one two", 0, 2), "one two");
}

TEST(Wrapped, BreaksAWordThatIsTooLong) {
    EXPECT_EQ(wrapped("name:  abcdefghijklmno", 9, 2), "name:\n  abcdefg\n  hijklmn\n  o");
    EXPECT_EQ(wrapped("\u00e4\u00f6\u00fc", 2, 5), "\u00e4\u00f6\n\u00fc");
}

TEST(Wrapped, ACharacterThatIsTooWideStandsAlone) {
    EXPECT_EQ(wrapped("\u65e5\u672c", 1, 0), "\u65e5\n\u672c");
    EXPECT_EQ(wrapped("\u65e5\u672c\u8a9e", 5, 0), "\u65e5\u672c\n\u8a9e");
}

TEST(Text, TheEndOfATextIsCountedInColumns) {
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
