#include "host/command/look/LogLines.h"

#include <cstddef>
#include <optional>
#include <ostream>
#include <utility>

#include "host/console/Console.h"
#include "host/console/Text.h"
#include "host/output/LogRecord.h"

namespace appsync {
namespace {

// More than a device writes: each of a message's few arguments is cut at 16 KiB.
constexpr std::size_t kLongestLine = std::size_t{1} << 20U;

// The line as it is shown; nothing where it is not wanted, or is no line of a log.
std::optional<std::string> shownLine(const std::string& text, const LogArguments& arguments) {
    const std::optional<LogRecord> record = readLogLine(text);
    if (!record) return std::nullopt;  // cut off by a crash, for instance
    const LogFilter filter{arguments.category, arguments.level, arguments.application};
    if (!isWanted(*record, filter)) return std::nullopt;
    if (arguments.asJson) return text;
    const std::string number = record->category ? std::to_string(*record->category) : "-";
    return localTimeOf(record->time) + ' ' + fitted(printable(record->level), 7) + ' ' +
           fitted(number, 2) + ' ' + printable(record->message);
}

}  // namespace

void LogLines::beginFile(std::string path) {
    path_ = std::move(path);
    begun_.clear();
    isTooLong_ = false;
    number_ = 0;
}

void LogLines::add(std::string_view piece) {
    for (std::size_t end = piece.find('\n'); end != piece.npos; end = piece.find('\n')) {
        addToLine(piece.substr(0, end));
        endLine();
        piece.remove_prefix(end + 1);
    }
    addToLine(piece);
}

void LogLines::showLast() {
    isGathering_ = false;
    for (const std::string& line : last_) console_.out << line << '\n';
    last_.clear();
    console_.out.flush();
}

void LogLines::addToLine(std::string_view piece) {
    isTooLong_ = isTooLong_ || begun_.size() + piece.size() > kLongestLine;
    if (!isTooLong_) begun_ += piece;
}

void LogLines::endLine() {
    ++number_;
    if (isTooLong_) {
        console_.complain("line " + std::to_string(number_) + " of " + path_ +
                          " is left out: it is longer than any that a device writes");
    } else if (std::optional<std::string> line = shownLine(begun_, arguments_)) {
        take(*std::move(line));
    }
    begun_.clear();
    isTooLong_ = false;
}

void LogLines::take(std::string line) {
    if (!isGathering_) {
        console_.out << line << '\n';
        return;
    }
    last_.push_back(std::move(line));
    if (last_.size() > *arguments_.last) last_.pop_front();
}

}  // namespace appsync
