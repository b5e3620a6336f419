#pragma once

// simulation/scheduling: who runs, and what time it is. `Scheduler` (this header) gives turns to
// tasks and to the test, which is the host, in an order that follows from a seed; each task is a
// `Fiber` (Fiber.h: a stack of its own on the one thread). Whatever blocks in the simulation waits
// here, and time passes here only. The lowest room of simulation/: all others wait and wake through
// it, most of them through the recorder. Includes only what fibers need to switch stacks.

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <exception>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace appsync {

class Chance;
class Fiber;

/// The virtual time since the simulation began.
using SimulatedTime = std::chrono::nanoseconds;

/// What the simulation says when the code that it runs breaks a rule of platform/, or gets stuck.
/// Thrown out of the call that the test is in; where that call is in a destructor the process ends
/// with this message.
class SimulationFailure : public std::logic_error {
  public:
    using std::logic_error::logic_error;
};

/// How the tasks of a simulation take turns.
struct Scheduling {
    /// Switch at every call across platform/, chosen by the seed, and now and then let time pass
    /// there; otherwise switch only when the task that runs is blocked or over, and then to the one
    /// whose turn is longest ago.
    bool interleaved = false;
    std::uint64_t seed = 0;
    /// Interleaved: how often the one that runs falls behind all others, chosen by the seed; else
    /// always the same one of those that can run goes first. Nothing: whoever the seed says goes on
    /// at each call.
    std::optional<std::size_t> changePoints = std::nullopt;
    /// Interleaved: what to choose by in place of the seed; at rest the one that runs goes on.
    /// Null: the seed.
    std::shared_ptr<Chance> chance = nullptr;

    [[nodiscard]] static Scheduling runToCompletion() { return {}; }
    [[nodiscard]] static Scheduling seeded(std::uint64_t seed) {
        return {.interleaved = true, .seed = seed};
    }
    /// Few changes of turn: what takes a certain order of a few events to go wrong shows sooner.
    [[nodiscard]] static Scheduling prioritized(std::uint64_t seed, std::size_t changePoints) {
        return {.interleaved = true, .seed = seed, .changePoints = changePoints};
    }
};

/// Runs the host (whoever made the scheduler: the test) and tasks in turns, on one thread and by a
/// virtual clock. What blocks in it blocks only the flow of control that called. Unless
/// interleaved, time stands still while anything can run; then it jumps to the next task or end of
/// a wait.
///
/// The same scheduling and the same calls give the same turns. When nothing can run any more while
/// the host waits, or when the clock passes its limit, the host's wait throws a SimulationFailure
/// that names who waits for what; nothing runs after that, and every later wait returns at once.
class Scheduler {
  public:
    explicit Scheduler(Scheduling scheduling);
    ~Scheduler();

    Scheduler(const Scheduler&) = delete;
    Scheduler& operator=(const Scheduler&) = delete;

    [[nodiscard]] SimulatedTime now() const { return now_; }
    /// The name of the task that runs: "host", or as given to `spawn`.
    [[nodiscard]] const std::string& currentName() const;
    /// Identifies the flow of control that runs.
    [[nodiscard]] const void* current() const { return current_; }

    /// A new task, ready at once, or after `delay`.
    void spawn(std::string name, std::function<void()> task);
    void spawnAfter(SimulatedTime delay, std::string name, std::function<void()> task);

    /// Somebody else may have a turn here. Only when interleaved; never throws.
    void switchPoint() noexcept;

    /// Blocks the caller until the condition holds. `what` names what is waited for. The condition
    /// is asked often, by others; it holds when this returns.
    void wait(const std::string& what, std::function<bool()> condition);
    /// The same for at most `timeout`: whether the condition holds.
    bool waitFor(const std::string& what, SimulatedTime timeout,
                 const std::function<bool()>& condition);

    /// Host only: gives turns until nothing is ready any more. Time stands still.
    void runUntilIdle();
    /// Host only: lets this much time pass, with everything that falls due.
    void advance(SimulatedTime duration);

    /// Who waits for what, one text each: "operation 1 waits for Lock#2".
    [[nodiscard]] std::vector<std::string> blockedTasks() const;
    /// How many delayed tasks have not begun.
    [[nodiscard]] std::size_t delayedTasks() const { return delayed_.size(); }

    /// The clock may not pass this (24 hours at first): what retries for ever gets a failure.
    void setTimeLimit(SimulatedTime limit) { timeLimit_ = limit; }

    /// Breaks off: nothing runs any more. The host's next wait throws the failure.
    void fail(std::exception_ptr failure);
    /// Destroys what has not begun and abandons what has not ended. A failure that no wait has
    /// thrown yet ends the process with its message.
    void shutDown();

  private:
    struct Turn;  // a flow of control and what it waits for
    struct Delayed {
        std::string name;
        std::function<void()> task;
    };

    [[nodiscard]] bool isRunnable(const Turn& turn) const;
    [[nodiscard]] bool othersRunnable() const;
    [[nodiscard]] Turn* nextTurn();
    [[nodiscard]] Turn* chosenTurn();
    void givePriority(Turn& turn);
    void maybeFallBehind();
    [[nodiscard]] std::optional<SimulatedTime> nextEvent() const;
    [[nodiscard]] bool jumpToNextEvent();
    void startDueTasks();
    void yieldTurn();
    void switchTo(Turn& next);
    void failStandstill();
    void throwFailure();
    void workerLoop(Turn& turn);
    static void abandon(std::unique_ptr<Turn> turn);
    void checkThread() const;
    [[nodiscard]] std::string standstill(const std::string& headline) const;

    const Scheduling scheduling_;
    const std::shared_ptr<Chance> chance_;
    const std::thread::id thread_;
    SimulatedTime now_{0};
    SimulatedTime timeLimit_;
    std::unique_ptr<Turn> host_;
    Turn* current_;
    std::vector<Turn*> order_;  // who runs or waits, the one whose turn is longest ago first
    std::vector<std::unique_ptr<Turn>> workers_;
    std::vector<Turn*> idleWorkers_;
    std::multimap<SimulatedTime, Delayed> delayed_;  // equal times: in order of submission
    std::exception_ptr failure_;
    bool broken_ = false;
    std::size_t changesLeft_ = 0;
    std::uint64_t lowestPriority_ = 0;
};

}  // namespace appsync
