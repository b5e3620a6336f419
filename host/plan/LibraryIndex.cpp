#include "host/plan/LibraryIndex.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>

#include "device/values/PackageIdentifier.h"
#include "device/values/PackageText.h"
#include "host/file/Checksum.h"
#include "system/file/DescriptorIO.h"
#include "system/file/RootDirectory.h"
#include "system/file/UniqueFd.h"

namespace appsync {
namespace {

// What an index begins with; the SHA-256 sum of the rest follows, which is the library's folder and
// the packages. The number goes up when what is read of a package changes, or what is refused: what
// an older one says is then not believed.
constexpr std::string_view kIndexHead = "appsync library index 2\n";
constexpr std::string_view kIndexMark = "appsync library index ";
constexpr std::size_t kIndexSumLength = 64;
constexpr std::uint64_t kLargestIndex = std::uint64_t{256} << 20U;
constexpr std::size_t kTypicalRecord = 192;
constexpr std::size_t kLongestIndexedText = 4096;
constexpr std::size_t kMostLookedAt = 256;  // of the indexes of other libraries

std::string indexSum(ByteView bytes) {
    RunningSum sum;
    sum.add(bytes);
    return sum.finish();
}

ByteView bytesOfText(std::string_view text) {
    return {reinterpret_cast<const std::uint8_t*>(text.data()), text.size()};
}

/// Numbers of 64 bits, the lowest byte first, and texts after their lengths.
class IndexWriter {
  public:
    explicit IndexWriter(std::size_t records) { bytes_.reserve(records * kTypicalRecord); }

    void number(std::uint64_t value) {
        for (unsigned shift = 0; shift < 64; shift += 8) {
            bytes_.push_back(static_cast<std::uint8_t>(value >> shift));
        }
    }
    void text(std::string_view text) {
        number(text.size());
        bytes_.insert(bytes_.end(), text.begin(), text.end());
    }
    [[nodiscard]] const Bytes& bytes() const { return bytes_; }

  private:
    Bytes bytes_;
};

/// The same read; what is not there is 0 and "", and the reading has failed.
class IndexReader {
  public:
    explicit IndexReader(ByteView bytes) : left_(bytes) {}

    std::uint64_t number() {
        if (!has(8)) return 0;
        std::uint64_t value = 0;
        for (std::size_t i = 8; i > 0; --i) value = value << 8U | left_[i - 1];
        left_ = left_.subspan(8);
        return value;
    }
    std::int64_t time() { return static_cast<std::int64_t>(number()); }
    std::string text() {
        const std::uint64_t size = number();
        if (size > kLongestIndexedText || !has(size)) {
            failed_ = true;
            return {};
        }
        std::string text(left_.begin(), left_.begin() + static_cast<std::ptrdiff_t>(size));
        left_ = left_.subspan(static_cast<std::size_t>(size));
        return text;
    }
    [[nodiscard]] bool atEnd() const { return left_.empty(); }
    [[nodiscard]] bool failed() const { return failed_; }

  private:
    bool has(std::uint64_t size) {
        failed_ = failed_ || left_.size() < size;
        return !failed_;
    }

