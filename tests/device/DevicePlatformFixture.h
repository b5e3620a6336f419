#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/LogFacility.h"
#include "platform/Platform.h"
#include "platform/SyncHost.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {

/// A device, and the platform that a client would be made with.
class DevicePlatformFixture : public DeviceFixture {
  protected:
    [[nodiscard]] Platform& platform() {
        if (!platform_) platform_.emplace(device().platform(host_, log_));
        return *platform_;
    }
    /// That of another handle on the device.
    [[nodiscard]] Platform platformOf(Device& other) { return other.platform(host_, log_); }
    void endSession() {
        platform_.reset();
        close();
    }

  private:
    class Host final : public SyncHost {
      public:
        [[nodiscard]] std::string mainBundleIdentifier() const override { return "test"; }
        [[nodiscard]] std::string pluginBundleIdentifier() const override { return "test"; }
        [[nodiscard]] bool isRecoverableError(const ErrorRecord&) const override { return false; }
    };
    class Log final : public LogFacility {
      public:
        void write(const LogMessage&) noexcept override {}
        [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view,
                                                            std::string_view) override {
            return std::make_unique<LogHandle>();
        }
    };

    Host host_;
    Log log_;
    std::optional<Platform> platform_;
};

}  // namespace appsync
