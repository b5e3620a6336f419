#include "system/property_list/PropertyListXmlValues.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <utility>

#include "system/property_list/PropertyListText.h"

namespace appsync {

namespace {

bool isDigit(char c) { return c >= '0' && c <= '9'; }

std::string_view trimmed(std::string_view text) {
    while (!text.empty() && isXmlSpace(text.front())) text.remove_prefix(1);
    while (!text.empty() && isXmlSpace(text.back())) text.remove_suffix(1);
    return text;
}

/// Consumes a sign; whether it was a minus.
bool takeMinus(std::string_view& text) {
    if (text.empty() || (text.front() != '-' && text.front() != '+')) return false;
    const bool minus = text.front() == '-';
    text.remove_prefix(1);
    return minus;
}

/// Consumes "0x".
bool takeHexadecimalPrefix(std::string_view& text) {
    if (text.size() < 2 || text[0] != '0' || (text[1] != 'x' && text[1] != 'X')) return false;
    text.remove_prefix(2);
    return true;
}

std::optional<PropertyList> withSign(std::uint64_t magnitude, bool minus) {
    if (!minus && std::in_range<std::int64_t>(magnitude)) {
        return PropertyList(static_cast<std::int64_t>(magnitude));
    }
    if (!minus) return PropertyList(magnitude);
    if (magnitude > std::uint64_t{1} << 63U) return std::nullopt;
    return PropertyList(static_cast<std::int64_t>(0 - magnitude));
}

}  // namespace

bool isXmlTextLiteral(std::string_view text) noexcept {
    return text.find('&') == std::string_view::npos && text.find('\r') == std::string_view::npos;
}

namespace {

/// The character that "&name;" stands for: one of the five that need no declaration.
std::optional<char32_t> predefinedEntity(std::string_view name) {
    if (name == "lt") return '<';
    if (name == "gt") return '>';
    if (name == "amp") return '&';
    if (name == "quot") return '"';
    if (name == "apos") return '\'';
    return std::nullopt;
}

/// The character that "&#digits;" or "&#xdigits;" stands for, if XML may hold it.
std::optional<char32_t> characterReference(std::string_view digits) {
    const int base = digits.starts_with('x') ? 16 : 10;
    if (base == 16) digits.remove_prefix(1);
    std::uint32_t code = 0;
    const char* end = digits.data() + digits.size();
    const auto [stop, status] = std::from_chars(digits.data(), end, code, base);
    if (status != std::errc() || stop != end || !isXmlCharacter(code)) return std::nullopt;
    return code;
}

/// The character that a reference stands for, given what follows its '&'.
std::optional<char32_t> referredCharacter(std::string_view text) {
    const std::size_t end = text.find(';');
    if (end == std::string_view::npos) return std::nullopt;
    const std::string_view name = text.substr(0, end);
    return name.starts_with('#') ? characterReference(name.substr(1)) : predefinedEntity(name);
}

}  // namespace

std::optional<std::size_t> appendXmlText(std::string_view text, bool references,
                                         std::string& meaning) {
    std::size_t at = 0;
    for (;;) {
        const std::size_t special = text.find_first_of(references ? "&\r" : "\r", at);
        meaning += text.substr(at, special == std::string_view::npos ? special : special - at);
        if (special == std::string_view::npos) return std::nullopt;
        at = special + 1;
        if (text[special] == '\r') {
            if (at < text.size() && text[at] == '\n') ++at;
            meaning += '\n';
            continue;
        }
        const auto code = referredCharacter(text.substr(at));
        if (!code) return special;
        appendUtf8(*code, meaning);
        at = text.find(';', at) + 1;
    }
}

XmlValue<PropertyList> integerFromXml(std::string_view text) {
    std::string_view rest = trimmed(text);
    const auto at = [text](const char* place) {
        return static_cast<std::size_t>(place - text.data());
    };
    const char* begin = rest.data();
    const bool minus = takeMinus(rest);
    const int base = takeHexadecimalPrefix(rest) ? 16 : 10;
    std::uint64_t magnitude = 0;
    const char* end = rest.data() + rest.size();
    const auto [stop, status] = std::from_chars(rest.data(), end, magnitude, base);
    if (status == std::errc::result_out_of_range) return {std::nullopt, at(begin)};
    if (status != std::errc() || stop != end) return {std::nullopt, at(stop)};
    return {withSign(magnitude, minus), at(begin)};
}

XmlValue<double> realFromXml(std::string_view text) {
    std::string_view rest = trimmed(text);
    const auto begin = static_cast<std::size_t>(rest.data() - text.data());
    const bool minus = takeMinus(rest);
    // A second sign would be taken by from_chars.
    const bool number = !rest.empty() && rest.front() != '-';
    double value = 0;
    const char* end = rest.data() + rest.size();
    const auto [stop, status] = std::from_chars(rest.data(), end, value);
    if (!number || status == std::errc::result_out_of_range) return {std::nullopt, begin};
    const auto badAt = static_cast<std::size_t>(stop - text.data());
    if (status != std::errc() || stop != end) return {std::nullopt, badAt};
    return {minus ? -value : value, 0};
}

std::string realToXml(double value) {
    if (std::isnan(value)) return "nan";
    std::array<char, 32> text{};
    const auto [end, status] = std::to_chars(text.data(), text.data() + text.size(), value);
    std::string result(text.data(), end);
    // So that everybody takes it for a real.
    if (std::isfinite(value) && result.find_first_of(".e") == std::string::npos) result += ".0";
    return result;
}

namespace {

using Days = std::chrono::sys_days;
using Seconds = std::chrono::seconds;

constexpr Days kEpochDay = std::chrono::year(2001) / 1 / 1;
constexpr Days kFirstDay = std::chrono::year(1) / 1 / 1;
constexpr Days kDayAfterLast = std::chrono::year(10000) / 1 / 1;

/// Reads a date from its text, front to back; remembers where it went wrong.
class DateReader {
  public:
    explicit DateReader(std::string_view text) : text_(trimmed(text)), whole_(text) {}

