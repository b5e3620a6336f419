#include "platform/Error.h"

#include <gtest/gtest.h>

#include "platform/Result.h"

namespace appsync {
namespace {

TEST(ErrorRecord, IsDescribedByItsSentence) {
    EXPECT_EQ(ErrorRecord::make("POSIX", 2, "no such file").description(), "no such file");
}

TEST(ErrorRecord, IsDescribedByItsDomainAndCodeWhereItHasNoSentence) {
    EXPECT_EQ((ErrorRecord{"POSIX", -2, {}}).description(), "POSIX error -2");
    const PropertyList other = PropertyList::map({{"description", 7}});
    EXPECT_EQ((ErrorRecord{"POSIX", 2, other}).description(), "POSIX error 2");
}

TEST(ErrorRecord, IsGivenContextBeforeItsSentence) {
    const ErrorRecord error = ErrorRecord::make("POSIX", 2, "no such file").withContext("/a");
    EXPECT_EQ(error, ErrorRecord::make("POSIX", 2, "/a: no such file"));
    EXPECT_EQ(error.withContext("read").description(), "read: /a: no such file");
}

TEST(ErrorRecord, IsGivenContextWhereItHasNoSentence) {
    EXPECT_EQ((ErrorRecord{"POSIX", 2, {}}).withContext("/a").description(), "/a: POSIX error 2");
}

TEST(ErrorRecord, KeepsWhatElseItTellsWhenItIsGivenContext) {
    const ErrorRecord error{"POSIX", 2, PropertyList::map({{"path", "/a"}})};
    EXPECT_EQ(*error.withContext("read").userInfo.findString("path"), "/a");
}

TEST(ErrorRecord, EqualsOneThatAgreesInEverything) {
    const ErrorRecord error = ErrorRecord::make("POSIX", 2, "no such file");
    EXPECT_EQ(error, ErrorRecord::make("POSIX", 2, "no such file"));
    EXPECT_NE(error, ErrorRecord::make("TRError", 2, "no such file"));
    EXPECT_NE(error, ErrorRecord::make("POSIX", 3, "no such file"));
    EXPECT_NE(error, ErrorRecord::make("POSIX", 2, "no such directory"));
}

TEST(StatusReport, LeavesTheErrorOnlyWhereItIsAskedFor) {
    const ErrorRecord error = ErrorRecord::make("POSIX", 2, "no such file");
    std::optional<ErrorRecord> out;
    report(Status(), &out);
    EXPECT_FALSE(out);
    report(error, nullptr);
    report(error, &out);
    EXPECT_EQ(out, error);
}

TEST(StatusReport, LeavesAnEarlierErrorAloneAfterASuccess) {
    std::optional<ErrorRecord> out = ErrorRecord::make("POSIX", 2, "no such file");
    report(Status(), &out);
    EXPECT_TRUE(out);
}

}  // namespace
}  // namespace appsync
