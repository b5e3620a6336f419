#include "contract/ContractKit.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <array>
#include <cstdlib>
#include <fstream>
#include <iostream>
#include <optional>
#include <string_view>
#include <thread>
#include <utility>

#include "contract/ContractPorts.h"
#include "contract/ContractSuites.h"
#include "contract/IsolatedTests.h"
#include "contract/KitReport.h"
#include "contract/Sentence.h"

namespace appsync {
namespace {

constexpr int kWrongArguments = 2;

constexpr std::string_view kHelp =
    R"(Proves that a device keeps the contracts of platform/. Options:
  --filter PATTERN     only these tests, as GoogleTest's filter: 'AppRegistry*', 'FileSystem*-*Link*'
  --time-limit SECONDS how long one test may take (10)
  --jobs N             how many tests run at a time (as many as there are processors)
  --json FILE          writes the report to FILE, too, for programs
  --in-one-process     runs all tests in this process, for a debugger; what follows are GoogleTest's options
  --help
The exit status is 0 when every sentence that was looked at is kept, 1 when one is broken, 2 for wrong
arguments.
)";

struct KitArguments {
    IsolationOptions isolation;
    std::string json;
};

std::optional<unsigned> numberFrom(const std::string& text) {
    char* end = nullptr;
    const unsigned long number = std::strtoul(text.c_str(), &end, 10);
    if (text.empty() || *end != '\0' || number == 0 || number > 1'000'000) return std::nullopt;
    return static_cast<unsigned>(number);
}

/// Takes one option. False when it is none, or its value is none.
bool take(const std::string& option, const std::string& value, KitArguments& arguments) {
    const std::optional<unsigned> number = numberFrom(value);
    if (option == "--filter") {
        arguments.isolation.filter = value;
    } else if (option == "--json") {
        arguments.json = value;
    } else if (option == "--jobs" && number) {
        arguments.isolation.jobs = *number;
    } else if (option == "--time-limit" && number) {
        arguments.isolation.timeLimit = std::chrono::seconds(*number);
    } else {
        return false;
    }
    return true;
}

std::optional<KitArguments> argumentsFrom(const std::vector<std::string>& words) {
    KitArguments arguments;
    arguments.isolation.jobs = std::max(1U, std::thread::hardware_concurrency());
    for (std::size_t i = 0; i < words.size(); i += 2) {
        if (i + 1 < words.size() && take(words[i], words[i + 1], arguments)) continue;
        std::cerr << "The contract kit does not understand '" << words[i] << "'";
        if (i + 1 < words.size()) std::cerr << " with '" << words[i + 1] << "'";
        std::cerr << "; --help lists its options.\n";
        return std::nullopt;
    }
    return arguments;
}

/// Registers the tests over these ports.
void prepare(int argc, char** argv, std::vector<ContractPort> ports) {
    linkContractSuites();
    setContractPorts(std::move(ports));
    testing::InitGoogleTest(&argc, argv);
}

bool writeJson(const std::string& path, const std::vector<PortReport>& reports) {
    std::ofstream file(path, std::ios::binary);
    file << jsonOf(reports);
    file.close();
    if (!file) std::cerr << "Cannot write the report to '" << path << "'.\n";
    return !file.fail();
}

int prove(const KitArguments& arguments, const std::vector<ContractPort>& ports) {
    const std::vector<TestOutcome> outcomes = runIsolated(arguments.isolation);
    if (outcomes.empty()) {
        std::cerr << "No test has a name like '" << arguments.isolation.filter << "'.\n";
        return kWrongArguments;
    }
    std::vector<PortReport> reports;
    reports.reserve(ports.size());
    for (const ContractPort& port : ports) {
        reports.push_back(reportOf(port, outcomes));
        std::cout << textOf(reports.back()) << std::flush;
    }
    const bool isWritten = arguments.json.empty() || writeJson(arguments.json, reports);
    const bool isKept = std::all_of(reports.begin(), reports.end(),
                                    [](const PortReport& report) { return report.broken.empty(); });
    return isKept && isWritten ? EXIT_SUCCESS : EXIT_FAILURE;
}

/// Says which sentence is broken, beside what GoogleTest says.
class SentenceTeller : public testing::EmptyTestEventListener {
  public:
    void OnTestStart(const testing::TestInfo&) override { checks({}, {}); }
    void OnTestPartResult(const testing::TestPartResult& result) override {
        const ContractSentence sentence = sentenceLookedAt();
        if (!result.failed() || sentence.header.empty()) return;
        std::cout << "This breaks " << sentence.header << ": \"" << sentence.text << "\"\n";
    }
};

}  // namespace

int runContractKit(int argc, char** argv, std::vector<ContractPort> ports) {
    const std::vector<std::string> words(argv + 1, argv + argc);
    if (words == std::vector<std::string>{"--help"}) {
        std::cout << kHelp;
        return EXIT_SUCCESS;
    }
    if (!words.empty() && words[0] == "--in-one-process") {
        return runContractSuites(argc - 1, argv + 1, std::move(ports));
    }
    const std::optional<KitArguments> arguments = argumentsFrom(words);
    if (!arguments) return kWrongArguments;
    prepare(1, argv, ports);
    return prove(*arguments, ports);
}

int runContractSuites(int argc, char** argv, std::vector<ContractPort> ports) {
    prepare(argc, argv, std::move(ports));
    testing::UnitTest::GetInstance()->listeners().Append(new SentenceTeller);
    return RUN_ALL_TESTS();
}

}  // namespace appsync
