#pragma once

namespace appsync {

enum class PolicyFeature { AppInstallationAllowed, AppRemovalAllowed };

/// The policy service's tri-state answer; its numbers.
enum class PolicyAnswer { Unset = 0, Yes = 1, No = 2 };

/// What the device's owner or manager allows. Callable on any thread; never fails.
class DevicePolicyService {
  public:
    virtual ~DevicePolicyService() = default;

    /// The effective value at this moment.
    [[nodiscard]] virtual PolicyAnswer effectiveValue(PolicyFeature feature) = 0;
};

}  // namespace appsync
