#include "platform/LogRendering.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <string_view>
#include <utility>
#include <variant>

#include "platform/Error.h"
#include "platform/LogFacility.h"
#include "platform/PropertyList.h"

namespace appsync {
namespace {

/// Keeps the first `limit` bytes of what is written to it and counts the rest.
class CutText {
  public:
    explicit CutText(std::size_t limit) : limit_(limit) {}

    void append(std::string_view text) {
        const std::size_t kept = std::min(text.size(), limit_ - text_.size());
        text_.append(text.substr(0, kept));
        dropped_ += text.size() - kept;
    }

    [[nodiscard]] std::string finish() && {
        if (dropped_ == 0) return std::move(text_);
        dropCutCharacter();
        text_ += "… (" + std::to_string(dropped_) + " more bytes)";
        return std::move(text_);
    }

  private:
    static bool isContinuation(char byte) {
        return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U;
    }

    /// Takes back the start of a UTF-8 character that the cut went through.
    void dropCutCharacter() {
        std::size_t start = text_.size();
        while (start > 0 && text_.size() - start < 3 && isContinuation(text_[start - 1])) --start;
        if (start == 0) return;
        const auto lead = static_cast<unsigned char>(text_[start - 1]);
        const std::size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : lead >= 0xC0 ? 2 : 1;
        const std::size_t present = text_.size() - (start - 1);
        if (length <= present) return;
        text_.resize(start - 1);
        dropped_ += present;
    }

    std::size_t limit_;
    std::string text_;
    std::size_t dropped_ = 0;
};

template <typename Number>
void appendNumber(CutText& out, Number value) {
    std::array<char, 64> buffer{};
    const auto [end, error] = std::to_chars(buffer.data(), buffer.data() + buffer.size(), value);
    if (error == std::errc{}) {
        out.append({buffer.data(), static_cast<std::size_t>(end - buffer.data())});
    }
}

template <typename... Arguments>
std::string printed(const std::string& format, Arguments... arguments) {
    std::array<char, 512> buffer{};
    const int length = std::snprintf(buffer.data(), buffer.size(), format.c_str(), arguments...);
    if (length < 0) return {};
    return {buffer.data(), std::min(static_cast<std::size_t>(length), buffer.size() - 1)};
}

void appendDate(CutText& out, PropertyList::Date date) {
    namespace chrono = std::chrono;
    constexpr double kFarthest = 3e11;  // beyond it a calendar year does not fit
    if (!(std::abs(date.secondsSince2001) < kFarthest)) {
        appendNumber(out, date.secondsSince2001);
        out.append(" s since 2001-01-01 00:00:00 +0000");
        return;
    }
    const chrono::seconds since{static_cast<std::int64_t>(std::floor(date.secondsSince2001))};
    const chrono::sys_seconds moment = chrono::sys_days{chrono::January / 1 / 2001} + since;
    const chrono::sys_days day = chrono::floor<chrono::days>(moment);
    const chrono::year_month_day calendar{day};
    const chrono::hh_mm_ss time{moment - day};
    out.append(
        printed("%04d-%02u-%02u %02d:%02d:%02d +0000", static_cast<int>(calendar.year()),
                static_cast<unsigned>(calendar.month()), static_cast<unsigned>(calendar.day()),
                static_cast<int>(time.hours().count()), static_cast<int>(time.minutes().count()),
                static_cast<int>(time.seconds().count())));
}

void append(CutText& out, const PropertyList& value);

void appendArray(CutText& out, const PropertyList& array) {
    std::string_view separator;
    out.append("(");
    for (const PropertyList& element : array.elements()) {
        out.append(separator);
        append(out, element);
        separator = ", ";
    }
    out.append(")");
}

void appendMap(CutText& out, const PropertyList& map) {
    std::string_view separator;
    out.append("{");
    for (const PropertyList::Entry& entry : map.entries()) {
        out.append(separator);
        out.append(entry.key);
        out.append(" = ");
        append(out, entry.value);
        out.append(";");
        separator = " ";
    }
    out.append("}");
}

// asReal and asUnsigned convert, so each is asked only for its own kind.
void append(CutText& out, const PropertyList& value) {
    using Kind = PropertyList::Kind;
    switch (value.kind()) {
        case Kind::Null:
            return out.append("(null)");
        case Kind::Boolean:
            return out.append(value.asBoolean().value_or(false) ? "1" : "0");
        case Kind::Integer:
            return appendNumber(out, value.asInteger().value_or(0));
        case Kind::Unsigned:
            return appendNumber(out, value.asUnsigned().value_or(0));
        case Kind::Real:
            return appendNumber(out, value.asReal().value_or(0));
        case Kind::Date:
            return appendDate(out, value.asDate().value_or(PropertyList::Date{}));
        case Kind::Data:
            return out.append("<" + std::to_string(value.asData()->size()) + " bytes>");
        case Kind::String:
            return out.append(*value.asString());
        case Kind::Array:
            return appendArray(out, value);
        case Kind::Map:
            return appendMap(out, value);
    }
}

std::string cut(std::string_view text) {
    CutText out(kLogArgumentLimit);
    out.append(text);
    return std::move(out).finish();
}

/// One place-holder of a format.
struct Placeholder {
    std::string_view text;   // all of it, the per cent sign included
    std::string_view flags;  // flags, width and precision
    char conversion = '\0';  // '@' for objects
};

constexpr std::string_view kFlagCharacters = "-+ #0123456789.";
constexpr std::string_view kLengthCharacters = "hlqjzt";
constexpr std::string_view kConversions = "@sdiufcxX%";

/// The place-holder at the start of `rest`, or nothing when there is none that is known.
std::optional<Placeholder> placeholderAt(std::string_view rest) {
    std::size_t end = 1;
    const std::size_t braces = rest.substr(end).starts_with('{') ? rest.find('}') : 0;
    if (braces == std::string_view::npos) return std::nullopt;
    if (braces != 0) end = braces + 1;
    const std::size_t flagsBegin = end;
    while (end < rest.size() && kFlagCharacters.find(rest[end]) != std::string_view::npos) ++end;
    const std::string_view flags = rest.substr(flagsBegin, end - flagsBegin);
    while (end < rest.size() && kLengthCharacters.find(rest[end]) != std::string_view::npos) ++end;
    if (end >= rest.size() || kConversions.find(rest[end]) == std::string_view::npos) {
        return std::nullopt;
    }
    return Placeholder{rest.substr(0, end + 1), flags, rest[end]};
}

/// Renders any kind of argument for one place-holder.
struct ArgumentRenderer {
    const Placeholder& placeholder;

