#include "host/replay/ReplayRun.h"

#include <algorithm>
#include <limits>

#include "host/console/Problem.h"
#include "host/replay/RecordingText.h"

namespace appsync {
namespace {

using ParsedJson = nlohmann::json;

constexpr std::size_t kShownBefore = 10;

/// An answer or arguments as the recording would have them.
ParsedJson jsonOf(const RecordText& text) { return ParsedJson::parse(text.text(), nullptr, false); }

bool sharesText(const ParsedJson& one, const ParsedJson& other) {
    if (one.is_structured()) {
        return std::any_of(one.begin(), one.end(),
                           [&](const ParsedJson& each) { return sharesText(each, other); });
    }
    if (!one.is_string()) return false;
    if (other.is_structured()) {
        return std::any_of(other.begin(), other.end(),
                           [&](const ParsedJson& each) { return sharesText(one, each); });
    }
    return one == other;
}

}  // namespace

ReplayRun::ReplayRun(const RecordedSession& session, bool isStrict)
    : session_(session),
      isStrict_(isStrict),
      values_(session.contents),
      consumed_(session.lines.size()),
      begun_(session.lines.size()) {
    scheduler_.setTimeLimit(SimulatedTime::max());
}

RecordText ReplayRun::newText() const {
    RecordText text(nullptr, std::numeric_limits<std::size_t>::max());
    text.setAliases(&values_.aliases());
    return text;
}

ReplayOutcome ReplayRun::run(const std::function<void(const RecordLine& line)>& host) {
    scheduler_.spawn("host", [this, &host] {
        for (std::size_t i = 0; i < session_.lines.size(); ++i) {
            if (session_.lines[i].kind != RecordKind::Host) continue;
            beginStretch(i);
            host(session_.lines[i]);
        }
        flows_.erase(scheduler_.current());
    });
    deliver();
    for (;;) {
        scheduler_.runUntilIdle();
        if (outcome_.divergence || outcome_.damage || position_ == session_.lines.size()) break;
        if (!isStrict_ && letOneComeEarly()) continue;
        std::string waits;
        for (const std::string& each : scheduler_.blockedTasks()) {
            if (!each.starts_with("host waits for everybody")) waits += "; " + each;
        }
        noteDivergence(position_, "nothing" + waits);
        break;
    }
    outcome_.lines = static_cast<std::size_t>(std::count(consumed_.begin(), consumed_.end(), true));
    return outcome_;
}

bool ReplayRun::isLeftOver() const {
    return outcome_.divergence || outcome_.damage || session_.isCutOff || !items_.empty() ||
           !completions_.empty() || !flows_.empty();
}

/// The next line of the stretch that runs. Where the recording is cut off nothing comes back.
std::size_t ReplayRun::nextLine(const std::string& came) {
    Flow& here = flow();
    if (here.empty()) {
        const std::size_t last = session_.lines.size() - 1;
        diverge(std::min(position_, last), came);
    }
    const Cursor& cursor = here.back();
    const std::vector<std::size_t>& lines = session_.stretches[cursor.stretch].lines;
    if (cursor.next == lines.size()) park();
    return lines[cursor.next];
}

const RecordLine& ReplayRun::match(std::string_view name, std::uint64_t object,
                                   const RecordText& text, bool isNumbered) {
    ParsedJson arguments = jsonOf(text);
    const std::string came = callText(name, object, arguments);
    const std::size_t index = nextLine(came);
    const RecordLine& expected = session_.lines[index];
    awaitTurn(index);
    if (isNumbered && !expected.arguments.empty()) arguments.push_back(expected.arguments.back());
    const bool isSame = expected.kind == RecordKind::Call && expected.name == name &&
                        expected.object == object && expected.arguments == arguments;
    if (!isSame) diverge(index, came);
    if (isNumbered && (arguments.empty() || !arguments.back().is_number_unsigned())) {
        giveUp(expected, "it lacks a number");
    }
    values_.remember(text.contents());
    ++flow().back().next;
    consume(index);
    return expected;
}

/// A call that was over late is so again, when what others had done by then is done.
void ReplayRun::comeBack() {
    const Flow& here = flow();
    if (here.empty()) return;
    const Cursor& cursor = here.back();
    const std::vector<std::size_t>& lines = session_.stretches[cursor.stretch].lines;
    if (cursor.next == lines.size()) return;
    const std::size_t index = lines[cursor.next];
    if (session_.lines[index].kind != RecordKind::Back) return;
    awaitTurn(index);
    ++flow().back().next;
    consume(index);
}

void ReplayRun::awaitTurn(std::size_t line) {
    waiting_[scheduler_.current()] = line;
    scheduler_.wait("line " + std::to_string(line + 2), [this, line] {
        const bool isEnded = outcome_.divergence || outcome_.damage;
        return !isEnded && (position_ == line || early_ == line);
    });
    waiting_.erase(scheduler_.current());
}

void ReplayRun::consume(std::size_t line) {
    consumed_[line] = true;
    if (early_ == line) early_.reset();
    std::deque<std::size_t>& recent = recent_[session_.lines[line].thread];
    recent.push_back(line);
    if (recent.size() > kShownBefore) recent.pop_front();
    while (position_ < consumed_.size() && consumed_[position_]) ++position_;
    deliver();
}

void ReplayRun::beginStretch(std::size_t line) {
    awaitTurn(line);
    consume(line);
    flow().push_back({session_.lines[line].begins, 0});
}

void ReplayRun::endStretch(const RecordText* answer) {
    const ParsedJson given = answer != nullptr ? jsonOf(*answer) : ParsedJson();
    RecordLine end;
    end.kind = RecordKind::End;
    end.answer = given;
    const std::string came = recordText(end);
    const std::size_t index = nextLine(came);
    const RecordLine& expected = session_.lines[index];
    awaitTurn(index);
    if (expected.kind != RecordKind::End || expected.answer != given) diverge(index, came);
    Flow& here = flow();
    here.pop_back();
    consume(index);
}

/// Has what the next line begins begin, where that is not the host's nor the plug-in's to do.
void ReplayRun::deliver() {
    if (position_ == session_.lines.size() || begun_[position_]) return;
    const RecordLine& line = session_.lines[position_];
    if (line.kind == RecordKind::Finished) {
        begun_[position_] = true;
        consumed_[position_++] = true;
        return;
    }
    const bool isItem = line.kind == RecordKind::Run && items_.contains(line.object);
    if (isItem || line.kind == RecordKind::Callback) {
        begun_[position_] = true;
        begin(position_);
    }
}

void ReplayRun::begin(std::size_t index) {
    const RecordLine& line = session_.lines[index];
    const std::string number = std::to_string(line.object);
    if (line.kind == RecordKind::Run) {
        const auto task = std::make_shared<Task>(std::move(items_.at(line.object)));
        items_.erase(line.object);
        return spawn("item " + number, index, [this, task, item = line.object] {
            (*task)();
            *task = nullptr;
            ended_.insert(item);
        });
    }
    spawn("callback of " + number, index, [this, index] { callBack(index); });
}

/// Whoever listens has said so before the line came to be the next, or does so in the same turn.
void ReplayRun::callBack(std::size_t index) {
    const RecordLine& line = session_.lines[index];
    if (const auto completion = completions_.extract(line.object)) {
        completion.mapped()(line);
    } else if (const auto found = callbacks_.find(line.object); found != callbacks_.end()) {
        const Callback callback = found->second;
        callback(line);
    } else {
        diverge(index, "nobody listens as #" + std::to_string(line.object));
    }
}

void ReplayRun::spawn(const std::string& name, std::size_t line, std::function<void()> body) {
    scheduler_.spawn(name, [this, line, body = std::move(body)] {
        beginStretch(line);
        body();
        endStretch(nullptr);
        flows_.erase(scheduler_.current());
    });
}

void ReplayRun::listen(std::uint64_t number, Callback callback) {
    callbacks_[number] = std::move(callback);
    comeBack();
}

void ReplayRun::complete(std::uint64_t number, Callback callback) {
    completions_[number] = std::move(callback);
    comeBack();
}

void ReplayRun::queue(std::uint64_t item, Task task) {
    items_[item] = std::move(task);
    deliver();
    comeBack();
}

bool ReplayRun::isOn(std::uint64_t item) {
    const Flow& here = flow();
    if (here.empty()) return false;
    const RecordLine& begins = session_.lines[session_.stretches[here.front().stretch].beginning];
    return begins.kind == RecordKind::Run && begins.object == item;
}

void ReplayRun::runHere(std::uint64_t item, const Task& task) {
    const auto run = session_.runs.find(item);
    if (run == session_.runs.end()) park();
    beginStretch(run->second);
    task();
    endStretch(nullptr);
    comeBack();
}

void ReplayRun::walk(std::string_view name, const RecordText& arguments,
                     const std::function<bool(const RecordLine& piece)>& piece) {
    const ParsedJson given = jsonOf(arguments);
    const std::string came = callText(name, 0, given);
    const std::size_t index = nextLine(came);
    const RecordLine& expected = session_.lines[index];
    awaitTurn(index);
    const bool isSame =
        expected.kind == RecordKind::Walk && expected.name == name && expected.arguments == given;
    if (!isSame) diverge(index, came);
    ++flow().back().next;
    consume(index);
    flow().push_back({expected.begins, 0});
    for (;;) {
        const std::size_t next = nextLine("");
        if (session_.lines[next].kind != RecordKind::Each) break;
        ++flow().back().next;
        beginStretch(next);
        RecordText stop = newText();
        stop.add(piece(session_.lines[next]));
        endStretch(&stop);
    }
    endStretch(nullptr);
}

/// What has the same number, or shares a text, is or may be about the same thing.
bool ReplayRun::touches(const RecordLine& one, const RecordLine& other) const {
    if (one.thread == other.thread) return true;
    if (one.object != 0 && one.object == other.object) return true;
    return sharesText(one.arguments, other.arguments);
}

/// The lines that flows wait for, and those at which items that are queued begin; in order.
std::vector<std::size_t> ReplayRun::waitedFor() const {
    std::vector<std::size_t> lines;
    lines.reserve(waiting_.size() + items_.size());
    for (const auto& [flow, line] : waiting_) lines.push_back(line);
    for (const auto& [item, task] : items_) {
        const auto run = session_.runs.find(item);
        if (run != session_.runs.end()) lines.push_back(run->second);
    }
    std::sort(lines.begin(), lines.end());
    return lines;
}

/// When nobody goes on in the recorded order: has the first one that waits for a later line go on,
/// if that touches none of those that it overtakes.
bool ReplayRun::letOneComeEarly() {
    if (early_) return false;
    for (const std::size_t line : waitedFor()) {
        bool isFree = true;
        for (std::size_t i = position_; i < line && isFree; ++i) {
            isFree = consumed_[i] || !touches(session_.lines[i], session_.lines[line]);
        }
        if (!isFree) continue;
        early_ = line;
        const bool isItem = session_.lines[line].kind == RecordKind::Run &&
                            items_.contains(session_.lines[line].object);
        if (isItem && !begun_[line]) {
            begun_[line] = true;
            begin(line);
        }
        return true;
    }
    return false;
}

void ReplayRun::noteDivergence(std::size_t expected, const std::string& came) {
    if (outcome_.divergence || outcome_.damage) return;
    const RecordLine& line = session_.lines[expected];
    Divergence divergence{line.thread, recordText(line), came, {}};
    divergence.before.reserve(kShownBefore);
    for (const std::size_t each : recent_[line.thread]) {
        divergence.before.push_back(recordText(session_.lines[each]));
    }
    outcome_.divergence = std::move(divergence);
}

void ReplayRun::diverge(std::size_t expected, const std::string& came) {
    noteDivergence(expected, came);
    park();
}

void ReplayRun::giveUp(const RecordLine& line, const std::string& why) {
    const auto number = static_cast<std::size_t>(&line - session_.lines.data()) + 2;
    if (!outcome_.divergence && !outcome_.damage) {
        outcome_.damage =
            unusable("line " + std::to_string(number) + " of the recording is damaged: " + why,
                     "record the session again");
    }
    park();
}

void ReplayRun::park() {
    for (;;) scheduler_.wait("the end of the replay", [] { return false; });
}

}  // namespace appsync
