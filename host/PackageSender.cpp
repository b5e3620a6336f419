#include "host/PackageSender.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <span>

#include "device/Device.h"
#include "host/HostFile.h"
#include "host/SyncDaemon.h"
#include "platform/FileSystem.h"
#include "system/DescriptorIO.h"
#include "system/RootDirectory.h"

namespace appsync {
namespace {

constexpr std::size_t kPieceBytes = std::size_t{1} << 20;

// A new file of the device, which goes away again unless it is kept.
class NewFile {
  public:
    NewFile(const UniqueFd& directory, std::string name)
        : directory_(directory.get()), name_(std::move(name)) {
        ::unlinkat(directory_, name_.c_str(), 0);
        descriptor_.reset(::openat(directory_, name_.c_str(),
                                   O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644));
        if (!descriptor_) error_ = errno;
    }
    NewFile(const NewFile&) = delete;
    NewFile& operator=(const NewFile&) = delete;
    ~NewFile() {
        if (descriptor_ && !isKept_) ::unlinkat(directory_, name_.c_str(), 0);
    }

    /// The errno value of the failure, or 0.
    [[nodiscard]] int error() const { return error_; }
    void write(ByteView bytes) {
        if (error_ == 0) error_ = writeWhole(descriptor_.get(), bytes).error;
    }
    void keep() { isKept_ = true; }

  private:
    const int directory_;
    const std::string name_;
    UniqueFd descriptor_;
    int error_ = 0;
    bool isKept_ = false;
};

ErrorRecord interrupted() {
    return ErrorRecord::make(kTransferErrorDomain, kTransferInterrupted,
                             "the transfer was interrupted: run the same command again");
}

ErrorRecord cutShort(const std::string& file) {
    return ErrorRecord::make(kTransferErrorDomain, kTransferCutShort,
                             file + " became shorter while it was sent: run the command again");
}

ErrorRecord cannotWrite(int errorNumber, const std::string& path) {
    ErrorRecord error = systemError(errorNumber, "cannot write " + path);
    if (errorNumber != ENOSPC && errorNumber != EDQUOT) return error;
    return ErrorRecord::make(error.domain, error.code,
                             error.description() + "; free space on the device and sync again");
}

Result<UniqueFd> openTarget(Device& device, const std::string& directory) {
    const FileAttributes mobile{"mobile", "mobile"};
    const Status made = device.files().createDirectory(directory, true, &mobile);
    if (!made) return made.error();
    return device.root().openDirectory(directory);
}

}  // namespace

PackageSender::PackageSender(Device& device) : device_(device), piece_(kPieceBytes) {}

Result<std::uint64_t> PackageSender::send(const std::string& file, const std::string& directory,
                                          const std::string& name, const Progress& progress) {
    Result<HostFile> source = HostFile::open(file);
    if (!source) return source.error();
    const Result<UniqueFd> target = openTarget(device_, directory);
    if (!target) return target.error();
    NewFile sent(*target, name);
    const std::uint64_t total = source->size();
    for (std::uint64_t done = 0; done < total && sent.error() == 0;) {
        const std::size_t wanted =
            static_cast<std::size_t>(std::min<std::uint64_t>(piece_.size(), total - done));
        const Result<std::size_t> count = source->read(std::span(piece_).first(wanted));
        if (!count) return count.error().withContext(file);
        if (*count == 0) return cutShort(file);
        sent.write(std::span(piece_).first(*count));
        done += *count;
        if (sent.error() == 0 && !progress(done, total)) return interrupted();
    }
    if (sent.error() != 0) {
        return cannotWrite(sent.error(), directory + "/" + name);
    }
    sent.keep();
    return total;
}

}  // namespace appsync
