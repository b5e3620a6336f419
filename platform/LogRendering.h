#pragma once

#include <cstddef>
#include <string>

namespace appsync {

class PropertyList;
struct ErrorRecord;
struct LogMessage;

/// The most bytes of text that one argument of a message takes; see `renderLogMessage`.
inline constexpr std::size_t kLogArgumentLimit = std::size_t{16} * 1024;

/// The text of a message: its format with each place-holder replaced by its argument. Numbers are
/// rendered as in C, flags, width and precision included; objects as by `describe`; a missing
/// object as "(null)". An argument's text is cut at `kLogArgumentLimit`.
///
/// A place-holder that has no argument, or that is none of those of `LogMessage`, stays as it is;
/// an argument of a kind that does not match is rendered as what it is. Callable on any thread.
[[nodiscard]] std::string renderLogMessage(const LogMessage& message);

/// The value in one line: `{key = value; key2 = value2;}`, `(a, b)`, text as it is, 1 and 0 for
/// booleans, `<12 bytes>` for data, `2001-01-01 00:00:00 +0000` for dates, `(null)` for the null
/// marker. What is longer than `limit` bytes is cut there, never inside a character, and ends with
/// "… (N more bytes)". Bounded memory however large the value is. Callable on any thread.
[[nodiscard]] std::string describe(const PropertyList& value,
                                   std::size_t limit = kLogArgumentLimit);

/// The error in one line: `Error Domain=POSIX Code=2 "no such file"`; `"(null)"` where it has no
/// sentence. Cut as above. Callable on any thread.
[[nodiscard]] std::string describe(const ErrorRecord& error, std::size_t limit = kLogArgumentLimit);

}  // namespace appsync
