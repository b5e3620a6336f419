#include "platform/LogRendering.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <initializer_list>
#include <limits>
#include <string>
#include <string_view>

#include "platform/Error.h"
#include "platform/LogFacility.h"
#include "platform/PropertyList.h"

namespace appsync {
namespace {

std::string render(std::string_view format, std::initializer_list<LogArgument> arguments) {
    return renderLogMessage({LogCategory::Coordination,
                             LogLevel::Default,
                             format,
                             {arguments.begin(), arguments.size()}});
}

LogArgument signedInteger(std::int64_t value) { return value; }
LogArgument unsignedInteger(std::uint64_t value) { return value; }
LogArgument text(std::string_view value) { return value; }

TEST(LogRenderingTest, FillsStringsAndObjectsInOrder) {
    EXPECT_EQ(render("%s|Changing %{public}@ from %{public}@ to %{public}@",
                     {text("com.korvu.apps"), text("a.b"), text("install"), text("SENT")}),
              "com.korvu.apps|Changing a.b from install to SENT");
}

TEST(LogRenderingTest, RendersIntegersOfEveryWidth) {
    EXPECT_EQ(render("%d %ld %lld", {signedInteger(-1), signedInteger(2),
                                     signedInteger(std::numeric_limits<std::int64_t>::min())}),
              "-1 2 -9223372036854775808");
    EXPECT_EQ(render("%u %lu %llu", {unsignedInteger(1), unsignedInteger(2),
                                     unsignedInteger(std::numeric_limits<std::uint64_t>::max())}),
              "1 2 18446744073709551615");
}

TEST(LogRenderingTest, AnIntegerOfTheOtherSignednessKeepsItsValue) {
    EXPECT_EQ(render("%lu %d", {signedInteger(7), unsignedInteger(8)}), "7 8");
    EXPECT_EQ(render("%lld", {unsignedInteger(std::numeric_limits<std::uint64_t>::max())}),
              "18446744073709551615");
}

TEST(LogRenderingTest, RendersRealsAndCharactersAsInC) {
    EXPECT_EQ(render("%f %lf %.2f %c", {0.5, 1.25, 0.126, signedInteger('y')}),
              "0.500000 1.250000 0.13 y");
}

TEST(LogRenderingTest, KeepsFlagsWidthAndPrecision) {
    EXPECT_EQ(
        render("[%5d|%-5d|%05u]", {signedInteger(42), signedInteger(42), unsignedInteger(42)}),
        "[   42|42   |00042]");
}

TEST(LogRenderingTest, AMissingObjectIsNull) {
    const PropertyList* list = nullptr;
    const ErrorRecord* error = nullptr;
    EXPECT_EQ(render("%{public}@ %{public}@ %{public}@ %s", {nullptr, list, error, nullptr}),
              "(null) (null) (null) (null)");
}

TEST(LogRenderingTest, APerCentSignStandsForItself) {
    EXPECT_EQ(render("%d%% of %@", {signedInteger(5), text("x")}), "5% of x");
    EXPECT_EQ(render("100%", {}), "100%");
}

TEST(LogRenderingTest, APlaceholderWithoutArgumentStays) {
    EXPECT_EQ(render("%s and %{public}@ and %k", {text("one")}), "one and %{public}@ and %k");
    EXPECT_EQ(render("%{public", {text("one")}), "%{public");
}

TEST(LogRenderingTest, AnArgumentOfAnotherKindIsRenderedAsItIs) {
    EXPECT_EQ(render("%d %{public}@", {text("text"), signedInteger(3)}), "text 3");
}

TEST(LogRenderingTest, ArgumentsAreNotFormats) {
    EXPECT_EQ(render("%s|%{public}@", {text("%d%s%n"), text("%@")}), "%d%s%n|%@");
}

TEST(LogRenderingTest, DescribesContainersOnOneLine) {
    const PropertyList value = PropertyList::map(
        {{"identifier", "com.example.a"}, {"parts", PropertyList::array({1, 2U, "c"})}});
    EXPECT_EQ(describe(value), "{identifier = com.example.a; parts = (1, 2, c);}");
    EXPECT_EQ(describe(PropertyList::map()), "{}");
    EXPECT_EQ(describe(PropertyList::array()), "()");
}

TEST(LogRenderingTest, DescribesEveryScalar) {
    EXPECT_EQ(describe(true), "1");
    EXPECT_EQ(describe(false), "0");
    EXPECT_EQ(describe(0.25), "0.25");
    EXPECT_EQ(describe(Bytes(12)), "<12 bytes>");
    EXPECT_EQ(describe(PropertyList()), "(null)");
    EXPECT_EQ(describe(PropertyList::Date{86400.5}), "2001-01-02 00:00:00 +0000");
    EXPECT_EQ(describe(PropertyList::Date{-1}), "2000-12-31 23:59:59 +0000");
    EXPECT_EQ(describe(PropertyList::Date{1e300}), "1e+300 s since 2001-01-01 00:00:00 +0000");
}

TEST(LogRenderingTest, DescribesErrors) {
    EXPECT_EQ(describe(ErrorRecord::make(kPosixErrorDomain, 2, "no such file")),
              "Error Domain=POSIX Code=2 \"no such file\"");
    EXPECT_EQ(describe(ErrorRecord{"TRError", 30, {}}), "Error Domain=TRError Code=30 \"(null)\"");
}

TEST(LogRenderingTest, CutsWhatIsTooLongAndSaysHowMuch) {
    EXPECT_EQ(describe("0123456789", 4), "0123… (6 more bytes)");
    EXPECT_EQ(describe("0123", 4), "0123");
    EXPECT_EQ(describe(PropertyList::array({"ab", "cd"}), 5), "(ab, … (3 more bytes)");
}

TEST(LogRenderingTest, NeverCutsInsideACharacter) {
    EXPECT_EQ(describe("abé", 3), "ab… (2 more bytes)");
    EXPECT_EQ(describe("é€x", 5), "é€… (1 more bytes)");
    EXPECT_EQ(describe("😀", 3), "… (4 more bytes)");
    EXPECT_EQ(describe("\x80\x80\x80\x80\x80", 4), "\x80\x80\x80\x80… (1 more bytes)");
}

TEST(LogRenderingTest, CutsEachArgumentOfAMessage) {
    const std::string longText(kLogArgumentLimit + 7, 'x');
    const std::string expected = std::string(kLogArgumentLimit, 'x') + "… (7 more bytes)|end";
    EXPECT_EQ(render("%{public}@|%s", {text(longText), text("end")}), expected);
}

TEST(LogRenderingTest, RendersIntegersInEachNotation) {
    EXPECT_EQ(render("%x %X %i", {unsignedInteger(255), signedInteger(255), signedInteger(-7)}),
              "ff FF -7");
    EXPECT_EQ(render("%04x %f %.1f", {unsignedInteger(10), signedInteger(3), unsignedInteger(4)}),
              "000a 3.000000 4.0");
}

TEST(LogRenderingTest, ARealWhereNoneIsAskedForIsRenderedAsItIs) {
    EXPECT_EQ(render("%d %{public}@ %s", {0.5, 1.25, -2.0}), "0.5 1.25 -2");
}

TEST(LogRenderingTest, RendersListsAndErrorsAmongTheArguments) {
    const PropertyList list = PropertyList::array({1});
    const ErrorRecord error{"TRError", 30, {}};
    EXPECT_EQ(render("%{public}@ %s", {&list, &error}),
              "(1) Error Domain=TRError Code=30 \"(null)\"");
}

TEST(LogRenderingTest, AFormatThatEndsInAPlaceholderIsRenderedAsItIs) {
    EXPECT_EQ(render("%", {text("one")}), "%");
    EXPECT_EQ(render("%5", {text("one")}), "%5");
    EXPECT_EQ(render("%ll", {text("one")}), "%ll");
    EXPECT_EQ(render("%k %s", {text("one")}), "%k one");
    EXPECT_EQ(render("%{public}", {text("one")}), "%{public}");
}

TEST(LogRenderingTest, AWideNumberIsCut) {
    EXPECT_EQ(render("%600d", {signedInteger(1)}), std::string(511, ' '));
}

TEST(LogRenderingTest, DescribesDatesFarAway) {
    EXPECT_EQ(describe(PropertyList::Date{-2.9e11}), "-7189-04-08 12:26:40 +0000");
    EXPECT_EQ(describe(PropertyList::Date{3e11}), "3e+11 s since 2001-01-01 00:00:00 +0000");
    EXPECT_EQ(describe(PropertyList::Date{-1e300}), "-1e+300 s since 2001-01-01 00:00:00 +0000");
    EXPECT_EQ(describe(PropertyList::Date{3661}), "2001-01-01 01:01:01 +0000");
}

TEST(LogRenderingTest, DescribesMapsOfSeveralEntries) {
    EXPECT_EQ(describe(PropertyList::map({{"a", 1}, {"b", -2}, {"c", UINT64_MAX}})),
              "{a = 1; b = -2; c = 18446744073709551615;}");
}

TEST(LogRenderingTest, CutsWhatBeginsInsideACharacter) {
    EXPECT_EQ(describe("\x80\x80\x80", 2), "\x80\x80… (1 more bytes)");
    EXPECT_EQ(describe("\x80", 0), "… (1 more bytes)");
}

TEST(LogRenderingTest, KeepsCharactersThatEndAtTheCut) {
    EXPECT_EQ(describe("éx", 2), "é… (1 more bytes)");
    EXPECT_EQ(describe("€x", 3), "€… (1 more bytes)");
    EXPECT_EQ(describe("😀x", 4), "😀… (1 more bytes)");
    EXPECT_EQ(describe("€", 1), "… (3 more bytes)");
    EXPECT_EQ(describe("€", 2), "… (3 more bytes)");
    EXPECT_EQ(describe("a😀", 2), "a… (4 more bytes)");
    // The first of the leading bytes of three, and of two.
    EXPECT_EQ(describe("\xE0\xA4\x85", 2), "… (3 more bytes)");
    EXPECT_EQ(describe("\xC0\x80", 1), "… (2 more bytes)");
}

}  // namespace
}  // namespace appsync
