#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace appsync {

/// A number of bytes for people: "812 bytes", "1.5 MiB".
[[nodiscard]] std::string formatBytes(std::uint64_t bytes);

/// A point in time as ISO 8601 in UTC, to the second: "2026-01-31T12:00:00Z".
[[nodiscard]] std::string formatTime(std::chrono::system_clock::time_point time);

/// The same for people, in the machine's time zone: "2026-01-31 13:00:00 +0100".
[[nodiscard]] std::string formatLocalTime(std::chrono::system_clock::time_point time);

/// A time that is written down in ISO 8601 and UTC, for people, as `formatLocalTime` has it, with
/// the fraction of its second; any other text made safe to print.
[[nodiscard]] std::string localTimeOf(std::string_view text);

/// The time of day in the machine's time zone: "13:00:00 +0100".
[[nodiscard]] std::string formatClock(std::chrono::system_clock::time_point time);

/// Minutes and seconds: "1:05".
[[nodiscard]] std::string formatDuration(std::chrono::seconds time);

/// The text with everything that a terminal could take for a command or that could make it show
/// something else (control characters, those that change the direction of text or cannot be seen,
/// broken UTF-8) replaced by "?".
[[nodiscard]] std::string printable(std::string_view text);

/// The first characters of the text, `width` columns of a terminal with the mark that ends them
/// when something is cut off, and with blanks where they are fewer.
[[nodiscard]] std::string fitted(std::string_view text, std::size_t width,
                                 std::string_view cutMark = "...");

/// The same with the last characters of the text, behind the mark.
[[nodiscard]] std::string fittedAtFront(std::string_view text, std::size_t width,
                                        std::string_view cutMark = "...");

/// As many characters from the text's begin as `width` columns hold.
[[nodiscard]] std::string_view beginOf(std::string_view text, std::size_t width);

/// As many characters from the text's end as `width` columns hold.
[[nodiscard]] std::string_view endOf(std::string_view text, std::size_t width);

/// The line with line ends between its words, so that none has more than `width` columns; those
/// that follow begin with `indent` blanks. A word that is longer is broken anywhere.
[[nodiscard]] std::string wrapped(std::string line, std::size_t width, std::size_t indent);

/// The columns that the text takes on a terminal: two for a character of East Asian writing or an
/// emoji, none for an accent that stands on the letter before it.
[[nodiscard]] std::size_t displayWidth(std::string_view text);

/// The text as a shell takes it for one word, made safe to print.
[[nodiscard]] std::string shellWord(std::string_view text);

/// "1 application", "2 applications".
[[nodiscard]] std::string counted(std::uint64_t number, std::string_view noun);

}  // namespace appsync
