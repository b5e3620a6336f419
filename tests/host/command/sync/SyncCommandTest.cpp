#include <filesystem>
#include <fstream>

#include "host/command/CommandLine.h"
#include "host/console/Console.h"
#include "host/session/Session.h"
#include "platform/AppRegistry.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

using SyncCommand = HostFixture;

TEST_F(SyncCommand, InstallsUpdatesAndRemoves) {
    addPackage("com.a", "1");
    addPackage("com.b", "1");
    EXPECT_EQ(sync(), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 1", "com.b 1"));
    addPackage("com.a", "2");
    EXPECT_EQ(sync({"--remove", "com.b"}), 0);
    EXPECT_THAT(applications(), ElementsAre("com.a 2"));
}

TEST_F(SyncCommand, ASecondSyncAsksForNothing) {
    addPackage("com.a", "1");
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(sync(), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"requested\": []"));
}

TEST_F(SyncCommand, WritesDownTheApplicationsThatArePresent) {
    addPackage("com.a", "1");
    EXPECT_EQ(sync(), 0);
    EXPECT_THAT(readLastSyncState(*open(DeviceAccess::Look)), ElementsAre("com.a"));
}

TEST_F(SyncCommand, APackageThatCannotBeReadFailsAloneAndByName) {
    addPackage("com.a", "1");
    write(library + "/broken.zip", "no package");
    EXPECT_EQ(sync(), 1);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
    EXPECT_THAT(out.str(), HasSubstr("\"identifier\": \"broken.zip\""));
    EXPECT_THAT(err.str(), HasSubstr("appsync: broken.zip: "));
}

TEST_F(SyncCommand, WhatPolicyForbidsIsSkippedWithStatus1) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"set", device, "installation=no"}), 0);
    EXPECT_EQ(sync(), 1);
    EXPECT_THAT(out.str(), HasSubstr("policy"));
    EXPECT_THAT(applications(), IsEmpty());
}

TEST_F(SyncCommand, APlanLeavesOutWhatPolicyForbids) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"set", device, "installation=no"}), 0);
    EXPECT_EQ(run({"plan", device, library}), 0);
    EXPECT_THAT(out.str(), HasSubstr("skip     com.a: device policy does not allow installing"));
    EXPECT_THAT(out.str(), HasSubstr("Nothing to do.\n"));
    EXPECT_EQ(sync({"--dry-run"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"install\": []"));
    EXPECT_THAT(out.str(), HasSubstr("\"needed\": 0"));
}

TEST_F(SyncCommand, ADryRunWithJsonLinesPrintsOneLine) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"sync", device, library, "--dry-run", "--json-lines"}), 0);
    EXPECT_THAT(out.str(), testing::StartsWith("{\"event\":\"plan\",\"install\":[\"com.a\"]"));
    EXPECT_EQ(out.str().find('\n'), out.str().size() - 1);
}

TEST_F(SyncCommand, APlanNamesThePackagesThatAreLeftOut) {
    addPackage("com.a", "1");
    std::filesystem::rename(library + "/com.a.zip", library + "/old.zip");
    addPackage("com.a", "2");
    EXPECT_EQ(run({"plan", device, library}), 0);
    EXPECT_THAT(out.str(), HasSubstr("note     " + library + "/old.zip is left out"));
    EXPECT_EQ(run({"plan", device, library, "--json"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("old.zip is left out"));
}

TEST_F(SyncCommand, ATerminalGetsNoCellThatBreaksTheTable) {
    addPackage("com.a", std::string(300, '7'));
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(run({"apps", device}), 0);
    EXPECT_THAT(out.str(), HasSubstr(std::string(300, '7')));
    std::ostringstream terminal;
    EXPECT_EQ(runCommandLine({"apps", device}, Console{terminal, err, true, 80}), 0);
    EXPECT_THAT(terminal.str(), HasSubstr("777...  "));
    std::istringstream lines(terminal.str());
    for (std::string line; std::getline(lines, line);) EXPECT_LE(line.size(), 80U) << line;
}

TEST_F(SyncCommand, APlanChangesNothing) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"plan", device, library}), 0);
    EXPECT_THAT(out.str(), HasSubstr("install  com.a 1"));
    EXPECT_THAT(applications(), IsEmpty());
    EXPECT_FALSE(std::filesystem::exists(root + "/var/mobile/Media/PublicStaging/ApplicationSync"));
}