    ByteView left_;
    bool failed_ = false;
};

void writeRecord(IndexWriter& writer, const IndexedPackage& each) {
    const FileStamp& stamp = each.stamp;
    const LibraryPackage& package = each.package;
    writer.text(package.file);
    for (const std::uint64_t number : {stamp.device, stamp.inode, stamp.size}) {
        writer.number(number);
    }
    writer.number(static_cast<std::uint64_t>(stamp.modified));
    writer.number(static_cast<std::uint64_t>(stamp.changed));
    for (const std::string* text : {&package.identifier, &package.version, &package.name}) {
        writer.text(*text);
    }
    writer.number(package.bytes);
    writer.number(package.unpackedBytes);
}

IndexedPackage readRecord(IndexReader& reader) {
    IndexedPackage each;
    each.package.file = reader.text();
    each.stamp.device = reader.number();
    each.stamp.inode = reader.number();
    each.stamp.size = reader.number();
    each.stamp.modified = reader.time();
    each.stamp.changed = reader.time();
    each.package.identifier = reader.text();
    each.package.version = reader.text();
    each.package.name = reader.text();
    each.package.bytes = reader.number();
    each.package.unpackedBytes = reader.number();
    return each;
}

// Whether a package could have said so.
bool isPlausible(const LibraryPackage& package) {
    const auto isText = [](std::string_view text) {
        return isValidUtf8(text) && !holdsControlCharacter(text);
    };
    return isLegalIdentifier(package.identifier) && isText(package.version) && isText(package.name);
}

bool isOwnFile(int descriptor, mode_t kind) {
    struct stat status {};
    return ::fstat(descriptor, &status) == 0 && (status.st_mode & S_IFMT) == kind &&
           status.st_uid == ::geteuid() && (status.st_mode & (S_IRWXG | S_IRWXO)) == 0;
}

bool isOwnDirectory(const std::string& path) {
    struct stat status {};
    return ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode) &&
           status.st_uid == ::geteuid();
}

std::string absoluteVariable(const char* name) {
    const char* value = std::getenv(name);
    return value != nullptr && *value == '/' ? value : "";
}

std::optional<Bytes> readOwnFile(const std::string& path) {
    const UniqueFd file(
        ::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    struct stat status {};
    if (!file || !isOwnFile(file.get(), S_IFREG) || ::fstat(file.get(), &status) != 0) {
        return std::nullopt;
    }
    Bytes bytes;
    const auto size = static_cast<std::uint64_t>(status.st_size);
    if (readWhole(file.get(), size, kLargestIndex, bytes) != 0) return std::nullopt;
    return bytes;
}

UniqueFd openOwnDirectory(const std::string& path) {
    for (std::size_t end = path.find('/', 1); end != path.npos; end = path.find('/', end + 1)) {
        ::mkdir(path.substr(0, end).c_str(), S_IRWXU);
    }
    ::mkdir(path.c_str(), S_IRWXU);
    UniqueFd directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    const bool isUsable = directory.valid() && isOwnFile(directory.get(), S_IFDIR);
    return isUsable ? std::move(directory) : UniqueFd();
}

// The file that is being written; none where another process is at it. One that a process has left
// behind when it was killed is used again.
UniqueFd openUnfinished(int directory, const std::string& name) {
    UniqueFd file(::openat(directory, name.c_str(), O_WRONLY | O_CREAT | O_NOFOLLOW | O_CLOEXEC,
                           S_IRUSR | S_IWUSR));
    if (!file || ::flock(file.get(), LOCK_EX | LOCK_NB) != 0) return {};
    struct stat own {};
    struct stat standing {};
    const bool isStillThere =
        ::fstat(file.get(), &own) == 0 &&
        ::fstatat(directory, name.c_str(), &standing, AT_SYMLINK_NOFOLLOW) == 0 &&
        own.st_ino == standing.st_ino && own.st_dev == standing.st_dev;
    const bool isUsable = isStillThere && isOwnFile(file.get(), S_IFREG);
    return isUsable && ::ftruncate(file.get(), 0) == 0 ? std::move(file) : UniqueFd();
}

// Not synced: whatever a crash leaves of it that is not whole has another sum.
void replaceOwnFile(const std::string& directoryPath, const std::string& name, ByteView bytes) {
    const UniqueFd directory = openOwnDirectory(directoryPath);
    if (!directory) return;
    const std::string unfinished = name + ".new";
    const UniqueFd file = openUnfinished(directory.get(), unfinished);
    if (!file) return;
    const bool isWritten = writeWhole(file.get(), bytes).error == 0;
    if (!isWritten ||
        ::renameat(directory.get(), unfinished.c_str(), directory.get(), name.c_str()) != 0) {
        ::unlinkat(directory.get(), unfinished.c_str(), 0);
    }
}

bool isIndexName(std::string_view name) {
    return name.size() == kIndexSumLength &&
           name.find_first_not_of("0123456789abcdef") == name.npos;
}

// The longest beginning of an index that tells of which library it is.
Bytes beginningOf(int directory, const std::string& name) {
    const UniqueFd file(::openat(directory, name.c_str(),
                                 O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!file || !isOwnFile(file.get(), S_IFREG)) return {};
    constexpr std::size_t kLengthBytes = 8;
    Bytes bytes(kIndexHead.size() + kIndexSumLength + kLengthBytes + kLongestIndexedText);
    const ssize_t count = ::pread(file.get(), bytes.data(), bytes.size(), 0);
    bytes.resize(count < 0 ? 0 : static_cast<std::size_t>(count));
    return bytes;
}

// Whether it is an index that serves nobody any more: of a library that is gone, or of another
// form.
bool isUseless(ByteView beginning) {
    const std::string_view text(reinterpret_cast<const char*>(beginning.data()), beginning.size());
    if (!text.starts_with(kIndexHead)) return text.starts_with(kIndexMark);
    constexpr std::size_t kHeadLength = kIndexHead.size() + kIndexSumLength;
    if (beginning.size() < kHeadLength) return true;
    IndexReader reader(beginning.subspan(kHeadLength));
    const std::string folder = reader.text();
    struct stat status {};
    if (reader.failed()) return true;
    if (::stat(folder.c_str(), &status) == 0) return !S_ISDIR(status.st_mode);
    return errno == ENOENT || errno == ENOTDIR;
}

void dropUselessIndexes(const std::string& directoryPath, const std::string& own) {
    const UniqueFd directory = openOwnDirectory(directoryPath);
    if (!directory) return;
    const Result<std::vector<std::string>> names = namesIn(directory.get(), directoryPath);
    if (!names) return;
    std::size_t looks = 0;
    for (const std::string& name : *names) {
        if (name == own || !isIndexName(name)) continue;
        if (++looks > kMostLookedAt) return;
        if (isUseless(beginningOf(directory.get(), name))) {
            ::unlinkat(directory.get(), name.c_str(), 0);
        }
    }
}

std::int64_t nanoseconds(const timespec& time) {
    constexpr std::int64_t kPerSecond = 1'000'000'000;
    return std::int64_t{time.tv_sec} * kPerSecond + time.tv_nsec;
}

// A library is the same by whatever way it is named.
std::string placeOfLibrary(const std::string& folder) {
    std::error_code code;
    const std::filesystem::path place = std::filesystem::canonical(folder, code);
    return code ? "" : place.native();
}

// The user's own, or one that may be made: not with the rights of root who acts for somebody else.
bool canBeOwn(const std::string& directory) {
    if (isOwnDirectory(directory)) return true;
    struct stat status {};
    return ::lstat(directory.c_str(), &status) != 0 && errno == ENOENT && ::getuid() == ::geteuid();
}

}  // namespace

LibraryIndexPlace LibraryIndexPlace::ofUser() {
    LibraryIndexPlace place;
    const std::string home = absoluteVariable("HOME");
    const std::string base = absoluteVariable("XDG_CACHE_HOME");
    if (!base.empty() && canBeOwn(base)) {
        place.directory = base + "/appsync";
    } else if (base.empty() && isOwnDirectory(home)) {
        place.directory = home + "/.cache/appsync";
    }
    return place;
}

LibraryIndex::LibraryIndex(LibraryIndexPlace place, const std::string& folder, std::size_t count)
    : place_(std::move(place)) {
    if (place_.directory.empty() || count < place_.fewest) return;
    folder_ = placeOfLibrary(folder);
    if (folder_.empty()) return;
    fileName_ = indexSum(bytesOfText(folder_));
    if (fileName_.empty()) return;
    now_.reserve(count);
    const std::optional<Bytes> bytes = readOwnFile(place_.directory + "/" + fileName_);
    auto known = bytes ? readIndex(*bytes) : std::nullopt;
    if (!known || known->folder != folder_) return;
    before_.reserve(known->packages.size());
    for (IndexedPackage& each : known->packages) {
        std::string name = each.package.file;
        before_.insert_or_assign(std::move(name), std::move(each));
    }
}

std::optional<LibraryPackage> LibraryIndex::take(const std::string& name, const FileStamp& stamp) {
    const auto found = before_.find(name);
    if (found == before_.end() || found->second.stamp != stamp) return std::nullopt;
    now_.push_back(std::move(found->second));
    before_.erase(found);
    return now_.back().package;
}

void LibraryIndex::keep(const std::string& name, const FileStamp& stamp,
                        const LibraryPackage& package) {
    if (fileName_.empty() || !hasSettled(stamp)) return;
    now_.push_back({stamp, package});
    now_.back().package.file = name;
    hasNew_ = true;
}

bool LibraryIndex::hasSettled(const FileStamp& stamp) const {
    const std::chrono::nanoseconds now = std::chrono::system_clock::now().time_since_epoch();
    return std::max(stamp.modified, stamp.changed) <= (now - place_.settling).count();
}

void LibraryIndex::save() {
    if (fileName_.empty() || (!hasNew_ && before_.empty())) return;
    replaceOwnFile(place_.directory, fileName_, indexBytes({folder_, now_}));
    dropUselessIndexes(place_.directory, fileName_);
}

std::optional<FileStamp> stampOf(const std::string& file) {
    struct stat status {};
    if (::stat(file.c_str(), &status) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
    return FileStamp{status.st_dev, status.st_ino, static_cast<std::uint64_t>(status.st_size),
                     nanoseconds(status.st_mtim), nanoseconds(status.st_ctim)};
}

Bytes indexBytes(const LibraryIndexContents& contents) {
    IndexWriter writer(contents.packages.size());
    writer.text(contents.folder);
    for (const IndexedPackage& each : contents.packages) writeRecord(writer, each);
    const std::string head = std::string(kIndexHead) + indexSum(writer.bytes());
    Bytes bytes(head.begin(), head.end());
    bytes.insert(bytes.end(), writer.bytes().begin(), writer.bytes().end());
    return bytes;
}

std::optional<LibraryIndexContents> readIndex(ByteView bytes) {
    constexpr std::size_t kHeadLength = kIndexHead.size() + kIndexSumLength;
    if (bytes.size() < kHeadLength) return std::nullopt;
    const ByteView records = bytes.subspan(kHeadLength);
    const std::string head = std::string(kIndexHead) + indexSum(records);
    if (!std::equal(head.begin(), head.end(), bytes.begin(), bytes.begin() + kHeadLength)) {
        return std::nullopt;
    }
    LibraryIndexContents contents;
    contents.packages.reserve(records.size() / kTypicalRecord);
    IndexReader reader(records);
    contents.folder = reader.text();
    while (!reader.failed() && !reader.atEnd()) {
        contents.packages.push_back(readRecord(reader));
        if (!isPlausible(contents.packages.back().package)) return std::nullopt;
    }
    return reader.failed() ? std::nullopt : std::optional(std::move(contents));
}

}  // namespace appsync
