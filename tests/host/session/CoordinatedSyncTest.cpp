#include <filesystem>
#include <fstream>
#include <sstream>

#include "device/database/Database.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class CoordinatedSync : public HostFixture {
  protected:
    CoordinatedSync() : HostFixture(true) {}

    [[nodiscard]] std::vector<std::string> coordinators() {
        std::vector<std::string> identifiers;
        const auto records = open(DeviceAccess::Look)->coordinators();
        if (!records) return {"no answer"};
        for (const CoordinatorRecord& each : *records) identifiers.push_back(each.identifier);
        return identifiers;
    }

    void create(const std::string& identifier) {
        EXPECT_EQ(run({"coordinator", device, "create", identifier}), 0) << err.str();
    }
};

TEST_F(CoordinatedSync, InstallsUpdatesAndRemoves) {
    addPackage("com.a", "1");
    addPackage("com.b", "1");
    EXPECT_EQ(sync(), 0) << out.str();
    EXPECT_THAT(applications(), ElementsAre("com.a 1", "com.b 1"));
    addPackage("com.a", "2");
    EXPECT_EQ(sync({"--remove", "com.b"}), 0) << out.str();
    EXPECT_THAT(applications(), ElementsAre("com.a 2"));
    EXPECT_THAT(coordinators(), IsEmpty());
}

TEST_F(CoordinatedSync, ReportsTheSamePhasesAsADirectOne) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"sync", device, library}), 0);
    EXPECT_THAT(out.str(), HasSubstr("install com.a: begins"));
    EXPECT_THAT(out.str(), HasSubstr("install com.a: done"));
}

TEST_F(CoordinatedSync, LeavesToAnotherClientWhatThatHasInHand) {
    addPackage("com.a", "1");
    addPackage("com.b", "1");
    create("com.a");
    EXPECT_EQ(sync(), 1);
    EXPECT_THAT(out.str(), HasSubstr("client 2"));
    EXPECT_THAT(applications(), ElementsAre("com.b 1"));
    EXPECT_THAT(coordinators(), ElementsAre("com.a"));
}

TEST_F(CoordinatedSync, APackageOfAnotherIdentifierFailsAndLeavesNothing) {
    addPackage("com.b", "1");
    write(root + "/var/mobile/Media/PublicStaging/ApplicationSync/ApplicationsSync.plist",
          "<plist version=\"1.0\"><array><dict><key>identifier</key><string>com.a</string>"
          "<key>operation</key><string>install</string></dict></array></plist>");
    std::filesystem::rename(library + "/com.b.zip", library + "/com.a.zip");
    EXPECT_EQ(sync({"--staged"}), 1);
    EXPECT_THAT(out.str(), HasSubstr("\"identifier\": \"com.a\""));
    EXPECT_THAT(applications(), IsEmpty());
    EXPECT_THAT(coordinators(), IsEmpty());
}

TEST_F(CoordinatedSync, SendsOnePackageInASessionOfItsOwn) {
    addPackage("com.a", "1");
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip"}), 0) << out.str() << err.str();
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(CoordinatedSync, SendingTakesNoNoteOfWhatWasUninstalled) {
    addPackage("com.a", "1");
    addPackage("com.b", "1");
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(run({"uninstall", device, "com.b"}), 0);
    EXPECT_EQ(run({"send", device, "com.a", library + "/com.a.zip"}), 0) << out.str() << err.str();
    EXPECT_EQ(run({"inventory", device, "--json"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("\"deleted\": [\n    \"com.b\"\n  ]"));
}

// Changes what only unpacking reads: the packed contents of an entry.
void damage(const std::string& package, const std::string& entry) {
    std::fstream file(package, std::ios::in | std::ios::out | std::ios::binary);
    std::stringstream contents;
    contents << file.rdbuf();
    const std::size_t place = contents.str().find(entry) + entry.size() + 4;
    file.seekp(static_cast<std::streamoff>(place));
    file.put(static_cast<char>(contents.str().at(place) ^ 0x20));
}

TEST_F(CoordinatedSync, AnErrorIsForgottenOnceAllIsInStep) {
    addPackage("com.a", "2");
    damage(library + "/com.a.zip", "Name.app/data");
    EXPECT_EQ(sync(), 1);
    EXPECT_EQ(run({"why", device, "com.a"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("Its last error"));
    addPackage("com.a", "1");
    EXPECT_EQ(sync(), 0);
    EXPECT_EQ(run({"why", device, "com.a"}), 0);
    EXPECT_THAT(out.str(), testing::Not(HasSubstr("Its last error")));
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

TEST_F(CoordinatedSync, WhatEndsWithCoordinationIsNamedInPrintableText) {
    create("com.a");
    {
        const auto database = Database::open(device + "/device.db", Database::Mode::Existing);
        ASSERT_TRUE(database.ok());
        ASSERT_TRUE((*database)->execute("UPDATE coordinators SET identifier = char(27) || '[2J'"));
    }
    EXPECT_EQ(run({"set", device, "coordination=off"}), 0);
    EXPECT_THAT(out.str(), HasSubstr("has a coordinator: ?[2J\n"));
}

TEST_F(CoordinatedSync, LookingAtTheDeviceStartsNothing) {
    addPackage("com.a", "1");
    create("com.a");
    EXPECT_EQ(run({"inventory", device}), 0);
    EXPECT_EQ(run({"apps", device}), 0);
    EXPECT_THAT(coordinators(), ElementsAre("com.a"));
}

}  // namespace
}  // namespace appsync
