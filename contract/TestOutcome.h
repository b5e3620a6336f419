#pragma once

#include <string>
#include <string_view>
#include <vector>

#include "contract/Sentence.h"

namespace appsync {

/// That a sentence was broken, and how that showed.
struct BrokenSentence {
    ContractSentence sentence;  // of no header: before the test looked at any
    std::string seen;
};

/// What came of one test over one port.
struct TestOutcome {
    std::string test;  // "Suite.Test"
    std::string port;
    std::vector<ContractSentence> lookedAt;
    std::vector<BrokenSentence> broken;
    /// Why the test could look at nothing here; empty when it could.
    std::string skipped;
    bool ended = false;
};

// How a test tells its outcome to another process: records, one after another.

[[nodiscard]] std::string recordOfSentence(const ContractSentence& sentence);
/// The sentence that is looked at now is broken.
[[nodiscard]] std::string recordOfFailure(std::string_view seen);
[[nodiscard]] std::string recordOfSkip(std::string_view why);
[[nodiscard]] std::string recordOfEnd();

/// Adds to the outcome what the records say. One that was cut off says nothing.
void readRecords(std::string_view records, TestOutcome& outcome);

}  // namespace appsync
