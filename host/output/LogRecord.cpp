#include "host/output/LogRecord.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cstddef>
#include <utility>
#include <variant>

#include "host/console/JsonReading.h"
#include "system/JsonLogFacility.h"

namespace appsync {
namespace {

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

bool isIdentifierCharacter(char character) {
    return std::isalnum(static_cast<unsigned char>(character)) != 0 || character == '-' ||
           character == '_' || character == '.';
}

// What may follow an identifier: the end of a sentence, or of the name of one of its files.
bool endsIdentifier(std::string_view rest) {
    if (rest.starts_with(".zip") || rest.starts_with(".app")) rest.remove_prefix(4);
    if (rest.starts_with('.')) rest.remove_prefix(1);
    return rest.empty() || !isIdentifierCharacter(rest.front());
}

char lowered(char character) {
    return static_cast<char>(std::tolower(static_cast<unsigned char>(character)));
}

bool holdsText(std::string_view text, std::string_view part) {
    const auto found =
        std::search(text.begin(), text.end(), part.begin(), part.end(),
                    [](char left, char right) { return lowered(left) == lowered(right); });
    return found != text.end() || part.empty();
}

}  // namespace

bool namesApplication(std::string_view text, std::string_view identifier) {
    for (std::size_t at = text.find(identifier); at != text.npos;
         at = text.find(identifier, at + 1)) {
        const bool begins = at == 0 || !isIdentifierCharacter(text[at - 1]);
        if (begins && endsIdentifier(text.substr(at + identifier.size()))) return true;
    }
    return false;
}

std::optional<LogRecord> readLogLine(std::string_view line) {
    LogRecord record;
    LineListener listener(record);
    if (!readJson(line, listener)) return std::nullopt;
    return record;
}

bool isWanted(const LogRecord& record, const LogFilter& filter) {
    if (filter.category && record.category != filter.category) return false;
    if (filter.application && !namesApplication(record.message, *filter.application)) return false;
    if (filter.text && !holdsText(record.message, *filter.text)) return false;
    return !filter.level || severityOf(record.level) >= severityOf(*filter.level);
}

std::optional<LogLevel> levelNamed(std::string_view name) {
    const std::size_t rank = severityOf(name);
    if (rank == kSeverity.size()) return std::nullopt;
    return kSeverity.at(rank);
}

}  // namespace appsync
