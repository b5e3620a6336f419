#include <gmock/gmock.h>

#include <filesystem>

#include "device/values/DevicePaths.h"
#include "system/file/UniqueFd.h"
#include "tests/device/DeviceFixture.h"

#include <fcntl.h>
#include <unistd.h>

namespace appsync {

namespace {

namespace fs = std::filesystem;

Status failing(const char* why) { return ErrorRecord::make(kPosixErrorDomain, ENOSPC, why); }

/// Data that comes from elsewhere while the device goes on.
class DataReplacementTest : public DeviceFixture {
  protected:
    void SetUp() override {
        ASSERT_TRUE(succeeded(install(kAtlas)));
        fs::create_directories(rootPath(Device::dataPath(kAtlas)));
        write(Device::dataPath(kAtlas) + "/letter", "old");
    }

    static Status writeLetter(int directory) {
        const UniqueFd file(::openat(directory, "letter", O_WRONLY | O_CREAT | O_EXCL, 0600));
        if (!file || ::write(file.get(), "new", 3) != 3) return failing("cannot write");
        return {};
    }
    [[nodiscard]] std::string letter() const { return read(Device::dataPath(kAtlas) + "/letter"); }
    [[nodiscard]] bool nothingIsLeftBeside() const {
        return !exists(std::string(kUnpackedDataDirectory)) ||
               fs::is_empty(rootPath(kUnpackedDataDirectory));
    }
};

TEST_F(DataReplacementTest, takesThePlaceOfAllThatWasThere) {
    write(Device::dataPath(kAtlas) + "/other", "old");
    EXPECT_TRUE(succeeded(device().replaceData(kAtlas, writeLetter)));
    EXPECT_EQ(letter(), "new");
    EXPECT_FALSE(exists(Device::dataPath(kAtlas) + "/other"));
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, isTheFirstDataWhereThereWasNone) {
    fs::remove_all(rootPath(Device::dataPath(kAtlas)));
    EXPECT_TRUE(succeeded(device().replaceData(kAtlas, writeLetter)));
    EXPECT_EQ(letter(), "new");
}

TEST_F(DataReplacementTest, changesNothingWhenItFailsOnTheWay) {
    const Status status = device().replaceData(kAtlas, [](int directory) {
        const Status written = writeLetter(directory);
        return written ? failing("the disk is full") : written;
    });
    EXPECT_FALSE(status.ok());
    EXPECT_EQ(letter(), "old");
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, isRefusedWhenTheApplicationWasStartedMeanwhile) {
    const Status status = device().replaceData(kAtlas, [&](int directory) {
        EXPECT_TRUE(succeeded(look()->run(kAtlas)));
        return writeLetter(directory);
    });
    EXPECT_TRUE(refusedBy(status, RegistryErrorCode::Running, "quit"));
    EXPECT_EQ(letter(), "old");
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, leavesNothingWhenTheApplicationWasUninstalledMeanwhile) {
    const Status status = device().replaceData(kAtlas, [&](int directory) {
        EXPECT_TRUE(succeeded(look()->uninstall(kAtlas)));
        return writeLetter(directory);
    });
    EXPECT_TRUE(refusedBy(status, RegistryErrorCode::NothingInstalled));
    EXPECT_FALSE(exists(Device::dataPath(kAtlas)));
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, isRefusedBehindThePlaceholderOfASync) {
    ASSERT_TRUE(succeeded(installPlaceholder(kBrook, kInstallTypeSync)));
    EXPECT_TRUE(
        refusedBy(device().replaceData(kBrook, writeLetter), RegistryErrorCode::NothingInstalled));
    EXPECT_FALSE(exists(Device::dataPath(kBrook)));
}

TEST_F(DataReplacementTest, isRefusedWhileARestoreBringsData) {
    ASSERT_TRUE(succeeded(device().setRestoreDataExpected(kAtlas, true)));
    EXPECT_TRUE(
        refusedBy(device().replaceData(kAtlas, writeLetter), RegistryErrorCode::UpdateUnderWay));
    EXPECT_EQ(letter(), "old");
}

TEST_F(DataReplacementTest, needsTheDeviceForItself) {
    EXPECT_FALSE(look()->replaceData(kAtlas, writeLetter).ok());
    EXPECT_EQ(letter(), "old");
}

TEST_F(DataReplacementTest, isLeftByACrashAsItWasAndTheNextSessionClearsTheRest) {
    const std::string unpacked = std::string(kUnpackedDataDirectory) + "/" + kAtlas;
    close();
    fs::create_directories(rootPath(unpacked));
    write(unpacked + "/letter", "half");
    EXPECT_TRUE(device().databaseFailure() == std::nullopt);
    EXPECT_EQ(letter(), "old");
    EXPECT_TRUE(nothingIsLeftBeside());
}

}  // namespace

}  // namespace appsync
