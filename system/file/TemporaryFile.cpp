#include "system/file/TemporaryFile.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <cstdint>
#include <cstdio>
#include <utility>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include "system/file/DescriptorIO.h"
#include "system/file/PosixError.h"
#include "system/file/RandomBytes.h"

namespace appsync {

namespace {

constexpr std::string_view kOperation = "write";
constexpr std::string_view kMark = ".appsync-";
constexpr std::string_view kSuffixCharacters = "abcdefghijklmnopqrstuvwxyz0123456789";
constexpr std::size_t kSuffixLength = 6;
constexpr std::size_t kLongestStem = NAME_MAX - 1 - kMark.size() - kSuffixLength;
constexpr mode_t kPermissions = S_IRUSR | S_IWUSR | S_IRGRP | S_IROTH;
constexpr int kNameTries = 100;

bool continuesCharacter(char c) { return (static_cast<unsigned char>(c) & 0xC0U) == 0x80U; }

/// The name, cut between two characters where it is too long.
std::string_view stemOf(std::string_view name) {
    if (name.size() <= kLongestStem) return name;
    std::size_t length = kLongestStem;
    while (length > kLongestStem - 4 && continuesCharacter(name[length])) --length;
    return name.substr(0, length);
}

std::string randomSuffix() {
    std::array<std::uint8_t, kSuffixLength> noise{};
    // It blocks only before the machine has any entropy, and cannot fail with so few bytes.
    if (!fillWithRandomBytes(noise)) noise.fill(0);
    std::string suffix;
    for (const std::uint8_t byte : noise) {
        suffix += kSuffixCharacters[byte % kSuffixCharacters.size()];
    }
    return suffix;
}

std::string temporaryNameFor(std::string_view name) {
    std::string result = ".";
    result.append(stemOf(name)).append(kMark).append(randomSuffix());
    return result;
}

}  // namespace

bool isTemporaryName(std::string_view name) {
    const std::size_t added = 1 + kMark.size() + kSuffixLength;
    if (name.size() <= added || name.front() != '.') return false;
    const std::string_view suffix = name.substr(name.size() - kSuffixLength);
    if (suffix.find_first_not_of(kSuffixCharacters) != std::string_view::npos) return false;
    return name.substr(0, name.size() - kSuffixLength).ends_with(kMark);
}

int removeIfStale(int directory, const std::string& name) {
    const int flags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
    const UniqueFd file(::openat(directory, name.c_str(), flags));
    if (!file) return errno == ENOENT || errno == ELOOP || errno == ENXIO ? 0 : errno;
    struct stat status {};
    if (::fstat(file.get(), &status) != 0) return errno;
    if (!S_ISREG(status.st_mode)) return 0;
    if (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) return errno == EWOULDBLOCK ? 0 : errno;
    if (::unlinkat(directory, name.c_str(), 0) != 0 && errno != ENOENT) return errno;
    return 0;
}

Result<TemporaryFile> TemporaryFile::create(const RootDirectory& root, const std::string& path) {
    Result<ItemPlace> place = root.place(path, kOperation);
    if (!place) return place.error();
    return create(*std::move(place), path);
}

Result<TemporaryFile> TemporaryFile::create(ItemPlace place, const std::string& path) {
    if (place.mustBeDirectory) return posixError(EISDIR, kOperation, path);
    TemporaryFile result(std::move(place), path);
    if (const int error = result.open(); error != 0) return posixError(error, kOperation, path);
    result.inheritFromTarget();
    return result;
}

TemporaryFile::TemporaryFile(TemporaryFile&& other) noexcept
    : place_(std::move(other.place_)),
      path_(std::move(other.path_)),
      temporaryName_(std::exchange(other.temporaryName_, {})),
      file_(std::move(other.file_)),
      status_(other.status_) {}

TemporaryFile::~TemporaryFile() {
    if (!temporaryName_.empty()) {
        ::unlinkat(place_.directory.get(), temporaryName_.c_str(), 0);
    }
}

int TemporaryFile::open() {
    int error = EEXIST;
    for (int tries = 0; error == EEXIST && tries < kNameTries; ++tries) error = openOnce();
    return error;
}

/// EEXIST when another name must be tried: the name is taken, or somebody who clears leftovers has
/// met the file before it was locked.
int TemporaryFile::openOnce() {
    std::string name = temporaryNameFor(place_.name);
    const int flags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
    UniqueFd file(::openat(place_.directory.get(), name.c_str(), flags, kPermissions));
    if (!file) return errno;
    temporaryName_ = std::move(name);
    file_ = std::move(file);
    const int error = ::flock(file_.get(), LOCK_EX | LOCK_NB) == 0 ? 0 : errno;
    if (error == 0 && isStillLinked()) return 0;
    ::unlinkat(place_.directory.get(), temporaryName_.c_str(), 0);
    temporaryName_.clear();
    return error == 0 || error == EWOULDBLOCK ? EEXIST : error;
}

bool TemporaryFile::isStillLinked() {
    return ::fstat(file_.get(), &status_) == 0 && status_.st_nlink > 0;
}

void TemporaryFile::inheritFromTarget() {
    struct stat target {};
    if (::fstatat(place_.directory.get(), place_.name.c_str(), &target, AT_SYMLINK_NOFOLLOW) != 0 ||
        !S_ISREG(target.st_mode)) {
        return;
    }
    // Where the system refuses either, the new file stays the writer's own.
    const bool isOwn = target.st_uid == status_.st_uid && target.st_gid == status_.st_gid;
    if (!isOwn && ::fchown(file_.get(), target.st_uid, target.st_gid) == 0) {
        status_.st_uid = target.st_uid;
        status_.st_gid = target.st_gid;
    }
    const mode_t permissions = target.st_mode & (S_IRWXU | S_IRWXG | S_IRWXO);
    if (permissions != (status_.st_mode & 0777U)) ::fchmod(file_.get(), permissions);
}

Status TemporaryFile::write(ByteView contents) {
    const WriteOutcome outcome = writeWhole(file_.get(), contents);
    if (outcome.error != 0) return posixError(outcome.error, kOperation, path_);
    return {};
}

Status TemporaryFile::sync() {
    if (::fsync(file_.get()) != 0) return posixError(errno, kOperation, path_);
    return {};
}

Status TemporaryFile::commit() {
    const int directory = place_.directory.get();
    if (::renameat(directory, temporaryName_.c_str(), directory, place_.name.c_str()) != 0) {
        return posixError(errno, kOperation, path_);
    }
    temporaryName_.clear();
    return {};
}

}  // namespace appsync
