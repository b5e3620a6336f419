#include "host/serve/ChangeBell.h"

namespace appsync {

void ChangeBell::ring() {
    const std::lock_guard lock(mutex_);
    ++rings_;
    rung_.notify_all();
}

std::uint64_t ChangeBell::rings() const {
    const std::lock_guard lock(mutex_);
    return rings_;
}

void ChangeBell::waitBeyond(std::uint64_t rings, std::chrono::milliseconds longest) const {
    std::unique_lock lock(mutex_);
    rung_.wait_for(lock, longest, [&] { return isSilenced_ || rings_ > rings; });
}

void ChangeBell::waitForSilence(std::chrono::milliseconds longest) const {
    std::unique_lock lock(mutex_);
    if (longest.count() > 0) rung_.wait_for(lock, longest, [&] { return isSilenced_; });
}

void ChangeBell::silence() {
    const std::lock_guard lock(mutex_);
    isSilenced_ = true;
    rung_.notify_all();
}

bool ChangeBell::isSilenced() const {
    const std::lock_guard lock(mutex_);
    return isSilenced_;
}

}  // namespace appsync
