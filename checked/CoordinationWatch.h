#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

#include "checked/BreachBook.h"

namespace appsync {

class WorkQueues;

/// What the checked handles and observers of one install-coordination service share: whom they
/// tell, and which thread calls the service or is called by it right now.
class CoordinationWatch {
  public:
    CoordinationWatch(std::shared_ptr<BreachBook> book, WorkQueues& queues,
                      std::chrono::nanoseconds patience)
        : book_(std::move(book)), queues_(queues), patience_(patience) {}

    /// A call of the service, for as long as this lives. One that an observer makes meanwhile is to
    /// be answered in time: a service that keeps a lock while it calls answers never.
    class Call {
      public:
        explicit Call(CoordinationWatch& watch);
        ~Call();
        Call(const Call&) = delete;
        Call& operator=(const Call&) = delete;

      private:
        CoordinationWatch& watch_;
        const std::uintptr_t thread_;
        const std::shared_ptr<std::atomic<bool>> isWithinReport_;  // null, or whether it goes on
    };
    /// A call of an observer by the service, for as long as this lives.
    class Report {
      public:
        explicit Report(CoordinationWatch& watch);
        ~Report();
        Report(const Report&) = delete;
        Report& operator=(const Report&) = delete;

      private:
        CoordinationWatch& watch_;
        const std::uintptr_t thread_;
    };

    [[nodiscard]] BreachBook& book() { return *book_; }
    [[nodiscard]] const std::shared_ptr<BreachBook>& sharedBook() const { return book_; }
    /// Whether this thread is in a call of the service that no observer makes.
    [[nodiscard]] bool isCaller();

    /// How often the progress of a promise was set: whoever sees the number that it has made was
    /// alone meanwhile.
    std::atomic<std::uint64_t>& progressChanges() { return progressChanges_; }

  private:
    struct Thread {
        std::size_t calls = 0;
        std::size_t reports = 0;
    };

    /// Null unless an observer makes the call.
    [[nodiscard]] std::shared_ptr<std::atomic<bool>> begin(std::uintptr_t thread);
    void endOne(std::uintptr_t thread, std::size_t Thread::*count);

    const std::shared_ptr<BreachBook> book_;
    WorkQueues& queues_;
    const std::chrono::nanoseconds patience_;
    std::atomic<std::uint64_t> progressChanges_{0};
    std::mutex mutex_;
    std::map<std::uintptr_t, Thread> threads_;  // protected by mutex_
};

}  // namespace appsync
