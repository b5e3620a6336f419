#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <thread>
#include <utility>
#include <variant>

#include "host/command/Commands.h"
#include "host/command/OpenDevice.h"
#include "host/console/Console.h"
#include "host/console/JsonReading.h"
#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "system/JsonLogFacility.h"
#include "system/LogFile.h"
#include "system/UniqueFd.h"

namespace appsync {
namespace {

constexpr std::chrono::milliseconds kFollowInterval{200};

// More than a device writes: each of a message's few arguments is cut at 16 KiB.
constexpr std::size_t kLongestLine = std::size_t{1} << 20U;
constexpr std::size_t kPieceSize = std::size_t{64} << 10U;

// From the least to the most severe.
constexpr std::array kSeverity = {LogLevel::Debug, LogLevel::Info, LogLevel::Default,
                                  LogLevel::Error, LogLevel::Fault};

std::size_t severityOf(LogLevel level) {
    std::size_t rank = 0;
    while (rank < kSeverity.size() && kSeverity.at(rank) != level) ++rank;
    return rank;
}

std::size_t severityOf(std::string_view name) {
    std::size_t rank = 0;
    while (rank < kSeverity.size() && nameOf(kSeverity.at(rank)) != name) ++rank;
    return rank;
}

// What the log says of a message; empty where it says nothing, or something else than a text.
struct LogRecord {
    std::string time;
    std::string level;
    std::string message;
    std::optional<std::int64_t> category;
};

std::optional<std::int64_t> wholeNumber(const JsonScalar& value) {
    if (const auto* number = std::get_if<std::int64_t>(&value)) return *number;
    const auto* positive = std::get_if<std::uint64_t>(&value);
    if (positive == nullptr || !std::in_range<std::int64_t>(*positive)) return std::nullopt;
    return static_cast<std::int64_t>(*positive);
}

// Takes a line's members and nothing that lies deeper.
class LineListener final : public JsonListener {
  public:
    explicit LineListener(LogRecord& record) : record_(record) {}

    bool memberBegins(std::string name) override {
        if (depth_ == 1) member_ = std::move(name);
        return true;
    }
    bool scalar(JsonScalar value) override {
        if (depth_ != 1) return depth_ != 0;  // a line is an object
        if (member_ == "category") record_.category = wholeNumber(value);
        auto* text = std::get_if<std::string>(&value);
        std::string* place = placeOf(member_);
        if (text != nullptr && place != nullptr) *place = std::move(*text);
        return true;
    }
    bool objectBegins() override { return ++depth_ != 0; }
    bool arrayBegins() override { return depth_++ != 0; }
    bool containerEnds() override {
        --depth_;
        return true;
    }

  private:
    std::string* placeOf(std::string_view member) {
        if (member == "time") return &record_.time;
        if (member == "level") return &record_.level;
        return member == "message" ? &record_.message : nullptr;
    }

    LogRecord& record_;
    std::string member_;
    std::size_t depth_ = 0;
};

bool isWanted(const LogRecord& record, const LogArguments& arguments) {
    if (arguments.category && record.category != arguments.category) return false;
    return !arguments.level || severityOf(record.level) >= severityOf(*arguments.level);
}

void showLine(const std::string& text, const LogArguments& arguments, const Console& console) {
    LogRecord record;
    LineListener listener(record);
    if (!readJson(text, listener)) return;  // cut off by a crash, for instance
    if (!isWanted(record, arguments)) return;
    if (arguments.asJson) {
        console.out << text << '\n';
        return;
    }
    const std::string number = record.category ? std::to_string(*record.category) : "-";
    console.out << localTimeOf(record.time) << ' ' << fitted(printable(record.level), 7) << ' '
                << fitted(number, 2) << ' ' << printable(record.message) << '\n';
}

// Puts lines together from the pieces that are read, and shows them.
class LogLines {
  public:
    LogLines(std::string path, const LogArguments& arguments, const Console& console)
        : path_(std::move(path)), arguments_(&arguments), console_(&console) {}

    void add(std::string_view piece) {
        for (std::size_t end = piece.find('\n'); end != piece.npos; end = piece.find('\n')) {
            addToLine(piece.substr(0, end));
            endLine();
            piece.remove_prefix(end + 1);
        }
        addToLine(piece);
    }