TEST_F(SyncCommand, ADeviceThatIsInUseIsStatus3) {
    const std::unique_ptr<Device> held = open(DeviceAccess::Session);
    EXPECT_EQ(sync(), 3);
    EXPECT_THAT(err.str(), HasSubstr("in use"));
}

TEST_F(SyncCommand, ALibraryThatIsMissingIsStatus3) {
    EXPECT_EQ(run({"sync", device, library + "/missing"}), 3);
}

class StagedSync : public HostFixture {
  protected:
    void stage(std::string_view todoList) {
        write(root + "/var/mobile/Media/PublicStaging/ApplicationSync/ApplicationsSync.plist",
              todoList);
    }

    static std::string entry(const std::string& identifier, const std::string& operation) {
        return "<dict><key>identifier</key><string>" + identifier +
               "</string><key>operation</key><string>" + operation + "</string></dict>";
    }

    static std::string list(const std::string& entries) {
        return "<plist version=\"1.0\"><array>" + entries + "</array></plist>";
    }
};

TEST_F(StagedSync, WithoutAStagingAreaHasNothingToDo) { EXPECT_EQ(sync({"--staged"}), 0); }

TEST_F(StagedSync, SendsWhatIsAskedForAndNamesWhatTheLibraryLacks) {
    addPackage("com.a", "1");
    stage(list(entry("com.a", "install") + entry("com.lacking", "install")));
    EXPECT_EQ(sync({"--staged"}), 1);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
    EXPECT_THAT(out.str(), HasSubstr("the library has no package of com.lacking"));
}

TEST_F(StagedSync, APackageOfAnotherIdentifierIsRefused) {
    addPackage("com.other", "1");
    std::filesystem::rename(library + "/com.other.zip", library + "/com.a.zip");
    stage(list(entry("com.a", "install")));
    EXPECT_EQ(sync({"--staged"}), 1);
    EXPECT_THAT(applications(), IsEmpty());
}

TEST_F(StagedSync, SaysWhatIsWrongWithTheTodoList) {
    stage("<plist version=\"1.0\"><dict/></plist>");
    EXPECT_EQ(sync({"--staged"}), 1);
    EXPECT_THAT(out.str(), HasSubstr("it is not a list"));
}

TEST_F(StagedSync, AnEntryWithAnIllegalIdentifierFailsAndTheOthersAreDone) {
    addPackage("com.a", "1");
    stage(list(entry("a/b", "install") + entry("com.a", "install")));
    EXPECT_EQ(sync({"--staged"}), 1);
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
    EXPECT_THAT(out.str(), HasSubstr("\"identifier\": \"a/b\""));
}

TEST_F(StagedSync, ALinkThatLeadsNowhereIsNamed) {
    const std::string staging = root + "/var/mobile/Media/PublicStaging";
    std::filesystem::create_directories(staging);
    std::filesystem::create_symlink(library, staging + "/ApplicationSync");
    EXPECT_EQ(sync({"--staged"}), 1);
    EXPECT_THAT(out.str(), HasSubstr("a link that leads nowhere"));
}

TEST_F(StagedSync, AListThatAsksForTooMuchIsRefusedBeforeTheDeviceSeesIt) {
    std::string entries;
    for (int number = 0; number < 20'001; ++number) {
        entries += "<dict><key>operation</key><string>install</string></dict>";
    }
    stage(list(entries));
    EXPECT_EQ(sync({"--staged"}), 1);
    EXPECT_THAT(err.str(), HasSubstr("20001 installs"));
    EXPECT_THAT(out.str(), HasSubstr("ApplicationsSync.plist"));
    EXPECT_TRUE(std::filesystem::exists(root + "/var/mobile/Media/PublicStaging/ApplicationSync"));
}

}  // namespace
}  // namespace appsync
