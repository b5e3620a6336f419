#include <algorithm>
#include <filesystem>
#include <fstream>
#include <functional>
#include <limits>

#include "device/values/DevicePaths.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr std::uint64_t kMoreThanThereIs = std::numeric_limits<std::uint64_t>::max();

class RollbackTest : public DeviceFixture {
  protected:
    void update(const std::string& identifier = kAtlas) {
        ASSERT_TRUE(succeeded(install(identifier, "1.0")));
        ASSERT_TRUE(succeeded(install(identifier, "2.0")));
    }
    template <typename Between>
    void reopenAfter(Between between) {
        close();
        between();
        static_cast<void>(device());
    }
    [[nodiscard]] std::vector<std::string> kept() const {
        std::vector<std::string> names;
        if (!fs::is_directory(devicePath("kept"))) return names;
        for (const auto& entry : fs::directory_iterator(devicePath("kept"))) {
            names.push_back(entry.path().filename());
        }
        std::sort(names.begin(), names.end());
        return names;
    }
    [[nodiscard]] std::string keptPath(const std::string& name) const {
        return devicePath("kept/" + name);
    }
    /// The version that is kept of the application; "-" where none is.
    [[nodiscard]] std::string keptVersion(const std::string& identifier = kAtlas) {
        const auto records = device().applications();
        for (const ApplicationRecord& each : *records) {
            if (each.identifier == identifier && each.kept) return each.kept->version.value_or("");
        }
        return "-";
    }
    [[nodiscard]] std::string program() { return read(application(kAtlas)->bundlePath + "/main"); }
    /// The record that is kept names a container that lies with those of bundles again: between a
    /// commit and the renaming that follows it.
    void moveBackToBundles() const {
        const std::string name = kept().front();
        fs::rename(keptPath(name), rootPath(containerPath(name)));
    }
    void expectNothingKept() {
        EXPECT_EQ(keptVersion(), "-");
        EXPECT_TRUE(kept().empty());
        EXPECT_EQ(number("SELECT count(*) FROM kept"), 0);
    }
};

TEST_F(RollbackTest, anUpdateKeepsWhatItReplaces) {
    update();
    EXPECT_EQ(containers().size(), 1U) << "only what is installed stands with the bundles";
    EXPECT_EQ(kept().size(), 1U);
    EXPECT_EQ(keptVersion(), "1.0");
    EXPECT_GT(device().applications()->front().kept->bytes, 0U);
}

TEST_F(RollbackTest, ofSeveralUpdatesOnlyTheLastIsKept) {
    update();
    ASSERT_TRUE(succeeded(install(kAtlas, "3.0")));
    EXPECT_EQ(keptVersion(), "2.0");
    EXPECT_EQ(kept().size(), 1U);
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(RollbackTest, theSameVersionAgainIsNoUpdate) {
    update();
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    EXPECT_EQ(keptVersion(), "1.0");
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(RollbackTest, aFirstInstallKeepsNothingAndNeitherDoesOneOfAnOffloadedApplication) {
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    EXPECT_FALSE(fs::exists(devicePath("kept")));
    ASSERT_TRUE(succeeded(device().demote(kAtlas, DemotedBy::Person)));
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    expectNothingKept();
}

TEST_F(RollbackTest, theVersionBeforeComesBackAndTheDataStays) {
    update();
    const std::string data = Device::dataPath(kAtlas);
    fs::create_directories(rootPath(data));
    write(data + "/notes", "written with 2.0");
    const auto done = device().rollBack(kAtlas);
    ASSERT_TRUE(done) << done.error().description();
    EXPECT_EQ(done->oldVersion, "2.0");
    EXPECT_EQ(done->newVersion, "1.0");
    EXPECT_EQ(application(kAtlas)->bundleVersion, "1.0");
    EXPECT_EQ(program(), "program 1.0");
    EXPECT_EQ(read(data + "/notes"), "written with 2.0");
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(RollbackTest, aRollbackCanBeUndoneByAnother) {
    update();
    ASSERT_TRUE(device().rollBack(kAtlas));
    EXPECT_EQ(keptVersion(), "2.0");
    EXPECT_EQ(kept().size(), 1U);
    ASSERT_TRUE(device().rollBack(kAtlas));
    EXPECT_EQ(keptVersion(), "1.0");
    EXPECT_EQ(program(), "program 2.0");
}

TEST_F(RollbackTest, placeAndTypeStayAndTheHistoryTells) {
    ASSERT_TRUE(succeeded(install(kBrook)));
    update();
    sql("UPDATE applications SET type = 'System' WHERE identifier = 'com.example.atlas'");
    const std::int64_t arrived = number("SELECT max(arrived) FROM applications");
    ASSERT_TRUE(device().rollBack(kAtlas));
    EXPECT_EQ(application(kAtlas)->applicationType, "System");
    EXPECT_EQ(number("SELECT arrived FROM applications WHERE identifier = 'com.example.atlas'"),
              arrived);
    const HistoryRecord last = device().history()->back();
    EXPECT_EQ(last.identifier, kAtlas);
    EXPECT_EQ(last.description, "Rolled back from 2.0 to 1.0");
    EXPECT_TRUE(last.success);
}

TEST_F(RollbackTest, refusals) {
    const auto rollBack = [this] {
        const auto done = device().rollBack(kAtlas);
        return done ? Status() : Status(done.error());
    };
    EXPECT_TRUE(refusedBy(rollBack(), RegistryErrorCode::NothingInstalled, "is not installed"));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas, kInstallTypeRestore)));
    EXPECT_TRUE(refusedBy(rollBack(), RegistryErrorCode::NothingInstalled, "is a placeholder"));
    ASSERT_TRUE(succeeded(install(kAtlas, "1.0")));
    EXPECT_TRUE(refusedBy(rollBack(), RegistryErrorCode::NothingKept, "no earlier version"));
    ASSERT_TRUE(succeeded(install(kAtlas, "2.0")));
    ASSERT_TRUE(succeeded(device().run(kAtlas)));
    EXPECT_TRUE(refusedBy(rollBack(), RegistryErrorCode::Running, "quit it"));
    ASSERT_TRUE(succeeded(device().quit(kAtlas)));
    ASSERT_TRUE(succeeded(installPlaceholder(kAtlas)));
    EXPECT_TRUE(refusedBy(rollBack(), RegistryErrorCode::UpdateUnderWay, "under way"));
    EXPECT_EQ(program(), "program 2.0");
    EXPECT_FALSE(look()->rollBack(kAtlas));
    EXPECT_FALSE(device().rollBack("../climbs"));
}

