#include "host/backup/RestoredData.h"

#include <sys/stat.h>

#include <filesystem>

#include "device/archive/ArchiveWriter.h"
#include "device/archive/PackageFolder.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

class RestoredDataTest : public HostFixture {
  protected:
    /// An archive of that many zeros.
    DataToPlace dataOf(const std::string& identifier, std::size_t count) {
        const std::string file = directory.path() + "/" + identifier;
        write(file, std::string(count, '\0'));
        const Status written =
            writeArchive({{file, "zeros", S_IFREG | 0644, count}}, file + ".zip");
        EXPECT_TRUE(written.ok()) << written.error().description();
        return {identifier, file + ".zip"};
    }
    static std::uint64_t sizeOf(const DataToPlace& data) {
        return std::filesystem::file_size(data.file);
    }
};

TEST_F(RestoredDataTest, NeedsRoomForAllArchivesAndForAllThatTheyHold) {
    const DataToPlace a = dataOf("com.a", 100'000);
    const DataToPlace b = dataOf("com.b", 50'000);
    const std::unique_ptr<Device> opened = open(DeviceAccess::Look);
    EXPECT_EQ(bytesNeededFor({}, *opened), 0U);
    EXPECT_EQ(bytesNeededFor({a}, *opened), 104'096 + sizeOf(a)) << "the last block";
    EXPECT_EQ(bytesNeededFor({a, b}, *opened), 158'192 + sizeOf(a) + sizeOf(b));
}

TEST_F(RestoredDataTest, NeedsNoRoomForWhatARestoreBeforeHasPlaced) {
    const DataToPlace a = dataOf("com.a", 100'000);
    const std::unique_ptr<Device> opened = open(DeviceAccess::Look);
    const std::string place = root + Device::restoreDataPath("com.a");
    std::filesystem::create_directories(std::filesystem::path(place).parent_path());
    std::filesystem::copy_file(a.file, place);
    EXPECT_EQ(bytesNeededFor({a}, *opened), 104'096U);
    write(place, std::string(1'000'000, 'x'));
    EXPECT_EQ(bytesNeededFor({a}, *opened), 104'096U) << "more than the archives is not counted";
}

TEST_F(RestoredDataTest, NeedsNoRoomForAnArchiveThatIsNone) {
    write(directory.path() + "/none.zip", "no archive");
    EXPECT_EQ(bytesNeededFor({{"com.a", directory.path() + "/none.zip"},
                              {"com.b", directory.path() + "/missing.zip"}},
                             *open(DeviceAccess::Look)),
              0U);
}

}  // namespace
}  // namespace appsync
