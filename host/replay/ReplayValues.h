#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <nlohmann/json.hpp>

#include "host/replay/RecordingReader.h"
#include "platform/AppRegistry.h"
#include "platform/FileSystem.h"
#include "platform/Result.h"

namespace appsync {

/// Makes the values of platform/ of what a recording says. `read` answers whether the JSON is such
/// a value.
class ReplayValues {
  public:
    explicit ReplayValues(const std::map<ContentSum, Bytes>& contents) : contents_(contents) {}

    /// What stands for contents that the recording does not keep is named as they are.
    [[nodiscard]] const std::map<ContentSum, ContentSum>& aliases() const { return aliases_; }
    /// What the plug-in has passed may come back without being kept.
    void remember(const std::vector<NamedContents>& passed);

    [[nodiscard]] bool read(const nlohmann::json& json, bool& value) const;
    [[nodiscard]] bool read(const nlohmann::json& json, double& value) const;
    [[nodiscard]] bool read(const nlohmann::json& json, std::string& value) const;
    [[nodiscard]] bool read(const nlohmann::json& json, Bytes& value);
    [[nodiscard]] bool read(const nlohmann::json& json, PropertyList& value);
    [[nodiscard]] bool read(const nlohmann::json& json, ErrorRecord& value);
    [[nodiscard]] bool read(const nlohmann::json& json, std::optional<ErrorRecord>& value);
    [[nodiscard]] bool read(const nlohmann::json& json, AppProxy& value);
    [[nodiscard]] bool read(const nlohmann::json& json, ItemAttributes& value);
    [[nodiscard]] bool read(const nlohmann::json& json, std::optional<FileURL>& value);
    [[nodiscard]] bool read(const nlohmann::json& json, Status& value);
    template <std::integral Number>
    requires(!std::same_as<Number, bool>)
        [[nodiscard]] bool read(const nlohmann::json& json, Number& value) const {
        if (json.is_number_unsigned()) {
            const auto number = json.get<std::uint64_t>();
            value = static_cast<Number>(number);
            return std::in_range<Number>(number);
        }
        if (!json.is_number_integer()) return false;
        const auto number = json.get<std::int64_t>();
        value = static_cast<Number>(number);
        return std::in_range<Number>(number);
    }
    template <typename Value>
    [[nodiscard]] bool read(const nlohmann::json& json, std::optional<Value>& value) {
        value.reset();
        return json.is_null() || read(json, value.emplace());
    }
    /// In brackets: a property list may be null itself.
    [[nodiscard]] bool read(const nlohmann::json& json, std::optional<PropertyList>& value);
    template <typename Value>
    [[nodiscard]] bool read(const nlohmann::json& json, std::vector<Value>& values) {
        if (!json.is_array()) return false;
        values.clear();
        values.reserve(json.size());
        for (const nlohmann::json& each : json) {
            if (!read(each, values.emplace_back())) return false;
        }
        return true;
    }
    template <typename Value>
    [[nodiscard]] bool read(const nlohmann::json& json, Result<Value>& value) {
        if (!json.is_object() || json.size() != 1) return false;
        if (json.contains("ok")) {
            Value read{};
            if (!this->read(json.at("ok"), read)) return false;
            value = std::move(read);
            return true;
        }
        ErrorRecord error;
        if (!json.contains("error") || !this->read(json.at("error"), error)) return false;
        value = std::move(error);
        return true;
    }
    /// The elements of a list of exactly these.
    template <typename... Values>
    [[nodiscard]] bool readAll(const nlohmann::json& json, Values&... values) {
        if (!json.is_array() || json.size() != sizeof...(values)) return false;
        std::size_t index = 0;
        return (read(json.at(index++), values) && ...);
    }

  private:
    [[nodiscard]] std::optional<Bytes> contentsOf(ContentSum sum, std::uint64_t size);
    [[nodiscard]] bool readWrapped(const nlohmann::json& json, PropertyList& value);
    [[nodiscard]] bool readMap(const nlohmann::json& json, PropertyList& value);

    const std::map<ContentSum, Bytes>& contents_;
    std::deque<std::pair<ContentSum, Bytes>> passed_;
    std::map<ContentSum, ContentSum> aliases_;
};

}  // namespace appsync
