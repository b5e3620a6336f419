#pragma once

#include <array>
#include <chrono>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "simulation/scheduling/Chance.h"
#include "tests/reliability/Demands.h"
#include "tests/reliability/Invariants.h"
#include "tests/reliability/SessionChanges.h"
#include "tests/reliability/World.h"

namespace appsync {

/// One or two sessions, perhaps after a restore or two, that a seed decides in every respect: what
/// is on the device, in the backup and in the lists, what becomes of each transfer, which
/// applications run, what policy says, what other clients do meanwhile, which calls fail, and who
/// has a turn when.
class RandomSession {
  public:
    explicit RandomSession(std::uint64_t seed, const SessionChanges& changes = {});

    /// What was broken; nothing is thrown.
    std::vector<std::string> run();
    /// Everything that crossed platform/, a line each.
    [[nodiscard]] std::vector<std::string> trace() const { return world_.platform.lines(); }
    [[nodiscard]] std::size_t faults() const { return world_.faults.injected().size(); }
    /// How many things the plug-in had to get done.
    [[nodiscard]] std::size_t demands() const { return demands_.count(); }
    /// How many draws have decided what there is, which calls fail, and who has a turn.
    [[nodiscard]] std::array<std::size_t, 3> draws() const;
    /// The session with all draws named that gave something else than at rest.
    [[nodiscard]] SessionChanges unrest() const;

  private:
    [[nodiscard]] static Scheduling schedulingOf(std::uint64_t seed, std::shared_ptr<Chance> turns);
    /// True once in so many times.
    [[nodiscard]] bool oneIn(std::uint64_t count, bool atRest = false) {
        return choices_.oneIn(count, atRest);
    }
    /// A number below `bound`.
    [[nodiscard]] std::uint64_t any(std::uint64_t bound) { return choices_.below(bound, 0); }
    [[nodiscard]] std::string anyIdentifier();
    [[nodiscard]] std::chrono::seconds anyDelay();
    [[nodiscard]] std::chrono::seconds shortDelay();

    void arrange();
    void arrangeFaults();
    void arrangePolicy();
    void arrangeOffloaded();
    void restore();
    void disturbRestore();
    void restoreAnother(const std::string& identifier, bool isSound);
    void sync();
    std::vector<SyncAssetPointer> assetsToSend();
    [[nodiscard]] PropertyList anyTodoList();
    void disturb();
    void cancelByAnother(const std::string& identifier, std::chrono::seconds delay);
    void transfer(const SyncAssetPointer& asset);
    void transferRestore();
    void loseTransfer(const SyncAssetPointer& asset);
    void runThrowing();

    const SessionChanges changes_;
    Chance choices_;
    std::shared_ptr<Chance> turns_;
    std::shared_ptr<Chance> faultChance_;  // null where nothing fails
    World world_;
    bool leaves_ = false;  // the host does, in the middle of a session
    Invariants invariants_;
    Demands demands_;
};

}  // namespace appsync
