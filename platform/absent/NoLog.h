#pragma once

#include "platform/LogFacility.h"

namespace appsync {

/// No log: messages are dropped, unrendered.
class NoLog final : public LogFacility {
  public:
    void write(const LogMessage& /*message*/) noexcept override {}
    [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view /*subsystem*/,
                                                        std::string_view /*category*/) override {
        return std::make_unique<LogHandle>();
    }
};

}  // namespace appsync
