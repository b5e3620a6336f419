#include "host/watch/PreparationEvents.h"

#include <algorithm>
#include <optional>
#include <utility>

#include "host/watch/SyncEvents.h"

namespace appsync {
namespace {

// What is over in a moment is told of at its beginning and its end only.
constexpr std::uint64_t kFewPackages = 100;
constexpr std::uint64_t kParts = 3;

SyncEvent preparationEvent(SyncEventKind kind, std::uint64_t done, std::uint64_t total,
                           SyncState state, std::string text) {
    return {kind, SyncPhase::Prepare, "", done, total, state, std::nullopt, std::move(text)};
}

}  // namespace

const char* PreparationEvents::nameOf(Part part) {
    switch (part) {
        case Part::Reading:
            return "reading packages";
        case Part::Staging:
            return "staging";
        case Part::Asking:
            return "asking the device";
    }
    return "";
}

void PreparationEvents::read(std::size_t done, std::size_t count) {
    const std::lock_guard guard(mutex_);
    begin(count);
    advance(Part::Reading, done, count);
}

void PreparationEvents::staged(std::size_t done, std::size_t count) {
    const std::lock_guard guard(mutex_);
    advance(Part::Staging, done, count);
}

void PreparationEvents::asked(std::size_t count) {
    const std::lock_guard guard(mutex_);
    if (asked_ < count) advance(Part::Asking, ++asked_, count);
}

void PreparationEvents::finish() { end(""); }

void PreparationEvents::fail(const std::string& why) { end(why); }

void PreparationEvents::begin(std::size_t packages) {
    if (total_ > 0) return;
    packages_ = packages;
    total_ = std::max(kParts * packages_, std::uint64_t{1});
    if (events_ == nullptr) return;
    events_->report(preparationEvent(SyncEventKind::Started, 0, total_, SyncState::Active,
                                     nameOf(Part::Reading)));
}

void PreparationEvents::advance(Part part, std::size_t done, std::size_t count) {
    if (isOver_ || total_ == 0) return;
    const std::uint64_t ofPart = count > 0 ? packages_ * done / count : packages_;
    done_ = std::max(done_, static_cast<std::uint64_t>(part) * packages_ + ofPart);
    if (events_ == nullptr || packages_ < kFewPackages) return;
    events_->report(preparationEvent(
        SyncEventKind::Progress, done_, total_, SyncState::Active,
        nameOf(part) + (", " + std::to_string(done) + " of " + std::to_string(count))));
}

void PreparationEvents::end(const std::string& why) {
    const std::lock_guard guard(mutex_);
    if (isOver_ || total_ == 0) return;
    isOver_ = true;
    if (events_ == nullptr) return;
    events_->report(
        why.empty()
            ? preparationEvent(SyncEventKind::Ended, total_, total_, SyncState::Finished, "")
            : preparationEvent(SyncEventKind::Ended, done_, total_, SyncState::Failed, why));
}

}  // namespace appsync
