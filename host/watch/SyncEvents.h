#pragma once

#include <chrono>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <vector>

#include "host/plan/SyncPlan.h"

namespace appsync {

enum class SyncEventKind { Started, Progress, Waiting, Ended };
enum class SyncPhase { Prepare, Remove, Transfer, Install };
enum class SyncState { Active, Waiting, Finished, Failed };

[[nodiscard]] std::string_view nameOf(SyncEventKind kind);
[[nodiscard]] std::string_view nameOf(SyncPhase phase);
[[nodiscard]] std::string_view nameOf(SyncState state);

/// Something that happened to one application in a session, or before it to all of them.
struct SyncEvent {
    SyncEventKind kind = SyncEventKind::Started;
    SyncPhase phase = SyncPhase::Transfer;
    /// Empty in the phase that is of all applications: `Prepare`.
    std::string identifier;
    /// Bytes; of a preparation, steps. `done` never passes `total` and never goes back within one
    /// phase of an identifier.
    std::uint64_t done = 0;
    std::uint64_t total = 0;
    SyncState state = SyncState::Active;
    /// When what waits is tried again.
    std::optional<std::chrono::system_clock::time_point> nextTry;
    /// Why it failed, what it waits for, or what is being prepared.
    std::string text;
};

/// What came of a session.
struct SyncSummary {
    std::vector<std::string> requested;
    std::vector<std::string> installed;
    std::vector<std::string> updated;
    std::vector<std::string> removed;
    std::vector<SyncFailure> failed;
    std::vector<PlannedSkip> skipped;
    std::uint64_t bytes = 0;
    double seconds = 0;
    /// Where nothing was to do: that is because all is in step with the library.
    bool bringsInStep = true;
    /// Something that was asked for did not happen.
    bool incomplete = false;
};

/// What a session is to do in all.
struct SyncTotals {
    /// That are to come or to go.
    std::size_t applications = 0;
    /// Of packages that are to travel.
    std::uint64_t bytes = 0;
};

/// Shows a session to whoever started it. One call at a time.
class SyncDisplay {
  public:
    virtual ~SyncDisplay() = default;
    /// Before the first event that is not of the preparation.
    virtual void expect(const SyncTotals&) {}
    /// What goes on before there are events of it.
    virtual void doing(std::string_view) {}
    virtual void show(const SyncEvent& event) = 0;
    /// Something that is no event, for the error stream.
    virtual void complain(std::string_view text) = 0;
    /// The same of what is no failure: people get it with the output.
    virtual void note(std::string_view text) { complain(text); }
    /// The session is over; nothing is shown after this.
    virtual void finish(const SyncSummary& summary) = 0;
    /// It ends before there is a summary: what would be drawn anew goes away.
    virtual void close() {}
    /// Whether it wants to be told, a few times in a second, that time goes by.
    [[nodiscard]] virtual bool isLive() const { return false; }
    virtual void tick() {}
};

/// Brings the events of all threads in one order and hands them to a display. What would make
/// progress go back is raised to what was shown before, what passes the total is cut, and a
/// progress event that shows no new whole per cent is dropped.
class SyncEvents {
  public:
    explicit SyncEvents(SyncDisplay& display) : display_(display) {}
    SyncEvents(const SyncEvents&) = delete;
    SyncEvents& operator=(const SyncEvents&) = delete;
    ~SyncEvents();

    /// Tells a live display from now on that time goes by, on a thread that takes the signals that
    /// this one does: call it when these are seen to.
    void tellOfTime();

    // All that follow are callable on any thread.

    void expect(const SyncTotals& totals);
    void doing(std::string_view what);
    void note(std::string_view text);
    void report(SyncEvent event);
    /// The session is over: whatever comes after this is dropped, another summary too.
    void finish(const SyncSummary& summary);

    // For a thread that cannot wait: nothing is shown where the display has been at work for half a
    // second, as on an output that nobody reads.

    void complainSoon(std::string_view text);
    /// Whether the session has ended for the display, now or before.
    bool finishSoon(const SyncSummary& summary);
    void closeSoon();

  private:
    [[nodiscard]] std::unique_lock<std::mutex> lockSoon();
    void finishLocked(const SyncSummary& summary);
    void tickOn();

    SyncDisplay& display_;
    std::mutex mutex_;
    std::condition_variable over_;  // notified when it ends for the display, or this object does
    // Guarded by mutex_: the last event shown, by phase and identifier.
    std::map<std::pair<SyncPhase, std::string>, SyncEvent> shown_;
    bool isFinished_ = false;  // guarded by mutex_ too
    std::thread ticker_;       // only of a display that is live
};

/// How much of the total is done, in whole per cent, rounded down; 100 when the total is 0.
[[nodiscard]] unsigned percentOf(std::uint64_t done, std::uint64_t total);

}  // namespace appsync
