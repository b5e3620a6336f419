#include "device/coordination/LivePromise.h"

#include <algorithm>
#include <cmath>

namespace appsync {

PromiseValues LivePromise::values() const {
    const std::lock_guard lock(mutex_);
    return values_;
}

void LivePromise::setPercent(double percent) {
    if (std::isnan(percent)) return;
    change(Change::Percent,
           [percent](PromiseValues& values) { values.percent = std::clamp(percent, 0.0, 1.0); });
}

void LivePromise::setPath(const std::string& path) {
    change(Change::Path, [&path](PromiseValues& values) { values.path = path; });
}

void LivePromise::setComplete() {
    change(Change::Complete, [](PromiseValues& values) { values.complete = true; });
}

void LivePromise::cancel() {
    change(Change::Cancelled, [](PromiseValues& values) { values.cancelled = true; });
}

bool LivePromise::attach(Listener listener) {
    const std::lock_guard lock(mutex_);
    if (attached_) return false;
    attached_ = true;
    listener_ = std::move(listener);
    return true;
}

void LivePromise::detach() {
    const std::lock_guard lock(mutex_);
    attached_ = false;
    listener_ = nullptr;
}

void LivePromise::close() {
    const std::lock_guard lock(mutex_);
    closed_ = true;
    listener_ = nullptr;
}

std::optional<PromiseValues> LivePromise::takeChanged() {
    const std::lock_guard lock(mutex_);
    if (!changed_) return std::nullopt;
    changed_ = false;
    return values_;
}

void LivePromise::change(Change what, const std::function<void(PromiseValues&)>& edit) {
    Listener listener;
    {
        const std::lock_guard lock(mutex_);
        if (closed_ || values_.complete || values_.cancelled) return;
        edit(values_);
        changed_ = true;
        listener = listener_;
    }
    if (listener) listener(what);
}

}  // namespace appsync
