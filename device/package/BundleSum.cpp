#include "device/package/BundleSum.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <utility>

#include "device/archive/Crc.h"
#include "platform/Bytes.h"
#include "system/file/PosixError.h"
#include "system/file/RootDirectory.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

constexpr std::size_t kSumPieceBytes = std::size_t{256} << 10;

// FNV-1a, stirred at the end: numbers of single items are added up.
std::uint64_t itemNumber(std::string_view text) {
    std::uint64_t number = 0xcbf29ce484222325;
    for (const char letter : text) {
        number = (number ^ static_cast<unsigned char>(letter)) * 0x100000001b3;
    }
    number = (number ^ number >> 30U) * 0xbf58476d1ce4e5b9;
    number = (number ^ number >> 27U) * 0x94d049bb133111eb;
    return number ^ number >> 31U;
}

/// What is added to it may come in any order.
class BundleSum {
  public:
    void addDirectory(std::string_view name) { add(name, "directory"); }
    void addFile(std::string_view name, std::uint64_t size, std::uint32_t crc, bool runs) {
        add(name, (runs ? "program " : "file ") + std::to_string(size) + ' ' + std::to_string(crc));
    }
    void addOther(std::string_view name) { add(name, "other"); }
    [[nodiscard]] std::uint64_t value() const noexcept { return value_; }

  private:
    void add(std::string_view name, std::string_view what) {
        value_ += itemNumber(std::string(name) + '\0' + std::string(what));
    }

    std::uint64_t value_ = 0;
};

bool liesIn(std::string_view name, std::string_view directory) noexcept {
    return name.starts_with(directory) &&
           (name.size() == directory.size() || name[directory.size()] == '/');
}

/// One reading of a bundle on disk.
class BundleReading {
  public:
    BundleReading(const RootDirectory& root, const std::string& bundle)
        : root_(root), bundle_(bundle) {}

    Result<std::uint64_t> run() {
        while (!waiting_.empty()) {
            const std::string directory = std::move(waiting_.back());
            waiting_.pop_back();
            if (Status status = addContents(directory); !status) return status.error();
        }
        return sum_.value();
    }

  private:
    // `directory` is "", or a name with a slash at its end.
    Status addContents(const std::string& directory) {
        const std::string path = bundle_ + "/" + directory;
        const Result<UniqueFd> opened = root_.openDirectoryWithoutLinks(path, "read");
        if (!opened) return opened.error();
        const Result<std::vector<std::string>> names = namesIn(opened->get(), path);
        if (!names) return names.error();
        for (const std::string& name : *names) {
            const int error = add(opened->get(), name, directory + name);
            if (error != 0) return posixError(error, "read", path + name);
        }
        return {};
    }

    // Gives an errno value, or 0.
    int add(int directory, const std::string& name, const std::string& wholeName) {
        struct stat status {};
        if (::fstatat(directory, name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) return errno;
        if (S_ISREG(status.st_mode)) return addFile(directory, name, wholeName);
        if (S_ISDIR(status.st_mode)) {
            sum_.addDirectory(wholeName);
            waiting_.push_back(wholeName + '/');
        } else {
            sum_.addOther(wholeName);
        }
        return 0;
    }

    int addFile(int directory, const std::string& name, const std::string& wholeName) {
        constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
        const UniqueFd file(::openat(directory, name.c_str(), kFlags));
        struct stat status {};
        if (!file || ::fstat(file.get(), &status) != 0) return errno;
        std::uint64_t size = 0;
        std::uint32_t crc = 0;
        while (true) {
            const ssize_t count = ::read(file.get(), buffer_.data(), buffer_.size());
            if (count < 0 && errno == EINTR) continue;
            if (count < 0) return errno;
            if (count == 0) break;
            crc = continueCrc(crc, ByteView(buffer_).first(static_cast<std::size_t>(count)));
            size += static_cast<std::uint64_t>(count);
        }
        sum_.addFile(wholeName, size, crc, (status.st_mode & S_IXUSR) != 0);
        return 0;
    }

    const RootDirectory& root_;
    const std::string& bundle_;
    std::vector<std::string> waiting_{""};
    Bytes buffer_ = Bytes(kSumPieceBytes);
    BundleSum sum_;
};

}  // namespace

std::uint64_t sumOfEntries(const std::vector<PackageEntry>& entries, std::string_view bundle) {
    BundleSum sum;
    std::string_view before;
    for (const PackageEntry& entry : entries) {
        std::string_view name = entry.name;
        if (!liesIn(name, bundle) || name.size() <= bundle.size()) continue;
        name.remove_prefix(bundle.size() + 1);
        // Directories need not be listed.
        for (std::size_t end = name.find('/'); end != name.npos; end = name.find('/', end + 1)) {
            const std::string_view parent = name.substr(0, end);
            if (!liesIn(before, parent)) sum.addDirectory(parent);
        }
        if (entry.isDirectory) {
            sum.addDirectory(name);
        } else {
            sum.addFile(name, entry.size, entry.crc, (entry.mode & S_IXUSR) != 0);
        }
        before = name;
    }
    return sum.value();
}

Result<std::uint64_t> sumOfBundle(const RootDirectory& root, const std::string& bundle) {
    return BundleReading(root, bundle).run();
}

}  // namespace appsync
