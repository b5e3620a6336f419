#include "tests/device/DeviceFixture.h"

#include <stdlib.h>

#include <algorithm>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <stdexcept>

#include "device/database/Database.h"
#include "device/install/Containers.h"
#include "device/values/DevicePaths.h"
#include "tests/device/package/PackageZip.h"

namespace appsync {

namespace fs = std::filesystem;

namespace {

::testing::AssertionResult tellsOf(const ErrorRecord& error, bool rightCode,
                                   std::string_view text) {
    const bool rightText = error.description().find(text) != std::string::npos;
    if (rightCode && rightText) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure()
           << error.domain << " " << error.code << ": " << error.description();
}

// In memory where that can be had: each install syncs the whole file system that it is on.
std::string temporaryDirectory() {
    if (std::getenv("TEST_TMPDIR") == nullptr && fs::is_directory("/dev/shm")) return "/dev/shm/";
    return ::testing::TempDir();
}

}  // namespace

DeviceFixture::DeviceFixture() {
    // Without a zone the C library frees and copies its default's name with each archive that is
    // opened, under a lock that ThreadSanitizer does not see.
    ::setenv("TZ", "UTC", 0);
    std::string pattern = temporaryDirectory() + "appsync-device-XXXXXX";
    directory_ = ::mkdtemp(pattern.data());
    EXPECT_TRUE(succeeded(Device::create(devicePath())));
}

DeviceFixture::~DeviceFixture() {
    close();
    std::error_code ignored;
    fs::remove_all(directory_, ignored);
}

Device& DeviceFixture::device() {
    if (device_ == nullptr) {
        Result<std::unique_ptr<Device>> opened =
            Device::open(devicePath(), {.access = DeviceAccess::Session});
        EXPECT_TRUE(opened.ok());
        if (!opened) throw std::runtime_error(opened.error().description());
        device_ = std::move(*opened);
    }
    return *device_;
}

std::unique_ptr<Device> DeviceFixture::look() const {
    Result<std::unique_ptr<Device>> opened = Device::open(devicePath());
    EXPECT_TRUE(opened.ok());
    if (!opened) throw std::runtime_error(opened.error().description());
    return std::move(*opened);
}

std::string DeviceFixture::path(std::string_view name) const {
    return directory_ + "/" + std::string(name);
}

std::string DeviceFixture::devicePath(std::string_view name) const {
    return path("device") + (name.empty() ? "" : "/" + std::string(name));
}

std::string DeviceFixture::rootPath(std::string_view devicePath) const {
    return this->devicePath("root") + std::string(devicePath);
}

std::string DeviceFixture::stagePackage(const std::string& identifier, const std::string& version) {
    static_cast<void>(device());  // an opening clears the staging directory
    const std::string package = std::string(kPublicStagingDirectory) + "/" + identifier + ".zip";
    write(package, packageOf(identifier, version));
    return package;
}

Status DeviceFixture::install(const std::string& identifier, const std::string& version) {
    return installFrom(stagePackage(identifier, version), identifier);
}

Status DeviceFixture::installFrom(const std::string& package, const std::string& identifier) {
    return device().registry().installPackage(
        *FileURL::fromPath(package, false),
        PropertyList::map(
            {{PackageTypeKey, PackageTypeCustomer}, {BundleIdentifierKey, identifier}}));
}

std::string DeviceFixture::stagePlaceholder(const std::string& identifier,
                                            const std::string& version) {
    static_cast<void>(device());  // an opening clears the temporary directory
    const std::string bundle = std::string(kTemporaryDirectory) + "/" + identifier + ".app";
    fs::create_directories(rootPath(bundle));
    write(bundle + "/Info.plist", infoOf(identifier, version));
    write(bundle + "/Icon.png", "an icon");
    return bundle;
}

Status DeviceFixture::installPlaceholder(const std::string& identifier, std::uint64_t installType) {
    return device().registry().installPlaceholderBundle(
        *FileURL::fromPath(stagePlaceholder(identifier), true),
        PropertyList::map({{PackageTypeKey, PackageTypePlaceholder},
                           {BundleIdentifierKey, identifier},
                           {InstallTypeKey, installType}}));
}

std::optional<AppProxy> DeviceFixture::application(const std::string& identifier) {
    return device().registry().proxyForIdentifier(identifier, AppRegistry::Placeholders::Excluded);
}

std::optional<AppProxy> DeviceFixture::either(const std::string& identifier) {
    return device().registry().proxyForIdentifier(identifier, AppRegistry::Placeholders::Included);
}

std::shared_ptr<InstallProgressRecord> DeviceFixture::progressOf(const std::string& identifier) {
    const std::optional<AppProxy> proxy = either(identifier);
    return proxy ? device().registry().installProgress(*proxy, 0) : nullptr;
}

std::vector<std::string> DeviceFixture::containers() const {
    std::vector<std::string> names;
    for (const fs::directory_entry& entry :
         fs::directory_iterator(rootPath(kContainersDirectory))) {
        names.push_back(entry.path().filename());
    }
    std::sort(names.begin(), names.end());
    return names;
}

std::string DeviceFixture::read(const std::string& devicePath) const {
    std::ifstream file(rootPath(devicePath), std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void DeviceFixture::write(const std::string& devicePath, std::string_view contents) const {
    std::ofstream(rootPath(devicePath), std::ios::binary) << contents;
}

bool DeviceFixture::exists(const std::string& devicePath) const {
    return fs::exists(fs::symlink_status(rootPath(devicePath)));
}

void DeviceFixture::sql(const std::string& statement) const {
    const auto database = Database::open(devicePath(kDatabaseName), Database::Mode::Existing);
    ASSERT_TRUE(database.ok());
    EXPECT_TRUE(succeeded((*database)->execute(statement.c_str())));
}

std::int64_t DeviceFixture::number(const std::string& query) const {
    const auto database = Database::open(devicePath(kDatabaseName), Database::Mode::Existing);
    EXPECT_TRUE(database.ok());
    const Result<std::int64_t> value = (*database)->integer(query.c_str());
    EXPECT_TRUE(value.ok());
    return value ? *value : -1;
}

std::string infoOf(const std::string& identifier, const std::string& version) {
    return R"(<?xml version="1.0" encoding="UTF-8"?><plist version="1.0"><dict>)"
           "<key>BundleIdentifier</key><string>" +
           identifier + "</string><key>BundleVersion</key><string>" + version +
           "</string><key>BundleDisplayName</key><string>Name of " + identifier +
           "</string><key>BundleIconFile</key><string>Icon.png</string></dict></plist>";
}

std::string packageOf(const std::string& identifier, const std::string& version) {
    return ZipBuilder()
        .add({zipDirectory("App.app/"), zipFile("App.app/Info.plist", infoOf(identifier, version)),
              zipFile("App.app/main", "program " + version),
              zipFile("VessikMetadata.plist", "metadata of " + identifier)})
        .bytes();
}

::testing::AssertionResult succeeded(const Status& status) {
    if (status) return ::testing::AssertionSuccess();
    return ::testing::AssertionFailure() << status.error().description();
}

::testing::AssertionResult refusedBy(const Status& status, RegistryErrorCode code,
                                     std::string_view text) {
    if (status) return ::testing::AssertionFailure() << "it succeeded";
    return tellsOf(status.error(), isRegistryError(status.error(), code), text);
}

::testing::AssertionResult unusable(const Result<std::unique_ptr<Device>>& device,
                                    DeviceErrorCode code, std::string_view text) {
    if (device) return ::testing::AssertionFailure() << "it opened";
    return tellsOf(device.error(), isDeviceError(device.error(), code), text);
}

}  // namespace appsync
