#include <array>
#include <chrono>
#include <cstddef>
#include <cstdio>
#include <ostream>
#include <set>
#include <string>
#include <string_view>
#include <utility>

#include <nlohmann/json.hpp>

#include "host/command/file/FileCommands.h"
#include "host/console/Console.h"
#include "host/console/JsonWriting.h"
#include "host/console/Problem.h"
#include "host/console/Table.h"
#include "host/console/Text.h"
#include "host/replay/RecordingReader.h"
#include "host/replay/RecordingText.h"

namespace appsync {
namespace {

using Json = nlohmann::ordered_json;

double recordSecondsOf(const RecordLine& line) {
    return std::chrono::duration<double>(line.time).count();
}

std::string microsecondsOf(const RecordLine& line) {
    constexpr std::size_t kLongest = 40;
    std::array<char, kLongest> text{};
    const int length = std::snprintf(text.data(), text.size(), "%.6f", recordSecondsOf(line));
    return {text.data(), static_cast<std::size_t>(length)};
}

bool isShown(const RecordLine& line, const ShowRecordingArguments& arguments) {
    if (arguments.identifier && !mentions(line, *arguments.identifier)) return false;
    if (arguments.service && serviceOf(line) != *arguments.service) return false;
    if (arguments.thread && line.thread != *arguments.thread) return false;
    if (arguments.from && recordSecondsOf(line) < *arguments.from) return false;
    return !arguments.to || recordSecondsOf(line) <= *arguments.to;
}

const char* recordKindName(RecordKind kind) {
    static constexpr std::array<const char*, 9> kNames = {"call", "host", "run", "callback", "walk",
                                                          "each", "back", "end", "finished"};
    return kNames.at(static_cast<std::size_t>(kind));
}

Json jsonOf(const RecordLine& line) {
    return {{"seconds", recordSecondsOf(line)},
            {"thread", line.thread},
            {"kind", recordKindName(line.kind)},
            {"name", line.name},
            {"object", line.object == 0 ? Json() : Json(line.object)},
            {"arguments", Json(line.arguments)},
            {"answer", Json(line.answer)}};
}

void printLinesAsJson(const RecordedSession& session, const ShowRecordingArguments& arguments,
                      const Console& console) {
    Json lines = Json::array();
    for (const RecordLine& each : session.lines) {
        if (isShown(each, arguments)) lines.push_back(jsonOf(each));
    }
    console.out << indented({{"plugIn", session.plugInVersion},
                             {"process", session.process},
                             {"anonymous", session.isAnonymous},
                             {"cutOff", session.isCutOff},
                             {"lines", std::move(lines)}})
                << '\n';
}

// Who mistypes a service is told which there are.
std::string sayNothingFits(const RecordedSession& session,
                           const ShowRecordingArguments& arguments) {
    std::set<std::string_view> services;
    for (const RecordLine& each : session.lines) services.insert(serviceOf(each));
    services.erase("");
    std::string text = "no line fits, of " + counted(session.lines.size(), "line");
    if (!arguments.service || services.contains(*arguments.service)) return text + "\n";
    constexpr std::size_t kMost = 30;  // more than there are, but for a file that somebody made up
    const char* between = "; what is recorded is of ";
    std::size_t told = 0;
    for (const std::string_view each : services) {
        if (told++ == kMost) return text + ", and more\n";
        text.append(std::exchange(between, ", ")).append(printable(std::string(each)));
    }
    return text + "\n";
}

void printLinesAsTable(const RecordedSession& session, const ShowRecordingArguments& arguments,
                       const Console& console) {
    Table table({"SECONDS", "THREAD", "WHAT"});
    bool isEmpty = true;
    for (const RecordLine& each : session.lines) {
        if (!isShown(each, arguments)) continue;
        isEmpty = false;
        table.add({microsecondsOf(each), std::to_string(each.thread), recordText(each)});
    }
    const bool nothingFits = isEmpty && !session.lines.empty();
    console.out << (nothingFits ? sayNothingFits(session, arguments) : table.textFor(console));
    if (session.isCutOff) console.out << "the recording is cut off: the session went on\n";
}

}  // namespace

int runRecordingShow(const ShowRecordingArguments& arguments, const Console& console) {
    const Result<RecordedSession> session = readRecordingFile(arguments.file);
    if (!session) return console.fail(session.error());
    (arguments.asJson ? printLinesAsJson : printLinesAsTable)(*session, arguments, console);
    return kExitDone;
}

}  // namespace appsync
