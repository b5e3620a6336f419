#include "host/output/SyncDisplays.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cstdio>
#include <map>
#include <ostream>
#include <string_view>
#include <utility>

#include "host/console/Console.h"
#include "host/console/Text.h"
#include "host/output/JsonSync.h"
#include "host/output/TerminalDisplay.h"

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

constexpr std::size_t kFew = 5;  // names that a terminal gets of many

// "com.a, com.b"; of more than are to be shown the first, and how many more.
std::string enumerated(const std::vector<std::string>& identifiers, std::size_t most) {
    const std::size_t shown = std::min(identifiers.size(), most);
    std::string text;
    for (std::size_t index = 0; index < shown; ++index) {
        const std::string& name = identifiers[index];
        text += (index == 0 ? "" : ", ") + (name.empty() ? "''" : name);
    }
    if (identifiers.size() == shown) return text;
    return text + " and " + std::to_string(identifiers.size() - shown) +
           " more, which --verbose names";
}

bool isOfIdentifier(char each) {
    return std::isalnum(static_cast<unsigned char>(each)) != 0 || each == '-' || each == '_';
}

// Whether what stands there is the whole of an identifier, and not a part of a longer one. A dot
// may end a sentence.
bool isWhole(std::string_view text, std::size_t begin, std::size_t length) {
    const std::string_view before = text.substr(0, begin);
    std::string_view after = text.substr(begin + length);
    if (after.starts_with('.')) after.remove_prefix(1);
    const bool goesOn = !after.empty() && isOfIdentifier(after.front());
    return !goesOn && (before.empty() || (before.back() != '.' && !isOfIdentifier(before.back())));
}

// What is alike in the reasons of several applications: each is called by the same name.
std::string likeReason(std::string reason, const std::string& identifier) {
    if (identifier.empty()) return reason;
    constexpr std::string_view kEach = "ID";
    std::size_t found = reason.find(identifier);
    while (found != std::string::npos) {
        const bool isName = isWhole(reason, found, identifier.size());
        if (isName) reason.replace(found, identifier.size(), kEach);
        found = reason.find(identifier, found + (isName ? kEach.size() : identifier.size()));
    }
    return reason;
}

// Those whom one reason befell, in their order; the reasons in the order in which they come first.
struct Befallen {
    std::string reason;  // as it was told of the first
    std::string like;    // as it is of all
    std::vector<std::string> identifiers;

    [[nodiscard]] const std::string& told() const { return identifiers.size() > 1 ? like : reason; }
};

class ReasonGroups {
  public:
    void add(const std::string& reason, const std::string& like, const std::string& identifier) {
        const auto [position, isNew] = places_.try_emplace(like, groups_.size());
        if (isNew) groups_.push_back({reason, like, {}});
        groups_[position->second].identifiers.push_back(identifier);
    }
    [[nodiscard]] const std::vector<Befallen>& groups() const { return groups_; }

  private:
    std::map<std::string, std::size_t> places_;
    std::vector<Befallen> groups_;
};

std::string failureLine(const Befallen& group, bool isCut) {
    const std::size_t count = group.identifiers.size();
    if (!isCut || count <= kFew) return enumerated(group.identifiers, count) + ": " + group.told();
    return std::to_string(count) + " not done: " + group.told() + " (" +
           enumerated(group.identifiers, kFew) + ")";
}

class ConsoleDisplay : public SyncDisplay {
  public:
    explicit ConsoleDisplay(const Console& console, bool isVerbose = false)
        : console_(console), isVerbose_(isVerbose) {}
    void complain(std::string_view text) override { console_.complain(text); }

  protected:
    // Errors are no part of the output.
    void tellFailures(const SyncSummary& summary) const {
        complainOfFailures(summary, console_, isVerbose_);
    }

    const Console& console_;
    const bool isVerbose_;
};

// A line per event.
class LineDisplay : public ConsoleDisplay {
  public:
    using ConsoleDisplay::ConsoleDisplay;

    void show(const SyncEvent& event) override {
        if (event.phase == SyncPhase::Prepare && !isWorthALine(event)) return;
        console_.out << eventLine(event) << '\n' << std::flush;
    }

    void note(std::string_view text) override { console_.out << printable(text) << '\n'; }

    void finish(const SyncSummary& summary) override {
        console_.out << summaryText(summary, console_.isTerminal, isVerbose_) << std::flush;
        tellFailures(summary);
    }

  private:
    // One for all of it, where it takes long enough for progress.
    bool isWorthALine(const SyncEvent& preparation) {
        return preparation.kind == SyncEventKind::Progress && !std::exchange(hasPrepared_, true);
    }

    bool hasPrepared_ = false;
};

class JsonDisplay : public ConsoleDisplay {
  public:
    using ConsoleDisplay::ConsoleDisplay;
    void show(const SyncEvent&) override {}
    void finish(const SyncSummary& summary) override {
        console_.out << jsonText(summary, JsonLayout::Indented) << '\n' << std::flush;
        tellFailures(summary);
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
        tellFailures(summary);
    }
};

std::string listed(const char* title, const std::vector<std::string>& identifiers, bool isCut) {
    if (identifiers.empty()) return {};
    std::string text = std::string(title) + " " + std::to_string(identifiers.size()) + ":";
    constexpr std::size_t kMost = 20;
    const std::size_t shown = isCut ? std::min(identifiers.size(), kMost) : identifiers.size();
    for (std::size_t index = 0; index < shown; ++index) {
        text += " " + printable(identifiers[index]);
    }
    if (identifiers.size() > shown) text += " ...";
    return text + "\n";
}

