#pragma once

#include <chrono>
#include <string>
#include <vector>

#include "contract/TestOutcome.h"

namespace appsync {

struct IsolationOptions {
    /// Which tests, as GoogleTest's filter: patterns with `*` and `?`, ':' between them, and after
    /// a '-' those that are left out.
    std::string filter = "*";
    /// How long one test may take.
    std::chrono::milliseconds timeLimit = std::chrono::seconds(10);
    /// How many run at a time.
    unsigned jobs = 2;
};

/// Runs each test in a process of its own, so that a service that crashes, hangs or throws fails
/// one test: the process is forked from this one, which should have no other thread. A directory
/// for temporary files, which TMPDIR names, is made for each test and removed when it has ended.
///
/// Call it when the ports are set and GoogleTest is initialised. In the order of the tests.
[[nodiscard]] std::vector<TestOutcome> runIsolated(const IsolationOptions& options);

}  // namespace appsync
