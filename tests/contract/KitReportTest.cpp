#include "contract/KitReport.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "contract/OptionalServices.h"

namespace appsync {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const ContractSentence kRenames{"platform/FileSystem.h", "Renames."};
const ContractSentence kCopies{"platform/FileSystem.h", "Copies a regular file."};

TestOutcome outcomeOf(const std::string& records, const std::string& port = "Port") {
    TestOutcome outcome;
    outcome.test = "Suite.Test";
    outcome.port = port;
    readRecords(records, outcome);
    return outcome;
}

PortReport reportOf(const std::vector<TestOutcome>& outcomes) {
    return reportOf({"Port", nullptr, nullptr, {OptionalService::Transfers}}, outcomes);
}

TEST(TestOutcomeTest, AFailureBreaksTheSentenceThatWasLookedAtLast) {
    const TestOutcome outcome = outcomeOf(recordOfSentence(kRenames) + recordOfSentence(kCopies) +
                                          recordOfFailure("it is gone") + recordOfEnd());
    EXPECT_THAT(outcome.lookedAt, ElementsAre(kRenames, kCopies));
    ASSERT_EQ(outcome.broken.size(), 1U);
    EXPECT_EQ(outcome.broken[0].sentence, kCopies);
    EXPECT_EQ(outcome.broken[0].seen, "it is gone");
    EXPECT_TRUE(outcome.ended);
}

TEST(TestOutcomeTest, WhatWasCutOffSaysNothing) {
    const std::string records = recordOfSentence(kRenames) + recordOfFailure("it is gone");
    const TestOutcome outcome = outcomeOf(records.substr(0, records.size() - 1));
    EXPECT_THAT(outcome.lookedAt, ElementsAre(kRenames));
    EXPECT_THAT(outcome.broken, IsEmpty());
    EXPECT_FALSE(outcome.ended);
}

TEST(KitReportTest, ASentenceThatOneTestBreaksIsNotKept) {
    const PortReport report =
        reportOf({outcomeOf(recordOfSentence(kRenames) + recordOfSentence(kCopies) + recordOfEnd()),
                  outcomeOf(recordOfSentence(kRenames) + recordOfFailure("no") + recordOfEnd()),
                  outcomeOf(recordOfSentence(kRenames) + recordOfEnd(), "Another")});
    EXPECT_EQ(report.tests, 2U);
    EXPECT_THAT(report.kept, ElementsAre(kCopies));
    EXPECT_EQ(report.broken.size(), 1U);
    EXPECT_TRUE(report.broken.contains(kRenames));
}

TEST(KitReportTest, ASentenceThatATestPassesOverIsNotKept) {
    const TestOutcome skipped = outcomeOf(recordOfSentence(kRenames) + recordOfSentence(kCopies) +
                                          recordOfSkip("it cannot be had") + recordOfEnd());
    EXPECT_THAT(reportOf({skipped}).kept, ElementsAre(kRenames));
    const TestOutcome another = outcomeOf(recordOfSentence(kCopies) + recordOfEnd());
    EXPECT_THAT(reportOf({skipped, another}).kept,
                testing::UnorderedElementsAre(kRenames, kCopies));
}

TEST(KitReportTest, TheTextNamesHeaderSentenceAndWhatWasSeen) {
    const std::string text = textOf(reportOf(
        {outcomeOf(recordOfSentence(kRenames) + recordOfFailure("no\nfile") + recordOfEnd())}));
    EXPECT_THAT(text, AllOf(HasSubstr("broken: platform/FileSystem.h\n    \"Renames.\"\n"),
                            HasSubstr("seen in Suite.Test:\n    no\n    file\n"),
                            HasSubstr("without transfer service: "),
                            HasSubstr("Port: 0 sentences kept, 1 broken\n")));
}

TEST(KitReportTest, JsonCarriesWhateverWasSeen) {
    const std::string json = jsonOf({reportOf(
        {outcomeOf(recordOfSentence(kRenames) + recordOfFailure("\"\\\n\x01") + recordOfEnd())})});
    EXPECT_THAT(json, HasSubstr(R"("what": "\"\\\u000a\u0001")"));
}

TEST(KitReportTest, JsonHasAMarkForBytesThatAreNoCharacters) {
    const std::string kept = "h\u00e9\u20ac\U0001f600";
    for (const std::string bad : {"\xff", "\xc0\x80", "\xe0\x80\x80", "\xed\xa0\x80",
                                  "\xf4\x90\x80\x80", "\xe2\x82", "\x80"}) {
        std::string marks;
        for (std::size_t i = 0; i < bad.size(); ++i) marks += "\ufffd";
        const std::string json = jsonOf({reportOf({outcomeOf(
            recordOfSentence(kRenames) + recordOfFailure(kept + bad) + recordOfEnd())})});
        EXPECT_THAT(json, HasSubstr("\"what\": \"" + kept + marks + "\""));
    }
}

TEST(KitReportTest, EveryAbsenceHasANameAndAMeaning) {
    for (int i = 0; i <= static_cast<int>(OptionalService::CancelByPerson); ++i) {
        EXPECT_NE(nameOf(static_cast<OptionalService>(i)), "?");
        EXPECT_NE(meaningOfAbsence(static_cast<OptionalService>(i)), "?");
    }
}

}  // namespace
}  // namespace appsync
