#include "device/package/PackageUnpacker.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

#include "device/archive/PackageArchive.h"
#include "device/archive/PackageError.h"
#include "system/file/DescriptorIO.h"
#include "system/file/PosixError.h"

namespace appsync {

namespace {

constexpr std::uint64_t kPieceBytes = std::uint64_t{256} << 10;
constexpr std::uint32_t kUsualDirectoryMode = 0755;
/// More than packages nest, but for those that mean it.
constexpr std::size_t kMostOpen = 16;

std::string_view parentOf(std::string_view name) noexcept {
    const std::size_t slash = name.rfind('/');
    return slash == std::string_view::npos ? std::string_view() : name.substr(0, slash);
}

std::string lastOf(std::string_view name) { return std::string(name.substr(name.rfind('/') + 1)); }

bool isInside(std::string_view name, std::string_view directory) noexcept {
    return name.starts_with(directory) &&
           (name.size() == directory.size() || name[directory.size()] == '/');
}

}  // namespace

PackageUnpacker::PackageUnpacker(PackageArchive& archive, int directoryDescriptor,
                                 const PackageUnpackOptions& options)
    : archive_(archive),
      top_(directoryDescriptor),
      options_(options),
      total_(archive.unpackedBytes()),
      buffer_(std::min(total_ + 1, kPieceBytes)) {}

Status PackageUnpacker::run() {
    for (const PackageEntry& entry : archive_.entries()) {
        if (Status status = unpack(entry); !status) return status;
    }
    return reportProgress();
}

Status PackageUnpacker::unpack(const PackageEntry& entry) {
    if (entry.isDirectory) return enter(entry.name, entry.mode);
    if (Status status = enter(parentOf(entry.name), kUsualDirectoryMode); !status) return status;
    return unpackFile(entry);
}

Status PackageUnpacker::unpackFile(const PackageEntry& entry) {
    UniqueFd file(::openat(innermost(), lastOf(entry.name).c_str(),
                           O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
    if (!file) return failed(errno, "create", entry.name);
    const auto write = [&](ByteView piece) { return writePiece(entry, file.get(), piece); };
    if (Status status = archive_.stream(entry, buffer_, write); !status) return status;
    return finishFile(entry, std::move(file));
}

Status PackageUnpacker::writePiece(const PackageEntry& entry, int fileDescriptor, ByteView piece) {
    const int error = writeWhole(fileDescriptor, piece).error;
    if (error != 0) return failed(error, "write", entry.name);
    done_ += piece.size();
    return reportProgress();
}

Status PackageUnpacker::finishFile(const PackageEntry& entry, UniqueFd file) {
    // Only now, so that nobody runs what is not yet whole; and past the umask.
    if (::fchmod(file.get(), entry.mode) != 0) return failed(errno, "set the mode of", entry.name);
    if (options_.keepsTimes && entry.modified) {
        const std::array<timespec, 2> times = {{{0, UTIME_OMIT}, {*entry.modified, 0}}};
        if (::futimens(file.get(), times.data()) != 0) {
            return failed(errno, "set the time of", entry.name);
        }
    }
    if (options_.fileWritten) {
        if (Status status = options_.fileWritten(file.get()); !status) return status;
    }
    if (::close(file.release()) != 0) return failed(errno, "close", entry.name);
    return {};
}

Status PackageUnpacker::enter(std::string_view directory, std::uint32_t mode) {
    if (Status status = leaveUntil(directory); !status) return status;
    while (path_.size() < directory.size()) {
        const std::size_t begin = path_.empty() ? 0 : path_.size() + 1;
        const std::size_t end = std::min(directory.find('/', begin), directory.size());
        const bool isLast = end == directory.size();
        Status status =
            makeDirectory(directory.substr(0, end), isLast ? mode : kUsualDirectoryMode);
        if (!status) return status;
    }
    return {};
}

Status PackageUnpacker::leaveUntil(std::string_view directory) {
    while (!path_.empty() && !isInside(directory, path_)) {
        if (!open_.empty()) open_.pop_back();
        path_.resize(parentOf(path_).size());
    }
    return open_.empty() ? reopen() : Status();
}

Status PackageUnpacker::reopen() {
    for (std::size_t begin = 0; begin < path_.size();) {
        const std::size_t end = std::min(path_.find('/', begin), path_.size());
        UniqueFd directory = openDirectory(path_.substr(begin, end - begin));
        if (!directory) return failed(errno, "open directory", path_.substr(0, end));
        push(std::move(directory));
        begin = end + 1;
    }
    return {};
}

UniqueFd PackageUnpacker::openDirectory(const std::string& name) const {
    return UniqueFd(
        ::openat(innermost(), name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

void PackageUnpacker::push(UniqueFd directory) {
    if (open_.size() == kMostOpen) open_.erase(open_.begin());
    open_.push_back(std::move(directory));
}

Status PackageUnpacker::makeDirectory(std::string_view directory, std::uint32_t mode) {
    const std::string name = lastOf(directory);
    if (::mkdirat(innermost(), name.c_str(), 0700) != 0) {
        return failed(errno, "create directory", directory);
    }
    UniqueFd made = openDirectory(name);
    if (!made || ::fchmod(made.get(), mode) != 0) {
        return failed(errno, "open directory", directory);
    }
    push(std::move(made));
    path_ = directory;
    return {};
}

int PackageUnpacker::innermost() const noexcept {
    return open_.empty() ? top_ : open_.back().get();
}

Status PackageUnpacker::reportProgress() const {
    if (!options_.progress || options_.progress(done_, total_)) return {};
    return packageError(PackageErrorCode::Cancelled, "the unpacking was cancelled");
}

ErrorRecord PackageUnpacker::failed(int errorNumber, std::string_view action,
                                    std::string_view name) const {
    return posixError(errorNumber, action, std::string(name) + " of package " + archive_.name());
}

}  // namespace appsync
