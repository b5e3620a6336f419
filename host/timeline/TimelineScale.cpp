#include "host/timeline/TimelineScale.h"

#include <array>
#include <cstdio>

namespace appsync {
namespace {

constexpr std::size_t kMostTicks = 10;

/// The least step of 1, 2 or 5 of a power of ten, up to a second, and of minutes beyond.
TimelineMoment stepOf(TimelineMoment length) {
    constexpr std::array<std::int64_t, 10> kSeconds = {1, 2, 5, 10, 20, 30, 60, 120, 300, 600};
    const auto isEnough = [&](std::int64_t step) {
        return length.count() / step < static_cast<std::int64_t>(kMostTicks);
    };
    constexpr std::int64_t kSecond = 1'000'000'000;
    for (std::int64_t power = 1; power < kSecond; power *= 10) {
        for (const std::int64_t digit : {1, 2, 5}) {
            if (isEnough(power * digit)) return TimelineMoment(power * digit);
        }
    }
    for (const std::int64_t seconds : kSeconds) {
        if (isEnough(seconds * kSecond)) return TimelineMoment(seconds * kSecond);
    }
    std::int64_t hours = 1;
    while (!isEnough(hours * 3600 * kSecond)) hours *= 2;
    return TimelineMoment(hours * 3600 * kSecond);
}

std::string tickText(TimelineMoment at, TimelineMoment step) {
    constexpr std::size_t kLongest = 40;
    std::array<char, kLongest> text{};
    const double nanoseconds = static_cast<double>(at.count());
    if (at.count() == 0) return "0";
    if (step >= std::chrono::minutes(1)) return durationText(at);
    if (step >= std::chrono::seconds(1)) {
        std::snprintf(text.data(), text.size(), "%.0f s", nanoseconds / 1e9);
    } else if (step >= std::chrono::milliseconds(100)) {
        std::snprintf(text.data(), text.size(), "%.1f s", nanoseconds / 1e9);
    } else if (step >= std::chrono::milliseconds(1)) {
        std::snprintf(text.data(), text.size(), "%.0f ms", nanoseconds / 1e6);
    } else {
        std::snprintf(text.data(), text.size(), "%.3g ms", nanoseconds / 1e6);
    }
    return text.data();
}

}  // namespace

std::vector<TimelineTick> ticksOf(TimelineMoment length) {
    const TimelineMoment step = stepOf(length);
    std::vector<TimelineTick> ticks;
    ticks.reserve(kMostTicks + 1);
    TimelineMoment at{0};
    while (at <= length && ticks.size() <= kMostTicks) {
        ticks.push_back({at, tickText(at, step)});
        at = together(at, step);
    }
    return ticks;
}

}  // namespace appsync
