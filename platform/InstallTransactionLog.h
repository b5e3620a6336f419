#pragma once

#include <cstdint>
#include <memory>
#include <string_view>

namespace appsync {

class LogHandle;

/// Keeps the steps of installs for those who look into them later. Callable on any thread; never
/// fails visibly. A record may be lost in a crash. Records stand in the order of the calls.
class InstallTransactionLog {
  public:
    virtual ~InstallTransactionLog() = default;

    /// One-time initialisation; a second one changes nothing. The handle is only borrowed.
    virtual void initialize(const LogHandle& handle) = 0;

    /// `logStep`: a step of kind `kind` starts (phase 1, success true) or ends (phase 2).
    virtual void logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase, bool success,
                         std::string_view identifier, std::string_view description) = 0;

    /// `logScenario`: something happened in a scenario. `step` is always 0.
    virtual void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                             std::string_view identifier, std::string_view description) = 0;
};

}  // namespace appsync
