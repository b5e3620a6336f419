#include "contract/IsolatedTests.h"

#include <errno.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <string.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <stdexcept>
#include <utility>

#include "contract/TemporaryMachineDirectory.h"

namespace appsync {
namespace {

using Clock = std::chrono::steady_clock;

/// What is kept of what a process that died has printed.
constexpr std::size_t kOutputLimit = 2000;

bool matchesOne(const std::string& patterns, const std::string& name) {
    std::size_t begin = 0;
    while (begin <= patterns.size()) {
        const std::size_t end = std::min(patterns.find(':', begin), patterns.size());
        if (::fnmatch(patterns.substr(begin, end - begin).c_str(), name.c_str(), 0) == 0)
            return true;
        begin = end + 1;
    }
    return false;
}

bool isWanted(const std::string& filter, const std::string& name) {
    const std::size_t dash = filter.find('-');
    const std::string wanted = filter.substr(0, dash);
    if (!wanted.empty() && !matchesOne(wanted, name)) return false;
    return dash == std::string::npos || !matchesOne(filter.substr(dash + 1), name);
}

std::vector<std::string> wantedTests(const std::string& filter) {
    std::vector<std::string> names;
    const testing::UnitTest& all = *testing::UnitTest::GetInstance();
    for (int i = 0; i < all.total_test_suite_count(); ++i) {
        const testing::TestSuite& suite = *all.GetTestSuite(i);
        for (int j = 0; j < suite.total_test_count(); ++j) {
            std::string name =
                std::string(suite.name()) + "." + std::string(suite.GetTestInfo(j)->name());
            if (isWanted(filter, name)) names.push_back(std::move(name));
        }
    }
    return names;
}

/// In the test's process: tells the other one what becomes of it.
class OutcomeWriter : public testing::EmptyTestEventListener {
  public:
    explicit OutcomeWriter(int pipe) : pipe_(pipe) {
        onSentence([this](const ContractSentence& sentence) { write(recordOfSentence(sentence)); });
    }

    void OnTestPartResult(const testing::TestPartResult& result) override {
        if (result.skipped()) write(recordOfSkip(result.message()));
        if (result.failed()) write(recordOfFailure(result.message()));
    }
    void OnTestEnd(const testing::TestInfo&) override { write(recordOfEnd()); }

  private:
    void write(std::string_view record) const {
        while (!record.empty()) {
            const ssize_t count = ::write(pipe_, record.data(), record.size());
            if (count < 0 && errno != EINTR) return;
            if (count > 0) record.remove_prefix(static_cast<std::size_t>(count));
        }
    }

