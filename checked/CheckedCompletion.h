#pragma once

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "checked/BreachBook.h"
#include "checked/Overdue.h"

namespace appsync {

struct ErrorRecord;

/// The completion of a call that passes the first of its calls on. `broken` is told of others, and
/// of none in time.
inline std::function<void(const ErrorRecord*)> checkedCompletion(
    const std::shared_ptr<BreachBook>& book, WorkQueues& queues, std::chrono::nanoseconds patience,
    std::string_view call, std::function<void(const ErrorRecord*)> completion,
    std::function<void(const std::string& seen)> broken) {
    const auto calls = std::make_shared<std::atomic<int>>(0);
    const std::string subject = "the completion of " + std::string(call);
    reportIfOverdue(
        queues, patience / kWaits, [calls] { return *calls == 0; },
        [broken, subject] { broken(subject + " was not called in time"); });
    return [calls, subject, book, call, broken = std::move(broken),
            completion = std::move(completion)](const ErrorRecord* error) {
        if (calls->fetch_add(1) != 0) {
            broken(subject + " was called again");
            return;
        }
        if (error != nullptr) book->checkHasDomain(*error, call);
        completion(error);
    };
}

}  // namespace appsync
