// Opens the bytes as a package, reads what it says of itself, and unpacks it if it is small.

#include <fcntl.h>
#include <stdlib.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <system_error>

#include "device/PackageIdentifier.h"
#include "device/PackageReader.h"
#include "system/PropertyListCodec.h"
#include "system/UniqueFd.h"

namespace {

namespace fs = std::filesystem;
using appsync::UniqueFd;

/// A directory in memory, if there is one, for what is unpacked.
class Target {
  public:
    Target() : path_(pattern()) {
        if (::mkdtemp(path_.data()) == nullptr) std::abort();
    }
    ~Target() {
        std::error_code ignored;
        fs::remove_all(path_, ignored);
    }
    Target(const Target&) = delete;
    Target& operator=(const Target&) = delete;

    [[nodiscard]] const std::string& path() const { return path_; }

    [[nodiscard]] UniqueFd open() const {
        return UniqueFd(::open(path_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    }

  private:
    static std::string pattern() {
        return std::string(::access("/dev/shm", W_OK) == 0 ? "/dev/shm" : "/tmp") +
               "/appsync-fuzz-XXXXXX";
    }

    std::string path_;
};

UniqueFd fileOf(const std::uint8_t* data, std::size_t size) {
    UniqueFd file(::memfd_create("package", MFD_CLOEXEC));
    if (::write(file.get(), data, size) != static_cast<ssize_t>(size)) std::abort();
    return file;
}

void check(bool condition, const char* what) {
    if (condition) return;
    std::fputs(what, stderr);
    std::abort();
}

/// Whatever the package, what stands in the target is what it announced.
void checkUnpacked(const fs::path& target, const appsync::PackageInfo& info) {
    std::uint64_t bytes = 0;
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(target)) {
        const fs::file_status status = entry.symlink_status();
        check(fs::is_regular_file(status) || fs::is_directory(status), "an odd kind of file\n");
        constexpr fs::perms kForbidden = fs::perms::set_uid | fs::perms::set_gid |
                                         fs::perms::sticky_bit | fs::perms::group_write |
                                         fs::perms::others_write;
        check((status.permissions() & kForbidden) == fs::perms::none, "a dangerous mode\n");
        if (fs::is_regular_file(status)) bytes += entry.file_size();
    }
    check(bytes == info.unpackedBytes, "not the size that was announced\n");
    check(fs::is_regular_file(target / info.bundleDirectoryName / "Info.plist"), "no Info.plist\n");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    constexpr std::uint64_t kMostUnpacked = std::uint64_t{1} << 20;
    appsync::SystemPropertyLists propertyLists;
    auto package =
        appsync::PackageReader::open(fileOf(data, size).get(), "fuzzed.zip", propertyLists);
    if (!package) {
        check(!package.error().description().empty(), "an error without a sentence\n");
        return 0;
    }
    const appsync::PackageInfo& info = package->info();
    check(appsync::isLegalIdentifier(info.identifier), "an illegal identifier\n");
    static_cast<void>(package->readStoreMetadata());
    static_cast<void>(package->readBundleFile(info.iconFile, kMostUnpacked));
    if (info.unpackedBytes > kMostUnpacked || info.entryCount > 100) return 0;
    const Target target;
    if (package->unpackInto(target.open().get())) checkUnpacked(target.path(), info);
    return 0;
}
