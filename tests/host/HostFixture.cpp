#include "tests/host/HostFixture.h"

#include <filesystem>
#include <fstream>
#include <utility>

#include "device/package/PackageWriter.h"
#include "host/command/CommandLine.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

std::string infoOf(const std::string& identifier, const std::string& version) {
    return "<plist version=\"1.0\"><dict><key>BundleIdentifier</key><string>" + identifier +
           "</string><key>BundleVersion</key><string>" + version + "</string></dict></plist>";
}

}  // namespace

HostFixture::HostFixture(bool coordination) {
    std::filesystem::create_directory(library);
    EXPECT_TRUE(Device::create(device, {coordination}).ok());
}

int HostFixture::run(std::vector<std::string> arguments) {
    out.str("");
    err.str("");
    return runCommandLine(std::move(arguments), Console{out, err, false, 80});
}

int HostFixture::sync(std::vector<std::string> options) {
    std::vector<std::string> arguments = {"sync", device, library, "--json"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    return run(std::move(arguments));
}

void HostFixture::write(const std::string& path, std::string_view contents) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path, std::ios::binary) << contents;
}

void HostFixture::addPackage(const std::string& identifier, const std::string& version) {
    const std::string folder = directory.path() + "/folder";
    std::filesystem::remove_all(folder);
    write(folder + "/Name.app/Info.plist", infoOf(identifier, version));
    write(folder + "/Name.app/data", std::string(5000, 'x'));
    SystemPropertyLists propertyLists;
    EXPECT_TRUE(writePackage(folder, library + "/" + identifier + ".zip", propertyLists).ok());
}

void HostFixture::addPackageAs(const std::string& file, const std::string& identifier,
                               const std::string& version) {
    const std::string folder = directory.path() + "/named";
    write(folder + "/Name.app/Info.plist", infoOf(identifier, version));
    EXPECT_EQ(run({"package", "make", folder, library + "/" + file}), 0) << err.str();
}

std::unique_ptr<Device> HostFixture::open(DeviceAccess access) {
    DeviceOpenOptions options;
    options.access = access;
    Result<std::unique_ptr<Device>> opened = Device::open(device, options);
    if (opened) return *std::move(opened);
    ADD_FAILURE() << opened.error().description();
    return nullptr;
}

std::vector<std::string> HostFixture::applications() {
    const Result<std::vector<ApplicationRecord>> records = open(DeviceAccess::Look)->applications();
    std::vector<std::string> result;
    if (!records) return result;
    for (const ApplicationRecord& record : *records) {
        result.push_back(record.identifier + " " +
                         (record.isPlaceholder ? "placeholder" : record.version.value_or("")));
    }
    return result;
}

}  // namespace appsync
