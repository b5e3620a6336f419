#include "host/session/PackageSender.h"

#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <memory>
#include <span>
#include <string_view>
#include <utility>

#include "device/Device.h"
#include "host/file/HostFile.h"
#include "host/plan/TransferError.h"
#include "host/watch/SyncDaemon.h"
#include "platform/FileSystem.h"
#include "system/file/DescriptorIO.h"
#include "system/file/RootDirectory.h"

namespace appsync {

// A new file of the device, which goes away again unless it is kept.
class NewFile {
  public:
    NewFile(const UniqueFd& directory, std::string name)
        : directory_(directory.get()), name_(std::move(name)) {
        open();
        if (error_ != EEXIST) return;
        ::unlinkat(directory_, name_.c_str(), 0);
        open();
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
    void sync() {
        if (error_ == 0 && ::fsync(descriptor_.get()) != 0) error_ = errno;
    }
    void fail(int error) {
        if (error_ == 0) error_ = error;
    }
    /// Gives it another place, in one step.
    void moveTo(int directory, const std::string& name) {
        if (error_ != 0) return;
        isKept_ = ::renameat(directory_, name_.c_str(), directory, name.c_str()) == 0;
        if (!isKept_) error_ = errno;
    }

  private:
    void open() {
        descriptor_.reset(::openat(directory_, name_.c_str(),
                                   O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644));
        error_ = descriptor_ ? 0 : errno;
    }

    const int directory_;
    const std::string name_;
    UniqueFd descriptor_;
    int error_ = 0;
    bool isKept_ = false;
};

namespace {

constexpr std::size_t kPieceBytes = std::size_t{1} << 20;
// In the directory for temporary files, which the opening of each session empties.
constexpr std::string_view kUnfinishedName = "Arriving";  // and a number

ErrorRecord interrupted() {
    return ErrorRecord::make(kTransferErrorDomain, kTransferInterrupted,
                             "the transfer was interrupted: run the same command again");
}

ErrorRecord cutShort(const std::string& file) {
    return ErrorRecord::make(kTransferErrorDomain, kTransferCutShort,
                             file + " became shorter while it was sent: send it again");
}

ErrorRecord cannotWrite(int errorNumber, const std::string& path) {
    ErrorRecord error = systemError(errorNumber, "cannot write " + path);
    if (errorNumber != ENOSPC && errorNumber != EDQUOT) return error;
    return ErrorRecord::make(error.domain, error.code,
                             error.description() + "; free space on the device and send it again");
}

Result<UniqueFd> openTarget(Device& device, const std::string& directory) {
    Result<UniqueFd> there = device.root().openDirectory(directory);
    if (there) return there;
    const FileAttributes mobile{"mobile", "mobile"};
    const Status made = device.files().createDirectory(directory, true, &mobile);
    if (!made) return made.error();
    return device.root().openDirectory(directory);
}

}  // namespace

/// A file that waits for its place.
struct PackageSender::Aside {
    std::string directory;
    std::string name;
    UniqueFd target;
    UniqueFd temporary;
    std::unique_ptr<NewFile> file;
};

PackageSender::PackageSender(Device& device) : device_(device), piece_(kPieceBytes) {}

PackageSender::~PackageSender() = default;

Result<std::uint64_t> PackageSender::send(const std::string& file, const std::string& directory,
                                          const std::string& name, const Progress& progress) {
    Result<HostFile> source = HostFile::open(file);
    if (!source) return source.error();
    const Result<UniqueFd> target = openTarget(device_, directory);
    if (!target) return target.error();
    NewFile sent(*target, name);
    Result<std::uint64_t> total = copy(*source, file, sent, progress);
    if (total && sent.error() != 0) return cannotWrite(sent.error(), directory + "/" + name);
    if (total) sent.keep();
    return total;
}

Result<std::uint64_t> PackageSender::sendWhole(const std::string& file,
                                               const std::string& directory,
                                               const std::string& name, const Progress& progress) {
    Result<std::uint64_t> total = sendAside(file, directory, name, progress);
    if (!total) return total;
    const std::map<std::string, ErrorRecord> failures = placeAll();
    return failures.empty() ? total : failures.begin()->second;
}

Result<std::uint64_t> PackageSender::sendAside(const std::string& file,
                                               const std::string& directory,
                                               const std::string& name, const Progress& progress) {
    Result<HostFile> source = HostFile::open(file);
    if (!source) return source.error();
    Result<UniqueFd> target = openTarget(device_, directory);
    if (!target) return target.error();
    Result<UniqueFd> temporary = openTarget(device_, device_.files().temporaryDirectory());
    if (!temporary) return temporary.error();
    auto sent = std::make_unique<NewFile>(
        *temporary, std::string(kUnfinishedName) + std::to_string(aside_.size()));
    Result<std::uint64_t> total = copy(*source, file, *sent, progress);
    if (total && sent->error() != 0) return cannotWrite(sent->error(), directory + "/" + name);
    if (total) {
        aside_.push_back(
            {directory, name, *std::move(target), *std::move(temporary), std::move(sent)});
    }
    return total;
}

std::map<std::string, ErrorRecord> PackageSender::placeAll() {
    const std::vector<Aside> all = std::exchange(aside_, {});
    if (all.size() == 1) all.front().file->sync();
    // Opened before the first was written, so it tells of all of them.
    const bool isSynced = all.size() <= 1 || ::syncfs(all.front().temporary.get()) == 0;
    const int error = isSynced ? 0 : errno;
    for (const Aside& each : all) {
        each.file->fail(error);
        each.file->moveTo(each.target.get(), each.name);
    }
    std::map<std::string, int> syncs;  // of the directories
    std::map<std::string, ErrorRecord> failures;
    for (const Aside& each : all) {
        const auto [sync, isNew] = syncs.try_emplace(each.directory, 0);
        if (isNew && ::fsync(each.target.get()) != 0) sync->second = errno;
        each.file->fail(sync->second);
        const std::string path = each.directory + "/" + each.name;
        if (each.file->error() != 0) failures.emplace(path, cannotWrite(each.file->error(), path));
    }
    return failures;
}

// Failures to write are the target's to tell.
Result<std::uint64_t> PackageSender::copy(HostFile& source, const std::string& file,
                                          NewFile& target, const Progress& progress) {
    const std::uint64_t total = source.size();
    for (std::uint64_t done = 0; done < total && target.error() == 0;) {
        const std::size_t wanted =
            static_cast<std::size_t>(std::min<std::uint64_t>(piece_.size(), total - done));
        const Result<std::size_t> count = source.read(std::span(piece_).first(wanted));
        if (!count) return count.error().withContext(file);
        if (*count == 0) return cutShort(file);
        target.write(std::span(piece_).first(*count));
        done += *count;
        if (target.error() == 0 && !progress(done, total)) return interrupted();
    }
    return total;
}

}  // namespace appsync
