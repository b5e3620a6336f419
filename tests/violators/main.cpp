// Which violators does the contract kit catch? Each is looked at in a process of its own, as some
// end it or never come to an end.
//
//     violators              every violator; the good implementations under a few seeds
//     violators --report FILE  the same, and a line "passed NAME" or "failed NAME" for each
//     violators NAME...      these, with what the kit says of them
//     violators --list       names, headers and sentences, separated by tabs
//     violators --seeds N    only the good implementations, the simulation under N seeds
//
// Exits with 0 when every violator but the known ones is caught, and nothing good is.

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "contract/TemporaryMachineDirectory.h"
#include "contract/forwarding/ForwardingAppRegistry.h"
#include "contract/forwarding/ForwardingCoordination.h"
#include "contract/forwarding/ForwardingDeviceServices.h"
#include "contract/forwarding/ForwardingFileSystem.h"
#include "contract/forwarding/ForwardingSystemServices.h"
#include "contract/forwarding/ForwardingWorkQueues.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

constexpr unsigned kSecondsForOne = 20;
constexpr unsigned kSecondsForSeeds = 600;
constexpr std::uint64_t kFewSeeds = 3;
constexpr std::uint64_t kSeedsAtOnce = 25;

/// Violators that the kit does not catch, each with the reason.
const std::map<std::string, std::string>& knownToEscape() {
    static const std::map<std::string, std::string> known{};
    return known;
}

std::vector<Violator> allViolators() {
    std::vector<Violator> all;
    for (auto* violators : {fileSystemViolators, workQueueViolators, propertyListViolators,
                            notificationViolators, registryViolators, registryObserverViolators,
                            progressViolators, deviceServiceViolators, coordinationViolators}) {
        for (Violator& each : violators()) all.push_back(std::move(each));
    }
    return all;
}

/// Which suites are to look at ports, for how long, and whether all of their tests.
struct Look {
    std::string suites = "*";
    unsigned seconds = kSecondsForOne;
    bool stopsAtAFailure = true;
};

