#include "host/serve/LogPage.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdint>
#include <deque>
#include <functional>
#include <string_view>
#include <utility>
#include <vector>

#include "host/console/JsonWriting.h"
#include "system/LogFile.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

#include <nlohmann/json.hpp>

namespace appsync {
namespace {

// More than a device writes.
constexpr std::size_t kLongestShownLine = std::size_t{1} << 20U;
constexpr std::size_t kReadSize = std::size_t{64} << 10U;
constexpr std::uint64_t kFirstWindow = std::uint64_t{256} << 10U;

// A place in a log: how far into which of its files.
struct LogPlace {
    std::uint64_t file = 0;
    std::uint64_t offset = 0;
};

std::string textOf(const LogPlace& place) {
    return std::to_string(place.file) + "-" + std::to_string(place.offset);
}

std::optional<std::uint64_t> numberIn(std::string_view text) {
    std::uint64_t number = 0;
    const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
    if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
    return number;
}

std::optional<LogPlace> placeIn(std::string_view text) {
    const std::size_t dash = text.find('-');
    if (dash == std::string_view::npos) return std::nullopt;
    const std::optional<std::uint64_t> file = numberIn(text.substr(0, dash));
    const std::optional<std::uint64_t> offset = numberIn(text.substr(dash + 1));
    if (!file || !offset) return std::nullopt;
    return LogPlace{*file, *offset};
}

// A file of the log, as far as it goes now.
struct LogPiece {
    UniqueFd file;
    std::uint64_t number = 0;
    std::uint64_t size = 0;
};

Result<std::optional<LogPiece>> openPiece(const std::string& path) {
    LogPiece piece;
    piece.file = UniqueFd(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
    if (!piece.file && errno == ENOENT) return std::optional<LogPiece>();
    struct stat status {};
    if (!piece.file || ::fstat(piece.file.get(), &status) != 0) {
        return posixError(errno, "read", path);
    }
    if (!S_ISREG(status.st_mode)) return posixError(EINVAL, "read", path, "it is no regular file");
    piece.number = status.st_ino;
    piece.size = static_cast<std::uint64_t>(status.st_size);
    return std::optional<LogPiece>(std::move(piece));
}

// The newer first: what becomes the older meanwhile is then there twice, and not missing.
Result<std::vector<LogPiece>> openPieces(const std::string& path) {
    Result<std::optional<LogPiece>> newer = openPiece(path);
    if (!newer) return newer.error();
    Result<std::optional<LogPiece>> older = openPiece(olderPartOf(path));
    if (!older) return older.error();
    std::vector<LogPiece> pieces;
    if (*older && (!*newer || (*older)->number != (*newer)->number)) {
        pieces.push_back(**std::move(older));
    }
    if (*newer) pieces.push_back(**std::move(newer));
    return pieces;
}

// Takes a line and the place of its end; whether to go on.
using TakeLine = std::function<bool(std::string_view line, std::uint64_t end)>;

// Hands on the whole lines behind that place. False where one was the last that is wanted.
bool eachLine(const LogPiece& piece, std::uint64_t from, const TakeLine& take) {
    std::string buffer(kReadSize, '\0');
    std::string begun;
    while (from < piece.size) {
        const std::uint64_t wanted = std::min<std::uint64_t>(buffer.size(), piece.size - from);
        const ssize_t count =
            ::pread(piece.file.get(), buffer.data(), wanted, static_cast<off_t>(from));
        if (count <= 0) return true;
        std::string_view rest(buffer.data(), static_cast<std::size_t>(count));
        for (std::size_t end = rest.find('\n'); end != rest.npos; end = rest.find('\n')) {
            if (begun.size() <= kLongestShownLine) begun += rest.substr(0, end);
            rest.remove_prefix(end + 1);
            from += end + 1;
            if (begun.size() <= kLongestShownLine && !take(begun, from)) return false;
            begun.clear();
        }
        if (begun.size() <= kLongestShownLine) begun += rest;
        from += rest.size();
    }
    return true;
}

// The line as it is shown, with its position before what it says itself.
std::optional<std::string> shownWith(const LogPlace& place, std::string_view line,
                                     const LogFilter& filter) {
    if (!line.starts_with('{')) return std::nullopt;
    const std::optional<LogRecord> record = readLogLine(line);
    if (!record || !isWanted(*record, filter)) return std::nullopt;
    std::string text = R"({"position":")" + textOf(place) + '"';
    const std::string_view members = line.substr(1);
    if (members.find_first_not_of(" \t\r") != members.find('}')) text += ',';
    return text.append(members);
}

struct LogLinesRead {
    std::deque<std::string> lines;
    LogPlace next;
};

LogLinesRead linesBehind(const std::vector<LogPiece>& pieces, std::size_t first,
                         std::uint64_t offset, const LogQuestion& question) {
    LogLinesRead read;
    read.next = {pieces[first].number, offset};
    for (std::size_t index = first; index < pieces.size(); ++index) {
        const LogPiece& piece = pieces[index];
        const std::uint64_t from = index == first ? offset : 0;
        read.next = {piece.number, from};
        const bool goesOn = eachLine(piece, from, [&](std::string_view line, std::uint64_t end) {
            read.next.offset = end;
            std::optional<std::string> shown =
                shownWith({piece.number, end}, line, question.filter);
            if (shown) read.lines.push_back(*std::move(shown));
            return read.lines.size() < question.most;
        });
        if (!goesOn) break;
    }
    return read;
}

// The lines in the last bytes of the log, the last of those that are wanted.
LogLinesRead linesWithin(const std::vector<LogPiece>& pieces, std::uint64_t window,
                         const LogQuestion& question) {
    LogLinesRead read;
    std::uint64_t behind = 0;  // bytes of the pieces that follow
    for (const LogPiece& piece : pieces) behind += piece.size;
    for (const LogPiece& piece : pieces) {
        behind -= piece.size;
        const std::uint64_t share = window > behind ? std::min(window - behind, piece.size) : 0;
        std::uint64_t from = piece.size - share;
        bool isWhole = from == 0;
        read.next = {piece.number, from};
        eachLine(piece, from, [&](std::string_view line, std::uint64_t end) {
            read.next.offset = end;
            std::optional<std::string> shown;
            if (std::exchange(isWhole, true)) {
                shown = shownWith({piece.number, end}, line, question.filter);
            }
            if (shown) read.lines.push_back(*std::move(shown));
            if (read.lines.size() > question.most) read.lines.pop_front();
            return true;
        });
    }
    return read;
}

LogLinesRead lastLines(const std::vector<LogPiece>& pieces, const LogQuestion& question) {
    std::uint64_t all = 0;
    for (const LogPiece& each : pieces) all += each.size;
    std::uint64_t window = kFirstWindow;
    LogLinesRead read = linesWithin(pieces, window, question);
    while (window < all && read.lines.size() < question.most) {
        window *= 8;
        read = linesWithin(pieces, window, question);
    }
    return read;
}

LogLinesRead linesFor(const std::vector<LogPiece>& pieces, const LogQuestion& question) {
    if (pieces.empty()) return {};
    const std::optional<LogPlace> after =
        question.after ? placeIn(*question.after) : std::optional<LogPlace>();
    if (!after) return lastLines(pieces, question);
    for (std::size_t index = 0; index < pieces.size(); ++index) {
        // One that is shorter than it was has been emptied.
        if (pieces[index].number == after->file && after->offset <= pieces[index].size) {
            return linesBehind(pieces, index, after->offset, question);
        }
    }
    return linesBehind(pieces, 0, 0, question);
}

}  // namespace

Result<std::string> logText(const std::string& path, const LogQuestion& question) {
    const Result<std::vector<LogPiece>> pieces = openPieces(path);
    if (!pieces) return pieces.error();
    const LogLinesRead read = linesFor(*pieces, question);
    std::string text = R"({"lines":[)";
    for (const std::string& line : read.lines) {
        if (text.back() != '[') text += ',';
        text += line;
    }
    return text + R"(],"next":)" + dumped(textOf(read.next)) + "}";
}

}  // namespace appsync
