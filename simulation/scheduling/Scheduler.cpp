#include "simulation/scheduling/Scheduler.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <iterator>
#include <string>
#include <utility>

#include "simulation/scheduling/Chance.h"
#include "simulation/scheduling/Fiber.h"

namespace appsync {
namespace {

constexpr SimulatedTime kDefaultTimeLimit = std::chrono::hours(24);
/// Interleaved: at one switch point of this many the clock jumps although somebody could run.
constexpr std::uint64_t kTimePassesOneIn = 64;
/// With priorities: at one switch point of this many they change, while changes are left.
constexpr std::uint64_t kPriorityChangesOneIn = 32;
/// Priorities begin above this; those that fell behind are below.
constexpr std::uint64_t kMiddlePriority = 1U << 20U;

std::string seconds(SimulatedTime time) {
    return std::to_string(std::chrono::duration_cast<std::chrono::seconds>(time).count()) + " s";
}

[[noreturn]] void endProcess(const std::string& message) {
    std::fprintf(stderr, "simulation: %s\n", message.c_str());
    std::abort();
}

}  // namespace

struct Scheduler::Turn {
    explicit Turn(std::string turnName) : name(std::move(turnName)) {}

    [[nodiscard]] bool isWaiting() const { return static_cast<bool>(condition); }

