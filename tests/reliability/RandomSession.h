#pragma once

#include <chrono>
#include <cstdint>
#include <random>
#include <string>
#include <vector>

#include "tests/reliability/Demands.h"
#include "tests/reliability/Invariants.h"
#include "tests/reliability/World.h"

namespace appsync {

/// One or two sessions, perhaps after a restore or two, that a seed decides in every respect: what
/// is on the device, in the backup and in the lists, what becomes of each transfer, which
/// applications run, what policy says, what other clients do meanwhile, which calls fail, and who
/// has a turn when.
class RandomSession {
  public:
    explicit RandomSession(std::uint64_t seed);

    /// What was broken; nothing is thrown.
    std::vector<std::string> run();
    /// Everything that crossed platform/, a line each.
    [[nodiscard]] std::vector<std::string> trace() const { return world_.platform.lines(); }
    [[nodiscard]] std::size_t faults() const { return world_.faults.injected().size(); }
    /// How many things the plug-in had to get done.
    [[nodiscard]] std::size_t demands() const { return demands_.count(); }

  private:
    [[nodiscard]] static Scheduling schedulingOf(std::uint64_t seed);
    /// True once in so many times.
    [[nodiscard]] bool oneIn(std::uint64_t count) { return random_() % count == 0; }
    [[nodiscard]] std::string anyIdentifier();
    [[nodiscard]] std::chrono::seconds anyDelay();
    [[nodiscard]] std::chrono::seconds shortDelay();

    void arrange();
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

    std::mt19937_64 random_;
    World world_;
    bool leaves_ = false;  // the host does, in the middle of a session
    Invariants invariants_;
    Demands demands_;
};

}  // namespace appsync
