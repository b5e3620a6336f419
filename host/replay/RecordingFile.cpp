#include "host/replay/RecordingFile.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <cerrno>
#include <cstring>
#include <utility>

#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "system/file/DescriptorIO.h"

namespace appsync {
namespace {

/// How much a recording grows at once: what a dozen applications take.
constexpr std::size_t kPiece = std::size_t{256} * 1024;

/// Whether the file system has no pieces to give.
bool isUnsupported(int error) {
    return error == EOPNOTSUPP || error == ENOSYS || error == ENODEV || error == EINVAL;
}

/// A signal, such as that of a terminal which stops the process, may interrupt it.
int takeRoom(int file, off_t offset) {
    while (::fallocate(file, 0, offset, kPiece) != 0) {
        if (errno != EINTR) return errno;
    }
    return 0;
}

}  // namespace

Result<std::unique_ptr<RecordingFile>> RecordingFile::create(const std::string& path) {
    constexpr mode_t kMode = 0600;  // it tells what is on a device
    UniqueFd file(
        ::open(path.c_str(), O_RDWR | O_CREAT | O_APPEND | O_CLOEXEC | O_NONBLOCK, kMode));
    struct stat status = {};
    if (!file) return cannotWriteFile(errno, path);
    // Two sessions that begin at once would both find it empty, were it not locked.
    const bool isTaken = ::flock(file.get(), LOCK_EX | LOCK_NB) != 0 && errno == EWOULDBLOCK;
    if (!isTaken && ::fstat(file.get(), &status) != 0) return cannotWriteFile(errno, path);
    if (isTaken || !S_ISREG(status.st_mode) || status.st_size > 0) {
        return wrongUsage("there is a file " + path + " already",
                          "record into another, or remove it");
    }
    return std::make_unique<RecordingFile>(path, std::move(file));
}

RecordingFile::RecordingFile(std::string path, UniqueFd file)
    : path_(std::move(path)), file_(std::move(file)) {
    const int error = nextPiece();
    isMapped_ = !isUnsupported(error);
    if (isMapped_) lossError_ = error;
}

RecordingFile::~RecordingFile() {
    if (isEmpty_) ::unlink(path_.c_str());
    if (piece_ == nullptr) return;
    const std::uint64_t size = pieceOffset_ + used_;
    leavePiece();
    // Where that fails, zeros follow the last line, as after a kill.
    static_cast<void>(::ftruncate(file_.get(), static_cast<off_t>(size)));
}

// After a line that was cut off no other may follow.
void RecordingFile::write(std::string_view line) noexcept {
    if (lossError_ != 0 || line.empty()) return;
    isEmpty_ = false;
    const ByteView bytes(reinterpret_cast<const std::uint8_t*>(line.data()), line.size());
    lossError_ = isMapped_ ? writeMapped(line) : writeWhole(file_.get(), bytes).error;
}

/// The end of the line comes last: without it the line is none, whatever is there of it.
int RecordingFile::writeMapped(std::string_view line) noexcept {
    const int error = append(line.substr(0, line.size() - 1));
    if (error != 0) return error;
    if (used_ == kPiece) {
        const int full = nextPiece();
        if (full != 0) return full;
    }
    std::atomic_ref(piece_[used_++]).store(line.back(), std::memory_order_release);
    return 0;
}

int RecordingFile::append(std::string_view text) noexcept {
    while (!text.empty()) {
        if (used_ == kPiece) {
            const int error = nextPiece();
            if (error != 0) return error;
        }
        const std::size_t count = std::min(text.size(), kPiece - used_);
        std::memcpy(piece_ + used_, text.data(), count);
        used_ += count;
        text.remove_prefix(count);
    }
    return 0;
}

/// Room is taken from the file system before: memory that has none behind it must not be written.
int RecordingFile::nextPiece() noexcept {
    const auto offset =
        static_cast<off_t>(piece_ == nullptr ? pieceOffset_ : pieceOffset_ + kPiece);
    const int taken = takeRoom(file_.get(), offset);
    if (taken != 0) return taken;
    void* const memory = ::mmap(nullptr, kPiece, PROT_READ | PROT_WRITE, MAP_SHARED | MAP_POPULATE,
                                file_.get(), offset);
    if (memory == MAP_FAILED) {
        const int error = errno;
        static_cast<void>(::ftruncate(file_.get(), offset));
        return error;
    }
    leavePiece();
    piece_ = static_cast<char*>(memory);
    pieceOffset_ = static_cast<std::uint64_t>(offset);
    used_ = 0;
    return 0;
}

void RecordingFile::leavePiece() noexcept {
    if (piece_ != nullptr) ::munmap(piece_, kPiece);
    piece_ = nullptr;
}

void RecordingFile::tellLoss(const Console& console) const {
    if (lossError_ == 0) return;
    console.complain("the recording " + path_ + (isEmpty_ ? " is not kept: " : " is cut off: ") +
                     systemError(lossError_, "write").description());
}

Result<std::unique_ptr<RecordingFile>> createRecording(const RecordingArguments& arguments) {
    if (arguments.path.empty()) {
        if (!arguments.isAnonymous) return std::unique_ptr<RecordingFile>();
        return wrongUsage("--anonymous without --record", "only a recording is anonymous");
    }
    return RecordingFile::create(arguments.path);
}

}  // namespace appsync
