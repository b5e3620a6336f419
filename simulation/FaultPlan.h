#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "simulation/recording/Recorder.h"

namespace appsync {

class Chance;
class SimulatedPlatform;

/// How long a fault lasts.
enum class FaultExtent {
    Once,
    /// Every later call of the same name fails too, in the same way.
    SameCall,
    /// Every later call that can fail does, in the first of its ways.
    Everything,
};

/// Lets calls across platform/ fail, each in the ways that its contract allows and no other. Calls
/// that cannot fail (queues, the transaction log, progress records ...) never do.
///
/// As long as it lives it counts the calls that can fail. A first run without a fault tells how
/// many there are and in how many ways; then each can be made to fail in a run of its own.
///
///     FaultPlan plan(platform);
///     plan.failAt(17, 0, FaultExtent::Once);
class FaultPlan : public CallInterceptor {
  public:
    /// A call that could fail.
    struct Opportunity {
        std::string call;  // "FileSystem.moveItem"
        std::size_t ways = 0;
    };

    /// The platform is only borrowed, and outlives the plan.
    explicit FaultPlan(SimulatedPlatform& platform);
    ~FaultPlan() override;

    FaultPlan(const FaultPlan&) = delete;
    FaultPlan& operator=(const FaultPlan&) = delete;

    /// The call of this number (the first is 0) among those that can fail does, in one of its ways.
    void failAt(std::size_t call, std::size_t way, FaultExtent extent);
    /// From now on one call of `oneIn` fails, in a way that is drawn too; none does at rest.
    void failSometimes(std::shared_ptr<Chance> chance, std::uint64_t oneIn);
    void failSometimes(std::uint64_t seed, std::uint64_t oneIn);
    /// Nothing fails any more; what was armed and not met is taken back.
    void stop();

    [[nodiscard]] const std::vector<Opportunity>& opportunities() const { return opportunities_; }
    /// What has failed, in order: "FileSystem.moveItem(/a, /b): no space".
    [[nodiscard]] const std::vector<std::string>& injected() const { return injected_; }
    /// Whether something of this beginning has failed: "FileSystem.removeItem(/var".
    [[nodiscard]] bool hasInjected(std::string_view beginning) const;

    std::optional<ErrorRecord> willCall(const RecordEntry& entry) override;
    void didCall() override;

    /// One way in which a call can fail.
    struct Way;

  private:
    struct Aim {
        std::size_t call = 0;
        std::size_t way = 0;
        FaultExtent extent = FaultExtent::Once;
    };

    [[nodiscard]] std::optional<std::size_t> wayOf(const std::string& name, std::size_t ways);
    std::optional<ErrorRecord> inject(const RecordEntry& entry, const Way& way);

    SimulatedPlatform& platform_;
    std::optional<Aim> aim_;
    std::string aimedAt_;  // the name of the call of the aim, once it was met
    std::shared_ptr<Chance> chance_;
    std::uint64_t oneIn_ = 0;
    const Way* pending_ = nullptr;  // what is to be undone when the call is over
    std::size_t denials_ = 0;
    std::vector<Opportunity> opportunities_;
    std::vector<std::string> injected_;
};

}  // namespace appsync
