#include "system/file/PosixError.h"

#include <cerrno>

#include <gtest/gtest.h>

namespace appsync {
namespace {

TEST(PosixErrorTest, NamesOperationPathAndReason) {
    const ErrorRecord error = posixError(ENOENT, "read", "/var/mobile/x");
    EXPECT_EQ(error.domain, kPosixErrorDomain);
    EXPECT_EQ(error.code, ENOENT);
    EXPECT_EQ(error.description(), "cannot read /var/mobile/x: No such file or directory");
}

TEST(PosixErrorTest, TellsTheReasonThatItWasGiven) {
    const ErrorRecord error = posixError(EINVAL, "read", "/pipe", "it is not a regular file");
    EXPECT_EQ(error.code, EINVAL);
    EXPECT_EQ(error.description(), "cannot read /pipe: it is not a regular file");
}

TEST(PosixErrorTest, NamesBothPaths) {
    const ErrorRecord error = posixErrorBetween(EEXIST, "move", "/a", "/b");
    EXPECT_EQ(error.code, EEXIST);
    EXPECT_EQ(error.description(), "cannot move /a to /b: File exists");
}

TEST(PosixErrorTest, AnUnknownCodeIsNamedByItsNumber) {
    EXPECT_EQ(posixReason(4711), "unknown error 4711");
}

TEST(PosixErrorTest, ControlCharactersOfAPathStayOnOneLine) {
    using std::string_view_literals::operator""sv;
    EXPECT_EQ(displayPath(""), "''");
    EXPECT_EQ(displayPath("/a\nb\x7f\0c"sv), "/a\\x0ab\\x7f\\x00c");
}

TEST(PosixErrorTest, AnEmptyPathIsQuoted) {
    EXPECT_EQ(posixError(ENOENT, "open", "").description(),
              "cannot open '': No such file or directory");
}

TEST(PosixErrorTest, LettersBeyondAsciiStayAsTheyAre) {
    EXPECT_EQ(displayPath("/\xC3\xBC"), "/\xC3\xBC");
}

TEST(PosixErrorTest, TheMiddleOfAVeryLongPathIsLeftOut) {
    const std::string shown = displayPath("/begin" + std::string(100'000, 'x') + "end");
    EXPECT_LT(shown.size(), 1100U);
    EXPECT_TRUE(shown.starts_with("/begin"));
    EXPECT_NE(shown.find("[...]"), std::string::npos);
    EXPECT_TRUE(shown.ends_with("end"));
}

}  // namespace
}  // namespace appsync
