#include "host/module/Trial.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <utility>

#include "system/file/DescriptorIO.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {
namespace {

constexpr char kEndOfAnswer = '\0';
constexpr std::size_t kLongestAnswer = 65'536;

void silence() {
    const rlimit noDump = {0, 0};
    ::setrlimit(RLIMIT_CORE, &noDump);
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);  // nobody else ends one that hangs
    const int nowhere = ::open("/dev/null", O_RDWR | O_CLOEXEC);
    for (const int stream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) ::dup2(nowhere, stream);
}

[[noreturn]] void actAndEnd(const std::function<std::string()>& action, int answerTo) noexcept {
    silence();
    std::string answer = action();
    answer.push_back(kEndOfAnswer);
    const auto* const bytes = reinterpret_cast<const std::uint8_t*>(answer.data());
    const bool isTold = writeWhole(answerTo, {bytes, answer.size()}).error == 0;
    ::_exit(isTold ? 0 : 1);
}

std::string waitForEnd(pid_t process) {
    int status = 0;
    while (::waitpid(process, &status, 0) < 0) {
        if (errno != EINTR) return posixReason(errno);
    }
    return WIFSIGNALED(status) ? "signal " + std::to_string(WTERMSIG(status))
                               : "status " + std::to_string(WEXITSTATUS(status));
}

// A copy of this process that is at its action, and what it has told so far.
class Trial {
  public:
    Trial(pid_t process, UniqueFd heard) : process_(process), heard_(std::move(heard)) {}

    Result<TrialOutcome> endWithin(std::chrono::milliseconds limit) {
        const UniqueFd end(static_cast<int>(::syscall(SYS_pidfd_open, process_, 0)));
        if (end.get() < 0) return giveUp(posixError(errno, "watch", "a process"));
        TrialOutcome outcome;
        outcome.isOverdue = !endsUntil(end.get(), Clock::now() + limit);
        if (outcome.isOverdue) ::kill(process_, SIGKILL);
        outcome.end = waitForEnd(process_);
        hear();
        if (!outcome.isOverdue && told_.ends_with(kEndOfAnswer)) {
            told_.pop_back();
            outcome.answer = std::move(told_);
        }
        return outcome;
    }

  private:
    using Clock = std::chrono::steady_clock;

    ErrorRecord giveUp(ErrorRecord why) const {
        ::kill(process_, SIGKILL);
        static_cast<void>(waitForEnd(process_));
        return why;
    }

    // Hears what is told meanwhile, so that nobody waits for room. Whoever has closed its side is
    // not listened to any more, but waited for.
    bool endsUntil(int end, Clock::time_point deadline) {
        std::array<pollfd, 2> awaited{{{end, POLLIN, 0}, {heard_.get(), POLLIN, 0}}};
        while (true) {
            const auto left = std::chrono::ceil<std::chrono::milliseconds>(deadline - Clock::now());
            if (left.count() <= 0) return false;
            const int ready =
                ::poll(awaited.data(), awaited.size(), static_cast<int>(left.count()));
            if (ready < 0 && errno != EINTR) return false;
            if (ready <= 0) continue;
            if (awaited[0].revents != 0) return true;
            if (!hear()) awaited[1].fd = -1;
        }
    }

    // Whether more may be told, and will be heard: nobody is heard out who does not come to an end.
    bool hear() {
        std::array<char, 4096> piece{};
        while (told_.size() <= kLongestAnswer) {
            const ssize_t count = ::read(heard_.get(), piece.data(), piece.size());
            if (count > 0) told_.append(piece.data(), static_cast<std::size_t>(count));
            if (count < 0 && errno == EINTR) continue;
            if (count <= 0) return count < 0 && errno == EAGAIN;
        }
        return false;
    }

    const pid_t process_;
    const UniqueFd heard_;  // gives what there is, and does not wait
    std::string told_;
};

}  // namespace

Result<TrialOutcome> tryInAnotherProcess(const std::function<std::string()>& action,
                                         std::chrono::milliseconds limit) {
    std::array<int, 2> ends{};
    if (::pipe2(ends.data(), O_CLOEXEC) != 0) return posixError(errno, "make", "a pipe");
    UniqueFd heard(ends[0]);
    UniqueFd told(ends[1]);
    const pid_t process = ::fork();
    if (process < 0) return posixError(errno, "start", "a process");
    if (process == 0) actAndEnd(action, told.get());
    told.reset();
    ::fcntl(heard.get(), F_SETFL, O_NONBLOCK);
    return Trial(process, std::move(heard)).endWithin(limit);
}

}  // namespace appsync
