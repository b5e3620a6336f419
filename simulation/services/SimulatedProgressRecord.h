#pragma once

#include <cstdint>
#include <functional>
#include <string>

#include "platform/InstallProgressRecord.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

/// A progress record in memory. Once its install is over it keeps its values and changes no more.
/// Made by SimulatedAppRegistry.
class SimulatedProgressRecord : public InstallProgressRecord {
  public:
    struct Values {
        std::uint64_t state = kInstallStateWaiting;
        std::uint64_t phase = kInstallPhaseLoading;
        std::int64_t total = 0;
        std::int64_t completed = 0;

        friend bool operator==(const Values&, const Values&) = default;
    };

    /// `stateChanged` runs when a caller's change of the state has taken effect.
    SimulatedProgressRecord(Recorder& recorder, std::string identifier,
                            std::function<void()> stateChanged);

    [[nodiscard]] std::uint64_t installState() const override;
    void setInstallState(std::uint64_t state) override;
    [[nodiscard]] std::uint64_t installPhase() const override;
    void setInstallPhase(std::uint64_t phase) override;
    [[nodiscard]] std::int64_t totalUnitCount() const override;
    void setTotalUnitCount(std::int64_t count) override;
    [[nodiscard]] std::int64_t completedUnitCount() const override;
    void setCompletedUnitCount(std::int64_t count) override;
    void cancel() override;
    [[nodiscard]] std::string description() const override;

    // The registry's side, and the test's: not recorded.
    [[nodiscard]] const std::string& identifier() const { return identifier_; }
    [[nodiscard]] const Values& values() const { return values_; }
    void setValues(const Values& values) { values_ = values; }
    [[nodiscard]] bool isOver() const { return over_; }
    /// Ends the install in a state.
    void end(std::uint64_t state);
    /// "com.example.a state=1 phase=0 0/1000".
    [[nodiscard]] std::string text() const;

  private:
    void tell() const;

    Recorder& recorder_;
    const std::string identifier_;
    const std::function<void()> stateChanged_;
    Values values_;
    bool over_ = false;
};

}  // namespace appsync