std::string skippedLine(const std::string& whom, const std::string& why) {
    return "Skipped " + printable(whom) + ": " + printable(why);
}

std::string skippedLines(const std::vector<PlannedSkip>& skipped, bool isCut) {
    std::string text;
    if (!isCut || skipped.size() <= kFew) {
        for (const PlannedSkip& skip : skipped) {
            text += skippedLine(skip.identifier, skip.why) + "\n";
        }
        return text;
    }
    ReasonGroups reasons;
    for (const PlannedSkip& skip : skipped) {
        reasons.add(skip.why, likeReason(skip.why, skip.identifier), skip.identifier);
    }
    for (const Befallen& group : reasons.groups()) {
        const std::size_t count = group.identifiers.size();
        text += count == 1 ? skippedLine(group.identifiers.front(), group.told())
                           : skippedLine(std::to_string(count), group.told()) + " (" +
                                 printable(enumerated(group.identifiers, kFew)) + ")";
        text += "\n";
    }
    return text;
}

std::string amountLine(const SyncSummary& summary) {
    std::array<char, 32> seconds{};
    std::snprintf(seconds.data(), seconds.size(), "%.1f", summary.seconds);
    return formatBytes(summary.bytes) + " sent in " + seconds.data() + " s\n";
}

std::string barOf(unsigned percent, std::size_t width) {
    const std::size_t filled = percent * width / 100;
    std::array<char, 8> number{};
    std::snprintf(number.data(), number.size(), " %3u %%", percent);
    return "[" + std::string(filled, '#') + std::string(width - filled, '.') + "]" + number.data();
}

std::string cut(const std::string& text, std::size_t width, std::string_view cutMark) {
    return displayWidth(text) > width ? fitted(text, width, cutMark) : text;
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
    return {barOf(percent, kBarWidth), barOf(percent, kShortBarWidth),
            std::to_string(percent) + " %"};
}

}  // namespace

std::string eventLine(const SyncEvent& event) {
    if (event.phase == SyncPhase::Prepare) return "prepare: " + printable(event.text);
    return std::string(nameOf(event.phase)) + " " + printable(event.identifier) + ": " +
           printable(stateText(event));
}

std::string eventBar(const SyncEvent& event, std::size_t width, std::string_view cutMark) {
    std::string bar = fitted(nameOf(event.phase), kPhaseWidth);
    const std::string name =
        printable(event.phase == SyncPhase::Prepare ? event.text : event.identifier);
    const std::vector<std::string> states = barStates(event);
    for (const std::string& state : states) {
        const std::size_t taken = displayWidth(state) + 1;
        if (taken + kPhaseWidth + kShortNameWidth <= width) {
            const std::size_t room = std::min(width - taken - kPhaseWidth, kNameWidth);
            bar.append(fittedAtFront(name, room, cutMark)).append(" ").append(state);
            return bar;
        }
    }
    const std::string& shortest = states.back();
    const std::size_t taken = displayWidth(shortest) + 1;
    if (taken + kTinyNameWidth > width) return cut(shortest, width, cutMark);
    return fittedAtFront(name, std::min(width - taken, kNameWidth), cutMark) + " " + shortest;
}

std::string percentBar(unsigned percent, std::size_t width) {
    constexpr std::size_t kWide = 100;
    constexpr std::size_t kNarrow = 36;
    if (width < kNarrow) return std::to_string(percent) + " %";
    return barOf(percent, width < kWide ? kShortBarWidth : kBarWidth);
}

std::string summaryText(const SyncSummary& summary, bool isForTerminal, bool isVerbose) {
    const bool isCut = isForTerminal && !isVerbose;
    std::string text =
        listed("Installed", summary.installed, isCut) + listed("Updated", summary.updated, isCut) +
        listed("Removed", summary.removed, isCut) + skippedLines(summary.skipped, isCut);
    std::vector<std::string> failed;
    failed.reserve(summary.failed.size());
    for (const SyncFailure& each : summary.failed) failed.push_back(each.identifier);
    text += listed("Failed", failed, isCut);
    if (text.empty() && summary.requested.empty()) {
        return summary.bringsInStep ? "Nothing to do: all is in step.\n" : "Nothing to do.\n";
    }
    return text + amountLine(summary);
}

void complainOfFailures(const SyncSummary& summary, const Console& console, bool isVerbose) {
    const bool isCut = console.isTerminal && !isVerbose;
    const bool areMany = summary.failed.size() > kFew;
    ReasonGroups reasons;
    for (const SyncFailure& each : summary.failed) {
        const std::string& like =
            isCut && areMany ? likeReason(each.error, each.identifier) : each.error;
        reasons.add(each.error, like, each.identifier);
    }
    for (const Befallen& group : reasons.groups()) {
        console.complain(failureLine(group, isCut));
    }
}

std::unique_ptr<SyncDisplay> makeSyncDisplay(SyncDisplayKind kind, const Console& console,
                                             bool isVerbose) {
    switch (kind) {
        case SyncDisplayKind::Json:
            return std::make_unique<JsonDisplay>(console);
        case SyncDisplayKind::JsonLines:
            return std::make_unique<JsonLinesDisplay>(console);
        case SyncDisplayKind::Text:
            break;
    }
    if (console.isTerminal) return std::make_unique<TerminalDisplay>(console, isVerbose);
    return std::make_unique<LineDisplay>(console, isVerbose);
}

}  // namespace appsync
