#include "host/output/SessionProgress.h"

#include <algorithm>
#include <cmath>

namespace appsync {
namespace {

using Seconds = std::chrono::duration<double>;

constexpr std::chrono::seconds kRateWindow{5};
constexpr std::chrono::seconds kShortestWindow{1};
constexpr std::chrono::milliseconds kBetweenSamples{100};

// From where on what is left can be told from what was.
constexpr std::chrono::seconds kSoonest{3};
constexpr double kLeastFraction = 0.03;

// An application that was not sent is not installed either.
bool endsApplication(const SyncEvent& event) {
    if (event.kind != SyncEventKind::Ended) return false;
    if (event.phase == SyncPhase::Transfer) return event.state == SyncState::Failed;
    return event.phase != SyncPhase::Prepare;
}

double share(std::uint64_t done, std::uint64_t total) {
    return static_cast<double>(std::min(done, total)) / static_cast<double>(total);
}

}  // namespace

void SessionProgress::add(const SyncEvent& event, Clock::time_point time) {
    if (event.phase == SyncPhase::Prepare) return;
    if (!begin_) begin_ = time;
    if (event.phase == SyncPhase::Transfer) addBytes(event, time);
    if (endsApplication(event)) ended_.insert(event.identifier);
}

void SessionProgress::addBytes(const SyncEvent& event, Clock::time_point time) {
    std::uint64_t& sent = sent_[event.identifier];
    if (event.done > sent) {
        bytes_ += event.done - sent;
        sent = event.done;
    }
    if (!samples_.empty() && time - samples_.back().time < kBetweenSamples) return;
    samples_.push_back({time, bytes_});
    while (samples_.size() > 2 && time - samples_[1].time >= kRateWindow) samples_.pop_front();
}

// Bytes and applications count as much: small packages take their time, too.
double SessionProgress::fraction() const {
    if (totals_.applications == 0) return 0;
    const double applications = share(ended_.size(), totals_.applications);
    if (totals_.bytes == 0) return applications;
    return (share(bytes_, totals_.bytes) + applications) / 2;
}

unsigned SessionProgress::percent() const { return static_cast<unsigned>(fraction() * 100); }

std::optional<std::uint64_t> SessionProgress::rate(Clock::time_point time) const {
    if (samples_.empty()) return std::nullopt;
    const Sample& first = samples_.front();
    const auto window = std::max<Clock::duration>(time - first.time, kShortestWindow);
    const bool isOld = time - samples_.back().time >= kRateWindow;
    if (isOld || bytes_ <= first.bytes) return std::nullopt;
    return static_cast<std::uint64_t>(static_cast<double>(bytes_ - first.bytes) /
                                      Seconds(window).count());
}

std::optional<std::chrono::seconds> SessionProgress::left(Clock::time_point time) const {
    const double done = fraction();
    if (!begin_ || time - *begin_ < kSoonest || done < kLeastFraction || done >= 1) {
        return std::nullopt;
    }
    const double seconds = Seconds(time - *begin_).count() * (1 - done) / done;
    return std::chrono::seconds(static_cast<std::int64_t>(std::ceil(seconds)));
}

}  // namespace appsync