    const int pipe_;
};

/// Runs the test in a process that was made for it.
[[noreturn]] void becomeTest(const std::string& name, int pipe, const std::string& directory) {
    ::setpgid(0, 0);  // so that what it starts can be ended with it
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    const std::string output = directory + "/output";
    const int file = ::open(output.c_str(), O_WRONLY | O_CREAT | O_APPEND, S_IRUSR | S_IWUSR);
    ::dup2(file, STDOUT_FILENO);
    ::dup2(file, STDERR_FILENO);
    ::close(file);
    ::setenv("TMPDIR", directory.c_str(), 1);
    ::unsetenv("GTEST_TOTAL_SHARDS");
    GTEST_FLAG_SET(filter, name);
    auto& listeners = testing::UnitTest::GetInstance()->listeners();
    delete listeners.Release(listeners.default_result_printer());
    listeners.Append(new OutcomeWriter(pipe));
    const int status = RUN_ALL_TESTS();
    std::fflush(nullptr);
    ::_exit(status);
}

std::string endOf(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    return text.size() <= kOutputLimit ? text : "[...]" + text.substr(text.size() - kOutputLimit);
}

/// One test in a process of its own.
class IsolatedTest {
  public:
    IsolatedTest(std::string name, std::string directory, std::chrono::milliseconds limit)
        : name_(std::move(name)), directory_(std::move(directory)), limit_(limit) {
        std::filesystem::create_directory(directory_);
        std::array<int, 2> ends{};
        if (::pipe2(ends.data(), O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
        std::fflush(nullptr);  // else both processes print what waits
        process_ = ::fork();
        if (process_ < 0) throw std::runtime_error("no process");
        if (process_ == 0) becomeTest(name_, ends[1], directory_);
        ::close(ends[1]);
        pipe_ = ends[0];
        ::fcntl(pipe_, F_SETFL, O_NONBLOCK);
        end_ = static_cast<int>(::syscall(SYS_pidfd_open, process_, 0));
        if (end_ < 0) throw std::runtime_error("no view of a process");
    }
    ~IsolatedTest() {
        ::close(end_);
        ::close(pipe_);
        std::error_code ignored;
        std::filesystem::remove_all(directory_, ignored);
    }
    IsolatedTest(const IsolatedTest&) = delete;
    IsolatedTest& operator=(const IsolatedTest&) = delete;

    /// Where it tells something, -1 when it tells no more; and where its end shows.
    [[nodiscard]] int pipe() const { return tellsNoMore_ ? -1 : pipe_; }
    [[nodiscard]] int end() const { return end_; }
    [[nodiscard]] Clock::time_point deadline() const { return deadline_; }

    /// Takes what the process has told by now.
    void read() {
        std::array<char, 4096> buffer{};
        ssize_t count = 0;
        while ((count = ::read(pipe_, buffer.data(), buffer.size())) > 0) {
            records_.append(buffer.data(), static_cast<std::size_t>(count));
        }
        tellsNoMore_ = count == 0;
    }

    /// Ends the process, if it has not ended yet.
    TestOutcome finish(bool isLate) {
        if (isLate) ::kill(-process_, SIGKILL);
        int status = 0;
        while (::waitpid(process_, &status, 0) < 0 && errno == EINTR) {
        }
        ::kill(-process_, SIGKILL);  // what it has started
        read();
        TestOutcome outcome;
        const std::size_t slash = name_.rfind('/');
        outcome.test = name_.substr(0, slash);
        if (slash != std::string::npos) outcome.port = name_.substr(slash + 1);
        readRecords(records_, outcome);
        if (!outcome.ended) noteDeath(outcome, isLate, status);
        return outcome;
    }

  private:
    void noteDeath(TestOutcome& outcome, bool isLate, int status) const {
        std::string seen;
        if (isLate) {
            seen = "no end within " + std::to_string(limit_.count()) + " ms";
        } else if (WIFSIGNALED(status)) {
            seen = "the process was ended by signal " + std::to_string(WTERMSIG(status)) + " (" +
                   ::strsignal(WTERMSIG(status)) + ")";
        } else {
            seen = "the process ended with status " + std::to_string(WEXITSTATUS(status)) +
                   " in the middle of the test";
        }
        const std::string output = endOf(directory_ + "/output");
        if (!output.empty()) seen += "; it had printed:\n" + output;
        outcome.broken.push_back(
            {outcome.lookedAt.empty() ? ContractSentence{} : outcome.lookedAt.back(), seen});
    }

    const std::string name_;
    const std::string directory_;
    const std::chrono::milliseconds limit_;
    const Clock::time_point deadline_ = Clock::now() + limit_;
    pid_t process_ = 0;
    int pipe_ = -1;
    int end_ = -1;
    bool tellsNoMore_ = false;
    std::string records_;
};

/// Several at a time.
class IsolatedTests {
  public:
    explicit IsolatedTests(const IsolationOptions& options)
        : options_(options),
          names_(wantedTests(options.filter)),
          running_(std::max(1U, options.jobs)),
          outcomes_(names_.size()) {}

    std::vector<TestOutcome> run() {
        do startMore();
        while (waitForOne());
        return std::move(outcomes_);
    }

  private:
    struct Slot {
        std::unique_ptr<IsolatedTest> test;
        std::size_t number = 0;
    };

    void startMore() {
        for (Slot& slot : running_) {
            if (slot.test != nullptr || next_ == names_.size()) continue;
            slot.number = next_++;
            slot.test = std::make_unique<IsolatedTest>(
                names_[slot.number], directory_.path() + "/" + std::to_string(slot.number),
                options_.timeLimit);
        }
    }

    /// Waits until one of them has told something, has ended, or its time is over. False when none
    /// runs.
    bool waitForOne() {
        std::vector<pollfd> awaited;
        awaited.reserve(2 * running_.size());
        Clock::time_point first = Clock::time_point::max();
        for (const Slot& slot : running_) {
            awaited.push_back({slot.test != nullptr ? slot.test->pipe() : -1, POLLIN, 0});
            awaited.push_back({slot.test != nullptr ? slot.test->end() : -1, POLLIN, 0});
            if (slot.test != nullptr) first = std::min(first, slot.test->deadline());
        }
        if (first == Clock::time_point::max()) return false;
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(first - Clock::now());
        ::poll(awaited.data(), awaited.size(), std::max(0, static_cast<int>(left.count())));
        for (std::size_t i = 0; i < running_.size(); ++i)
            look(running_[i], awaited[2 * i].revents != 0, awaited[2 * i + 1].revents != 0);
        return true;
    }

    void look(Slot& slot, bool isReadable, bool hasEnded) {
        if (slot.test == nullptr) return;
        if (isReadable) slot.test->read();
        const bool isLate = !hasEnded && Clock::now() >= slot.test->deadline();
        if (!isLate && !hasEnded) return;
        outcomes_[slot.number] = slot.test->finish(isLate);
        slot.test.reset();
    }

    const IsolationOptions options_;
    const std::vector<std::string> names_;
    const TemporaryMachineDirectory directory_;  // of what the tests leave
    std::vector<Slot> running_;
    std::size_t next_ = 0;
    std::vector<TestOutcome> outcomes_;
};

}  // namespace

std::vector<TestOutcome> runIsolated(const IsolationOptions& options) {
    return IsolatedTests(options).run();
}

}  // namespace appsync
