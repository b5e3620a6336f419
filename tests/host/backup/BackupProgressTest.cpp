#include <map>

#include "host/backup/BackupFolder.h"
#include "host/backup/BackupMaking.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

class BackupProgressTest : public HostFixture {};

TEST_F(BackupProgressTest, TellsHowMuchDataOfEachApplicationIsPacked) {
    addPackage("com.example.a", "1.0");
    addPackage("com.example.b", "1.0");
    ASSERT_EQ(sync(), 0) << err.str();
    write(root + Device::dataPath("com.example.b") + "/one", std::string(100'000, 'x'));
    write(root + Device::dataPath("com.example.b") + "/two", std::string(23, 'x'));
    const std::unique_ptr<Device> opened = open(DeviceAccess::Session);
    Result<BackupFolder> folder = BackupFolder::make(directory.path() + "/backup");
    ASSERT_TRUE(folder);
    std::map<std::string, std::uint64_t> packed;
    const auto made = makeBackup(
        *opened, *folder,
        [&](const std::string& identifier, std::uint64_t bytes) { packed[identifier] += bytes; });
    ASSERT_TRUE(made);
    EXPECT_EQ(packed, (std::map<std::string, std::uint64_t>{{"com.example.b", 100'023}}));
}

}  // namespace
}  // namespace appsync
