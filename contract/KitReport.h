#pragma once

#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "contract/ContractKit.h"
#include "contract/TestOutcome.h"

namespace appsync {

/// What the kit has found out of one port.
struct PortReport {
    /// One test that saw a sentence broken.
    struct Sight {
        std::string test;
        std::string seen;
    };

    std::string port;
    std::size_t tests = 0;
    /// In alphabetical order, by header.
    std::set<ContractSentence> kept;
    std::map<ContractSentence, std::vector<Sight>> broken;
    /// What the tests need and this machine lacks: the test, and why.
    std::map<std::string, std::string> skipped;
    std::set<OptionalService> absent;
    /// "system" or "device", where the port makes none.
    std::vector<std::string> notMade;
};

[[nodiscard]] PortReport reportOf(const ContractPort& port,
                                  const std::vector<TestOutcome>& outcomes);

/// For people.
[[nodiscard]] std::string textOf(const PortReport& report);
/// For programs: one JSON object with an array "ports".
[[nodiscard]] std::string jsonOf(const std::vector<PortReport>& reports);

}  // namespace appsync
