#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

namespace appsync {

/// A value of JSON that is no container. The first kind stands for null and for numbers that are
/// no whole ones of 64 bits.
using JsonScalar = std::variant<std::monostate, bool, std::int64_t, std::uint64_t, std::string>;

/// Hears what a JSON text holds, in its order: what it does not keep takes no memory. Each answers
/// whether to go on.
class JsonListener {
  public:
    virtual ~JsonListener() = default;
    /// The name of the member that follows.
    virtual bool memberBegins(std::string name) = 0;
    virtual bool scalar(JsonScalar value) = 0;
    virtual bool objectBegins() = 0;
    virtual bool arrayBegins() = 0;
    /// The innermost object or array that has begun.
    virtual bool containerEnds() = 0;
};

/// Reads one JSON text. False when it is none, which may turn out after the listener has heard the
/// most of it, or when the listener does not go on. NUL ends no text; it is part of none.
[[nodiscard]] bool readJson(std::string_view text, JsonListener& listener);

}  // namespace appsync
