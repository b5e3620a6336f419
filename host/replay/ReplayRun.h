#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "host/replay/RecordingReader.h"
#include "host/replay/Replay.h"
#include "host/replay/ReplayValues.h"
#include "platform/WorkQueues.h"
#include "recording/RecordText.h"
#include "simulation/scheduling/Scheduler.h"

namespace appsync {

/// Has the plug-in do again what a recording tells. Each stretch of it is a flow of control on the
/// scheduler; each call that the plug-in makes waits until its line is the next, and is answered by
/// that line. Items of work and callbacks begin when their lines are the next.
///
/// What a call does not find in its place ends the run: that flow, and whatever waits for it, goes
/// no further.
class ReplayRun {
  public:
    /// Called when the line is the next, on a flow of its own.
    using Callback = std::function<void(const RecordLine& line)>;

    ReplayRun(const RecordedSession& session, bool isStrict);
    ReplayRun(const ReplayRun&) = delete;
    ReplayRun& operator=(const ReplayRun&) = delete;
    ~ReplayRun() = default;

    /// Runs to the end: `host` makes the call of a line of the host, and gives its answer.
    ReplayOutcome run(const std::function<void(const RecordLine& line)>& host);
    /// Whether plug-in code may still be called by what is left here.
    [[nodiscard]] bool isLeftOver() const;

    [[nodiscard]] const RecordedSession& session() const { return session_; }
    [[nodiscard]] ReplayValues& values() { return values_; }
    [[nodiscard]] RecordText newText() const;

    /// The line of a call that the plug-in makes, when it is its turn.
    template <typename... Arguments>
    const RecordLine& call(std::string_view name, std::uint64_t object,
                           const Arguments&... arguments) {
        RecordText text = newText();
        text.begin('[');
        (text.add(arguments), ...);
        text.end(']');
        const RecordLine& line = match(name, object, text, false);
        comeBack();
        return line;
    }
    /// The same of a call whose last argument is a number that the recorder gave: that of an item,
    /// a callback or an observer. It is over when that was handed to one of those below.
    template <typename... Arguments>
    const RecordLine& numberedCall(std::string_view name, std::uint64_t object,
                                   const Arguments&... arguments) {
        RecordText text = newText();
        text.begin('[');
        (text.add(arguments), ...);
        text.end(']');
        return match(name, object, text, true);
    }
    [[nodiscard]] static std::uint64_t numberIn(const RecordLine& line) {
        return line.arguments.back().get<std::uint64_t>();
    }

    /// What the line answers.
    template <typename Answer>
    Answer answer(const RecordLine& line) {
        Answer value{};
        if (!values_.read(line.answer, value)) giveUp(line, "its answer is none of this call");
        return value;
    }
    /// The answer or the arguments, when they are these.
    template <typename... Values>
    void readAll(const RecordLine& line, const nlohmann::json& json, Values&... values) {
        if (!values_.readAll(json, values...)) giveUp(line, "it does not hold what it should");
    }

    /// What the number stands for from now on.
    void listen(std::uint64_t number, Callback callback);
    /// The same of what is called back once.
    void complete(std::uint64_t number, Callback callback);
    void queue(std::uint64_t item, Task task);
    [[nodiscard]] bool isOver(std::uint64_t item) const { return ended_.contains(item); }
    /// Whether the flow that runs is that item's.
    [[nodiscard]] bool isOn(std::uint64_t item);
    /// Runs the task of an item on the flow that runs.
    void runHere(std::uint64_t item, const Task& task);
    /// Answers a call piece by piece: `piece` is given each in turn, and what it answers is
    /// compared.
    void walk(std::string_view name, const RecordText& arguments,
              const std::function<bool(const RecordLine& piece)>& piece);
    /// Blocks the flow that runs.
    void wait(const std::string& what, std::function<bool()> condition) {
        scheduler_.wait(what, std::move(condition));
    }

    /// The stretch that runs here ends, with this answer where there is one to compare.
    void endStretch(const RecordText* answer);
    /// The recording is not what it seemed: nothing more runs.
    [[noreturn]] void giveUp(const RecordLine& line, const std::string& why);

  private:
    struct Cursor {
        std::size_t stretch;
        std::size_t next;
    };
    using Flow = std::vector<Cursor>;

    const RecordLine& match(std::string_view name, std::uint64_t object, const RecordText& text,
                            bool isNumbered);
    [[nodiscard]] Flow& flow() { return flows_[scheduler_.current()]; }
    [[nodiscard]] std::size_t nextLine(const std::string& came);
    void comeBack();
    void beginStretch(std::size_t line);
    void awaitTurn(std::size_t line);
    void consume(std::size_t line);
    void deliver();
    void begin(std::size_t line);
    void callBack(std::size_t line);
    void spawn(const std::string& name, std::size_t line, std::function<void()> body);
    [[nodiscard]] std::vector<std::size_t> waitedFor() const;
    [[nodiscard]] bool letOneComeEarly();
    [[nodiscard]] bool touches(const RecordLine& one, const RecordLine& other) const;
    [[noreturn]] void diverge(std::size_t expected, const std::string& came);
    void noteDivergence(std::size_t expected, const std::string& came);
    [[noreturn]] void park();

    const RecordedSession& session_;
    const bool isStrict_;
    ReplayValues values_;
    Scheduler scheduler_{Scheduling::runToCompletion()};
    ReplayOutcome outcome_;
    std::size_t position_ = 0;  // the next line
    std::optional<std::size_t> early_;
    std::vector<bool> consumed_;
    std::vector<bool> begun_;
    std::map<const void*, Flow> flows_;
    std::map<const void*, std::size_t> waiting_;  // the line that each flow waits for
    std::map<std::uint64_t, Task> items_;
    std::set<std::uint64_t> ended_;
    std::map<std::uint64_t, Callback> callbacks_;
    std::map<std::uint64_t, Callback> completions_;
    std::map<std::uint64_t, std::deque<std::size_t>> recent_;  // of each thread
};

}  // namespace appsync
