#include "host/replay/RecordingFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <utility>

#include "host/console/Console.h"
#include "host/console/Problem.h"
#include "host/file/HostFile.h"
#include "system/DescriptorIO.h"

namespace appsync {

Result<std::unique_ptr<RecordingFile>> RecordingFile::create(const std::string& path) {
    constexpr mode_t kMode = 0600;  // it tells what is on a device
    UniqueFd file(
        ::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC | O_NONBLOCK, kMode));
    struct stat status = {};
    if (!file || ::fstat(file.get(), &status) != 0) return cannotWriteFile(errno, path);
    if (!S_ISREG(status.st_mode) || status.st_size > 0) {
        return wrongUsage("there is a file " + path + " already",
                          "record into another, or remove it");
    }
    return std::make_unique<RecordingFile>(path, std::move(file));
}

RecordingFile::~RecordingFile() {
    if (isEmpty_) ::unlink(path_.c_str());
}

// After a line that was cut off no other may follow.
void RecordingFile::write(std::string_view line) noexcept {
    if (lossError_ != 0) return;
    isEmpty_ = false;
    const ByteView bytes(reinterpret_cast<const std::uint8_t*>(line.data()), line.size());
    lossError_ = writeWhole(file_.get(), bytes).error;
}

void RecordingFile::tellLoss(const Console& console) const {
    if (lossError_ == 0) return;
    console.complain("the recording " + path_ +
                     " is cut off: " + systemError(lossError_, "write").description());
}

Result<std::unique_ptr<RecordingFile>> createRecording(const RecordingArguments& arguments) {
    if (arguments.path.empty()) {
        if (!arguments.isAnonymous) return std::unique_ptr<RecordingFile>();
        return wrongUsage("--anonymous without --record", "only a recording is anonymous");
    }
    return RecordingFile::create(arguments.path);
}

}  // namespace appsync
