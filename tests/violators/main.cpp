// Which violators does the contract kit catch? Each is looked at in a process of its own, as some
// end it or never come to an end.
//
//     violators              every violator; the good implementations under a few seeds
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

#include "contract/ForwardingAppRegistry.h"
#include "contract/ForwardingCoordination.h"
#include "contract/ForwardingDeviceServices.h"
#include "contract/ForwardingFileSystem.h"
#include "contract/ForwardingSystemServices.h"
#include "contract/ForwardingWorkQueues.h"
#include "contract/TemporaryMachineDirectory.h"
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

/// In the child: its output goes into the file, and it ends by itself.
[[noreturn]] void runKit(const std::string& output, unsigned seconds, std::string filter,
                         std::vector<ContractPort> ports) {
    const int file = ::open(output.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600);
    if (file < 0 || ::dup2(file, 1) < 0 || ::dup2(file, 2) < 0) ::_exit(EXIT_FAILURE);
    const struct rlimit none {};
    (void)::setrlimit(RLIMIT_CORE, &none);
    ::alarm(seconds);
    std::string program = "violators";
    filter.insert(0, "--gtest_filter=");
    std::string failFast = "--gtest_fail_fast";
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

Outcome lookAt(const TemporaryMachineDirectory& directory, const std::string& filter,
               const std::vector<ContractPort>& ports, unsigned seconds) {
    const std::string path = directory.path() + "/output";
    std::cout.flush();
    const pid_t child = ::fork();
    if (child < 0) return {false, "there is no process for it\n", {}};
    if (child == 0) runKit(path, seconds, filter, ports);
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

/// What is good and caught all the same, with what the kit says.
int countFalseAlarms(const TemporaryMachineDirectory& directory, std::uint64_t seeds) {
    std::vector<std::vector<ContractPort>> rounds;
    for (std::uint64_t seed = 1; seed <= seeds; ++seed) {
        if (seed % kSeedsAtOnce == 1 || kSeedsAtOnce == 1) rounds.emplace_back();
        rounds.back().push_back(
            simulatedPort("Seed" + std::to_string(seed), Scheduling::seeded(seed)));
    }
    rounds.push_back(forwardingPorts());
    rounds.push_back({posixPort(), referencePort()});
    int alarms = 0;
    for (const auto& ports : rounds) {
        const Outcome outcome = lookAt(directory, "*", ports, kSecondsForSeeds);
        if (outcome.passed) continue;
        std::cout << "false alarm: " << outcome.test << '\n' << outcome.output;
        ++alarms;
    }
    std::cout << "good implementations: the simulation under " << seeds << " seeds, "
              << forwardingPorts().size()
              << " wrappers that break nothing, system/ and device/: " << alarms
              << " false alarms\n";
    return alarms;
}

/// True when it is as it should be.
bool isAsExpected(const Violator& violator, const Outcome& outcome) {
    const auto known = knownToEscape().find(violator.name);
    const bool mayEscape = known != knownToEscape().end();
    std::cout << (outcome.passed ? "ESCAPED " : "caught  ") << violator.name;
    if (!outcome.passed) std::cout << ": " << outcome.test;
    if (outcome.passed && mayEscape) std::cout << ": " << known->second;
    std::cout << '\n';
    if (!outcome.passed && mayEscape) {
        std::cout << "    is on the list of those that escape: take it off\n";
    }
    return outcome.passed == mayEscape;
}

int countWrong(const TemporaryMachineDirectory& directory, const std::vector<Violator>& violators,
               bool showsOutput) {
    int wrong = 0;
    std::size_t caught = 0;
    for (const Violator& violator : violators) {
        const Outcome outcome = lookAt(directory, violator.suites, {violator.port}, kSecondsForOne);
        if (!isAsExpected(violator, outcome)) ++wrong;
        if (!outcome.passed) ++caught;
        if (showsOutput) std::cout << outcome.output;
    }
    std::cout << caught << " of " << violators.size() << " violators caught\n";
    return wrong;
}

void list(const std::vector<Violator>& violators) {
    for (const Violator& each : violators) {
        std::cout << each.name << '\t' << each.header << '\t' << each.sentence << '\n';
    }
}

int run(const std::vector<std::string>& arguments) {
    std::vector<Violator> violators = allViolators();
    const std::string first = arguments.empty() ? std::string() : arguments.front();
    if (first == "--list") {
        list(violators);
        return EXIT_SUCCESS;
    }
    const TemporaryMachineDirectory directory;
    if (first == "--seeds" && arguments.size() == 2) {
        return countFalseAlarms(directory, std::stoull(arguments[1])) == 0 ? EXIT_SUCCESS
                                                                           : EXIT_FAILURE;
    }
    if (!arguments.empty()) {
        std::erase_if(violators, [&](const Violator& each) {
            return std::find(arguments.begin(), arguments.end(), each.name) == arguments.end();
        });
        return countWrong(directory, violators, true) == 0 ? EXIT_SUCCESS : EXIT_FAILURE;
    }
    const int alarms = countFalseAlarms(directory, kFewSeeds);
    const int wrong = countWrong(directory, violators, false);
    const bool areFew = knownToEscape().size() * 20 <= violators.size();
    return alarms == 0 && wrong == 0 && areFew ? EXIT_SUCCESS : EXIT_FAILURE;
}

}  // namespace
}  // namespace appsync

int main(int argc, char** argv) {
    // Without a zone the C library looks one up with each archive that is opened.
    ::setenv("TZ", "UTC", 0);
    return appsync::run({argv + 1, argv + argc});
}
