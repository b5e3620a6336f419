#pragma once

#include <optional>
#include <string_view>
#include <utility>
#include <variant>

#include "platform/Error.h"

namespace appsync {

/// What an operation that can fail gives back: a value or an error, never both.
template <typename Value>
class [[nodiscard]] Result {
  public:
    Result(Value value) : content_(std::in_place_index<0>, std::move(value)) {}
    Result(ErrorRecord error) : content_(std::in_place_index<1>, std::move(error)) {}

    [[nodiscard]] bool ok() const noexcept { return content_.index() == 0; }
    explicit operator bool() const noexcept { return ok(); }

    // Only when ok().
    [[nodiscard]] Value& operator*() & { return std::get<0>(content_); }
    [[nodiscard]] const Value& operator*() const& { return std::get<0>(content_); }
    [[nodiscard]] Value&& operator*() && { return std::get<0>(std::move(content_)); }
    [[nodiscard]] Value* operator->() { return &std::get<0>(content_); }
    [[nodiscard]] const Value* operator->() const { return &std::get<0>(content_); }

    // Only when not ok().
    [[nodiscard]] const ErrorRecord& error() const { return std::get<1>(content_); }

  private:
    std::variant<Value, ErrorRecord> content_;
};

/// Success, or the error.
template <>
class [[nodiscard]] Result<void> {
  public:
    Result() = default;
    Result(ErrorRecord error) : error_(std::move(error)) {}

    [[nodiscard]] bool ok() const noexcept { return !error_.has_value(); }
    explicit operator bool() const noexcept { return ok(); }

    // Only when not ok().
    [[nodiscard]] const ErrorRecord& error() const { return error_.value(); }

    /// For the callers whose contract says that this failure is ignored.
    void ignore() const noexcept {}

  private:
    std::optional<ErrorRecord> error_;
};

using Status = Result<void>;

/// Leaves the error where the caller asked for it, if it did and there is one.
inline void report(const Status& status, ErrorOut out) {
    if (out != nullptr && !status) *out = status.error();
}

}  // namespace appsync
