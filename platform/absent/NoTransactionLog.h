#pragma once

#include "platform/InstallTransactionLog.h"

namespace appsync {

/// No transaction log: steps and scenarios are forgotten. What happened then stands in the host's
/// log only.
class NoTransactionLog final : public InstallTransactionLog {
  public:
    void initialize(const LogHandle& /*handle*/) override {}
    void logStep(std::uint64_t /*kind*/, std::uint64_t /*party*/, std::uint64_t /*phase*/,
                 bool /*success*/, std::string_view /*identifier*/,
                 std::string_view /*description*/) override {}
    void logScenario(std::string_view /*scenario*/, std::uint64_t /*step*/, bool /*success*/,
                     std::string_view /*identifier*/, std::string_view /*description*/) override {}
};

}  // namespace appsync
