#include "host/replay/ReplayValues.h"

#include <charconv>
#include <limits>

#include "recording/Recording.h"

namespace appsync {
namespace {

using ParsedJson = nlohmann::json;

/// Of contents that are not kept.
constexpr std::uint64_t kLargestStandIn = std::uint64_t{64} * 1024 * 1024;

std::optional<ContentSum> sumIn(const ParsedJson& json) {
    if (!json.is_string()) return std::nullopt;
    const auto& text = json.get_ref<const std::string&>();
    constexpr int kBase = 16;
    ContentSum sum = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), sum, kBase);
    if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
    return sum;
}

}  // namespace

void ReplayValues::remember(const std::vector<NamedContents>& passed) {
    for (const NamedContents& each : passed) {
        if (each.bytes.size() <= kPassedContentLimit) continue;
        passed_.emplace_back(each.sum, Bytes(each.bytes.begin(), each.bytes.end()));
        if (passed_.size() > kRememberedContents) passed_.pop_front();
    }
}

bool ReplayValues::read(const ParsedJson& json, bool& value) const {
    if (!json.is_boolean()) return false;
    value = json.get<bool>();
    return true;
}

bool ReplayValues::read(const ParsedJson& json, double& value) const {
    using Limits = std::numeric_limits<double>;
    if (json.is_number()) {
        value = json.get<double>();
    } else if (json == "nan") {
        value = Limits::quiet_NaN();
    } else if (json == "inf" || json == "-inf") {
        value = json == "inf" ? Limits::infinity() : -Limits::infinity();
    } else {
        return false;
    }
    return true;
}

bool ReplayValues::read(const ParsedJson& json, std::string& value) const {
    std::optional<std::string> text = textIn(json);
    if (!text) return false;
    value = *std::move(text);
    return true;
}

/// Bytes of that size that nothing but this replay knows, where the recording has none.
std::optional<Bytes> ReplayValues::contentsOf(ContentSum sum, std::uint64_t size) {
    if (const auto kept = contents_.find(sum); kept != contents_.end()) return kept->second;
    for (const auto& [passed, bytes] : passed_) {
        if (passed == sum) return bytes;
    }
    if (size > kLargestStandIn) return std::nullopt;
    constexpr unsigned kByte = 8;
    Bytes standIn(size);
    for (std::size_t i = 0; i < standIn.size(); ++i) {
        standIn[i] = static_cast<std::uint8_t>(sum >> i % sizeof sum * kByte);
    }
    aliases_[sumOf(standIn)] = sum;
    return standIn;
}

bool ReplayValues::read(const ParsedJson& json, Bytes& value) {
    if (!json.is_object() || !json.contains("size") || !json.contains("sum")) return false;
    const std::optional<ContentSum> sum = sumIn(json.at("sum"));
    std::uint64_t size = 0;
    if (!sum || !read(json.at("size"), size)) return false;
    std::optional<Bytes> contents = contentsOf(*sum, size);
    if (!contents || contents->size() != size) return false;
    value = *std::move(contents);
    return true;
}

bool ReplayValues::readMap(const ParsedJson& json, PropertyList& value) {
    if (!json.is_array() || json.size() % 2 != 0) return false;
    value = PropertyList::map(json.size() / 2);
    for (std::size_t i = 0; i < json.size(); i += 2) {
        std::string key;
        PropertyList entry;
        if (!read(json[i], key) || !read(json[i + 1], entry)) return false;
        if (value.find(key) != nullptr || !value.set(key, std::move(entry))) return false;
    }
    return true;
}

bool ReplayValues::readWrapped(const ParsedJson& json, PropertyList& value) {
    if (json.contains("bytes")) {
        std::string text;
        if (!read(json, text)) return false;
        value = PropertyList(std::move(text));
        return true;
    }
    if (json.size() != 1) return false;
    const ParsedJson& inner = json.begin().value();
    double number = 0;
    Bytes data;
    if (json.contains("map")) return readMap(inner, value);
    if (json.contains("real") && read(inner, number)) {
        value = PropertyList(number);
    } else if (json.contains("date") && read(inner, number)) {
        value = PropertyList(PropertyList::Date{number});
    } else if (json.contains("data") && read(inner, data)) {
        value = PropertyList(std::move(data));
    } else {
        return false;
    }
    return true;
}

bool ReplayValues::read(const ParsedJson& json, PropertyList& value) {
    std::string text;
    if (json.is_object()) return readWrapped(json, value);
    if (json.is_null()) {
        value = PropertyList();
    } else if (json.is_boolean()) {
        value = PropertyList(json.get<bool>());
    } else if (json.is_number_unsigned() &&
               !std::in_range<std::int64_t>(json.get<std::uint64_t>())) {
        value = PropertyList(json.get<std::uint64_t>());
    } else if (json.is_number_integer()) {
        value = PropertyList(json.get<std::int64_t>());
    } else if (json.is_string() && read(json, text)) {
        value = PropertyList(std::move(text));
    } else if (json.is_array()) {
        value = PropertyList::array(json.size());
        for (const ParsedJson& each : json) {
            PropertyList element;
            if (!read(each, element) || !value.append(std::move(element))) return false;
        }
    } else {
        return false;
    }
    return true;
}

bool ReplayValues::read(const ParsedJson& json, std::optional<PropertyList>& value) {
    value.reset();
    if (json.is_null()) return true;
    return json.is_array() && json.size() == 1 && read(json[0], value.emplace());
}

bool ReplayValues::read(const ParsedJson& json, ErrorRecord& value) {
    return readAll(json, value.domain, value.code, value.userInfo);
}

bool ReplayValues::read(const ParsedJson& json, std::optional<ErrorRecord>& value) {
    value.reset();
    if (json.is_null()) return true;
    ErrorRecord error;
    if (!read(json, error)) return false;
    value = std::move(error);
    return true;
}

bool ReplayValues::read(const ParsedJson& json, AppProxy& value) {
    return readAll(json, value.applicationIdentifier, value.bundleVersion, value.displayName,
                   value.bundlePath, value.bundleContainerPath, value.applicationType,
                   value.installType, value.state.installed, value.state.placeholder,
                   value.staticDiskUsage);
}

bool ReplayValues::read(const ParsedJson& json, ItemAttributes& value) {
    return readAll(json, value.size, value.isDirectory);
}

bool ReplayValues::read(const ParsedJson& json, std::optional<FileURL>& value) {
    value.reset();
    if (json.is_null()) return true;
    std::string path;
    bool isDirectory = false;
    if (!readAll(json, path, isDirectory)) return false;
    value = FileURL::fromPath(path, isDirectory);
    return value.has_value();
}

bool ReplayValues::read(const ParsedJson& json, Status& value) {
    value = Status();
    if (json.is_null()) return true;
    ErrorRecord error;
    if (!read(json, error)) return false;
    value = std::move(error);
    return true;
}

}  // namespace appsync
