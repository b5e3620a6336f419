#include "host/replay/RecordingReader.h"

#include <algorithm>
#include <array>
#include <limits>
#include <set>
#include <utility>

#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "recording/Recording.h"

namespace appsync {
namespace {

using ParsedJson = nlohmann::json;

constexpr std::uint64_t kLargestRecording = std::uint64_t{512} * 1024 * 1024;
constexpr std::size_t kLongestRecordLine = std::size_t{16} * 1024 * 1024;
/// Property lists nest 128 deep, each map in two brackets.
constexpr int kDeepestNesting = 300;

ErrorRecord noRecording(const std::string& what) {
    return unusable("this is no recording: " + what, "give one that --record has written");
}

ErrorRecord damagedRecording(std::size_t line, const std::string& what) {
    return unusable("line " + std::to_string(line) + " of the recording is damaged: " + what,
                    "record the session again");
}

/// How deep brackets nest outside of texts.
int nestingOf(std::string_view line) {
    int depth = 0;
    int deepest = 0;
    bool isInText = false;
    for (std::size_t i = 0; i < line.size(); ++i) {
        const char each = line[i];
        if (isInText) {
            if (each == '\\') ++i;
            if (each == '"') isInText = false;
            continue;
        }
        if (each == '"') isInText = true;
        if (each == '[' || each == '{') deepest = std::max(deepest, ++depth);
        if (each == ']' || each == '}') --depth;
    }
    return deepest;
}

std::optional<ParsedJson> objectIn(std::string_view line) {
    if (nestingOf(line) > kDeepestNesting) return std::nullopt;
    ParsedJson value = ParsedJson::parse(line.begin(), line.end(), nullptr, false);
    if (!value.is_object()) return std::nullopt;
    return value;
}

std::optional<std::uint64_t> memberNumber(const ParsedJson& object, const char* name) {
    const auto found = object.find(name);
    if (found == object.end() || !found->is_number_unsigned()) return std::nullopt;
    return found->get<std::uint64_t>();
}

std::optional<std::string> memberText(const ParsedJson& object, const char* name) {
    const auto found = object.find(name);
    if (found == object.end() || !found->is_string()) return std::nullopt;
    return found->get<std::string>();
}

std::optional<std::string> fromBase64(std::string_view text) {
    static constexpr std::string_view kDigits =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    if (text.size() % 4 != 0) return std::nullopt;
    while (!text.empty() && text.back() == '=') text.remove_suffix(1);
    std::string bytes;
    bytes.reserve(text.size() * 3 / 4);
    std::uint32_t word = 0;
    unsigned bits = 0;
    for (const char each : text) {
        const std::size_t digit = kDigits.find(each);
        if (digit == std::string_view::npos) return std::nullopt;
        word = word << 6U | static_cast<std::uint32_t>(digit);
        bits += 6;
        if (bits < 8) continue;
        bits -= 8;
        bytes += static_cast<char>(word >> bits & 0xFFU);
    }
    return bytes;
}

/// Reads line after line into a session, and holds each against those before it.
class Reading {
  public:
    Status header(const ParsedJson& line) {
        const std::optional<std::uint64_t> version = memberNumber(line, "recording");
        if (!version) return noRecording("its first line is no header");
        if (*version < kOldestRecordingVersion || *version > kRecordingVersion) {
            return unusable("the recording has version " + std::to_string(*version) +
                                ", and this command reads versions " +
                                std::to_string(kOldestRecordingVersion) + " to " +
                                std::to_string(kRecordingVersion),
                            "use the appsync that wrote it");
        }
        const auto plugIn = memberText(line, "plug-in");
        const auto process = memberText(line, "process");
        const auto bundle = memberText(line, "bundle");
        const auto anonymous = line.find("anonymous");
        const bool isWhole =
            plugIn && process && bundle && anonymous != line.end() && anonymous->is_boolean();
        if (!isWhole) return noRecording("its header lacks something");
        session_.plugInVersion = *plugIn;
        session_.process = *process;
        session_.bundle = *bundle;
        session_.isAnonymous = anonymous->get<bool>();
        return {};
    }

    /// What is wrong with the line; empty when nothing is.
    std::string line(ParsedJson& value) {
        if (!session_.isCutOff) return "it comes after the end of the session";
        RecordLine line;
        std::string wrong = readWhoAndWhen(value, line);
        if (wrong.empty()) wrong = readKind(value, line);
        if (wrong.empty()) wrong = nameFormat(line);
        if (wrong.empty()) wrong = keepContents(value);
        if (wrong.empty()) wrong = place(line);
        if (wrong.empty()) session_.lines.push_back(std::move(line));
        return wrong;
    }

