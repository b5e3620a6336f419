#pragma once

#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <utility>

#include "platform/InstallProgressRecord.h"

namespace appsync {

/// The progress of an install, in memory: for a registry whose installs begin anew with each
/// process. Callable on any thread.
class MemoryProgressRecord final : public InstallProgressRecord {
  public:
    /// `stateChanged` is called after each change of the state, on the thread that made it and
    /// without a lock: the lists of the installs under way may be others now.
    MemoryProgressRecord(std::string identifier, std::function<void()> stateChanged)
        : identifier_(std::move(identifier)), stateChanged_(std::move(stateChanged)) {}

    [[nodiscard]] std::uint64_t installState() const override { return get(state_); }
    void setInstallState(std::uint64_t state) override {
        if (set(state_, state)) stateChanged_();
    }
    [[nodiscard]] std::uint64_t installPhase() const override { return get(phase_); }
    void setInstallPhase(std::uint64_t phase) override { set(phase_, phase); }
    [[nodiscard]] std::int64_t totalUnitCount() const override { return get(total_); }
    void setTotalUnitCount(std::int64_t count) override { set(total_, count); }
    [[nodiscard]] std::int64_t completedUnitCount() const override { return get(completed_); }
    void setCompletedUnitCount(std::int64_t count) override { set(completed_, count); }
    void cancel() override { setInstallState(kInstallStateCanceled); }
    [[nodiscard]] std::string description() const override {
        const std::lock_guard guard(mutex_);
        return identifier_ + " state=" + std::to_string(state_) +
               " phase=" + std::to_string(phase_) + " " + std::to_string(completed_) + "/" +
               std::to_string(total_);
    }

    /// The install is over, with this state: from now on nothing changes. Does not call back.
    void end(std::uint64_t state) {
        const std::lock_guard guard(mutex_);
        if (!isOver_) state_ = state;
        isOver_ = true;
    }

  private:
    template <typename Value>
    [[nodiscard]] Value get(const Value& value) const {
        const std::lock_guard guard(mutex_);
        return value;
    }
    template <typename Value>
    bool set(Value& value, Value changed) {
        const std::lock_guard guard(mutex_);
        if (!isOver_) value = changed;
        return !isOver_;
    }

    const std::string identifier_;
    const std::function<void()> stateChanged_;
    mutable std::mutex mutex_;
    // Protected by mutex_.
    bool isOver_ = false;
    std::uint64_t state_ = kInstallStateWaiting;
    std::uint64_t phase_ = kInstallPhaseLoading;
    std::int64_t total_ = 0;
    std::int64_t completed_ = 0;
};

}  // namespace appsync
