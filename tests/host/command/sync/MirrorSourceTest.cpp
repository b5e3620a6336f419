#include <filesystem>

#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

// Whatever is refused, the device keeps its application.
class MirrorSource : public HostFixture {
  protected:
    MirrorSource() {
        addPackage("com.a", "1");
        EXPECT_EQ(sync(), 0);
    }

    void expectRefused(const std::string& folder, const std::string& option,
                       const std::string& why) {
        for (const char* command : {"plan", "sync"}) {
            EXPECT_EQ(run({command, device, folder, option}), 3) << command;
            EXPECT_THAT(err.str(), HasSubstr(why));
            EXPECT_EQ(err.str().find('\n'), err.str().size() - 1);
        }
        EXPECT_THAT(applications(), ElementsAre("com.a 1"));
    }

    const std::string empty = directory.path() + "/empty";
    const std::string backup = directory.path() + "/backup";
};

TEST_F(MirrorSource, ADeviceIsNone) {
    for (const char* option : {"--mirror", "--mirror=empty", "--no-wait"}) {
        expectRefused(device, option, device + " is a device and no library: name the folder");
    }
}

TEST_F(MirrorSource, WhatIsLeftOfADeviceIsNone) {
    const std::string lost = directory.path() + "/lost";
    std::filesystem::create_directories(lost + "/root/var/mobile");
    expectRefused(lost, "--mirror=empty", lost + " is a device and no library");
    expectRefused(lost + "/root", "--mirror=empty", "which stands in a device");
}

TEST_F(MirrorSource, ABackupIsNone) {
    ASSERT_EQ(run({"backup", device, backup}), 0);
    for (const char* option : {"--mirror", "--mirror=empty", "--no-wait"}) {
        expectRefused(backup, option, backup + " is a backup and no library: name the folder");
    }
}

TEST_F(MirrorSource, AFolderWithoutPackagesIsOneWhereThatIsSaid) {
    std::filesystem::create_directory(empty);
    write(empty + "/notes.txt", "no package");
    expectRefused(empty, "--mirror", "--mirror=empty");
    EXPECT_EQ(run({"sync", device, empty, "--mirror=empty"}), 0);
    EXPECT_THAT(applications(), IsEmpty());
}

TEST_F(MirrorSource, WhatCannotBeReadStillKeepsEverything) {
    std::filesystem::create_directory(empty);
    write(empty + "/broken.zip", "no package");
    EXPECT_EQ(run({"sync", device, empty, "--mirror"}), 1);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(MirrorSource, AFolderInADeviceOrABackupIsNone) {
    const std::string media = device + "/root/var/mobile/Media";
    std::filesystem::create_directory_symlink(media, empty);
    ASSERT_EQ(run({"backup", device, backup}), 0);
    std::filesystem::create_directory(backup + "/more");
    for (const std::string& folder : {media, empty, media + "/"}) {
        expectRefused(folder, "--mirror=empty", folder + ", which stands in a device: name");
    }
    expectRefused(backup + "/more", "--mirror=empty", ", which stands in a backup: name");
}

TEST_F(MirrorSource, WithoutAMirrorAFolderWithoutPackagesIsNoted) {
    std::filesystem::create_directory(empty);
    const std::string note = empty + " holds no package (*.zip): there is nothing to install";
    for (const char* command : {"plan", "sync"}) {
        EXPECT_EQ(run({command, device, empty}), 0);
        EXPECT_THAT(out.str(), HasSubstr(note));
    }
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
    EXPECT_EQ(run({"sync", device, empty, "--remove", "com.a"}), 0);
    EXPECT_THAT(out.str(), Not(HasSubstr("no package"))) << "a removal needs none";
}

TEST_F(MirrorSource, ItsOptionTakesNoWordThatFollows) {
    addPackage("com.b", "1");
    EXPECT_EQ(run({"sync", "--mirror", device, library}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1", "com.b 1"));
}

}  // namespace
}  // namespace appsync
