#include "host/replay/RecordingText.h"

#include <algorithm>
#include <cctype>

namespace appsync {
namespace {

using ParsedJson = nlohmann::json;

constexpr std::size_t kLongestValue = 400;

std::string shown(const ParsedJson& value) {
    std::string text = value.dump(-1, ' ', false, ParsedJson::error_handler_t::replace);
    if (text.size() <= kLongestValue) return text;
    std::size_t end = kLongestValue;
    while (end > 0 && (static_cast<unsigned char>(text[end]) & 0xC0U) == 0x80U) --end;
    return text.substr(0, end) + "...";
}

bool isOfName(char character) {
    const auto byte = static_cast<unsigned char>(character);
    return std::isalnum(byte) != 0 || character == '-' || character == '_';
}

/// Whether the text holds the identifier, and no longer one there.
bool holdsWord(std::string_view text, std::string_view identifier) {
    for (std::size_t at = text.find(identifier); at != std::string_view::npos;
         at = text.find(identifier, at + 1)) {
        const bool begins = at == 0 || (!isOfName(text[at - 1]) && text[at - 1] != '.');
        const std::string_view rest = text.substr(at + identifier.size());
        const bool ends = rest.empty() || (!isOfName(rest[0]) && rest[0] != '.') ||
                          rest.starts_with(".zip") || rest == ".";
        if (begins && ends) return true;
    }
    return false;
}

bool holds(const ParsedJson& value, std::string_view identifier) {
    if (value.is_string()) return holdsWord(value.get_ref<const std::string&>(), identifier);
    return value.is_structured() &&
           std::any_of(value.begin(), value.end(),
                       [&](const ParsedJson& each) { return holds(each, identifier); });
}

}  // namespace

std::string callText(std::string_view name, std::uint64_t object, const ParsedJson& arguments) {
    std::string text(name);
    if (object != 0) text += " #" + std::to_string(object);
    text += '(';
    bool isFirst = true;
    for (const ParsedJson& each : arguments) {
        if (!isFirst) text += ", ";
        isFirst = false;
        text += shown(each);
    }
    return text + ')';
}

std::string recordText(const RecordLine& line) {
    const std::string call = callText(line.name, line.object, line.arguments);
    const std::string answer = line.answer.is_null() ? "" : " -> " + shown(line.answer);
    switch (line.kind) {
        case RecordKind::Call:
            return call + answer;
        case RecordKind::Host:
            return "host: " + call;
        case RecordKind::Run:
            return "begin of item #" + std::to_string(line.object);
        case RecordKind::Callback:
            return "callback: " + call;
        case RecordKind::Walk:
            return call + ", piece by piece";
        case RecordKind::Each:
            return "piece: " + shown(line.arguments);
        case RecordKind::Back:
            return "back from it";
        case RecordKind::End:
            return "end" + answer;
        case RecordKind::Finished:
            break;
    }
    return "end of the session";
}

std::string_view serviceOf(const RecordLine& line) {
    switch (line.kind) {
        case RecordKind::Host:
            return "SyncClient";
        case RecordKind::Run:
            return "WorkQueues";
        case RecordKind::Each:
            return "AppRegistry";
        default:
            return std::string_view(line.name).substr(0, line.name.find('.'));
    }
}

bool mentions(const RecordLine& line, std::string_view identifier) {
    return holds(line.arguments, identifier) || holds(line.answer, identifier);
}

}  // namespace appsync
