#include "contract/TestOutcome.h"

#include <algorithm>
#include <initializer_list>
#include <utility>

namespace appsync {
namespace {

// A record is a letter for its kind, and its fields, each followed by a NUL.
constexpr char kSentence = 'S';
constexpr char kFailure = 'F';
constexpr char kSkip = 'K';
constexpr char kEnd = 'E';

std::string record(char kind, std::initializer_list<std::string_view> fields) {
    std::string text(1, kind);
    for (const std::string_view field : fields) {
        std::string plain(field);
        std::replace(plain.begin(), plain.end(), '\0', ' ');
        text += plain;
        text += '\0';
    }
    return text;
}

/// Takes the records apart.
class RecordReader {
  public:
    explicit RecordReader(std::string_view records) : rest_(records) {}

    /// The kind of the next record; NUL at the end.
    char kind() {
        if (rest_.empty()) return '\0';
        const char kind = rest_.front();
        rest_.remove_prefix(1);
        return kind;
    }
    /// The next field. False when it was cut off.
    bool field(std::string& text) {
        const std::size_t end = rest_.find('\0');
        if (end == std::string_view::npos) return false;
        text = rest_.substr(0, end);
        rest_.remove_prefix(end + 1);
        return true;
    }

  private:
    std::string_view rest_;
};

/// The sentence that was to be looked at is not.
void skip(const std::string& why, TestOutcome& outcome) {
    outcome.skipped = why;
    if (!outcome.lookedAt.empty()) outcome.lookedAt.pop_back();
}

}  // namespace

std::string recordOfSentence(const ContractSentence& sentence) {
    return record(kSentence, {sentence.header, sentence.text});
}
std::string recordOfFailure(std::string_view seen) { return record(kFailure, {seen}); }
std::string recordOfSkip(std::string_view why) { return record(kSkip, {why}); }
std::string recordOfEnd() { return record(kEnd, {}); }

void readRecords(std::string_view records, TestOutcome& outcome) {
    RecordReader reader(records);
    ContractSentence now;
    std::string text;
    while (const char kind = reader.kind()) {
        if (kind == kEnd) {
            outcome.ended = true;
        } else if (kind == kSentence) {
            if (!reader.field(now.header) || !reader.field(now.text)) return;
            if (!now.header.empty()) outcome.lookedAt.push_back(now);
        } else {
            if (!reader.field(text)) return;
            if (kind == kSkip) skip(text, outcome);
            if (kind == kFailure) outcome.broken.push_back({now, text});
        }
    }
}

}  // namespace appsync
