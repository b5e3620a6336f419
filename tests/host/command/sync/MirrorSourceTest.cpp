#include <filesystem>

#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

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
    expectRefused(device, "--mirror", "which is a device");
    expectRefused(device, "--mirror=empty", "which is a device");
}

TEST_F(MirrorSource, ABackupIsNone) {
    ASSERT_EQ(run({"backup", device, backup}), 0);
    expectRefused(backup, "--mirror", "which is a backup");
    expectRefused(backup, "--mirror=empty", "which is a backup");
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

TEST_F(MirrorSource, WithoutAMirrorAnyFolderWillDo) {
    EXPECT_EQ(run({"sync", device, device}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(MirrorSource, ItsOptionTakesNoWordThatFollows) {
    addPackage("com.b", "1");
    EXPECT_EQ(run({"sync", "--mirror", device, library}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1", "com.b 1"));
}

}  // namespace
}  // namespace appsync