    [[nodiscard]] RecordedSession take() { return std::move(session_); }

  private:
    std::string readWhoAndWhen(const ParsedJson& value, RecordLine& line) {
        const std::optional<std::uint64_t> time = memberNumber(value, "t");
        const std::optional<std::uint64_t> thread = memberNumber(value, "w");
        if (!time || !thread) return "it does not say when or by whom";
        if (*time > std::numeric_limits<std::int64_t>::max()) return "its time is none";
        line.time = std::chrono::nanoseconds(static_cast<std::int64_t>(*time));
        line.thread = *thread;
        if (line.time < lastTime_) return "it is older than the line before it";
        lastTime_ = line.time;
        if (line.thread == 0 || line.thread > open_.size() + 1) return "its thread is none";
        if (line.thread > open_.size()) open_.emplace_back();
        return {};
    }

    static std::string readKind(ParsedJson& value, RecordLine& line) {
        static constexpr std::array<std::pair<const char*, RecordKind>, 6> kKinds = {
            {{"call", RecordKind::Call},
             {"host", RecordKind::Host},
             {"run", RecordKind::Run},
             {"callback", RecordKind::Callback},
             {"walk", RecordKind::Walk},
             {"each", RecordKind::Each}}};
        std::size_t kinds = 0;
        for (const auto& [name, kind] : kKinds) {
            if (!value.contains(name)) continue;
            const std::optional<std::string> text = memberText(value, name);
            if (!text) return "its name is none";
            line.kind = kind;
            line.name = *text;
            ++kinds;
        }
        for (const auto& [name, kind] :
             {std::pair("back", RecordKind::Back), std::pair("end", RecordKind::End),
              std::pair("finished", RecordKind::Finished)}) {
            if (!value.contains(name)) continue;
            line.kind = kind;
            ++kinds;
        }
        if (kinds != 1) return "it tells of nothing, or of two things";
        if (value.contains("on")) {
            const std::optional<std::uint64_t> object = memberNumber(value, "on");
            if (!object || *object == 0) return "what it is about has no number";
            line.object = *object;
        }
        if (value.contains("a")) line.arguments = std::move(value["a"]);
        if (!line.arguments.is_array()) return "its arguments are no list";
        if (value.contains("r")) line.answer = std::move(value["r"]);
        return {};
    }

    /// A message whose format was there before has its number in its place.
    std::string nameFormat(RecordLine& line) {
        constexpr std::size_t kPlace = 2;
        const bool isMessage = line.kind == RecordKind::Call && line.name == "LogFacility.write" &&
                               line.arguments.size() > kPlace;
        if (!isMessage) return {};
        ParsedJson& format = line.arguments[kPlace];
        if (format.is_string() && isNumberedFormat(format.get_ref<const std::string&>())) {
            formats_.push_back(format);
        }
        if (!format.is_number_unsigned()) return {};
        const auto number = format.get<std::uint64_t>();
        if (number == 0 || number > formats_.size()) return "its format is none";
        format = formats_[number - 1];
        return {};
    }

    std::string keepContents(const ParsedJson& value) {
        const auto kept = value.find("kept");
        if (kept == value.end()) return {};
        if (!kept->is_array()) return "what it keeps is no list";
        for (const ParsedJson& each : *kept) {
            const std::optional<std::string> text = textIn(each);
            if (!text) return "what it keeps is no text";
            Bytes bytes(text->begin(), text->end());
            const ContentSum sum = sumOf(bytes);
            session_.contents.emplace(sum, std::move(bytes));
        }
        return {};
    }

    /// Finds the stretch that the line belongs to, or begins.
    std::string place(RecordLine& line) {
        std::vector<std::size_t>& open = open_[line.thread - 1];
        const bool isInside = !open.empty();
        switch (line.kind) {
            case RecordKind::Finished:
                session_.isCutOff = false;
                return {};
            case RecordKind::Host:
                if (hostThread_ == 0) hostThread_ = line.thread;
                if (line.thread != hostThread_) return "the host calls on two threads";
                if (isInside) return "the host calls while it is called";
                break;
            case RecordKind::Run:
                return placeRun(line, open);
            case RecordKind::Callback:
                if (line.object == 0) return "it does not say who is called";
                break;
            case RecordKind::Each:
                if (!isInside || !walks(open.back())) return "it is a piece of nothing";
                join(line, open.back());
                break;
            case RecordKind::Call:
            case RecordKind::Walk:
                if (!isInside) return "the plug-in calls and nobody has called it";
                if (walks(open.back())) return "it comes between the pieces of an answer";
                join(line, open.back());
                if (line.kind == RecordKind::Walk) break;
                return noteItem(line);
            case RecordKind::Back:
                if (!isInside || !hasCalled(open.back())) return "it comes back from no call";
                join(line, open.back());
                return {};
            case RecordKind::End:
                if (!isInside) return "it ends what has not begun";
                join(line, open.back());
                open.pop_back();
                return {};
        }
        begin(line, open);
        return {};
    }

