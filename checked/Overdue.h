#pragma once

#include <chrono>
#include <functional>
#include <utility>

#include "platform/WorkQueues.h"

namespace appsync {

/// In how many pieces somebody waits who must not be misled by a leap of time: after a machine has
/// slept, or was kept from running, whatever was due comes late and is not lost.
inline constexpr int kWaits = 8;

/// Reports when something is still overdue at the end of that many waits, of `piece` each. Both
/// functions are called on the queues' threads, or never, where the queues end before.
inline void reportIfOverdue(WorkQueues& queues, std::chrono::nanoseconds piece,
                            std::function<bool()> isOverdue, std::function<void()> report,
                            int waits = kWaits) {
    queues.runAfter(piece, [&queues, piece, isOverdue = std::move(isOverdue),
                            report = std::move(report), waits]() mutable {
        if (!isOverdue()) return;
        if (waits <= 1) {
            report();
        } else {
            reportIfOverdue(queues, piece, std::move(isOverdue), std::move(report), waits - 1);
        }
    });
}

}  // namespace appsync
