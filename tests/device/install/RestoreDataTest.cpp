#include "device/install/RestoreData.h"

#include <gmock/gmock.h>

#include <filesystem>

#include "device/values/DevicePaths.h"
#include "platform/FileSystem.h"
#include "tests/device/DeviceFixture.h"
#include "tests/device/package/PackageZip.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

/// Archives that a restore has left, and applications that come after it.
class RestoreDataTest : public DeviceFixture {
  protected:
    void leave(const std::string& identifier, const std::string& archive) const {
        fs::create_directories(rootPath(kRestoreDataDirectory));
        write(restoreArchiveOf(identifier), archive);
    }
    void leaveLetter(const std::string& identifier = kAtlas) const {
        leave(identifier, ZipBuilder()
                              .add({zipDirectory("Documents/"),
                                    zipFile("Documents/letter", "of " + identifier)})
                              .bytes());
    }
    void writeData(const std::string& name, const std::string& contents) const {
        const std::string path = Device::dataPath(kAtlas) + "/" + name;
        fs::create_directories(fs::path(rootPath(path)).parent_path());
        write(path, contents);
    }
    [[nodiscard]] std::string letterOf(const std::string& identifier = kAtlas) const {
        return read(Device::dataPath(identifier) + "/Documents/letter");
    }
    [[nodiscard]] bool waits(const std::string& identifier = kAtlas) const {
        return exists(restoreArchiveOf(identifier));
    }
};

TEST_F(RestoreDataTest, comesBackWithTheInstall) {
    leaveLetter();
    EXPECT_TRUE(succeeded(install(kAtlas)));
    EXPECT_EQ(letterOf(), "of com.example.atlas");
    EXPECT_FALSE(waits()) << "it is restored once";
    EXPECT_TRUE(!exists(std::string(kUnpackedDataDirectory)) ||
                fs::is_empty(rootPath(kUnpackedDataDirectory)));
}

TEST_F(RestoreDataTest, takesThePlaceOfWhatWasThere) {
    writeData("Documents/newer", "newer");
    leaveLetter();
    EXPECT_TRUE(succeeded(install(kAtlas)));
    EXPECT_EQ(letterOf(), "of com.example.atlas");
    EXPECT_FALSE(exists(Device::dataPath(kAtlas) + "/Documents/newer"));
}

TEST_F(RestoreDataTest, isLeftAloneWhereThereIsNoArchive) {
    writeData("kept", "kept");
    leaveLetter("com.example.b");
    EXPECT_TRUE(succeeded(install(kAtlas)));
    EXPECT_EQ(read(Device::dataPath(kAtlas) + "/kept"), "kept");
    EXPECT_TRUE(waits("com.example.b"));
}

TEST_F(RestoreDataTest, thatCannotBeUsedFailsTheInstallAndLeavesTheDataAsItWas) {
    writeData("kept", "kept");
    ZipEntry damaged = zipFile("Documents/letter", "contents");
    damaged.crc = 1;
    const std::vector<std::string> archives = {"no archive", "", ZipBuilder().add(damaged).bytes(),
                                               ZipBuilder().add(zipFile("../escape", "2")).bytes()};
    for (const std::string& archive : archives) {
        leave(kAtlas, archive);
        const Status installed = install(kAtlas);
        ASSERT_FALSE(installed.ok());
        EXPECT_THAT(installed.error().description(),
                    HasSubstr("the data of com.example.atlas cannot be restored"));
        EXPECT_EQ(read(Device::dataPath(kAtlas) + "/kept"), "kept");
        EXPECT_FALSE(application(kAtlas));
        EXPECT_FALSE(exists(std::string(kUnpackedDataDirectory) + "/" + kAtlas));
        EXPECT_TRUE(waits());
    }
    EXPECT_FALSE(exists("/var/mobile/tmp/escape"));
}

TEST_F(RestoreDataTest, isUnpackedAgainAfterAnInstallThatWasCutOff) {
    leaveLetter();
    fs::create_directories(rootPath(std::string(kUnpackedDataDirectory) + "/" + kAtlas));
    write(std::string(kUnpackedDataDirectory) + "/" + kAtlas + "/half", "half of it");
    EXPECT_TRUE(succeeded(install(kAtlas)));
    EXPECT_EQ(letterOf(), "of com.example.atlas");
    EXPECT_FALSE(exists(Device::dataPath(kAtlas) + "/half"));
}

TEST_F(RestoreDataTest, goesWithTheRemovalOfItsPlaceholder) {
    EXPECT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeRestore)));
    leaveLetter();
    EXPECT_TRUE(succeeded(device().registry().uninstallApplication(kAtlas, {})));
    EXPECT_FALSE(waits());
}

TEST_F(RestoreDataTest, ofAnInstalledApplicationAndWhatIsNoneGoWithTheNextSession) {
    EXPECT_TRUE(succeeded(install(kAtlas)));
    close();
    leaveLetter();
    leaveLetter("com.example.b");
    write(std::string(kRestoreDataDirectory) + "/archive.part", "cut off");
    static_cast<void>(device());
    EXPECT_FALSE(waits()) << "its install was committed";
    EXPECT_TRUE(waits("com.example.b"));
    EXPECT_FALSE(exists(std::string(kRestoreDataDirectory) + "/archive.part"));
}

TEST_F(RestoreDataTest, ofTheLongestIdentifierComesBackToo) {
    for (const std::string& identifier :
         {std::string(255, 'x'), std::string(251, 'y') + ".zip", std::string(251, 'y')}) {
        leaveLetter(identifier);
        close();
        static_cast<void>(device());
        EXPECT_TRUE(waits(identifier)) << "the opening of a session leaves it";
        write("/var/mobile/tmp/package", packageOf(identifier, "1.0"));
        EXPECT_TRUE(succeeded(installFrom("/var/mobile/tmp/package", identifier)));
        EXPECT_EQ(letterOf(identifier), "of " + identifier);
        EXPECT_FALSE(waits(identifier));
    }
}

}  // namespace

}  // namespace appsync
