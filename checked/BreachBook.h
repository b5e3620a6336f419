#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <mutex>
#include <set>
#include <string>
#include <string_view>

#include "checked/ContractBreach.h"

namespace appsync {

struct ErrorRecord;

/// What the wrappers tell of breaches. Callable on any thread.
class BreachBook {
  public:
    BreachBook(std::function<void(const ContractBreach&)> sink,
               std::function<std::uintptr_t()> currentThread);

    /// Tells the sink, once for each text that was seen.
    void broken(std::string_view header, std::string_view sentence, const std::string& seen);
    /// Breaks Error.h's contract where the error's domain is none of those that are known there.
    void checkDomain(const ErrorRecord& error, std::string_view call);
    /// Breaks it where the error of a service that has a domain of its own has none.
    void checkHasDomain(const ErrorRecord& error, std::string_view call);

    /// Whether somebody else than the plug-in installs, too: the coordination service.
    [[nodiscard]] bool othersInstall() const { return othersInstall_; }
    void noteOthersInstall() { othersInstall_ = true; }

    [[nodiscard]] std::uintptr_t currentThread() const { return currentThread_(); }

  private:
    const std::function<void(const ContractBreach&)> sink_;
    const std::function<std::uintptr_t()> currentThread_;
    std::atomic<bool> othersInstall_{false};
    std::mutex mutex_;
    // Protected by mutex_.
    std::set<std::string, std::less<>> told_;
};

}  // namespace appsync