    std::string name;
    std::unique_ptr<Fiber> fiber;
    std::function<void()> task;
    bool begun = false;
    std::uint64_t priority = 0;  // the highest goes first
    std::string what;            // what it waits for
    std::function<bool()> condition;
    std::optional<SimulatedTime> deadline;
};

void Scheduler::abandon(std::unique_ptr<Turn> turn) {
    // Never destroyed. The task is kept beside its stack because AddressSanitizer may put what a
    // frame holds elsewhere, where leak detection does not look.
    static auto& abandoned = *new std::vector<std::unique_ptr<Turn>>;
    abandoned.push_back(std::move(turn));
}

Scheduler::Scheduler(Scheduling scheduling)
    : scheduling_(std::move(scheduling)),
      chance_(scheduling_.chance ? scheduling_.chance : std::make_shared<Chance>(scheduling_.seed)),
      thread_(std::this_thread::get_id()),
      timeLimit_(kDefaultTimeLimit),
      host_(std::make_unique<Turn>("host")),
      current_(host_.get()),
      changesLeft_(scheduling_.changePoints.value_or(0)),
      lowestPriority_(kMiddlePriority) {
    givePriority(*host_);
    host_->fiber = std::make_unique<Fiber>();
    order_.push_back(host_.get());
}

Scheduler::~Scheduler() { shutDown(); }

const std::string& Scheduler::currentName() const { return current_->name; }

void Scheduler::spawn(std::string name, std::function<void()> task) {
    checkThread();
    if (idleWorkers_.empty()) {
        Turn& created = *workers_.emplace_back(std::make_unique<Turn>(""));
        created.fiber = std::make_unique<Fiber>([this, &created] { workerLoop(created); });
        idleWorkers_.push_back(&created);
    }
    Turn& turn = *idleWorkers_.back();
    idleWorkers_.pop_back();
    turn.name = std::move(name);
    turn.task = std::move(task);
    turn.begun = false;
    givePriority(turn);
    order_.push_back(&turn);
}

void Scheduler::spawnAfter(SimulatedTime delay, std::string name, std::function<void()> task) {
    checkThread();
    const SimulatedTime due = now_ + std::max(delay, SimulatedTime::zero());
    delayed_.emplace(due, Delayed{std::move(name), std::move(task)});
    if (delay <= SimulatedTime::zero()) startDueTasks();
}

void Scheduler::workerLoop(Turn& turn) {
    for (;;) {
        try {
            turn.begun = true;
            turn.task();
        } catch (...) {
            fail(std::current_exception());
        }
        turn.task = nullptr;
        std::erase(order_, &turn);
        idleWorkers_.push_back(&turn);
        yieldTurn();
    }
}

void Scheduler::switchPoint() noexcept {
    checkThread();
    if (!scheduling_.interleaved || broken_) return;
    if (chance_->oneIn(kTimePassesOneIn)) {
        const std::optional<SimulatedTime> event = nextEvent();
        if (event && *event <= timeLimit_) (void)jumpToNextEvent();
    }
    maybeFallBehind();
    switchTo(*chosenTurn());
}

void Scheduler::wait(const std::string& what, std::function<bool()> condition) {
    checkThread();
    if (failure_ == nullptr && (broken_ || condition())) {
        current_->deadline.reset();
        return;
    }
    current_->what = what;
    current_->condition = std::move(condition);
    yieldTurn();
    current_->condition = nullptr;
    current_->deadline.reset();
    if (current_ == host_.get() && failure_ != nullptr) throwFailure();
}

bool Scheduler::waitFor(const std::string& what, SimulatedTime timeout,
                        const std::function<bool()>& condition) {
    const SimulatedTime left = SimulatedTime::max() - now_;
    current_->deadline = now_ + std::min(std::max(timeout, SimulatedTime::zero()), left);
    wait(what, condition);
    return condition();
}

void Scheduler::runUntilIdle() {
    if (current_ != host_.get()) throw SimulationFailure("only the host may run the others");
    wait("everybody else", [this] { return !othersRunnable(); });
}

void Scheduler::advance(SimulatedTime duration) {
    const SimulatedTime target = now_ + duration;
    runUntilIdle();
    for (auto event = nextEvent(); event && *event <= target && !broken_; event = nextEvent()) {
        if (!jumpToNextEvent()) {
            failStandstill();
            throwFailure();
        }
        runUntilIdle();
    }
    now_ = std::max(now_, target);
}

bool Scheduler::isRunnable(const Turn& turn) const {
    return !turn.isWaiting() || (turn.deadline && *turn.deadline <= now_) || turn.condition();
}

bool Scheduler::othersRunnable() const {
    return std::any_of(order_.begin(), order_.end(), [this](const Turn* turn) {
        return turn != host_.get() && isRunnable(*turn);
    });
}

/// Of those that can run, the one of the highest priority, or whoever the seed says.
Scheduler::Turn* Scheduler::chosenTurn() {
    std::vector<Turn*> runnable;
    std::copy_if(order_.begin(), order_.end(), std::back_inserter(runnable),
                 [this](const Turn* turn) { return isRunnable(*turn); });
    if (runnable.empty()) return nullptr;
    if (!scheduling_.changePoints) {
        const auto running = std::find(runnable.begin(), runnable.end(), current_);
        const std::ptrdiff_t goesOn = running != runnable.end() ? running - runnable.begin() : 0;
        return runnable[chance_->below(runnable.size(), static_cast<std::size_t>(goesOn))];
    }
    return *std::max_element(runnable.begin(), runnable.end(), [](const Turn* a, const Turn* b) {
        return a->priority < b->priority;
    });
}

void Scheduler::givePriority(Turn& turn) {
    if (scheduling_.changePoints)
        turn.priority = kMiddlePriority + chance_->below(kMiddlePriority, 0);
}

void Scheduler::maybeFallBehind() {
    if (changesLeft_ == 0 || !chance_->oneIn(kPriorityChangesOneIn)) return;
    --changesLeft_;
    current_->priority = --lowestPriority_;
}

/// Whose turn is next, once the one that runs can not go on; null when nobody's ever is.
Scheduler::Turn* Scheduler::nextTurn() {
    do {
        if (scheduling_.interleaved) {
            if (Turn* turn = chosenTurn()) return turn;
        } else {
            const auto found = std::find_if(order_.begin(), order_.end(),
                                            [this](const Turn* turn) { return isRunnable(*turn); });
            if (found != order_.end()) return *found;
        }
    } while (jumpToNextEvent());
    return nullptr;
}

std::optional<SimulatedTime> Scheduler::nextEvent() const {
    std::optional<SimulatedTime> event;
    if (!delayed_.empty()) event = delayed_.begin()->first;
    for (const Turn* turn : order_) {
        if (!turn->isWaiting() || !turn->deadline || *turn->deadline <= now_) continue;
        event = std::min(event.value_or(*turn->deadline), *turn->deadline);
    }
    return event;
}

bool Scheduler::jumpToNextEvent() {
    const std::optional<SimulatedTime> event = nextEvent();
    if (!event || *event > timeLimit_) return false;
    now_ = std::max(now_, *event);
    startDueTasks();
    return true;
}

void Scheduler::startDueTasks() {
    while (!delayed_.empty() && delayed_.begin()->first <= now_) {
        Delayed due = std::move(delayed_.begin()->second);
        delayed_.erase(delayed_.begin());
        spawn(std::move(due.name), std::move(due.task));
    }
}

void Scheduler::yieldTurn() {
    Turn* next = broken_ ? host_.get() : nextTurn();
    if (next == nullptr) {
        failStandstill();
        next = host_.get();
    }
    switchTo(*next);
}

void Scheduler::failStandstill() {
    const std::string headline = nextEvent()
                                     ? "the clock has passed its limit of " + seconds(timeLimit_) +
                                           " and the end is not in sight"
                                     : "nothing can run any more";
    fail(std::make_exception_ptr(SimulationFailure(standstill(headline))));
}

void Scheduler::switchTo(Turn& next) {
    Turn& previous = *current_;
    const auto position = std::find(order_.begin(), order_.end(), &next);
    std::rotate(position, position + 1, order_.end());
    current_ = &next;
    previous.fiber->switchTo(*next.fiber);
}

std::vector<std::string> Scheduler::blockedTasks() const {
    std::vector<std::string> texts;
    for (const Turn* turn : order_) {
        if (!isRunnable(*turn)) texts.push_back(turn->name + " waits for " + turn->what);
    }
    return texts;
}

std::string Scheduler::standstill(const std::string& headline) const {
    std::string text = headline + " (at " + seconds(now_) + "):";
    for (const std::string& blocked : blockedTasks()) text += " " + blocked + ";";
    text.back() = '.';
    return text;
}

void Scheduler::fail(std::exception_ptr failure) {
    if (failure_ == nullptr && !broken_) failure_ = std::move(failure);
    broken_ = true;
}

void Scheduler::throwFailure() { std::rethrow_exception(std::exchange(failure_, nullptr)); }

void Scheduler::shutDown() {
    broken_ = true;
    const auto neverBegun = std::exchange(delayed_, {});
    for (std::unique_ptr<Turn>& worker : workers_) {
        const bool idle = std::find(order_.begin(), order_.end(), worker.get()) == order_.end();
        if (idle) continue;
        if (worker->begun) {
            abandon(std::move(worker));
        } else {
            worker->task = nullptr;
        }
    }
    order_.assign(1, host_.get());
    if (failure_ == nullptr || std::uncaught_exceptions() > 0) return;
    try {
        throwFailure();
    } catch (const std::exception& failure) {
        endProcess(std::string("a task failed and nobody has waited since: ") + failure.what());
    } catch (...) {
        endProcess("a task threw and nobody has waited since");
    }
}

void Scheduler::checkThread() const {
    if (std::this_thread::get_id() != thread_) {
        endProcess("called on another thread than the one that made it; it has only one");
    }
}

}  // namespace appsync
