#include "host/console/PropertyListReading.h"

#include <array>
#include <charconv>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

#include "host/console/Problem.h"

namespace appsync {
namespace {

constexpr int kFarthestYear = 10'000;
constexpr std::string_view kJsonBlanks = " \t\r\n";

// The value of a base64 digit; 64 for what is none.
std::uint32_t digitValue(char digit) {
    static constexpr std::string_view kDigits =
        "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    const std::size_t found = kDigits.find(digit);
    return static_cast<std::uint32_t>(found == std::string_view::npos ? 64 : found);
}

std::optional<Bytes> bytesOfBase64(std::string_view text) {
    if (text.size() % 4 != 0) return std::nullopt;
    Bytes bytes;
    bytes.reserve(text.size() / 4 * 3);
    for (std::size_t start = 0; start < text.size(); start += 4) {
        std::string_view group = text.substr(start, 4);
        if (start + 4 == text.size()) group = group.substr(0, group.find_last_not_of('=') + 1);
        if (group.size() < 2) return std::nullopt;
        std::uint32_t value = 0;
        for (std::size_t index = 0; index < 4; ++index) {
            const std::uint32_t digit = index < group.size() ? digitValue(group[index]) : 0;
            if (digit == 64) return std::nullopt;
            value = value << 6U | digit;
        }
        for (std::size_t index = 0; index + 1 < group.size(); ++index) {
            bytes.push_back(static_cast<std::uint8_t>(value >> (16 - 8 * index)));
        }
    }
    return bytes;
}

// Takes a number of at least so many digits, and what follows it.
std::optional<int> takeNumber(std::string_view& text, std::size_t digits, char after) {
    int number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    const auto length = static_cast<std::size_t>(end - text.data());
    if (error != std::errc() || length < digits || length == text.size() || *end != after) {
        return std::nullopt;
    }
    text.remove_prefix(length + 1);
    return number;
}

std::optional<PropertyList::Date> dateOfText(std::string_view text) {
    constexpr std::chrono::sys_days kEpoch =
        std::chrono::year{2001} / std::chrono::January / std::chrono::day{1};
    constexpr std::array<std::pair<int, char>, 6> kParts = {
        {{4, '-'}, {2, '-'}, {2, 'T'}, {2, ':'}, {2, ':'}, {2, 'Z'}}};
    std::array<int, 6> parts{};
    for (std::size_t index = 0; index < parts.size(); ++index) {
        const auto [digits, after] = kParts.at(index);
        const auto number = takeNumber(text, static_cast<std::size_t>(digits), after);
        if (!number) return std::nullopt;
        parts.at(index) = *number;
    }
    const auto [year, month, day, hour, minute, second] = parts;
    const std::chrono::year_month_day date{std::chrono::year{year},
                                           std::chrono::month{static_cast<unsigned>(month)},
                                           std::chrono::day{static_cast<unsigned>(day)}};
    const bool isTime =
        hour >= 0 && hour < 24 && minute >= 0 && minute < 60 && second >= 0 && second <= 60;
    const bool isYear = year > -kFarthestYear && year < kFarthestYear;
    if (!text.empty() || !isYear || !date.ok() || !isTime) return std::nullopt;
    const double days = static_cast<double>((std::chrono::sys_days{date} - kEpoch).count());
    return PropertyList::Date{days * 86400 + hour * 3600 + minute * 60 + second};
}

// What a map of one text stands for, if for anything but itself.
std::optional<PropertyList> markedValue(const std::vector<PropertyList::Entry>& entries) {
    if (entries.size() != 1) return std::nullopt;
    const std::string* text = entries.front().value.asString();
    if (text == nullptr) return std::nullopt;
    if (entries.front().key == "data") {
        std::optional<Bytes> bytes = bytesOfBase64(*text);
        if (bytes) return PropertyList(*std::move(bytes));
    } else if (entries.front().key == "date") {
        if (const auto date = dateOfText(*text)) return PropertyList(*date);
    }
    return std::nullopt;
}

// Builds the value as the parser goes; no container that is open is part of another yet.
class PropertyListBuilder final : public nlohmann::json_sax<nlohmann::json> {
  public:
    bool null() override { return add({}); }
    bool boolean(bool value) override { return add(value); }
    bool number_integer(number_integer_t value) override { return add(value); }
    bool number_unsigned(number_unsigned_t value) override { return add(value); }
    bool number_float(number_float_t value, const string_t& text) override {
        const bool isWhole = text.find_first_of(".eE") == text.npos;
        return isWhole ? stop(text + " does not fit into 64 bits") : add(value);
    }
    bool string(string_t& value) override { return add(std::move(value)); }
    bool binary(binary_t& /*value*/) override { return false; }
    bool start_object(std::size_t /*size*/) override { return open(true); }
    bool key(string_t& name) override {
        open_.back().key = std::move(name);
        return true;
    }
    bool end_object() override {
        Container ended = std::move(open_.back());
        open_.pop_back();
        if (std::optional<PropertyList> marked = markedValue(ended.entries)) {
            return add(*std::move(marked));
        }
        PropertyList map;
        if (!map.becomeMap(ended.entries)) return stop("a map names something twice");
        return add(std::move(map));
    }
    bool start_array(std::size_t /*size*/) override { return open(false); }
    bool end_array() override {
        Container ended = std::move(open_.back());
        open_.pop_back();
        PropertyList array;
        if (!array.becomeArray(ended.elements)) return stop("it nests too deep");
        return add(std::move(array));
    }
    bool parse_error(std::size_t position, const std::string& /*token*/,
                     const nlohmann::detail::exception& /*error*/) override {
        return stop("it is not JSON, at byte " + std::to_string(position));
    }

    [[nodiscard]] const std::string& defect() const { return defect_; }
    PropertyList takeValue() { return std::move(value_); }

  private:
    struct Container {
        bool isMap = false;
        std::string key;
        std::vector<PropertyList> elements;
        std::vector<PropertyList::Entry> entries;
    };

    bool open(bool isMap) {
        if (open_.size() == PropertyList::kMaximumDepth) return stop("it nests too deep");
        open_.push_back({isMap, {}, {}, {}});
        return true;
    }

    bool add(PropertyList value) {
        if (open_.empty()) {
            value_ = std::move(value);
        } else if (open_.back().isMap) {
            open_.back().entries.push_back({std::move(open_.back().key), std::move(value)});
        } else {
            open_.back().elements.push_back(std::move(value));
        }
        return true;
    }

    bool stop(std::string why) {
        defect_ = std::move(why);
        return false;
    }

    std::vector<Container> open_;
    PropertyList value_;
    std::string defect_;
};

}  // namespace

bool looksLikeJson(std::string_view text) {
    const std::size_t begin = text.find_first_not_of(kJsonBlanks);
    return begin != std::string_view::npos && (text[begin] == '{' || text[begin] == '[');
}

Result<PropertyList> propertyListOfJson(std::string_view text) {
    PropertyListBuilder builder;
    // The parser takes a NUL for the end.
    const std::size_t end = text.find('\0');
    const bool isRead = end == std::string_view::npos &&
                        nlohmann::json::sax_parse(text.begin(), text.end(), &builder);
    if (isRead) return builder.takeValue();
    const std::string defect = builder.defect().empty()
                                   ? "it is not JSON, at byte " + std::to_string(end + 1)
                                   : builder.defect();
    return failure(defect, "write it as plist show --json does");
}

}  // namespace appsync
