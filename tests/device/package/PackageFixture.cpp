#include "tests/device/package/PackageFixture.h"

#include <fcntl.h>
#include <sys/stat.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "system/property_list/PropertyListCodec.h"

namespace appsync {

namespace fs = std::filesystem;

PackageFixture::PackageFixture() : propertyLists_(std::make_unique<SystemPropertyLists>()) {
    std::string pattern = ::testing::TempDir() + "appsync-package-XXXXXX";
    directory_ = ::mkdtemp(pattern.data());
}

PackageFixture::~PackageFixture() {
    std::error_code ignored;
    fs::remove_all(directory_, ignored);
}

std::string PackageFixture::path(std::string_view name) const {
    return directory_ + "/" + std::string(name);
}

void PackageFixture::write(std::string_view name, std::string_view contents) const {
    std::ofstream(path(name), std::ios::binary) << contents;
}

std::string PackageFixture::read(std::string_view name) const {
    std::ifstream file(path(name), std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void PackageFixture::makeDirectory(std::string_view name) const {
    fs::create_directories(path(name));
}

UniqueFd PackageFixture::openDirectory(std::string_view name) const {
    return UniqueFd(::open(path(name).c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

std::vector<std::string> PackageFixture::list(std::string_view directory) const {
    std::vector<std::string> names;
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(path(directory))) {
        const std::string name = fs::relative(entry.path(), path(directory)).native();
        names.push_back(name + (entry.is_directory() ? "/" : ""));
    }
    std::sort(names.begin(), names.end());
    return names;
}

unsigned int PackageFixture::modeOf(std::string_view name) const {
    struct stat status = {};
    EXPECT_EQ(::lstat(path(name).c_str(), &status), 0) << name;
    return status.st_mode & 07777U;
}

Result<PackageReader> PackageFixture::open(std::string_view archive, const PackageLimits& limits) {
    write("app.zip", archive);
    return PackageReader::open(path("app.zip"), propertyLists(), limits);
}

Result<PackageReader> PackageFixture::open(const ZipBuilder& archive, const PackageLimits& limits) {
    return open(archive.bytes(), limits);
}

Status PackageFixture::unpack(const ZipBuilder& archive, const PackageUnpackOptions& options) {
    Result<PackageReader> package = open(archive);
    if (!package) return package.error();
    makeDirectory("target");
    return package->unpackInto(openDirectory("target").get(), options);
}

std::string infoWith(const std::vector<std::pair<std::string, std::string>>& entries) {
    std::string text = R"(<?xml version="1.0" encoding="UTF-8"?><plist version="1.0"><dict>)";
    for (const auto& [key, value] : entries) text += "<key>" + key + "</key>" + value;
    return text + "</dict></plist>";
}

std::string atlasInfo() {
    return infoWith({{"BundleIdentifier", "<string>com.example.atlas</string>"},
                     {"BundleVersion", "<string>1.0</string>"},
                     {"BundleDisplayName", "<string>Atlas &amp; Co</string>"},
                     {"BundleExecutable", "<string>Atlas</string>"}});
}

std::vector<ZipEntry> atlasEntries() {
    ZipEntry executable = zipFile("Atlas.app/Atlas", "#!/bin/sh\n");
    executable.mode = S_IFREG | 0755;
    return {zipDirectory("Atlas.app/"), zipFile("Atlas.app/Info.plist", atlasInfo()), executable};
}

ZipBuilder atlasWith(const std::vector<ZipEntry>& more) {
    return ZipBuilder().add(atlasEntries()).add(more);
}

namespace {

::testing::AssertionResult check(const ErrorRecord& error, PackageErrorCode code,
                                 std::string_view text) {
    const std::string sentence = error.description();
    if (!isPackageError(error, code)) {
        return ::testing::AssertionFailure()
               << error.domain << " " << error.code << ": " << sentence;
    }
    if (sentence.find(text) == std::string::npos) {
        return ::testing::AssertionFailure() << "not in \"" << sentence << "\": " << text;
    }
    return ::testing::AssertionSuccess();
}

}  // namespace

::testing::AssertionResult refused(const Result<PackageReader>& package, PackageErrorCode code,
                                   std::string_view text) {
    if (package) return ::testing::AssertionFailure() << "the package was accepted";
    if (package.error().description().find("app.zip") == std::string::npos) {
        return ::testing::AssertionFailure()
               << "the package is not named: " << package.error().description();
    }
    return check(package.error(), code, text);
}

::testing::AssertionResult failedAs(const Status& status, PackageErrorCode code,
                                    std::string_view text) {
    if (status) return ::testing::AssertionFailure() << "it succeeded";
    return check(status.error(), code, text);
}

}  // namespace appsync
