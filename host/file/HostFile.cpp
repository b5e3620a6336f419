#include "host/file/HostFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

#include "system/file/PosixError.h"

namespace appsync {

ErrorRecord systemError(int errorNumber, const std::string& what) {
    return ErrorRecord::make(kPosixErrorDomain, errorNumber,
                             what + ": " + posixReason(errorNumber));
}

namespace {

ErrorRecord advised(const ErrorRecord& error, const char* advice) {
    return ErrorRecord::make(error.domain, error.code, error.description() + "; " + advice);
}

}  // namespace

ErrorRecord cannotWriteFile(int errorNumber, const std::string& path) {
    const bool isFull = errorNumber == ENOSPC || errorNumber == EDQUOT;
    return advised(systemError(errorNumber, "cannot write " + displayPath(path)),
                   isFull ? "free space there, and run it again"
                          : "name a file in a directory that can be written");
}

Result<HostFile> HostFile::open(const std::string& path) {
    const int descriptor = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK);
    if (descriptor < 0) {
        return advised(systemError(errno, "cannot open " + displayPath(path)),
                       "name a file that can be read");
    }
    HostFile file(descriptor, 0);
    struct stat attributes {};
    if (::fstat(descriptor, &attributes) != 0) return systemError(errno, "cannot look at " + path);
    if (!S_ISREG(attributes.st_mode)) {
        return ErrorRecord::make(kPosixErrorDomain, EINVAL,
                                 path + " is not a regular file; name one that is");
    }
    file.size_ = static_cast<std::uint64_t>(attributes.st_size);
    return file;
}

HostFile& HostFile::operator=(HostFile&& other) noexcept {
    std::swap(descriptor_, other.descriptor_);
    std::swap(size_, other.size_);
    return *this;
}

HostFile::~HostFile() {
    if (descriptor_ >= 0) ::close(descriptor_);
}

Result<std::size_t> HostFile::read(std::span<std::uint8_t> buffer) {
    for (;;) {
        const ssize_t count = ::read(descriptor_, buffer.data(), buffer.size());
        if (count >= 0) return static_cast<std::size_t>(count);
        if (errno != EINTR) return systemError(errno, "cannot read");
    }
}

namespace {

ErrorRecord tooLarge(const std::string& path) {
    return ErrorRecord::make(kPosixErrorDomain, EFBIG,
                             path + " is too large, or grows while it is read; see what it is");
}

// The first bytes of the file, at most so many.
Result<Bytes> readFirst(HostFile& file, const std::string& path, std::size_t most) {
    Bytes contents(most);
    std::size_t length = 0;
    while (length < contents.size()) {
        const Result<std::size_t> count = file.read(std::span(contents).subspan(length));
        if (!count) return count.error().withContext(path);
        if (*count == 0) break;
        length += *count;
    }
    contents.resize(length);
    return contents;
}

}  // namespace

Result<Bytes> readHostFile(const std::string& path, std::uint64_t maximumBytes) {
    Result<HostFile> file = HostFile::open(path);
    if (!file) return file.error();
    if (file->size() > maximumBytes) return tooLarge(path);
    Result<Bytes> contents = readFirst(*file, path, file->size() + 1);
    if (contents && contents->size() > file->size()) return tooLarge(path);
    return contents;
}

Result<Bytes> readGrowingHostFile(const std::string& path, std::uint64_t maximumBytes) {
    Result<HostFile> file = HostFile::open(path);
    if (!file) return file.error();
    if (file->size() > maximumBytes) return tooLarge(path);
    return readFirst(*file, path, file->size());
}

Result<Bytes> readStandardInput(std::uint64_t maximumBytes) {
    constexpr std::size_t kPiece = std::size_t{64} << 10U;
    Bytes contents;
    for (std::size_t length = 0;;) {
        contents.resize(length + kPiece);
        const ssize_t count = ::read(STDIN_FILENO, contents.data() + length, kPiece);
        if (count < 0 && errno == EINTR) continue;
        if (count < 0) return systemError(errno, "cannot read standard input");
        length += static_cast<std::size_t>(count);
        if (length > maximumBytes) {
            return ErrorRecord::make(kPosixErrorDomain, EFBIG,
                                     "standard input brings too much; see what it is");
        }
        contents.resize(length);
        if (count == 0) return contents;
    }
}

namespace {

Status writeAndClose(int descriptor, const std::string& path, ByteView contents) {
    Status status;
    while (!contents.empty() && status) {
        const ssize_t count = ::write(descriptor, contents.data(), contents.size());
        if (count >= 0) {
            contents = contents.subspan(static_cast<std::size_t>(count));
        } else if (errno != EINTR) {
            status = cannotWriteFile(errno, path);
        }
    }
    if (::close(descriptor) != 0 && status) status = cannotWriteFile(errno, path);
    return status;
}

bool isSpecial(const std::string& path) {
    struct stat attributes {};
    return ::stat(path.c_str(), &attributes) == 0 && !S_ISREG(attributes.st_mode);
}

}  // namespace

namespace {

// A link stays, as /dev/stdout does: what it leads to is replaced.
std::string placeOf(const std::string& path) {
    std::error_code code;
    const std::filesystem::path place = std::filesystem::canonical(path, code);
    return code ? path : place.native();
}

}  // namespace

bool isHostFile(const std::string& path) {
    struct stat attributes {};
    return ::stat(path.c_str(), &attributes) == 0 && S_ISREG(attributes.st_mode);
}

Status writeHostFile(const std::string& path, ByteView contents) {
    // A pipe or a terminal is written to, not replaced.
    const bool isDirect = isSpecial(path);
    const std::string place = placeOf(path);
    const std::string target = isDirect ? path : place + "." + std::to_string(::getpid()) + ".new";
    const int descriptor =
        ::open(target.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC | (isDirect ? 0 : O_EXCL), 0666);
    if (descriptor < 0) return cannotWriteFile(errno, path);
    Status status = writeAndClose(descriptor, path, contents);
    if (isDirect) return status;
    if (status && ::rename(target.c_str(), place.c_str()) != 0) {
        status = cannotWriteFile(errno, path);
    }
    if (!status) ::unlink(target.c_str());
    return status;
}

}  // namespace appsync
