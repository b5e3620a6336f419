#include "host/output/SyncDisplays.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <map>
#include <ostream>
#include <string_view>
#include <utility>

#include "host/console/Console.h"
#include "host/console/Text.h"
#include "host/output/JsonSync.h"

namespace appsync {
namespace {

constexpr std::size_t kPhaseWidth = 9;
constexpr std::size_t kNameWidth = 28;
constexpr std::size_t kShortNameWidth = 16;  // what a name is cut to before its phase goes
constexpr std::size_t kTinyNameWidth = 4;    // what it is cut to before it goes altogether
constexpr std::size_t kBarWidth = 20;
constexpr std::size_t kShortBarWidth = 8;

std::string percentText(const SyncEvent& event) {
    return std::to_string(percentOf(event.done, event.total)) + " %";
}

std::string waitText(const SyncEvent& event) {
    std::string text = "waiting: " + event.text;
    if (event.nextTry) text += "; next try at " + formatClock(*event.nextTry);
    return text;
}

std::string stateText(const SyncEvent& event) {
    switch (event.state) {
        case SyncState::Waiting:
            return waitText(event);
        case SyncState::Finished:
            return "done";
        case SyncState::Failed:
            return "failed: " + event.text;
        case SyncState::Active:
            break;
    }
    if (event.kind == SyncEventKind::Started) return "begins";
    return percentText(event) + " (" + formatBytes(event.done) + " of " + formatBytes(event.total) +
           ")";
}

// "com.a, com.b"; on a terminal the first few, and how many more.
std::string enumerated(const std::vector<std::string>& identifiers, bool isForTerminal) {
    constexpr std::size_t kMost = 5;
    const std::size_t shown =
        isForTerminal ? std::min(identifiers.size(), kMost) : identifiers.size();
    std::string text;
    for (std::size_t index = 0; index < shown; ++index) {
        const std::string& name = identifiers[index];
        text += (index == 0 ? "" : ", ") + (name.empty() ? "''" : name);
    }
    if (identifiers.size() == shown) return text;
    return text + " and " + std::to_string(identifiers.size() - shown) + " more";
}

class ConsoleDisplay : public SyncDisplay {
  public:
    explicit ConsoleDisplay(const Console& console) : console_(console) {}
    void complain(std::string_view text) override { console_.complain(text); }

  protected:
    // Errors are no part of the output. One line for each, whatever it befell.
    void complainOfFailures(const SyncSummary& summary) const {
        std::map<std::string_view, std::vector<std::string>> befallen;
        for (const SyncFailure& each : summary.failed) {
            befallen[each.error].push_back(each.identifier);
        }
        for (const SyncFailure& each : summary.failed) {
            const auto found = befallen.find(each.error);
            if (found == befallen.end()) continue;
            console_.complain(enumerated(found->second, console_.isTerminal) + ": " + each.error);
            befallen.erase(found);
        }
    }

    const Console& console_;
};

// A line per event.
class LineDisplay : public ConsoleDisplay {
  public:
    using ConsoleDisplay::ConsoleDisplay;

    void show(const SyncEvent& event) override {
        if (event.phase == SyncPhase::Prepare && !isWorthALine(event)) return;
        console_.out << eventLine(event) << '\n' << std::flush;
    }

    void finish(const SyncSummary& summary) override {
        console_.out << summaryText(summary, console_.isTerminal) << std::flush;
        complainOfFailures(summary);
    }

  private:
    // One for all of it, where it takes long enough for progress.
    bool isWorthALine(const SyncEvent& preparation) {
        return preparation.kind == SyncEventKind::Progress && !std::exchange(hasPrepared_, true);
    }

    bool hasPrepared_ = false;
};

// What has ended scrolls up; what is under way is redrawn below it.
class BarDisplay : public ConsoleDisplay {
  public:
    using ConsoleDisplay::ConsoleDisplay;

    void show(const SyncEvent& event) override {
        const auto drawn = std::find_if(bars_.begin(), bars_.end(), [&](const SyncEvent& bar) {
            return bar.phase == event.phase && bar.identifier == event.identifier;
        });
        erase();
        if (event.kind == SyncEventKind::Ended) {
            if (drawn != bars_.end()) bars_.erase(drawn);
            // Of what was before the first application, nothing is left to be told.
            if (event.phase != SyncPhase::Prepare) {
                console_.out << eventBar(event, barWidth()) << '\n';
            }
        } else if (drawn != bars_.end()) {
            *drawn = event;
        } else {
            bars_.push_back(event);
        }
        draw();
    }

    // The error stream is most often the same terminal.
    void complain(std::string_view text) override {
        erase();
        console_.complain(text);
        draw();
    }

    void finish(const SyncSummary& summary) override {
        erase();
        console_.out << summaryText(summary, console_.isTerminal) << std::flush;
        complainOfFailures(summary);
    }

    void close() override {
        erase();
        console_.out << std::flush;
    }

  private:
    // Some terminals go on to the next line once the last column is filled.
    [[nodiscard]] std::size_t barWidth() const {
        return console_.width > 0 ? console_.width - 1 : 0;
    }

    // From the line's beginning: a terminal has shown what was typed meanwhile, such as "^C".
    void erase() {
        if (drawnLines_ > 0) console_.out << "\r\x1b[" << drawnLines_ << "A\x1b[J";
        drawnLines_ = 0;
    }

    void draw() {
        constexpr std::size_t kMostBars = 12;  // more could be taller than the window
        drawnLines_ = std::min(bars_.size(), kMostBars);
        for (std::size_t index = 0; index < drawnLines_; ++index) {
            console_.out << eventBar(bars_[index], barWidth()) << '\n';
        }
        console_.out << std::flush;
    }

