#pragma once

#include <memory>
#include <string>
#include <string_view>

#include "platform/LogFacility.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// A log of one subsystem and category.
class SimulatedLogHandle : public LogHandle {
  public:
    SimulatedLogHandle(std::string_view subsystem, std::string_view category)
        : text_(std::string(subsystem) + "/" + std::string(category)) {}
    /// "subsystem/category".
    [[nodiscard]] const std::string& text() const { return text_; }

  private:
    const std::string text_;
};

/// Renders messages into the recording.
class SimulatedLogFacility : public LogFacility {
  public:
    explicit SimulatedLogFacility(Recorder& recorder) : recorder_(recorder) {}

    void write(const LogMessage& message) noexcept override;
    [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view subsystem,
                                                        std::string_view category) override;

  private:
    Recorder& recorder_;
};

}  // namespace appsync
