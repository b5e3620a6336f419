#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "host/output/SessionProgress.h"
#include "host/watch/SyncEvents.h"

namespace appsync {

struct Console;

/// A session on a terminal: a line for the whole, with a bar, and below it one for each transfer
/// and install that is under way. What ends well goes away, what fails stays above.
///
/// Before the first event the line says what is being done. It tells, too, for how long the session
/// goes on, so that it never stands still, and is drawn no more often than eyes can follow and the
/// terminal takes it.
class TerminalDisplay : public SyncDisplay {
  public:
    using Clock = SessionProgress::Clock;

    /// The console outlives the display. `now` is the time.
    explicit TerminalDisplay(const Console& console, bool isVerbose = false,
                             std::function<Clock::time_point()> now = Clock::now);

    void expect(const SyncTotals& totals) override;
    void doing(std::string_view what) override;
    void show(const SyncEvent& event) override;
    void complain(std::string_view text) override;
    void note(std::string_view text) override;
    void finish(const SyncSummary& summary) override;
    void close() override;
    [[nodiscard]] bool isLive() const override { return true; }
    void tick() override;

  private:
    void noteBar(const SyncEvent& event);
    void tellOfFailure(const SyncEvent& event);
    [[nodiscard]] std::vector<std::string> lines() const;
    [[nodiscard]] std::string headLine() const;
    [[nodiscard]] std::vector<std::string> preparationPieces() const;
    [[nodiscard]] std::vector<std::string> progressPieces() const;
    [[nodiscard]] std::string elapsed() const;
    [[nodiscard]] std::size_t lineWidth() const;
    [[nodiscard]] std::size_t mostBars() const;
    void drawSoon();
    void drawIfTaken();
    void draw();
    [[nodiscard]] std::string erasure();

    const Console& console_;
    const bool isVerbose_;
    const std::function<Clock::time_point()> now_;
    const Clock::time_point begin_;
    Clock::time_point drawn_;  // when that was
    std::string doing_;
    SessionProgress progress_;
    std::vector<SyncEvent> bars_;  // what is under way
    std::map<SyncPhase, std::size_t> failures_;
    std::size_t drawnLines_ = 0;
};

}  // namespace appsync