    XmlValue<PropertyList::Date> read() {
        const int year = number(4);
        expect('-');
        const int month = number(2);
        expect('-');
        const int day = number(2);
        expect('T');
        const int hour = number(2, 23);
        expect(':');
        const int minute = number(2, 59);
        expect(':');
        const int second = number(2, 59);
        expect('Z');
        if (at_ != text_.size()) wrong_ = true;
        const auto date = std::chrono::year(year) / month / day;
        if (!wrong_ && (year == 0 || !date.ok())) wrong_ = true, at_ = 0;
        if (wrong_) return {std::nullopt, offset()};
        const Seconds whole = (Days(date) - kEpochDay) + std::chrono::hours(hour) +
                              std::chrono::minutes(minute) + Seconds(second);
        return {PropertyList::Date{static_cast<double>(whole.count())}, 0};
    }

  private:
    [[nodiscard]] char next() const { return at_ < text_.size() ? text_[at_] : '\0'; }
    [[nodiscard]] std::size_t offset() const {
        return static_cast<std::size_t>(text_.data() - whole_.data()) + at_;
    }

    int number(int digits, int limit = 9999) {
        const std::size_t begin = at_;
        int value = 0;
        for (; !wrong_ && digits > 0; --digits, ++at_) {
            if (!isDigit(next())) return wrong_ = true, 0;
            value = value * 10 + (next() - '0');
        }
        if (value > limit) wrong_ = true, at_ = begin;
        return value;
    }

    void expect(char c) {
        if (wrong_) return;
        if (next() == c) {
            ++at_;
        } else {
            wrong_ = true;
        }
    }

