#include <algorithm>
#include <filesystem>

#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

using SendCommand = HostFixture;

TEST_F(SendCommand, InstallsAPackageThatNobodyAskedFor) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip"}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(SendCommand, ARestoredPackageWaitsForItsData) {
    addPackage("com.a", "1");
    write(library + "/data", "the application's data");
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip", "--restore", "--parts", "1"}),
              0);
    EXPECT_THAT(applications(), IsEmpty());
    EXPECT_EQ(run({"send", device, "com.a", library + "/data", "--restore", "--parts", "2"}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
    EXPECT_TRUE(std::filesystem::exists(root + "/var/mobile/Containers/Data/com.a/data"));
}

TEST_F(SendCommand, ASyncInBetweenKeepsThePackageThatWaits) {
    addPackage("com.a", "1");
    write(library + "/data", "the application's data");
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip", "--restore", "--parts", "1"}),
              0);
    std::filesystem::remove(library + "/com.a.zip");
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(run({"send", device, "com.a", library + "/data", "--restore", "--parts", "2"}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(SendCommand, ARestoredPackageWithoutDataIsInstalledAtOnce) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip", "--restore"}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(SendCommand, ARestoredPackageWaitsForDataThatIsAnnounced) {
    addPackage("com.a", "1");
    ASSERT_TRUE(open(DeviceAccess::Session)->setRestoreDataExpected("com.a", true));
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip", "--restore", "--json"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("its package waits for its data"));
    EXPECT_THAT(applications(), IsEmpty());
}

TEST_F(SendCommand, ARestoredPackageWaitsForDataThatWaitsItself) {
    addPackage("com.a", "1");
    write(root + Device::restoreDataPath("com.a"), "an archive");
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip", "--restore"}), 0);
    EXPECT_THAT(applications(), IsEmpty());
    EXPECT_TRUE(open(DeviceAccess::Look)->status("com.a")->awaitsRestoreData);
}

class CoordinatedSendCommand : public HostFixture {
  protected:
    CoordinatedSendCommand() : HostFixture(true) {}
};

TEST_F(CoordinatedSendCommand, ARestoredPackageWithoutDataIsInstalledAtOnce) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip", "--restore"}), 0) << err.str();
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(CoordinatedSendCommand, ARestoredPackageInPartsIsTheStores) {
    addPackage("com.a", "1");
    const std::string package = library + "/com.a.zip";
    EXPECT_EQ(run({"send", device, "com.a", package, "--restore", "--parts", "1"}), 1);
    EXPECT_THAT(err.str(), HasSubstr("appsync store"));
    write(root + Device::restoreDataPath("com.a"), "an archive");
    EXPECT_EQ(run({"send", device, "com.a", package, "--restore"}), 1);
    EXPECT_THAT(err.str(), HasSubstr("appsync store"));
    EXPECT_THAT(applications(), IsEmpty());
}

TEST_F(SendCommand, DataWithoutAPackageThatWaitsIsRefused) {
    write(library + "/data", "data");
    EXPECT_EQ(run({"send", device, "com.a", library + "/data", "--restore", "--parts", "2"}), 1);
    EXPECT_THAT(err.str(), HasSubstr("no package of com.a waits"));
}

TEST_F(SendCommand, APackageThatIsNoneFailsWithItsReason) {
    write(library + "/text.zip", "no package");
    EXPECT_EQ(run({"send", device, "com.a", library + "/text.zip", "--json"}), 1);
    EXPECT_THAT(out.str(), HasSubstr("\"failed\": [\n    {\n      \"identifier\": \"com.a\""));
}

TEST_F(SendCommand, IsRefusedWhereInstallingIsForbidden) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"set", device, "installation=no"}), 0);
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip", "--json"}), 1);
    EXPECT_THAT(err.str(), HasSubstr("policy does not allow installing"));
    EXPECT_EQ(std::ranges::count(err.str(), '\n'), 1) << "it is told once: " << err.str();
    EXPECT_THAT(out.str(), HasSubstr("\"identifier\": \"com.a\""));
    EXPECT_THAT(applications(), IsEmpty());
}

TEST_F(SendCommand, WhatDoesNotFitIsRefusedBeforeTheFirstByte) {
    write(library + "/huge", "");
    std::filesystem::resize_file(library + "/huge", std::uint64_t{1} << 42);  // a hole
    EXPECT_EQ(run({"send", device, "com.a", library + "/huge", "--json"}), 1);
    EXPECT_THAT(err.str(), HasSubstr("it needs 4.0 TiB, the device has "));
    EXPECT_THAT(out.str(), HasSubstr("\"bytes\": 0"));
}

}  // namespace
}  // namespace appsync