  private:
    void addToLine(std::string_view piece) {
        isTooLong_ = isTooLong_ || begun_.size() + piece.size() > kLongestLine;
        if (!isTooLong_) begun_ += piece;
    }

    void endLine() {
        ++number_;
        if (isTooLong_) {
            console_->complain("line " + std::to_string(number_) + " of " + path_ +
                               " is left out: it is longer than any that a device writes");
        } else {
            showLine(begun_, *arguments_, *console_);
        }
        begun_.clear();
        isTooLong_ = false;
    }

    std::string path_;
    const LogArguments* arguments_;
    const Console* console_;
    std::string begun_;  // the line that is still being written
    bool isTooLong_ = false;
    std::uint64_t number_ = 0;
};

// One file of the log, as far as it has been read; none where there is no regular file.
class LogPart {
  public:
    LogPart() = default;
    // A pipe in its place would be waited on.
    explicit LogPart(const std::string& path)
        : file_(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK)) {
        const bool isRegular =
            file_ && ::fstat(file_.get(), &opened_) == 0 && S_ISREG(opened_.st_mode);
        if (!isRegular) file_.reset();
    }

    [[nodiscard]] bool isThere() const { return file_.valid(); }
    [[nodiscard]] bool isSameAs(const LogPart& other) const {
        return isThere() && other.isThere() && isSameAs(other.opened_);
    }
    [[nodiscard]] bool standsAt(const std::string& path) const {
        struct stat now {};
        return isThere() && ::stat(path.c_str(), &now) == 0 && isSameAs(now);
    }
    // The next bytes of it; empty where there are none yet.
    [[nodiscard]] std::string_view read(std::string& buffer) const {
        if (!isThere()) return {};
        const ssize_t count = ::read(file_.get(), buffer.data(), buffer.size());
        return std::string_view(buffer).substr(0, count > 0 ? static_cast<std::size_t>(count) : 0);
    }

  private:
    [[nodiscard]] bool isSameAs(const struct stat& other) const {
        return opened_.st_dev == other.st_dev && opened_.st_ino == other.st_ino;
    }

    UniqueFd file_;
    struct stat opened_ {};
};

// Shows a log: its older part, then what lines are appended to, whichever file that is.
class LogReader {
  public:
    LogReader(std::string path, const LogArguments& arguments, const Console& console)
        : path_(std::move(path)),
          arguments_(arguments),
          console_(console),
          lines_(path_, arguments, console) {}

    void show() {
        begin();
        bool isPutAside = false;
        while (arguments_.follows && console_.out.good()) {
            std::this_thread::sleep_for(kFollowInterval);
            showRest();
            // Who was writing when it was put aside has had this round to end the line.
            if (isPutAside) begin();
            isPutAside = !part_.standsAt(path_);
        }
    }

  private:
    // Shows what of both parts has not been shown.
    void begin() {
        LogPart next(path_);  // before the older part, which it may become in between
        LogPart older(olderPartOf(path_));
        if (!older.isSameAs(next)) turnTo(std::move(older), olderPartOf(path_));
        turnTo(std::move(next), path_);
    }

    void turnTo(LogPart part, const std::string& path) {
        if (!part.isThere() || part.isSameAs(part_)) return;
        part_ = std::move(part);
        lines_ = LogLines(path, arguments_, console_);
        showRest();
    }

    void showRest() {
        std::string_view piece = part_.read(buffer_);
        while (!piece.empty() && console_.out.good()) {
            lines_.add(piece);
            piece = part_.read(buffer_);
        }
        console_.out.flush();
    }

    const std::string path_;
    const LogArguments& arguments_;
    const Console& console_;
    std::string buffer_ = std::string(kPieceSize, '\0');
    LogPart part_;  // which is being shown
    LogLines lines_;
};

}  // namespace

int runLog(const LogArguments& arguments, const Console& console) {
    Result<std::unique_ptr<Device>> device = openDevice(arguments.device, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    const std::string path = (*device)->logPath();
    device->reset();  // whoever watches the log has no use for the database
    LogReader(path, arguments, console).show();
    return kExitDone;
}

}  // namespace appsync
