#include "host/output/TerminalDisplay.h"

#include <algorithm>
#include <ostream>
#include <utility>

#include "host/console/Console.h"
#include "host/console/LiveLine.h"
#include "host/console/Text.h"
#include "host/output/SyncDisplays.h"

namespace appsync {
namespace {

constexpr std::chrono::milliseconds kBetweenDraws{50};
// With no more than these, each is to be seen.
constexpr std::size_t kFewApplications = 20;
// Of one phase; the summary names them all.
constexpr std::size_t kMostFailures = 10;
constexpr std::size_t kMostBars = 12;

// As many of the pieces as there is room for, in their order; of the first at least the beginning.
std::string joined(const std::vector<std::string>& pieces, std::size_t width,
                   std::string_view cutMark) {
    constexpr std::string_view kBetween = "  ";
    std::string line;
    for (const std::string& piece : pieces) {
        if (line.empty()) {
            line = displayWidth(piece) > width ? fitted(piece, width, cutMark) : piece;
        } else if (displayWidth(line) + kBetween.size() + displayWidth(piece) <= width) {
            line.append(kBetween).append(piece);
        }
    }
    return line;
}

std::string preparationText(const std::string& text, std::size_t width) {
    const std::string whole = "prepare  " + text;
    return displayWidth(whole) <= width ? whole : workWithin(text, width);
}

// Rounded, as it is an estimate.
std::string leftText(std::chrono::seconds left) {
    constexpr std::int64_t kMinute = 60;
    const std::int64_t seconds = left.count();
    if (seconds > 2 * kMinute - 1) {
        return "about " + std::to_string((seconds + kMinute / 2) / kMinute) + " min left";
    }
    const std::int64_t step = seconds > 10 ? 10 : 5;
    return "about " + std::to_string((seconds + step - 1) / step * step) + " s left";
}

bool isSameBar(const SyncEvent& left, const SyncEvent& right) {
    return left.phase == right.phase && left.identifier == right.identifier;
}

}  // namespace

TerminalDisplay::TerminalDisplay(const Console& console, bool isVerbose,
                                 std::function<Clock::time_point()> now)
    : console_(console),
      isVerbose_(isVerbose),
      now_(std::move(now)),
      begin_(now_()),
      drawn_(begin_ - kBetweenDraws) {}

void TerminalDisplay::expect(const SyncTotals& totals) { progress_.expect(totals); }

void TerminalDisplay::doing(std::string_view what) {
    doing_ = what;
    drawSoon();
}

void TerminalDisplay::show(const SyncEvent& event) {
    progress_.add(event, now_());
    noteBar(event);
    const bool hasFailed = event.kind == SyncEventKind::Ended && event.state == SyncState::Failed;
    if (hasFailed && event.phase != SyncPhase::Prepare) tellOfFailure(event);
    const bool isToBeSeen = event.kind != SyncEventKind::Progress &&
                            progress_.totals().applications <= kFewApplications;
    if (isToBeSeen) {
        drawIfTaken();
    } else {
        drawSoon();
    }
}

void TerminalDisplay::noteBar(const SyncEvent& event) {
    const auto bar =
        std::ranges::find_if(bars_, [&](const SyncEvent& each) { return isSameBar(each, event); });
    if (event.kind == SyncEventKind::Ended) {
        if (bar != bars_.end()) bars_.erase(bar);
    } else if (bar != bars_.end()) {
        *bar = event;
    } else {
        bars_.push_back(event);
    }
}

void TerminalDisplay::tellOfFailure(const SyncEvent& event) {
    if (++failures_[event.phase] > kMostFailures && !isVerbose_) return;
    console_.out << erasure() << eventBar(event, lineWidth(), console_.cutMark) << '\n';
    drawIfTaken();
}

// The error stream is most often the same terminal.
void TerminalDisplay::complain(std::string_view text) {
    console_.out << erasure();
    console_.complain(text);
    drawIfTaken();
}

void TerminalDisplay::note(std::string_view text) {
    console_.out << erasure() << printable(text) << '\n';
    drawIfTaken();
}

void TerminalDisplay::finish(const SyncSummary& summary) {
    console_.out << erasure() << summaryText(summary, true, isVerbose_) << std::flush;
    complainOfFailures(summary, console_, isVerbose_);
}

void TerminalDisplay::close() { console_.out << erasure() << std::flush; }

void TerminalDisplay::tick() { drawSoon(); }

// Some terminals go on to the next line once the last column is filled.
std::size_t TerminalDisplay::lineWidth() const {
    const std::size_t width = console_.currentWidth();
    return width > 0 ? width - 1 : 0;
}

// All lines, and the one that the cursor stands in, must be on the screen.
std::size_t TerminalDisplay::mostBars() const {
    constexpr std::size_t kOtherLines = 2;
    const std::size_t height = console_.height;
    return height > kOtherLines ? std::min(kMostBars, height - kOtherLines) : 1;
}

std::string TerminalDisplay::elapsed() const {
    return formatDuration(std::chrono::duration_cast<std::chrono::seconds>(now_() - begin_));
}

std::vector<std::string> TerminalDisplay::preparationPieces() const {
    const auto preparation = std::ranges::find(bars_, SyncPhase::Prepare, &SyncEvent::phase);
    if (preparation == bars_.end())
        return {doing_.empty() ? "working" : printable(doing_), elapsed()};
    return {preparationText(printable(preparation->text), lineWidth()),
            percentBar(percentOf(preparation->done, preparation->total), lineWidth()), elapsed()};
}

std::vector<std::string> TerminalDisplay::progressPieces() const {
    const SyncTotals& totals = progress_.totals();
    const Clock::time_point time = now_();
    std::vector<std::string> pieces{
        percentBar(progress_.percent(), lineWidth()),
        std::to_string(progress_.applications()) + " of " + std::to_string(totals.applications)};
    if (totals.bytes > 0) {
        pieces.push_back(formatBytes(progress_.bytes()) + " of " + formatBytes(totals.bytes));
    }
    const bool isWaiting = !bars_.empty() && std::ranges::all_of(bars_, [](const SyncEvent& bar) {
        return bar.state == SyncState::Waiting;
    });
    const auto left = progress_.left(time);
    if (left && !isWaiting) pieces.push_back(leftText(*left));
    pieces.push_back(elapsed());
    if (const auto rate = progress_.rate(time)) pieces.push_back(formatBytes(*rate) + "/s");
    return pieces;
}

std::string TerminalDisplay::headLine() const {
    const bool isPreparing = progress_.totals().applications == 0 ||
                             std::ranges::any_of(bars_, [](const SyncEvent& bar) {
                                 return bar.phase == SyncPhase::Prepare;
                             });
    return joined(isPreparing ? preparationPieces() : progressPieces(), lineWidth(),
                  console_.cutMark);
}

std::vector<std::string> TerminalDisplay::lines() const {
    std::vector<std::string> lines{headLine()};
    for (const SyncEvent& bar : bars_) {
        if (bar.phase == SyncPhase::Prepare) continue;
        if (lines.size() > mostBars()) break;
        lines.push_back(eventBar(bar, lineWidth(), console_.cutMark));
    }
    return lines;
}

void TerminalDisplay::drawSoon() {
    if (now_() - drawn_ >= kBetweenDraws) drawIfTaken();
}

void TerminalDisplay::drawIfTaken() {
    if (console_.takesMore()) draw();
}

// From the line's beginning: a terminal has shown what was typed meanwhile, such as "^C".
std::string TerminalDisplay::erasure() {
    const std::size_t count = std::exchange(drawnLines_, 0);
    return count > 0 ? "\r\x1b[" + std::to_string(count) + "A\x1b[J" : "";
}

void TerminalDisplay::draw() {
    std::string text = erasure();
    for (const std::string& line : lines()) {
        text += line + "\n";
        ++drawnLines_;
    }
    console_.out << text << std::flush;
    drawn_ = now_();
}

}  // namespace appsync
