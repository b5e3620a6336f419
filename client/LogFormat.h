#pragma once

#include <array>
#include <cstddef>
#include <string_view>
#include <type_traits>

namespace appsync {

/// What an argument of a message is, and what a place-holder asks for.
enum class LogArgumentKind { Object, Signed, Unsigned, Real, Character };

/// The kind that an argument of type T is. What is no number is an object.
template <typename T>
consteval LogArgumentKind logArgumentKind() {
    if constexpr (std::is_same_v<T, char>) return LogArgumentKind::Character;
    if constexpr (std::is_floating_point_v<T>) return LogArgumentKind::Real;
    if constexpr (std::is_same_v<T, bool>) return LogArgumentKind::Signed;
    if constexpr (std::is_unsigned_v<T>) return LogArgumentKind::Unsigned;
    if constexpr (std::is_integral_v<T>) return LogArgumentKind::Signed;
    return LogArgumentKind::Object;
}

/// A place-holder of message formats, without its per cent sign, and what it asks for.
struct LogPlaceHolder {
    std::string_view text;
    LogArgumentKind kind;
};

/// Every place-holder that a format may hold ("%%" aside).
inline constexpr std::array kLogPlaceHolders{
    LogPlaceHolder{"s", LogArgumentKind::Object},
    LogPlaceHolder{"{public}@", LogArgumentKind::Object},
    LogPlaceHolder{"d", LogArgumentKind::Signed},
    LogPlaceHolder{"ld", LogArgumentKind::Signed},
    LogPlaceHolder{"lld", LogArgumentKind::Signed},
    LogPlaceHolder{"u", LogArgumentKind::Unsigned},
    LogPlaceHolder{"lu", LogArgumentKind::Unsigned},
    LogPlaceHolder{"llu", LogArgumentKind::Unsigned},
    LogPlaceHolder{"f", LogArgumentKind::Real},
    LogPlaceHolder{"lf", LogArgumentKind::Real},
    LogPlaceHolder{"c", LogArgumentKind::Character},
};

/// The place-holder that `text` begins with; null when it begins with none.
constexpr const LogPlaceHolder* logPlaceHolderAtStartOf(std::string_view text) {
    for (const LogPlaceHolder& placeHolder : kLogPlaceHolders) {
        if (text.starts_with(placeHolder.text)) return &placeHolder;
    }
    return nullptr;
}

/// Whether the place-holders of `format` ask for exactly these arguments, in this order.
template <std::size_t count>
constexpr bool logFormatFits(std::string_view format,
                             const std::array<LogArgumentKind, count>& arguments) {
    std::size_t next = 0;
    while (!format.empty()) {
        const bool isPlaceHolder = format.front() == '%';
        format.remove_prefix(1);
        if (!isPlaceHolder) continue;
        if (format.starts_with('%')) {
            format.remove_prefix(1);
            continue;
        }
        const LogPlaceHolder* placeHolder = logPlaceHolderAtStartOf(format);
        if (placeHolder == nullptr || next == count) return false;
        if (placeHolder->kind != arguments[next++]) return false;
        format.remove_prefix(placeHolder->text.size());
    }
    return next == count;
}

/// Never defined: a format whose check calls it does not compile.
void formatDoesNotFitItsArguments();

/// How the messages in the plug-in's name begin.
inline constexpr std::string_view kLogPrefix = "%s|";

/// A format literal, checked against its arguments when the caller is compiled. The argument of the
/// prefix, if it has one, is not among `Arguments`.
template <bool isPrefixed, typename... Arguments>
class LogFormat {
  public:
    // Implicit on purpose: a message is written down as its literal.
    consteval LogFormat(const char* text)  // NOLINT(google-explicit-constructor)
        : text_(text) {
        constexpr std::array<LogArgumentKind, sizeof...(Arguments)> kinds{
            logArgumentKind<Arguments>()...};
        std::string_view rest = text_;
        if (rest.starts_with(kLogPrefix) != isPrefixed) formatDoesNotFitItsArguments();
        if (isPrefixed) rest.remove_prefix(kLogPrefix.size());
        if (!logFormatFits(rest, kinds)) formatDoesNotFitItsArguments();
    }

    [[nodiscard]] constexpr std::string_view text() const { return text_; }

  private:
    std::string_view text_;
};

}  // namespace appsync
