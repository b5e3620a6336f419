#pragma once

#include "platform/DevicePolicyService.h"

namespace appsync {

/// No policy: nobody has set anything, so installing and removing are allowed.
class NoPolicy final : public DevicePolicyService {
  public:
    [[nodiscard]] PolicyAnswer effectiveValue(PolicyFeature /*feature*/) override {
        return PolicyAnswer::Unset;
    }
};

}  // namespace appsync