    std::vector<SyncEvent> bars_;
    std::size_t drawnLines_ = 0;
};

class JsonDisplay : public ConsoleDisplay {
  public:
    using ConsoleDisplay::ConsoleDisplay;
    void show(const SyncEvent&) override {}
    void finish(const SyncSummary& summary) override {
        console_.out << jsonText(summary, JsonLayout::Indented) << '\n' << std::flush;
        complainOfFailures(summary);
    }
};

class JsonLinesDisplay : public ConsoleDisplay {
  public:
    using ConsoleDisplay::ConsoleDisplay;
    void show(const SyncEvent& event) override {
        console_.out << jsonText(event) << '\n' << std::flush;
    }
    void finish(const SyncSummary& summary) override {
        console_.out << jsonText(summary, JsonLayout::EventLine) << '\n' << std::flush;
        complainOfFailures(summary);
    }
};

std::string listed(const char* title, const std::vector<std::string>& identifiers,
                   bool isForTerminal) {
    if (identifiers.empty()) return {};
    std::string text = std::string(title) + " " + std::to_string(identifiers.size()) + ":";
    constexpr std::size_t kMost = 20;
    const std::size_t shown =
        isForTerminal ? std::min(identifiers.size(), kMost) : identifiers.size();
    for (std::size_t index = 0; index < shown; ++index) {
        text += " " + printable(identifiers[index]);
    }
    if (identifiers.size() > shown) text += " ...";
    return text + "\n";
}

std::string amountLine(const SyncSummary& summary) {
    std::array<char, 32> seconds{};
    std::snprintf(seconds.data(), seconds.size(), "%.1f", summary.seconds);
    return formatBytes(summary.bytes) + " sent in " + seconds.data() + " s\n";
}

std::string bar(unsigned percent, std::size_t width) {
    const std::size_t filled = percent * width / 100;
    std::array<char, 8> number{};
    std::snprintf(number.data(), number.size(), " %3u %%", percent);
    return "[" + std::string(filled, '#') + std::string(width - filled, '.') + "]" + number.data();
}

std::string cut(const std::string& text, std::size_t width) {
    return displayWidth(text) > width ? fitted(text, width) : text;
}

// When the next try comes is what must not be lost; which application runs, the line says already
// where it is the one that waits.
std::vector<std::string> waitStates(const SyncEvent& event) {
    std::string what = printable(event.text);
    const std::string own = printable(event.identifier) + " ";
    if (what.starts_with(own)) what.replace(0, own.size(), "it ");
    if (!event.nextTry) return {"waiting: " + what, "waiting"};
    const std::string time = formatClock(*event.nextTry);
    return {"waiting: " + what + "; next try at " + time, what + "; next try " + time,
            "next try " + time, time, time.substr(0, time.find(' '))};
}

// What may stand behind the name, from the longest text to the shortest.
std::vector<std::string> barStates(const SyncEvent& event) {
    if (event.state == SyncState::Waiting) return waitStates(event);
    if (event.state == SyncState::Failed) return {"failed"};  // the error stream says why
    const unsigned percent = percentOf(event.done, event.total);
    return {bar(percent, kBarWidth), bar(percent, kShortBarWidth), std::to_string(percent) + " %"};
}

}  // namespace

std::string eventLine(const SyncEvent& event) {
    if (event.phase == SyncPhase::Prepare) return "prepare: " + printable(event.text);
    return std::string(nameOf(event.phase)) + " " + printable(event.identifier) + ": " +
           printable(stateText(event));
}

std::string eventBar(const SyncEvent& event, std::size_t width) {
    std::string bar = fitted(nameOf(event.phase), kPhaseWidth);
    const std::string name =
        printable(event.phase == SyncPhase::Prepare ? event.text : event.identifier);
    const std::vector<std::string> states = barStates(event);
    for (const std::string& state : states) {
        const std::size_t taken = displayWidth(state) + 1;
        if (taken + kPhaseWidth + kShortNameWidth <= width) {
            const std::size_t room = std::min(width - taken - kPhaseWidth, kNameWidth);
            bar.append(fitted(name, room)).append(" ").append(state);
            return bar;
        }
    }
    const std::string& shortest = states.back();
    const std::size_t taken = displayWidth(shortest) + 1;
    if (taken + kTinyNameWidth > width) return cut(shortest, width);
    return fitted(name, std::min(width - taken, kNameWidth)) + " " + shortest;
}

std::string summaryText(const SyncSummary& summary, bool isForTerminal) {
    std::string text = listed("Installed", summary.installed, isForTerminal) +
                       listed("Updated", summary.updated, isForTerminal) +
                       listed("Removed", summary.removed, isForTerminal);
    for (const PlannedSkip& skip : summary.skipped) {
        text += "Skipped " + printable(skip.identifier) + ": " + printable(skip.why) + "\n";
    }
    std::vector<std::string> failed;
    for (const SyncFailure& each : summary.failed) failed.push_back(each.identifier);
    text += listed("Failed", failed, isForTerminal);
    if (text.empty() && summary.requested.empty()) {
        return summary.bringsInStep ? "Nothing to do: all is in step.\n" : "Nothing to do.\n";
    }
    return text + amountLine(summary);
}

std::unique_ptr<SyncDisplay> makeSyncDisplay(SyncDisplayKind kind, const Console& console) {
    switch (kind) {
        case SyncDisplayKind::Json:
            return std::make_unique<JsonDisplay>(console);
        case SyncDisplayKind::JsonLines:
            return std::make_unique<JsonLinesDisplay>(console);
        case SyncDisplayKind::Text:
            break;
    }
    if (console.isTerminal) return std::make_unique<BarDisplay>(console);
    return std::make_unique<LineDisplay>(console);
}

}  // namespace appsync
