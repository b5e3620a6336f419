#pragma once

#include <concepts>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include "platform/AppRegistry.h"
#include "platform/Bytes.h"
#include "platform/FileSystem.h"
#include "platform/Result.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

struct InstallOptions;
struct PlaceholderAttributes;
struct StoreMetadata;
struct SyncAsset;

// How arguments and results read in a recorded call.
inline std::string callText(bool value) { return value ? "yes" : "no"; }
inline std::string callText(std::string_view value) { return std::string(value); }
inline std::string callText(const std::string& value) { return value; }
inline std::string callText(const char* value) { return value; }
template <std::integral Integer>
std::string callText(Integer value) {
    return std::to_string(value);
}
std::string callText(double value);
std::string callText(ByteView value);
std::string callText(const Bytes& value);
std::string callText(const PropertyList& value);
std::string callText(const ErrorRecord& value);
std::string callText(const FileURL& value);
std::string callText(const ItemAttributes& value);
std::string callText(const FileAttributes& value);
/// "com.example.a", or "com.example.a (placeholder)".
std::string callText(const AppProxy& value);
std::string callText(const std::vector<AppProxy>& value);
/// "com.example.a, Application, download", and ", named Example" where the asset has a name.
std::string callText(const SyncAsset& value);
std::string callText(const StoreMetadata& value);
std::string callText(const InstallOptions& value);
std::string callText(const PlaceholderAttributes& value);
/// "ok", or the error.
std::string callText(const Status& value);

template <typename Value>
std::string callText(const Result<Value>& value) {
    return value ? callText(*value) : callText(value.error());
}
template <typename Value>
std::string callText(const std::optional<Value>& value) {
    return value ? callText(*value) : "(null)";
}

/// One call across platform/ while it lasts.
class RecordedCall {
  public:
    /// Records the call; `arguments` are anything that `callText` knows.
    template <typename... Arguments>
    RecordedCall(Recorder& recorder, std::string_view service, std::string_view method,
                 const Arguments&... arguments)
        : recorder_(recorder),
          number_(recorder.begin(
              service, method,
              recorder.isListening() ? joined({callText(arguments)...}) : std::string())),
          refusal_(recorder.takeRefusal()) {}

    /// Records the result and gives it back.
    template <typename Value>
    Value result(Value value) {
        if (refusal_) refuse(value);
        if (recorder_.isListening()) recorder_.end(number_, callText(value));
        return value;
    }
    /// Records a result that has no text of its own as `text`.
    template <typename Value>
    Value result(Value value, std::string text) {
        if (refusal_) {
            refuse(value);
            text = "(refused)";
        }
        recorder_.end(number_, std::move(text));
        return value;
    }

  private:
    template <typename Value>
    void refuse(Value& value) const {
        if constexpr (requires { value.reset(); }) {
            value.reset();
        } else if constexpr (std::is_same_v<Value, bool>) {
            value = false;
        } else if constexpr (std::is_assignable_v<Value&, const ErrorRecord&>) {
            value = *refusal_;
        } else {
            throw SimulationFailure("a call with such a result cannot be refused");
        }
    }
    static std::string joined(const std::vector<std::string>& texts);

    Recorder& recorder_;
    std::size_t number_;
    std::optional<ErrorRecord> refusal_;
};

}  // namespace appsync
