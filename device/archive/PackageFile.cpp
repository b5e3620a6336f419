#include "device/archive/PackageFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <utility>

#include "device/archive/PackageError.h"
#include "device/values/PackageText.h"
#include "system/file/PosixError.h"

namespace appsync {

PackageFile::PackageFile(UniqueFd descriptor, std::uint64_t size, std::string_view name)
    : descriptor_(std::move(descriptor)), size_(size), name_(name) {}

Result<PackageFile> PackageFile::open(const std::string& path) {
    UniqueFd descriptor(::open(path.c_str(), O_RDONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!descriptor) {
        const int error = errno;
        return posixError(error, "open", path,
                          posixReason(error) + "; name a file that can be read");
    }
    return examine(std::move(descriptor), path);
}

Result<PackageFile> PackageFile::duplicate(int fileDescriptor, std::string_view name) {
    UniqueFd descriptor(::fcntl(fileDescriptor, F_DUPFD_CLOEXEC, 0));
    if (!descriptor) return posixError(errno, "open", name);
    return examine(std::move(descriptor), name);
}

Result<PackageFile> PackageFile::examine(UniqueFd descriptor, std::string_view name) {
    struct stat status = {};
    if (::fstat(descriptor.get(), &status) != 0) return posixError(errno, "examine", name);
    if (!S_ISREG(status.st_mode)) {
        return packageError(PackageErrorCode::NotARegularFile,
                            "package " + quotedName(name) +
                                ": it is not a regular file; name the .zip file itself");
    }
    return take({std::move(descriptor), static_cast<std::uint64_t>(status.st_size), 0}, name);
}

Result<PackageFile> PackageFile::take(RegularFile opened, std::string_view name) {
    PackageFile file(std::move(opened.descriptor), opened.size, name);
    const std::uint64_t kept = std::min(file.size_, kKeptBytes);
    Result<Bytes> end = file.readExactly(file.size_ - kept, kept);
    if (!end) return end.error();
    file.end_ = *std::move(end);
    return file;
}

Result<std::size_t> PackageFile::readAt(std::uint64_t offset, std::span<std::uint8_t> bytes) const {
    std::size_t done = readKept(offset, bytes);
    while (done < bytes.size()) {
        const ssize_t count = ::pread(descriptor_.get(), bytes.data() + done, bytes.size() - done,
                                      static_cast<off_t>(offset + done));
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) return posixError(errno, "read", name_);
        if (count == 0) break;
        done += static_cast<std::size_t>(count);
    }
    return done;
}

std::size_t PackageFile::readKept(std::uint64_t offset,
                                  std::span<std::uint8_t> bytes) const noexcept {
    const std::uint64_t begin = size_ - end_.size();
    if (offset < begin || offset - begin >= end_.size()) return 0;
    const ByteView kept = end().subspan(static_cast<std::size_t>(offset - begin));
    const std::size_t count = std::min(kept.size(), bytes.size());
    std::copy_n(kept.begin(), count, bytes.begin());
    return count;
}

Result<Bytes> PackageFile::readExactly(std::uint64_t offset, std::uint64_t size) const {
    Bytes bytes(static_cast<std::size_t>(size));
    const Result<std::size_t> count = readAt(offset, bytes);
    if (!count) return count.error();
    if (*count == bytes.size()) return bytes;
    return packageError(PackageErrorCode::Inconsistent,
                        "it became shorter while it was read; copy it or make it again");
}

}  // namespace appsync