    std::string placeRun(RecordLine& line, std::vector<std::size_t>& open) {
        if (items_.erase(line.object) == 0) return "it runs what was not queued";
        session_.runs.emplace(line.object, session_.lines.size());
        begin(line, open);
        return {};
    }

    /// A call that queues an item has its number as the last argument.
    std::string noteItem(const RecordLine& line) {
        static constexpr std::array<std::string_view, 3> kQueueing = {
            "SerialQueue.sync", "OperationQueue.add", "WorkQueues.runAfter"};
        if (std::find(kQueueing.begin(), kQueueing.end(), line.name) == kQueueing.end()) return {};
        if (line.arguments.empty() || !line.arguments.back().is_number_unsigned()) {
            return "what it queues has no number";
        }
        const auto item = line.arguments.back().get<std::uint64_t>();
        const bool isNew = !session_.runs.contains(item) && items_.insert(item).second;
        return isNew ? "" : "it queues again what was queued";
    }

    void begin(RecordLine& line, std::vector<std::size_t>& open) {
        line.begins = session_.stretches.size();
        session_.stretches.push_back({session_.lines.size(), {}});
        open.push_back(line.begins);
    }

    void join(RecordLine& line, std::size_t stretch) {
        line.stretch = stretch;
        session_.stretches[stretch].lines.push_back(session_.lines.size());
    }

    [[nodiscard]] bool walks(std::size_t stretch) const {
        return session_.lines[session_.stretches[stretch].beginning].kind == RecordKind::Walk;
    }

    /// Whether a call was the last of the stretch.
    [[nodiscard]] bool hasCalled(std::size_t stretch) const {
        const std::vector<std::size_t>& lines = session_.stretches[stretch].lines;
        return !lines.empty() && session_.lines[lines.back()].kind == RecordKind::Call;
    }

    RecordedSession session_;
    std::chrono::nanoseconds lastTime_{0};
    std::uint64_t hostThread_ = 0;
    std::vector<std::vector<std::size_t>> open_;  // for each thread, the stretches that go on
    std::set<std::uint64_t> items_;               // that were queued and have not run
    std::vector<ParsedJson> formats_;             // of messages, as they came
};

}  // namespace

std::optional<std::string> textIn(const ParsedJson& value) {
    if (value.is_string()) return value.get<std::string>();
    if (!value.is_object()) return std::nullopt;
    const std::optional<std::string> bytes = memberText(value, "bytes");
    return bytes ? fromBase64(*bytes) : std::nullopt;
}

Result<RecordedSession> readRecording(std::string_view text) {
    Reading reading;
    std::size_t number = 0;
    // A recording grows by zeros, and a kill before its first line leaves nothing else.
    if (text.find_first_not_of('\0') == std::string_view::npos) return noRecording("it is empty");
    while (!text.empty()) {
        const std::size_t length = text.find('\n');
        if (length == std::string_view::npos && number > 0) break;  // the process ended in it
        ++number;
        if (std::min(length, text.size()) > kLongestRecordLine)
            return damagedRecording(number, "it is too long");
        std::optional<ParsedJson> line = objectIn(text.substr(0, length));
        if (number == 1) {
            const Status known =
                line ? reading.header(*line) : noRecording("its first line is no header");
            if (!known) return known.error();
        } else {
            const std::string wrong = line ? reading.line(*line) : "it is no record";
            if (!wrong.empty()) return damagedRecording(number, wrong);
        }
        text.remove_prefix(std::min(length, text.size() - 1) + 1);
    }
    return reading.take();
}

Result<RecordedSession> readRecordingFile(const std::string& path) {
    const Result<Bytes> bytes = readHostFile(path, kLargestRecording);
    if (!bytes) return unusable(bytes.error());
    return readRecording({reinterpret_cast<const char*>(bytes->data()), bytes->size()});
}

}  // namespace appsync