    std::string_view text_;
    std::string_view whole_;
    std::size_t at_ = 0;
    bool wrong_ = false;
};

void appendDigits(std::int64_t value, std::size_t width, std::string& text) {
    const std::string digits = std::to_string(value);
    text.append(width > digits.size() ? width - digits.size() : 0, '0');
    text += digits;
}

std::string spelled(Seconds sinceEpoch) {
    const auto time = kEpochDay + sinceEpoch;
    const auto day = std::chrono::floor<std::chrono::days>(time);
    const std::chrono::year_month_day date(day);
    const std::chrono::hh_mm_ss clock(time - day);
    std::string text;
    appendDigits(static_cast<int>(date.year()), 4, text);
    appendDigits(static_cast<unsigned>(date.month()), 2, text += '-');
    appendDigits(static_cast<unsigned>(date.day()), 2, text += '-');
    appendDigits(clock.hours().count(), 2, text += 'T');
    appendDigits(clock.minutes().count(), 2, text += ':');
    appendDigits(clock.seconds().count(), 2, text += ':');
    return text + "Z";
}

}  // namespace

XmlValue<PropertyList::Date> dateFromXml(std::string_view text) { return DateReader(text).read(); }

std::optional<std::string> dateToXml(PropertyList::Date date) {
    constexpr auto first = static_cast<double>(Seconds(kFirstDay - kEpochDay).count());
    constexpr auto end = static_cast<double>(Seconds(kDayAfterLast - kEpochDay).count());
    const double seconds = date.secondsSince2001;
    if (!(seconds >= first && seconds < end)) return std::nullopt;  // what is not a number neither
    return spelled(Seconds(static_cast<std::int64_t>(std::floor(seconds))));
}

namespace {

constexpr std::string_view kDigits =
    "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t kNoDigit = 64;

constexpr std::array<std::uint8_t, 256> kDigitValues = [] {
    std::array<std::uint8_t, 256> values{};
    values.fill(kNoDigit);
    for (std::size_t i = 0; i < kDigits.size(); ++i) {
        values[static_cast<std::uint8_t>(kDigits[i])] = static_cast<std::uint8_t>(i);
    }
    return values;
}();

/// Takes base64 digits one by one and makes bytes of them.
class Base64Decoder {
  public:
    explicit Base64Decoder(std::size_t textSize) { bytes_.reserve(textSize / 4 * 3); }

    /// False when the character has no business there.
    bool take(char c) {
        if (isXmlSpace(c)) return true;
        if (c == '=') return takePadding();
        const std::uint8_t digit = kDigitValues[static_cast<std::uint8_t>(c)];
        if (digit == kNoDigit || padding_ != 0) return false;
        pending_ = pending_ << 6U | digit;
        if (++count_ % 4 == 0) emit(3);
        return true;
    }

    [[nodiscard]] bool complete() const { return (count_ + padding_) % 4 == 0; }
    Bytes bytes() && { return std::move(bytes_); }

  private:
    bool takePadding() {
        if (count_ % 4 < 2 || complete()) return false;
        ++padding_;
        const bool unusedBits = (pending_ & (count_ % 4 == 2 ? 15U : 3U)) != 0;
        if (unusedBits) return false;
        if (!complete()) return true;
        pending_ <<= 6 * padding_;
        emit(3 - padding_);
        return true;
    }

    void emit(std::size_t size) {
        for (std::size_t i = 0; i < size; ++i) {
            bytes_.push_back(static_cast<std::uint8_t>(pending_ >> (16 - 8 * i) & 0xFFU));
        }
        pending_ = 0;
    }

    Bytes bytes_;
    std::uint32_t pending_ = 0;
    std::size_t count_ = 0;    // of digits
    std::size_t padding_ = 0;  // of "="
};

std::array<char, 4> encoded(ByteView upToThree) {
    std::uint32_t bits = 0;
    for (std::size_t i = 0; i < 3; ++i)
        bits = bits << 8U | (i < upToThree.size() ? upToThree[i] : 0U);
    std::array<char, 4> text = {kDigits[bits >> 18U], kDigits[bits >> 12U & 63U],
                                kDigits[bits >> 6U & 63U], kDigits[bits & 63U]};
    std::fill(text.begin() + static_cast<std::ptrdiff_t>(upToThree.size()) + 1, text.end(), '=');
    return text;
}

}  // namespace

XmlValue<Bytes> dataFromXml(std::string_view text) {
    Base64Decoder decoder(text.size());
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (!decoder.take(text[i])) return {std::nullopt, i};
    }
    if (!decoder.complete()) return {std::nullopt, text.size()};
    return {std::move(decoder).bytes(), 0};
}

void appendDataAsXml(ByteView data, std::string_view indentation, std::string& text) {
    constexpr std::size_t bytesPerLine = 57;
    while (!data.empty()) {
        text += indentation;
        ByteView line = data.first(std::min(bytesPerLine, data.size()));
        data = data.subspan(line.size());
        while (!line.empty()) {
            const ByteView group = line.first(std::min<std::size_t>(3, line.size()));
            text.append(encoded(group).data(), 4);
            line = line.subspan(group.size());
        }
        text += '\n';
    }
}

}  // namespace appsync
