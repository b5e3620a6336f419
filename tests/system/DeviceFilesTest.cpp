#include "tests/system/DeviceFilesTest.h"

#include <algorithm>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

namespace appsync::device_files {

namespace fs = std::filesystem;

namespace {

/// In memory where there is such a place: some disks take milliseconds to forget a removed
/// directory, and there are tests that remove ten thousand. TMPDIR names another place.
fs::path scratchParent() {
    const fs::path memory = "/dev/shm";
    const bool isUsable = ::access(memory.c_str(), W_OK | X_OK) == 0;
    return isUsable && ::getenv("TMPDIR") == nullptr ? memory : fs::temp_directory_path();
}

}  // namespace

ScratchDirectory::ScratchDirectory() {
    std::string pattern = (scratchParent() / "appsync-test-XXXXXX").string();
    if (::mkdtemp(pattern.data()) == nullptr) ADD_FAILURE() << "no scratch directory";
    path_ = pattern;
}

ScratchDirectory::~ScratchDirectory() {
    std::error_code ignored;
    fs::remove_all(path_, ignored);
}

Bytes bytes(std::string_view text) { return {text.begin(), text.end()}; }

std::string text(const Bytes& contents) { return {contents.begin(), contents.end()}; }

DeviceFilesTest::DeviceFilesTest() {
    fs::create_directories(scratch_.path() / "root");
    fs::create_directories(outside());
    std::ofstream(outside() / "file") << kSecret;
    auto opened = RootedFileSystem::open((scratch_.path() / "root").string());
    if (!opened) throw std::runtime_error(opened.error().description());
    files_ = std::move(*opened);
}

fs::path DeviceFilesTest::real(std::string_view devicePath) const {
    return scratch_.path() / "root" / fs::path(devicePath).relative_path();
}

void DeviceFilesTest::put(std::string_view devicePath, std::string_view contents) const {
    fs::create_directories(real(devicePath).parent_path());
    std::ofstream(real(devicePath), std::ios::binary) << contents;
}

void DeviceFilesTest::link(std::string_view devicePath, const fs::path& target) const {
    fs::create_directories(real(devicePath).parent_path());
    fs::create_symlink(target, real(devicePath));
}

void DeviceFilesTest::pipe(std::string_view devicePath) const {
    ASSERT_EQ(::mkfifo(real(devicePath).c_str(), 0600), 0);
}

std::string DeviceFilesTest::contents(std::string_view devicePath) const {
    std::ifstream stream(real(devicePath), std::ios::binary);
    if (!stream) return "(none)";
    return {std::istreambuf_iterator<char>(stream), {}};
}

std::vector<std::string> DeviceFilesTest::names(std::string_view devicePath) const {
    std::vector<std::string> result;
    for (const auto& entry : fs::directory_iterator(real(devicePath))) {
        result.push_back(entry.path().filename().string());
    }
    std::sort(result.begin(), result.end());
    return result;
}

bool DeviceFilesTest::outsideIsUntouched() const {
    std::string found;
    std::ifstream(outside() / "file") >> found;
    return found == kSecret && std::distance(fs::directory_iterator(outside()), {}) == 1;
}

}  // namespace appsync::device_files