    template <typename Integer>
    [[nodiscard]] std::string integer(Integer value) const {
        const std::string start = "%" + std::string(placeholder.flags);
        switch (placeholder.conversion) {
            case 'c':
                return std::string(1, static_cast<char>(value));
            case 'u':
            case 'x':
            case 'X':
                return printed(start + "ll" + placeholder.conversion,
                               static_cast<unsigned long long>(value));
            case 'f':
                return printed(start + "f", static_cast<double>(value));
            case 'd':
            case 'i':
                if (std::in_range<long long>(value)) {
                    return printed(start + "lld", static_cast<long long>(value));
                }
                return std::to_string(value);
            default:
                return std::to_string(value);
        }
    }

    std::string operator()(std::nullptr_t) const { return "(null)"; }
    std::string operator()(std::int64_t value) const { return integer(value); }
    std::string operator()(std::uint64_t value) const { return integer(value); }
    std::string operator()(double value) const {
        if (placeholder.conversion == 'f') {
            return printed("%" + std::string(placeholder.flags) + "f", value);
        }
        return describe(PropertyList(value));
    }
    std::string operator()(std::string_view value) const { return cut(value); }
    std::string operator()(const PropertyList* value) const {
        return value == nullptr ? "(null)" : describe(*value);
    }
    std::string operator()(const ErrorRecord* value) const {
        return value == nullptr ? "(null)" : describe(*value);
    }
};

}  // namespace

std::string describe(const PropertyList& value, std::size_t limit) {
    CutText out(limit);
    append(out, value);
    return std::move(out).finish();
}

std::string describe(const ErrorRecord& error, std::size_t limit) {
    const std::string* sentence = error.userInfo.findString("description");
    CutText out(limit);
    out.append("Error Domain=" + error.domain + " Code=" + std::to_string(error.code) + " \"");
    out.append(sentence != nullptr ? std::string_view(*sentence) : "(null)");
    out.append("\"");
    return std::move(out).finish();
}

std::string renderLogMessage(const LogMessage& message) {
    std::string text;
    std::size_t next = 0;
    std::string_view rest = message.format;
    while (!rest.empty()) {
        const std::size_t literal = std::min(rest.find('%'), rest.size());
        text.append(rest.substr(0, literal));
        rest.remove_prefix(literal);
        if (rest.empty()) break;
        const std::optional<Placeholder> placeholder = placeholderAt(rest);
        const std::size_t length = placeholder ? placeholder->text.size() : 1;
        if (placeholder && placeholder->conversion == '%') {
            text += '%';
        } else if (placeholder && next < message.arguments.size()) {
            text += std::visit(ArgumentRenderer{*placeholder}, message.arguments[next++]);
        } else {
            text.append(rest.substr(0, length));
        }
        rest.remove_prefix(length);
    }
    return text;
}

}  // namespace appsync
