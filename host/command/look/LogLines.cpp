#include "host/command/look/LogLines.h"

#include <array>
#include <cctype>
#include <cstddef>
#include <optional>
#include <ostream>
#include <utility>
#include <variant>

#include "host/console/Console.h"
#include "host/console/JsonReading.h"
#include "host/console/Text.h"
#include "system/JsonLogFacility.h"

namespace appsync {
namespace {

// More than a device writes: each of a message's few arguments is cut at 16 KiB.
constexpr std::size_t kLongestLine = std::size_t{1} << 20U;

// From the least to the most severe.
constexpr std::array kSeverity = {LogLevel::Debug, LogLevel::Info, LogLevel::Default,
                                  LogLevel::Error, LogLevel::Fault};

std::size_t severityOf(LogLevel level) {
    std::size_t rank = 0;
    while (rank < kSeverity.size() && kSeverity.at(rank) != level) ++rank;
    return rank;
}

std::size_t severityOf(std::string_view name) {
    std::size_t rank = 0;
    while (rank < kSeverity.size() && nameOf(kSeverity.at(rank)) != name) ++rank;
    return rank;
}

// What the log says of a message; empty where it says nothing, or something else than a text.
struct LogRecord {
    std::string time;
    std::string level;
    std::string message;
    std::optional<std::int64_t> category;
};

std::optional<std::int64_t> wholeNumber(const JsonScalar& value) {
    if (const auto* number = std::get_if<std::int64_t>(&value)) return *number;
    const auto* positive = std::get_if<std::uint64_t>(&value);
    if (positive == nullptr || !std::in_range<std::int64_t>(*positive)) return std::nullopt;
    return static_cast<std::int64_t>(*positive);
}

// Takes a line's members and nothing that lies deeper.
class LineListener final : public JsonListener {
  public:
    explicit LineListener(LogRecord& record) : record_(record) {}

    bool memberBegins(std::string name) override {
        if (depth_ == 1) member_ = std::move(name);
        return true;
    }
    bool scalar(JsonScalar value) override {
        if (depth_ != 1) return depth_ != 0;  // a line is an object
        if (member_ == "category") record_.category = wholeNumber(value);
        auto* text = std::get_if<std::string>(&value);
        std::string* place = placeOf(member_);
        if (text != nullptr && place != nullptr) *place = std::move(*text);
        return true;
    }
    bool objectBegins() override { return ++depth_ != 0; }
    bool arrayBegins() override { return depth_++ != 0; }
    bool containerEnds() override {
        --depth_;
        return true;
    }

  private:
    std::string* placeOf(std::string_view member) {
        if (member == "time") return &record_.time;
        if (member == "level") return &record_.level;
        return member == "message" ? &record_.message : nullptr;
    }

    LogRecord& record_;
    std::string member_;
    std::size_t depth_ = 0;
};

bool isOfIdentifier(char character) {
    return std::isalnum(static_cast<unsigned char>(character)) != 0 || character == '-' ||
           character == '_' || character == '.';
}

// What may follow an identifier: the end of a sentence, or of the name of one of its files.
bool endsIdentifier(std::string_view rest) {
    if (rest.starts_with(".zip") || rest.starts_with(".app")) rest.remove_prefix(4);
    if (rest.starts_with('.')) rest.remove_prefix(1);
    return rest.empty() || !isOfIdentifier(rest.front());
}

bool isWanted(const LogRecord& record, const LogArguments& arguments) {
    if (arguments.category && record.category != arguments.category) return false;
    if (arguments.application && !namesApplication(record.message, *arguments.application)) {
        return false;
    }
    return !arguments.level || severityOf(record.level) >= severityOf(*arguments.level);
}

// The line as it is shown; nothing where it is not wanted, or is no line of a log.
std::optional<std::string> shownLine(const std::string& text, const LogArguments& arguments) {
    LogRecord record;
    LineListener listener(record);
    if (!readJson(text, listener)) return std::nullopt;  // cut off by a crash, for instance
    if (!isWanted(record, arguments)) return std::nullopt;
    if (arguments.asJson) return text;
    const std::string number = record.category ? std::to_string(*record.category) : "-";
    return localTimeOf(record.time) + ' ' + fitted(printable(record.level), 7) + ' ' +
           fitted(number, 2) + ' ' + printable(record.message);
}

}  // namespace

bool namesApplication(std::string_view text, std::string_view identifier) {
    for (std::size_t at = text.find(identifier); at != text.npos;
         at = text.find(identifier, at + 1)) {
        const bool begins = at == 0 || !isOfIdentifier(text[at - 1]);
        if (begins && endsIdentifier(text.substr(at + identifier.size()))) return true;
    }
    return false;
}

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
