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

constexpr const char* kA = "com.example.a";

Status failing(const char* why) { return ErrorRecord::make(kPosixErrorDomain, ENOSPC, why); }

/// Data that comes from elsewhere while the device goes on.
class DataReplacementTest : public DeviceFixture {
  protected:
    void SetUp() override {
        ASSERT_TRUE(succeeded(install(kA)));
        fs::create_directories(rootPath(Device::dataPath(kA)));
        write(Device::dataPath(kA) + "/letter", "old");
    }

    static Status writeLetter(int directory) {
        const UniqueFd file(::openat(directory, "letter", O_WRONLY | O_CREAT | O_EXCL, 0600));
        if (!file || ::write(file.get(), "new", 3) != 3) return failing("cannot write");
        return {};
    }
    [[nodiscard]] std::string letter() const { return read(Device::dataPath(kA) + "/letter"); }
    [[nodiscard]] bool nothingIsLeftBeside() const {
        return !exists(std::string(kUnpackedDataDirectory)) ||
               fs::is_empty(rootPath(kUnpackedDataDirectory));
    }
};

TEST_F(DataReplacementTest, takesThePlaceOfAllThatWasThere) {
    write(Device::dataPath(kA) + "/other", "old");
    EXPECT_TRUE(succeeded(device().replaceData(kA, writeLetter)));
    EXPECT_EQ(letter(), "new");
    EXPECT_FALSE(exists(Device::dataPath(kA) + "/other"));
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, isTheFirstDataWhereThereWasNone) {
    fs::remove_all(rootPath(Device::dataPath(kA)));
    EXPECT_TRUE(succeeded(device().replaceData(kA, writeLetter)));
    EXPECT_EQ(letter(), "new");
}

TEST_F(DataReplacementTest, changesNothingWhenItFailsOnTheWay) {
    const Status status = device().replaceData(kA, [](int directory) {
        const Status written = writeLetter(directory);
        return written ? failing("the disk is full") : written;
    });
    EXPECT_FALSE(status.ok());
    EXPECT_EQ(letter(), "old");
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, isRefusedWhenTheApplicationWasStartedMeanwhile) {
    const Status status = device().replaceData(kA, [&](int directory) {
        EXPECT_TRUE(succeeded(look()->run(kA)));
        return writeLetter(directory);
    });
    EXPECT_TRUE(refusedBy(status, RegistryErrorCode::Running, "quit"));
    EXPECT_EQ(letter(), "old");
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, leavesNothingWhenTheApplicationWasUninstalledMeanwhile) {
    const Status status = device().replaceData(kA, [&](int directory) {
        EXPECT_TRUE(succeeded(look()->uninstall(kA)));
        return writeLetter(directory);
    });
    EXPECT_TRUE(refusedBy(status, RegistryErrorCode::NothingInstalled));
    EXPECT_FALSE(exists(Device::dataPath(kA)));
    EXPECT_TRUE(nothingIsLeftBeside());
}

TEST_F(DataReplacementTest, isRefusedBehindThePlaceholderOfASync) {
    constexpr const char* kB = "com.example.b";
    ASSERT_TRUE(succeeded(installPlaceholder(kB, kInstallTypeSync)));
    EXPECT_TRUE(
        refusedBy(device().replaceData(kB, writeLetter), RegistryErrorCode::NothingInstalled));
    EXPECT_FALSE(exists(Device::dataPath(kB)));
}

TEST_F(DataReplacementTest, isRefusedWhileARestoreBringsData) {
    ASSERT_TRUE(succeeded(device().setRestoreDataExpected(kA, true)));
    EXPECT_TRUE(
        refusedBy(device().replaceData(kA, writeLetter), RegistryErrorCode::UpdateUnderWay));
    EXPECT_EQ(letter(), "old");
}

TEST_F(DataReplacementTest, needsTheDeviceForItself) {
    EXPECT_FALSE(look()->replaceData(kA, writeLetter).ok());
    EXPECT_EQ(letter(), "old");
}

TEST_F(DataReplacementTest, isLeftByACrashAsItWasAndTheNextSessionClearsTheRest) {
    const std::string unpacked = std::string(kUnpackedDataDirectory) + "/" + kA;
    close();
    fs::create_directories(rootPath(unpacked));
    write(unpacked + "/letter", "half");
    EXPECT_TRUE(device().databaseFailure() == std::nullopt);
    EXPECT_EQ(letter(), "old");
    EXPECT_TRUE(nothingIsLeftBeside());
}

}  // namespace

}  // namespace appsync
