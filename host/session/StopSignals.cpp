#include "host/session/StopSignals.h"

#include <poll.h>
#include <signal.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <utility>

namespace appsync {
namespace {

sigset_t stopSet() {
    sigset_t set;
    sigemptyset(&set);
    for (const int signal : {SIGINT, SIGTERM, SIGHUP}) {
        struct sigaction action {};
        // One that is ignored (a command in the background, under nohup) stays ignored.
        if (::sigaction(signal, nullptr, &action) == 0 && action.sa_handler != SIG_IGN) {
            sigaddset(&set, signal);
        }
    }
    return set;
}

}  // namespace

StopSignals::StopSignals(std::chrono::milliseconds patience, std::function<void()> stopping,
                         std::function<void()> giveUp)
    : patience_(patience), stopping_(std::move(stopping)), giveUp_(std::move(giveUp)) {
    const sigset_t set = stopSet();
    signals_ = ::signalfd(-1, &set, SFD_CLOEXEC);
    ended_ = ::eventfd(0, EFD_CLOEXEC);
    if (signals_ < 0 || ended_ < 0) return;  // then a signal ends the process at once
    ::pthread_sigmask(SIG_BLOCK, &set, nullptr);
    watcher_ = std::thread([this] { watch(); });
}

StopSignals::~StopSignals() {
    if (watcher_.joinable()) {
        const std::uint64_t one = 1;
        while (::write(ended_, &one, sizeof(one)) < 0 && errno == EINTR) {
        }
        watcher_.join();
        const sigset_t set = stopSet();
        ::pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
    }
    if (signals_ >= 0) ::close(signals_);
    if (ended_ >= 0) ::close(ended_);
}

void StopSignals::watch() {
    std::array<pollfd, 2> sources = {pollfd{signals_, POLLIN, 0}, pollfd{ended_, POLLIN, 0}};
    for (;;) {
        const int timeout = requested_ ? static_cast<int>(patience_.count()) : -1;
        const int ready = ::poll(sources.data(), sources.size(), timeout);
        if (ready < 0 && errno == EINTR) continue;
        if (ready > 0 && sources[1].revents != 0) return;
        signalfd_siginfo info{};
        const bool hasCome = ready > 0 && ::read(signals_, &info, sizeof(info)) > 0;
        if (requested_ || ready <= 0) return leave();
        requested_ = hasCome;
        if (hasCome) stopping_();
    }
}

// An output that nobody reads may hold `giveUp` up for ever.
void StopSignals::leave() {
    const sigset_t set = stopSet();
    ::pthread_sigmask(SIG_UNBLOCK, &set, nullptr);
    giveUp_();
}

}  // namespace appsync
