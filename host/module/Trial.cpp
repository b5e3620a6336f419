#include "host/module/Trial.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <span>

#include "platform/Bytes.h"
#include "system/DescriptorIO.h"
#include "system/PosixError.h"
#include "system/UniqueFd.h"

namespace appsync {
namespace {

constexpr char kEndOfAnswer = '\0';

void silence() {
    const rlimit noDump = {0, 0};
    ::setrlimit(RLIMIT_CORE, &noDump);
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

std::optional<std::string> answerFrom(int descriptor) {
    constexpr std::uint64_t kLongestAnswer = 65'536;
    Bytes bytes;
    if (readWhole(descriptor, 0, kLongestAnswer, bytes) != 0) return std::nullopt;
    if (bytes.empty() || bytes.back() != kEndOfAnswer) return std::nullopt;
    return std::string(bytes.begin(), bytes.end() - 1);
}

std::string waitForEnd(pid_t process) {
    int status = 0;
    while (::waitpid(process, &status, 0) < 0) {
        if (errno != EINTR) return posixReason(errno);
    }
    return WIFSIGNALED(status) ? "signal " + std::to_string(WTERMSIG(status))
                               : "status " + std::to_string(WEXITSTATUS(status));
}

}  // namespace

Result<TrialOutcome> tryInAnotherProcess(const std::function<std::string()>& action) {
    std::array<int, 2> ends{};
    if (::pipe2(ends.data(), O_CLOEXEC) != 0) return posixError(errno, "make", "a pipe");
    const UniqueFd heard(ends[0]);
    UniqueFd told(ends[1]);
    const pid_t process = ::fork();
    if (process < 0) return posixError(errno, "start", "a process");
    if (process == 0) actAndEnd(action, told.get());
    told.reset();
    TrialOutcome outcome;
    outcome.answer = answerFrom(heard.get());
    outcome.end = waitForEnd(process);
    return outcome;
}

}  // namespace appsync