/// In the child: its output goes into the file, and it ends by itself.
[[noreturn]] void runKit(const std::string& output, const Look& look,
                         std::vector<ContractPort> ports) {
    const int file = ::open(output.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    if (file < 0 || ::dup2(file, 1) < 0 || ::dup2(file, 2) < 0) ::_exit(EXIT_FAILURE);
    const struct rlimit none {};
    (void)::setrlimit(RLIMIT_CORE, &none);
    ::alarm(look.seconds);
    std::string program = "violators";
    std::string filter = "--gtest_filter=" + look.suites;
    std::string failFast = look.stopsAtAFailure ? "--gtest_fail_fast=1" : "--gtest_fail_fast=0";
    std::array<char*, 4> arguments{program.data(), filter.data(), failFast.data(), nullptr};
    std::exit(runContractSuites(3, arguments.data(), std::move(ports)));
}

struct Outcome {
    bool passed = false;
    std::string output;
    /// The test that failed, or in which all ended.
    std::string test;
};

std::string contentsOf(const std::string& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// The test that failed first, or else the one that had begun last.
std::string failedTest(const std::string& output) {
    constexpr std::string_view kFailed = "[  FAILED  ] ";
    constexpr std::string_view kBegun = "[ RUN      ] ";
    std::size_t found = output.find(kFailed);
    if (found == std::string::npos) found = output.rfind(kBegun);
    if (found == std::string::npos) return {};
    const std::size_t begin = found + kFailed.size();
    return output.substr(begin, output.find_first_of(", \n", begin) - begin);
}

Outcome lookAt(const TemporaryMachineDirectory& directory, const Look& look,
               const std::vector<ContractPort>& ports) {
    const std::string path = directory.path() + "/output";
    std::cout.flush();
    const pid_t child = ::fork();
    if (child < 0) return {false, "there is no process for it\n", {}};
    if (child == 0) runKit(path, look, ports);
    int status = 0;
    (void)::waitpid(child, &status, 0);
    Outcome outcome{WIFEXITED(status) && WEXITSTATUS(status) == 0, contentsOf(path), {}};
    outcome.test = failedTest(outcome.output);
    if (WIFSIGNALED(status)) {
        outcome.test += WTERMSIG(status) == SIGALRM ? " (no end)" : " (crash)";
    }
    return outcome;
}

/// Wrappers that change nothing: what is caught there is their own fault.
std::vector<ContractPort> forwardingPorts() {
    return {systemWith<ForwardingFileSystem>("ForwardingFileSystem"),
            systemWith<ForwardingWorkQueues>("ForwardingWorkQueues"),
            systemWith<ForwardingPropertyLists>("ForwardingPropertyLists"),
            systemWith<ForwardingNamedNotifications>("ForwardingNamedNotifications"),
            systemWith<ForwardingNotificationCenter>("ForwardingNotificationCenter"),
            deviceWith<ForwardingAppRegistry>("ForwardingAppRegistry"),
            deviceWith<ForwardingDevicePolicy>("ForwardingDevicePolicy"),
            deviceWith<ForwardingBackupService>("ForwardingBackupService"),
            deviceWith<ForwardingHomeScreen>("ForwardingHomeScreen"),
            deviceWith<ForwardingInstaller>("ForwardingInstaller"),
            deviceWith<ForwardingTransactionLog>("ForwardingTransactionLog"),
            deviceWith<ForwardingIconRenderer>("ForwardingIconRenderer"),
            deviceWith<ForwardingCoordination>("ForwardingCoordination")};
}

/// Says what came of each thing that was looked at; also in a file, where one is asked for.
class Report {
  public:
    explicit Report(const std::string& path) {
        if (!path.empty()) file_.open(path);
    }
    void say(const std::string& name, bool isGood) {
        file_ << (isGood ? "passed " : "failed ") << name << '\n';
        if (!isGood) ++failed_;
    }
    [[nodiscard]] int failed() const { return failed_; }

  private:
    std::ofstream file_;
    int failed_ = 0;
};

struct GoodOnes {
    std::string name;
    std::vector<ContractPort> ports;
};

std::vector<GoodOnes> goodOnes(std::uint64_t seeds) {
    std::vector<GoodOnes> all{{"wrappers that break nothing", forwardingPorts()}};
    // With few seeds this is beside test_contract, which has looked at these.
    if (seeds > kFewSeeds) all.push_back({"system/ and device/", {posixPort(), referencePort()}});
    for (std::uint64_t first = 1; first <= seeds; first += kSeedsAtOnce) {
        const std::uint64_t last = std::min(first + kSeedsAtOnce - 1, seeds);
        GoodOnes some{
            "the simulation, seeds " + std::to_string(first) + " to " + std::to_string(last), {}};
        some.ports.reserve(kSeedsAtOnce);
        for (std::uint64_t seed = first; seed <= last; ++seed) {
            some.ports.push_back(
                simulatedPort("Seed" + std::to_string(seed), Scheduling::seeded(seed)));
        }
        all.push_back(std::move(some));
    }
    return all;
}

void lookForFalseAlarms(const TemporaryMachineDirectory& directory, std::uint64_t seeds,
                        Report& report) {
    for (const GoodOnes& good : goodOnes(seeds)) {
        const Outcome outcome = lookAt(directory, {"*", kSecondsForSeeds, false}, good.ports);
        report.say(good.name, outcome.passed);
        std::cout << (outcome.passed ? "good    " : "FALSE ALARM ") << good.name;
        if (!outcome.passed) std::cout << ": " << outcome.test << '\n' << outcome.output;
        std::cout << '\n';
    }
}

/// True when it is caught, or known to escape.
bool isAsExpected(const Violator& violator, const Outcome& outcome) {
    const auto known = knownToEscape().find(violator.name);
    const bool mayEscape = known != knownToEscape().end();
    std::cout << (outcome.passed ? "ESCAPED " : "caught  ") << violator.name;
    if (!outcome.passed) std::cout << ": " << outcome.test;
    if (outcome.passed && mayEscape) std::cout << ": " << known->second;
    if (!outcome.passed && mayEscape) std::cout << ", which was known to escape";
    std::cout << '\n';
    return outcome.passed == mayEscape;
}

void lookAtViolators(const TemporaryMachineDirectory& directory,
                     const std::vector<Violator>& violators, bool showsOutput, Report& report) {
    std::size_t caught = 0;
    for (const Violator& violator : violators) {
        const Outcome outcome = lookAt(directory, {violator.suites}, {violator.port});
        report.say(violator.name, isAsExpected(violator, outcome));
        if (!outcome.passed) ++caught;
        if (showsOutput) std::cout << outcome.output;
    }
    std::cout << caught << " of " << violators.size() << " violators caught\n";
}

void list(const std::vector<Violator>& violators) {
    for (const Violator& each : violators) {
        std::cout << each.name << '\t' << each.header << '\t' << each.sentence << '\n';
    }
}

int run(const std::vector<std::string>& arguments) {
    std::vector<Violator> violators = allViolators();
    const std::string first = arguments.empty() ? std::string() : arguments.front();
    const std::string second = arguments.size() == 2 ? arguments.back() : std::string();
    if (first == "--list") {
        list(violators);
        return EXIT_SUCCESS;
    }
    const TemporaryMachineDirectory directory;
    Report report(first == "--report" ? second : std::string());
    if (first == "--seeds" && !second.empty()) {
        lookForFalseAlarms(directory, std::stoull(second), report);
    } else if (first.empty() || first == "--report") {
        lookForFalseAlarms(directory, kFewSeeds, report);
        lookAtViolators(directory, violators, false, report);
        report.say("few are known to escape", knownToEscape().size() * 20 <= violators.size());
    } else {
        std::erase_if(violators, [&](const Violator& each) {
            return std::find(arguments.begin(), arguments.end(), each.name) == arguments.end();
        });
        lookAtViolators(directory, violators, true, report);
    }
    return report.failed() == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace
}  // namespace appsync

int main(int argc, char** argv) {
    // Without a zone the C library looks one up with each archive that is opened.
    ::setenv("TZ", "UTC", 0);
    return appsync::run({argv + 1, argv + argc});
}
