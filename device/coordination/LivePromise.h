#pragma once

#include <functional>
#include <mutex>
#include <optional>
#include <string>

#include "device/values/PromiseValues.h"

namespace appsync {

/// A promise, alone or attached to a coordinator or a placeholder; every handle on it shares one.
/// Callable on any thread.
class LivePromise {
  public:
    enum class Change { Percent, Path, Complete, Cancelled };
    /// Called after a change, on the thread that made it.
    using Listener = std::function<void(Change)>;

    explicit LivePromise(PromiseValues values) : values_(std::move(values)) {}

    [[nodiscard]] PromiseValues values() const;
    [[nodiscard]] bool isComplete() const { return values().complete; }

    // A change of a promise that was kept, given up or closed does nothing.
    void setPercent(double percent);
    void setPath(const std::string& path);
    void setComplete();
    void cancel();

    /// From now on the listener hears. False when somebody has attached it already.
    [[nodiscard]] bool attach(Listener listener);
    /// It was refused after all.
    void detach();
    /// What it was attached to is gone: it keeps its values.
    void close();

    /// The values, where they have changed since the last call.
    [[nodiscard]] std::optional<PromiseValues> takeChanged();

  private:
    void change(Change what, const std::function<void(PromiseValues&)>& edit);

    mutable std::mutex mutex_;
    // Protected by mutex_.
    PromiseValues values_;
    Listener listener_;
    bool attached_ = false;
    bool closed_ = false;
    bool changed_ = true;
};

}  // namespace appsync