TEST_F(RollbackTest, theRemovalOfTheApplicationTakesWhatIsKept) {
    update();
    ASSERT_TRUE(succeeded(look()->uninstall(kAtlas)));
    expectNothingKept();
    EXPECT_TRUE(containers().empty());
}

TEST_F(RollbackTest, offloadingTheApplicationTakesWhatIsKept) {
    update();
    ASSERT_TRUE(succeeded(device().demote(kAtlas, DemotedBy::Person)));
    expectNothingKept();
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(RollbackTest, anApplicationThatIsLostTakesWhatIsKept) {
    update();
    const std::string container = application(kAtlas)->bundleContainerPath;
    reopenAfter([&] { fs::remove_all(rootPath(container)); });
    EXPECT_FALSE(application(kAtlas));
    expectNothingKept();
}

TEST_F(RollbackTest, whatIsKeptOutlivesSessions) {
    update();
    reopenAfter([] {});
    EXPECT_EQ(keptVersion(), "1.0");
    EXPECT_TRUE(device().rollBack(kAtlas));
}

TEST_F(RollbackTest, aKillBetweenTheCommitAndTheRenamingLosesNothing) {
    update();
    reopenAfter([&] { moveBackToBundles(); });
    EXPECT_EQ(keptVersion(), "1.0");
    EXPECT_EQ(kept().size(), 1U);
    EXPECT_EQ(containers().size(), 1U);
    ASSERT_TRUE(device().rollBack(kAtlas));
    EXPECT_EQ(program(), "program 1.0");
}

TEST_F(RollbackTest, aKillBeforeTheCommitOfARollbackLeavesWhatWasInstalled) {
    update();
    moveBackToBundles();
    EXPECT_EQ(program(), "program 2.0");
    reopenAfter([] {});
    EXPECT_EQ(program(), "program 2.0");
    EXPECT_EQ(keptVersion(), "1.0");
    EXPECT_EQ(kept().size(), 1U);
}

TEST_F(RollbackTest, aKillAfterTheCommitOfARollbackLeavesTheVersionBefore) {
    update();
    ASSERT_TRUE(device().rollBack(kAtlas));
    reopenAfter([&] { moveBackToBundles(); });
    EXPECT_EQ(program(), "program 1.0");
    EXPECT_EQ(keptVersion(), "2.0");
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(RollbackTest, aKillWhileOneIsGivenUpLeavesNothingOfIt) {
    update();
    const std::string name = kept().front();
    const std::string aside = rootPath(kTemporaryDirectory) + "/" + name;
    reopenAfter([&] { fs::rename(keptPath(name), aside); });
    expectNothingKept();
    EXPECT_FALSE(fs::exists(aside));
}

TEST_F(RollbackTest, whatNoRecordNamesIsRemovedAndNoLinkIsFollowed) {
    update();
    fs::create_directories(path("outside"));
    fs::create_directories(keptPath("STRAY/App.app"));
    fs::create_directory_symlink(path("outside"), keptPath("LINK"));
    fs::create_directory_symlink(path("outside"), keptPath("STRAY/App.app/link"));
    fs::create_directories(path("outside/deep"));
    reopenAfter([] {});
    EXPECT_EQ(kept().size(), 1U);
    EXPECT_TRUE(fs::exists(path("outside/deep")));
    EXPECT_EQ(keptVersion(), "1.0");
}

TEST_F(RollbackTest, aLinkInThePlaceOfTheDirectoryIsLeftAlone) {
    fs::create_directories(path("outside/deep"));
    fs::create_directory_symlink(path("outside"), devicePath("kept"));
    update();
    EXPECT_EQ(keptVersion(), "-");
    EXPECT_EQ(containers().size(), 1U);
    EXPECT_FALSE(device().rollBack(kAtlas));
    reopenAfter([] {});
    EXPECT_TRUE(fs::exists(path("outside/deep")));
    EXPECT_EQ(std::distance(fs::directory_iterator(path("outside")), {}), 1);
}

TEST_F(RollbackTest, aFileInThePlaceOfTheDirectoryKeepsNothing) {
    static_cast<void>(device());
    fs::copy_file(devicePath("device.db"), devicePath("kept"));
    update();
    EXPECT_EQ(number("SELECT count(*) FROM kept"), 0);
    EXPECT_EQ(containers().size(), 1U);
}

TEST_F(RollbackTest, aLinkInThePlaceOfWhatIsKeptIsNotBroughtBack) {
    update();
    fs::create_directories(path("outside/App.app"));
    const std::string name = kept().front();
    fs::remove_all(keptPath(name));
    fs::create_directory_symlink(path("outside"), keptPath(name));
    const auto done = device().rollBack(kAtlas);
    ASSERT_FALSE(done);
    EXPECT_TRUE(isRegistryError(done.error(), RegistryErrorCode::NothingKept));
    EXPECT_EQ(program(), "program 2.0");
    EXPECT_TRUE(fs::exists(path("outside/App.app")));
    expectNothingKept();
}

TEST_F(RollbackTest, whatSomebodyHasTakenAwayIsNotKept) {
    update();
    fs::remove_all(keptPath(kept().front()));
    const auto done = device().rollBack(kAtlas);
    ASSERT_FALSE(done);
    EXPECT_TRUE(isRegistryError(done.error(), RegistryErrorCode::NothingKept));
    expectNothingKept();
    EXPECT_EQ(program(), "program 2.0");
}

/// Something that happens to a bundle.
struct Damage {
    const char* name;
    std::function<void(const fs::path& bundle)> happen;
};

const std::vector<Damage>& damages() {
    static const std::vector<Damage> all = {
        {"no Info.plist", [](const fs::path& bundle) { fs::remove(bundle / "Info.plist"); }},
        {"no program", [](const fs::path& bundle) { fs::remove(bundle / "main"); }},
        {"an empty program", [](const fs::path& bundle) { fs::resize_file(bundle / "main", 0); }},
        {"a byte that has flipped",
         [](const fs::path& bundle) {
             std::fstream file(bundle / "main", std::ios::in | std::ios::out | std::ios::binary);
             file.seekp(3);
             file.put('X');
         }},
        {"a link in place of the program",
         [](const fs::path& bundle) {
             fs::rename(bundle / "main", bundle.parent_path() / "main");
             fs::create_symlink("../main", bundle / "main");
         }},
        {"a file more", [](const fs::path& bundle) { std::ofstream(bundle / "more") << "x"; }},
        {"a directory more", [](const fs::path& bundle) { fs::create_directory(bundle / "more"); }},
    };
    return all;
}

TEST_F(RollbackTest, whatIsDamagedIsNotInstalledAndNotKeptOn) {
    for (const Damage& damage : damages()) {
        update();
        damage.happen(keptPath(kept().front()) + "/App.app");
        const auto refused = device().rollBack(kAtlas);
        ASSERT_FALSE(refused) << damage.name;
        EXPECT_TRUE(isRegistryError(refused.error(), RegistryErrorCode::NothingKept));
        EXPECT_THAT(
            refused.error().description(),
            testing::HasSubstr("earlier version of com.example.atlas that was kept is damaged"));
        EXPECT_EQ(program(), "program 2.0") << damage.name;
        expectNothingKept();
        EXPECT_EQ(containers().size(), 1U) << damage.name;
    }
}

TEST_F(RollbackTest, storeMetadataThatIsWrittenAnewIsNoDamage) {
    update();
    std::ofstream(keptPath(kept().front()) + "/VessikMetadata.plist") << "newer";
    ASSERT_TRUE(device().rollBack(kAtlas));
    EXPECT_EQ(program(), "program 1.0");
}

TEST_F(RollbackTest, whatNobodyHasSummedUpIsTakenForWhole) {
    update();
    sql("DELETE FROM sums");
    const std::string bundle = keptPath(kept().front()) + "/App.app";
    std::ofstream(bundle + "/main") << "changed";
    ASSERT_TRUE(device().rollBack(kAtlas));
    EXPECT_EQ(program(), "changed");
    fs::remove(keptPath(kept().front()) + "/App.app/Info.plist");
    EXPECT_FALSE(device().rollBack(kAtlas));
    expectNothingKept();
}

TEST_F(RollbackTest, sumsGoWithWhatTheyAreOf) {
    update();
    update(kBrook);
    ASSERT_TRUE(device().rollBack(kBrook));
    close();
    EXPECT_EQ(number("SELECT count(*) FROM sums"), 4);
    ASSERT_TRUE(succeeded(look()->uninstall(kAtlas)));
    ASSERT_TRUE(succeeded(install(kBrook, "3.0")));
    close();
    EXPECT_EQ(number("SELECT count(*) FROM sums"), 2);
    EXPECT_TRUE(device().rollBack(kBrook)) << "by the sum of what was installed before";
}

TEST_F(RollbackTest, whatCouldNotBePutAwayIsKeptWhereItLies) {
    update();
    moveBackToBundles();
    EXPECT_TRUE(device().rollBack(kAtlas)) << "in the session of the update";
    EXPECT_EQ(program(), "program 1.0");
    EXPECT_EQ(keptVersion(), "2.0");
}

TEST_F(RollbackTest, anUpdateByAnotherClientIsUnderWay) {
    update();
    sql("INSERT INTO coordinators (identifier, kind, client, created) VALUES"
        " ('com.example.atlas', 2, 2, 0)");
    const auto refused = device().rollBack(kAtlas);
    ASSERT_FALSE(refused);
    EXPECT_TRUE(isRegistryError(refused.error(), RegistryErrorCode::UpdateUnderWay));
    EXPECT_TRUE(refusedBy(device().demote(kAtlas, DemotedBy::Person),
                          RegistryErrorCode::UpdateUnderWay, "under way"));
    EXPECT_EQ(keptVersion(), "1.0");
}

TEST_F(RollbackTest, anAlteredRecordDoesNotTouchWhatIsInstalled) {
    update();
    sql("UPDATE kept SET container = (SELECT container FROM applications)");
    EXPECT_FALSE(device().rollBack(kAtlas));
    EXPECT_EQ(program(), "program 2.0");
    sql("INSERT INTO kept (identifier, install_type, container, bundle, icon, bytes)"
        " VALUES ('com.example.atlas', 0, '../../../..', '', '', 9223372036854775807)");
    EXPECT_FALSE(device().rollBack(kAtlas));
    reopenAfter([] {});
    EXPECT_EQ(program(), "program 2.0");
    expectNothingKept();
}

TEST_F(RollbackTest, whatIsKeptGoesWhenTheRoomIsNeeded) {
    update();
    update(kBrook);
    device().makeRoom(0);
    device().makeRoom(1);
    EXPECT_EQ(keptVersion(), "1.0") << "or the test's own disk is about full";
    device().makeRoom(kMoreThanThereIs);
    expectNothingKept();
    EXPECT_EQ(program(), "program 2.0");
}

TEST_F(RollbackTest, onlyASessionGivesUpWhatIsKept) {
    update();
    close();
    look()->makeRoom(kMoreThanThereIs);
    EXPECT_EQ(kept().size(), 1U);
}

TEST_F(RollbackTest, whatIsKeptCountsAsFree) {
    update();
    sql("UPDATE kept SET bytes = 9223372036854775807");
    EXPECT_EQ(*look()->freeSpace(), fs::space(devicePath()).capacity);
}

}  // namespace
}  // namespace appsync
