#pragma once

#include "platform/HomeScreenService.h"

namespace appsync {

/// No home screen: it cannot be reached, and nothing ever runs. The host's icon layout is dropped,
/// assets are asked for in the order of the todo list, and no install waits for an application to
/// end. So this is for devices on which applications do not run while they sync.
class NoHomeScreen final : public HomeScreenService {
  public:
    [[nodiscard]] std::shared_ptr<HomeScreenConnection> blockableConnection() override {
        return nullptr;
    }
    /// `kNoSuchApplication`, upon which the client installs.
    [[nodiscard]] TerminationAssertionResult takeTerminationAssertion(
        const std::string& /*identifier*/, std::uint64_t /*reason*/) override {
        return {};
    }
};

}  // namespace appsync
