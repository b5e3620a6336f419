#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstddef>
#include <ostream>
#include <string>
#include <string_view>
#include <thread>
#include <utility>

#include "host/command/argument/IdentifierArgument.h"
#include "host/command/argument/OpenDevice.h"
#include "host/command/look/LogLines.h"
#include "host/command/look/LookCommands.h"
#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "system/LogFile.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {
namespace {

constexpr std::chrono::milliseconds kFollowInterval{200};
constexpr std::size_t kPieceSize = std::size_t{64} << 10U;

ErrorRecord cannotReadLog(const std::string& path, const std::string& why) {
    return unusable("cannot read the device's log " + displayPath(path) + ": " + why,
                    "see what stands there, and who may read it");
}

// One file of the log, as far as it has been read; none where nothing stands.
class LogPart {
  public:
    LogPart() = default;

    static Result<LogPart> open(const std::string& path) {
        // A pipe in its place would be waited on.
        UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
        if (!file && errno == ENOENT) return LogPart();
        LogPart part;
        if (!file || ::fstat(file.get(), &part.opened_) != 0) {
            return cannotReadLog(path, posixReason(errno));
        }
        if (!S_ISREG(part.opened_.st_mode)) return cannotReadLog(path, "it is no regular file");
        part.file_ = std::move(file);
        part.path_ = path;
        return part;
    }

    [[nodiscard]] bool isThere() const { return file_.valid(); }
    [[nodiscard]] bool isSameAs(const LogPart& other) const {
        return isThere() && other.isThere() && isSameAs(other.opened_);
    }
    [[nodiscard]] bool standsAt(const std::string& path) const {
        struct stat now {};
        return isThere() && ::stat(path.c_str(), &now) == 0 && isSameAs(now);
    }
    // Whether somebody has emptied it; it is then read from its beginning again.
    [[nodiscard]] bool beginsAnew() const {
        struct stat now {};
        const off_t read = isThere() ? ::lseek(file_.get(), 0, SEEK_CUR) : 0;
        if (!isThere() || ::fstat(file_.get(), &now) != 0 || now.st_size >= read) return false;
        return ::lseek(file_.get(), 0, SEEK_SET) == 0;
    }
    // The next bytes of it; empty where there are none yet.
    [[nodiscard]] Result<std::string_view> read(std::string& buffer) const {
        if (!isThere()) return std::string_view();
        const ssize_t count = ::read(file_.get(), buffer.data(), buffer.size());
        if (count < 0) return cannotReadLog(path_, posixReason(errno));
        return std::string_view(buffer).substr(0, static_cast<std::size_t>(count));
    }

  private:
    [[nodiscard]] bool isSameAs(const struct stat& other) const {
        return opened_.st_dev == other.st_dev && opened_.st_ino == other.st_ino;
    }

    UniqueFd file_;
    std::string path_;
    struct stat opened_ {};
};

// Shows a log: its older part, then what lines are appended to, whichever file that is.
class LogReader {
  public:
    LogReader(std::string path, const LogArguments& arguments, const Console& console)
        : path_(std::move(path)),
          arguments_(arguments),
          console_(console),
          lines_(arguments, console) {}

    Status show() {
        Status status = begin();
        lines_.showLast();
        bool isPutAside = false;
        while (status && arguments_.follows && console_.out.good()) {
            std::this_thread::sleep_for(kFollowInterval);
            if (part_.beginsAnew()) lines_.beginFile(path_);
            status = showRest(part_);
            // Who was writing when it was put aside has had this round to end the line.
            if (status && isPutAside) status = begin();
            isPutAside = !part_.standsAt(path_);
        }
        return status;
    }

  private:
    // Shows what of both parts has not been shown.
    Status begin() {
        Result<LogPart> next = LogPart::open(path_);  // before the older, which it may become
        if (!next) return next.error();
        Result<LogPart> older = LogPart::open(olderPartOf(path_));
        if (!older) return older.error();
        const bool isNew = next->isThere() && !next->isSameAs(part_);
        if (part_.isThere() && !isNew) return {};
        Status status = beginOlder(*std::move(older), *next);
        if (!status || !isNew) return status;
        part_ = *std::move(next);
        lines_.beginFile(path_);
        return showRest(part_);
    }

    Status beginOlder(LogPart older, const LogPart& next) {
        if (older.isSameAs(part_)) {
            older_ = std::move(part_);
            return {};
        }
        if (!older.isThere() || older.isSameAs(older_) || older.isSameAs(next)) return {};
        older_ = std::move(older);
        lines_.beginFile(olderPartOf(path_));
        return showRest(older_);
    }

    Status showRest(const LogPart& part) {
        Result<std::string_view> piece = part.read(buffer_);
        while (piece && !piece->empty() && console_.out.good()) {
            lines_.add(*piece);
            piece = part.read(buffer_);
        }
        console_.out.flush();
        return piece ? Status() : Status(piece.error());
    }

    const std::string path_;
    const LogArguments& arguments_;
    const Console& console_;
    std::string buffer_ = std::string(kPieceSize, '\0');
    LogPart part_;   // which is being shown
    LogPart older_;  // the older part that has been shown: open, so that no other gets its number
    LogLines lines_;
};

Status checkArguments(const LogArguments& arguments) {
    if (!arguments.application) return {};
    return checkIdentifier(*arguments.application, kGiveAsShown, "--app");
}

}  // namespace

int runLog(const LogArguments& arguments, const Console& console) {
    const Status checked = checkArguments(arguments);
    if (!checked) return console.fail(checked.error());
    Result<std::unique_ptr<Device>> device = openDevice(arguments.device, DeviceAccess::Look);
    if (!device) return console.fail(device.error());
    const std::string path = (*device)->logPath();
    device->reset();  // whoever watches the log has no use for the database
    const Status shown = LogReader(path, arguments, console).show();
    return shown ? kExitDone : console.fail(shown.error());
}

}  // namespace appsync
