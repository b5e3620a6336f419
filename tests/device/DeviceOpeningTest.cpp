#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "device/database/Database.h"
#include "device/database/DeviceSchema.h"
#include "tests/device/DeviceFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

class DeviceOpeningTest : public DeviceFixture {
  protected:
    static Result<std::unique_ptr<Device>> openSession(const std::string& path) {
        return Device::open(path, {.access = DeviceAccess::Session});
    }

    void scribble(std::uintmax_t offset, std::size_t bytes) const {
        std::fstream file(devicePath("device.db"), std::ios::in | std::ios::out | std::ios::binary);
        file.seekp(static_cast<std::streamoff>(offset));
        file << std::string(bytes, '\xa5');
    }
};

TEST_F(DeviceOpeningTest, anEmptyDeviceHoldsNothingAndAllowsEverything) {
    EXPECT_TRUE(device().applications()->empty());
    EXPECT_TRUE(device().homeScreen()->empty());
    EXPECT_EQ(device().settings()->installation, PolicyAnswer::Unset);
    EXPECT_FALSE(device().settings()->coordination);
    EXPECT_FALSE(device().databaseFailure());
    EXPECT_GT(*device().freeSpace(), 0U);
}

TEST_F(DeviceOpeningTest, creationKeepsWhatWasAskedFor) {
    ASSERT_TRUE(succeeded(Device::create(path("other"), {.coordination = true})));
    EXPECT_TRUE((*Device::open(path("other")))->settings()->coordination);
    EXPECT_TRUE(fs::is_directory(path("other/log")));
}

TEST_F(DeviceOpeningTest, creationWritesAheadAndSyncsEachCommit) {
    EXPECT_EQ(number("SELECT journal_mode = 'wal' FROM pragma_journal_mode"), 1);
    EXPECT_EQ(number("PRAGMA user_version"), 5);
}

TEST_F(DeviceOpeningTest, creationRefusesAPathThatExists) {
    const Status status = Device::create(devicePath());
    ASSERT_FALSE(status);
    EXPECT_TRUE(isDeviceError(status.error(), DeviceErrorCode::AlreadyExists));
    EXPECT_TRUE(Device::open(devicePath()).ok());
}

TEST_F(DeviceOpeningTest, creationRefusesALinkThatLeadsNowhere) {
    fs::create_symlink("nowhere", path("link"));
    const Status status = Device::create(path("link"));
    ASSERT_FALSE(status);
    EXPECT_TRUE(isDeviceError(status.error(), DeviceErrorCode::AlreadyExists));
}

TEST_F(DeviceOpeningTest, spaceForAFullDiskIsKept) {
    const std::string reserve = devicePath("space.reserve");
    ASSERT_EQ(fs::file_size(reserve), 256U * 1024) << "or the test's own disk is about full";
    ASSERT_TRUE(Device::open(devicePath(), {.makesRoom = true}).ok());
    EXPECT_TRUE(fs::exists(reserve)) << "the disk is not full";
    fs::remove(reserve);
    ASSERT_TRUE(Device::open(devicePath()).ok());
    EXPECT_FALSE(fs::exists(reserve));
    ASSERT_TRUE(openSession(devicePath()).ok());
    EXPECT_TRUE(fs::exists(reserve)) << "a session keeps some when it ends";
}

TEST_F(DeviceOpeningTest, spaceIsKeptAgainWhenASessionBegins) {
    fs::remove(devicePath("space.reserve"));
    const auto session = openSession(devicePath());
    EXPECT_TRUE(fs::exists(devicePath("space.reserve")));
    EXPECT_EQ((*session)->spaceReserve(), 256U * 1024);
}

TEST_F(DeviceOpeningTest, whoHasTakenSomethingAwayKeepsSpaceAgain) {
    fs::remove(devicePath("space.reserve"));
    EXPECT_EQ((*Device::open(devicePath(), {.makesRoom = true}))->spaceReserve(), 0U);
    EXPECT_TRUE(fs::exists(devicePath("space.reserve")));
}

TEST_F(DeviceOpeningTest, aSessionThatIsCutOffIsKnown) {
    EXPECT_FALSE(look()->session()->wasInterrupted);
    {
        const auto session = openSession(devicePath());
        const SessionRecord seen = *look()->session();
        EXPECT_TRUE(seen.isUnderWay);
        EXPECT_EQ(seen.process, ::getpid());
    }
    EXPECT_FALSE(look()->session()->isUnderWay);
    EXPECT_FALSE(look()->session()->wasInterrupted);
}

TEST_F(DeviceOpeningTest, creationRefusesAPlaceInsideADevice) {
    const Status status = Device::create(rootPath("/new"));
    ASSERT_FALSE(status);
    EXPECT_NE(status.error().description().find("inside the device"), std::string::npos);
    EXPECT_FALSE(fs::exists(rootPath("/new")));
}

TEST_F(DeviceOpeningTest, creationWithoutAParentLeavesNothing) {
    const Status status = Device::create(path("no/such/device"));
    ASSERT_FALSE(status);
    EXPECT_TRUE(isDeviceError(status.error(), DeviceErrorCode::CannotUse));
    EXPECT_FALSE(fs::exists(path("no")));
}

TEST_F(DeviceOpeningTest, creationClearsWhatAnInterruptedOneLeft) {
    fs::create_directories(path(".other.creating-abc123/root"));
    ASSERT_TRUE(succeeded(Device::create(path("other/"))));
    EXPECT_FALSE(fs::exists(path(".other.creating-abc123")));
    EXPECT_TRUE(Device::open(path("other")).ok());
}

TEST_F(DeviceOpeningTest, missing) {
    EXPECT_TRUE(unusable(Device::open(path("absent")), DeviceErrorCode::Missing, "create one"));
    EXPECT_TRUE(unusable(Device::open(""), DeviceErrorCode::Missing));
    EXPECT_TRUE(unusable(Device::open(std::string("a\0b", 3)), DeviceErrorCode::Missing));
}

TEST_F(DeviceOpeningTest, aFileIsNotADevice) {
    std::ofstream(path("file")) << "text";
    EXPECT_TRUE(unusable(Device::open(path("file")), DeviceErrorCode::NotADevice));
}

TEST_F(DeviceOpeningTest, anEmptyDirectoryIsNotADevice) {
    fs::create_directory(path("empty"));
    EXPECT_TRUE(unusable(Device::open(path("empty")), DeviceErrorCode::NotADevice, "device.db"));
}

TEST_F(DeviceOpeningTest, aPipeInPlaceOfTheDatabaseIsRefusedWithoutWaitingOnIt) {
    fs::remove(devicePath("device.db"));
    ASSERT_EQ(::mkfifo(devicePath("device.db").c_str(), 0600), 0);
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::NotADevice));
}

TEST_F(DeviceOpeningTest, whatStandsInThePlaceOfTheTemporaryDirectoryIsToBeRemoved) {
    const fs::path directory = rootPath("/var/mobile/tmp");
    const auto refused = [&] {
        return unusable(openSession(devicePath()), DeviceErrorCode::CannotUse,
                        "remove what stands there in its place");
    };
    fs::remove_all(directory);
    fs::create_symlink("/nowhere", directory);
    EXPECT_TRUE(refused());
    fs::remove(directory);
    fs::create_symlink("tmp", directory);
    EXPECT_TRUE(refused());
    fs::remove(directory);
    std::ofstream(directory) << "a file";
    EXPECT_TRUE(refused());
    fs::remove(directory);
    EXPECT_TRUE(openSession(devicePath()).ok());
}

TEST_F(DeviceOpeningTest, theDatabaseOfSomethingElseIsNotADevice) {
    sql("PRAGMA application_id = 1");
    EXPECT_TRUE(unusable(Device::open(devicePath()), DeviceErrorCode::NotADevice));
}

TEST_F(DeviceOpeningTest, halfCreated) {
    fs::remove(devicePath("device.db"));
    EXPECT_TRUE(unusable(Device::open(devicePath()), DeviceErrorCode::HalfCreated, "device.db"));
    std::ofstream(devicePath("device.db")).close();
    EXPECT_TRUE(unusable(Device::open(devicePath()), DeviceErrorCode::HalfCreated, "remove"));
}

TEST_F(DeviceOpeningTest, aDeviceWithoutItsContainersIsNotWhole) {
    fs::remove_all(devicePath("root/var/containers"));
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::HalfCreated, "containers"));
}

TEST_F(DeviceOpeningTest, aNewerSchemaIsRefusedAndLeftAlone) {
    sql("PRAGMA user_version = 99");
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::NewerSchema, "99"));
    EXPECT_EQ(number("PRAGMA user_version"), 99);
}

class DeviceOfVersion4Test : public DeviceOpeningTest {
  protected:
    /// Makes the device one of version 4, with all that it holds.
    void goBack() {
        close();
        std::ifstream file(VERSION4_SQL);
        const std::string script(std::istreambuf_iterator<char>(file), {});
        ASSERT_FALSE(script.empty());
        sql(script);
    }

    std::string onHomeScreen() {
        std::string all;
        const auto items = look()->homeScreen();
        for (const HomeScreenItem& item : *items) all += item.identifier + " ";
        return all;
    }
};

class DeviceOfVersion1Test : public DeviceOfVersion4Test {
  protected:
    DeviceOfVersion1Test() {
        goBack();
        sql("DROP TABLE sums; DROP TABLE kept; DROP TABLE uninstalled; DROP TABLE session;"
            "CREATE TABLE uninstalled (\n"
            "    identifier TEXT PRIMARY KEY,\n"
            "    version TEXT,\n"
            "    time INTEGER NOT NULL\n"
            ") STRICT;"
            "CREATE TABLE session (\n"
            "    id INTEGER PRIMARY KEY CHECK (id = 1),\n"
            "    process INTEGER NOT NULL,\n"
            "    started INTEGER NOT NULL\n"
            ") STRICT;"
            "INSERT INTO uninstalled VALUES ('com.example.b', '1.0', 2), ('com.example.a', '2.0', "
            "1);"
            "PRAGMA user_version = 1");
    }
};

TEST_F(DeviceOfVersion1Test, aLookUsesItAsItIs) {
    const std::unique_ptr<Device> other = look();
    EXPECT_TRUE(other->status("com.example.a")->uninstalled);
    EXPECT_EQ(number("PRAGMA user_version"), 1);
}

TEST_F(DeviceOfVersion1Test, aPersonRemovesApplicationsFromIt) {
    sql("INSERT INTO applications VALUES"
        " ('com.example.c', '1', 'C', 'User', 5, 'container', 'C.app', 'Icon.png', 1, 1)");
    ASSERT_TRUE(succeeded(look()->uninstall("com.example.c")));
    EXPECT_TRUE(look()->status("com.example.c")->uninstalled);
}

TEST_F(DeviceOfVersion1Test, aSessionBringsItUpToDateAndLosesNothing) {
    ASSERT_TRUE(succeeded(install("com.example.b")));  // in a session that began after its removal
    EXPECT_EQ(number("PRAGMA user_version"), 5);
    EXPECT_EQ(number("SELECT count(*) FROM uninstalled WHERE identifier = 'com.example.a'"
                     " AND version = '2.0' AND time = 1"),
              1);
    close();
    EXPECT_TRUE(openSession(devicePath()).ok());
}

TEST_F(DeviceOfVersion1Test, isMadeUsableFirstWhereThereIsLittleRoom) {
    {
        auto database = Database::open(devicePath("device.db"), Database::Mode::Existing);
        ASSERT_TRUE(database.ok());
        EXPECT_GT(*roomToBringSchemaUpToDate(**database), 512U << 10U);
        ASSERT_TRUE(succeeded(makeSchemaUsable(**database)));
        EXPECT_TRUE(succeeded(checkDeviceSchema(**database)));
        EXPECT_TRUE(succeeded(makeSchemaUsable(**database))) << "nothing is left to do";
    }
    EXPECT_EQ(number("PRAGMA user_version"), 4);
    EXPECT_TRUE(look()->status("com.example.a")->uninstalled);
    ASSERT_TRUE(openSession(devicePath()).ok());
    EXPECT_EQ(number("PRAGMA user_version"), 5);
}

TEST_F(DeviceOfVersion1Test, aSessionThatWasCutOffIsStillKnown) {
    sql("INSERT INTO session VALUES (1, 99, 1)");
    const std::string temporary = rootPath("/var/mobile/tmp") + "/left";
    std::ofstream(temporary) << "left";
    ASSERT_TRUE(openSession(devicePath()).ok());
    EXPECT_FALSE(fs::exists(temporary));
    EXPECT_EQ(number("SELECT count(*) FROM session"), 0) << "it has ended in order";
}

class DeviceOfVersion2Test : public DeviceOfVersion4Test {
  protected:
    DeviceOfVersion2Test() {
        EXPECT_TRUE(succeeded(install("com.example.a", "1.0")));
        goBack();
        sql("DROP TABLE sums; DROP TABLE kept; PRAGMA user_version = 2");
    }
};

TEST_F(DeviceOfVersion2Test, aLookUsesItAsItIs) {
    EXPECT_EQ(look()->applications()->size(), 1U);
    EXPECT_FALSE(look()->applications()->front().kept);
    EXPECT_TRUE(look()->freeSpace());
    EXPECT_EQ(number("PRAGMA user_version"), 2);
}

TEST_F(DeviceOfVersion2Test, aPersonRemovesApplicationsFromIt) {
    ASSERT_TRUE(succeeded(look()->uninstall("com.example.a")));
    EXPECT_TRUE(containers().empty());
    EXPECT_EQ(number("PRAGMA user_version"), 2);
}

TEST_F(DeviceOfVersion2Test, aSessionBringsItUpToDateAndLosesNothing) {
    sql("INSERT INTO uninstalled VALUES (7, 'com.example.b', '2.0', 1)");
    ASSERT_TRUE(succeeded(install("com.example.a", "2.0")));
    EXPECT_EQ(number("PRAGMA user_version"), 5);
    EXPECT_EQ(number("SELECT id FROM uninstalled"), 7);
    EXPECT_EQ(device().applications()->front().kept->version, "1.0");
    close();
    EXPECT_TRUE(openSession(devicePath()).ok());
}

TEST_F(DeviceOfVersion2Test, aTableOfTheNextVersionIsNotItsOwn) {
    sql("CREATE TABLE kept (id INTEGER PRIMARY KEY)");
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::Damaged, "kept"));
}

class DeviceOfVersion3Test : public DeviceOfVersion4Test {
  protected:
    DeviceOfVersion3Test() {
        for (const char* version : {"1.0", "2.0"}) {
            EXPECT_TRUE(succeeded(install("com.example.a", version)));
        }
        goBack();
        sql("DROP TABLE sums; PRAGMA user_version = 3");
    }
};

TEST_F(DeviceOfVersion3Test, aLookTellsWhatIsKept) {
    EXPECT_EQ(look()->applications()->front().kept->version, "1.0");
    ASSERT_TRUE(succeeded(look()->uninstall("com.example.a")));
    EXPECT_TRUE(fs::is_empty(devicePath("kept")));
    EXPECT_EQ(number("PRAGMA user_version"), 3);
}

TEST_F(DeviceOfVersion3Test, aSessionBringsItUpToDateAndWhatIsKeptComesBack) {
    EXPECT_TRUE(device().rollBack("com.example.a"));
    EXPECT_EQ(number("PRAGMA user_version"), 5);
    EXPECT_EQ(device().applications()->front().version, "1.0");
    EXPECT_EQ(device().applications()->front().kept->version, "2.0");
}

TEST_F(DeviceOfVersion4Test, aLookUsesItAsItIs) {
    ASSERT_TRUE(succeeded(install("com.example.a")));
    goBack();
    EXPECT_EQ(look()->applications()->size(), 1U);
    ASSERT_TRUE(succeeded(look()->uninstall("com.example.a")));
    EXPECT_TRUE(look()->applications()->empty());
    EXPECT_EQ(number("PRAGMA user_version"), 4);
}

TEST_F(DeviceOfVersion4Test, aSessionBringsItUpToDateAndLosesNothing) {
    for (const char* version : {"1.0", "2.0"}) {
        ASSERT_TRUE(succeeded(install("com.example.a", version)));
    }
    ASSERT_TRUE(succeeded(install("com.example.b")));
    ASSERT_TRUE(succeeded(install("com.example.c")));
    ASSERT_TRUE(succeeded(device().demote("com.example.c", DemotedBy::Person)));
    goBack();
    sql("INSERT INTO running VALUES ('com.example.a');"
        "INSERT INTO progress VALUES ('com.example.c', 1, 2, 3, 4, 5);"
        "UPDATE applications SET arrived = 9 - arrived");
    const std::int64_t records = number("SELECT count(*) FROM history");

    ASSERT_TRUE(openSession(devicePath()).ok());

    EXPECT_EQ(number("PRAGMA user_version"), 5);
    EXPECT_EQ(look()->applications()->size(), 3U);
    EXPECT_EQ(look()->applications()->front().kept->version, "1.0");
    EXPECT_EQ(number("SELECT count(*) FROM running WHERE identifier = 'com.example.a'"), 1);
    EXPECT_EQ(number("SELECT completed FROM progress WHERE identifier = 'com.example.c'"), 4);
    EXPECT_EQ(number("SELECT count(*) FROM history"), records);
    EXPECT_EQ(onHomeScreen(), "com.example.c com.example.b com.example.a ") << "by arrival";
    ASSERT_TRUE(succeeded(install("com.example.d")));
    EXPECT_EQ(look()->homeScreen()->back().identifier, "com.example.d");
}

TEST_F(DeviceOfVersion4Test, twoWithOnePlaceInTheOrderOfArrivalGetTwo) {
    for (const char* identifier : {"com.example.b", "com.example.a"}) {
        ASSERT_TRUE(succeeded(install(identifier)));
    }
    goBack();
    sql("UPDATE applications SET arrived = 7");
    ASSERT_TRUE(openSession(devicePath()).ok());
    EXPECT_EQ(onHomeScreen(), "com.example.a com.example.b ");
}

TEST_F(DeviceOfVersion4Test, aTableOfTheNextVersionIsNotItsOwn) {
    sql("PRAGMA user_version = 4");
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::Damaged, "applications"));
}

TEST_F(DeviceOfVersion1Test, tablesOfTheNextVersionAreNotItsOwn) {
    sql("DROP TABLE session; CREATE TABLE session (\n"
        "    id INTEGER PRIMARY KEY CHECK (id = 1),\n"
        "    process INTEGER NOT NULL,\n"
        "    started INTEGER NOT NULL,\n"
        "    last_uninstall INTEGER NOT NULL\n"
        ") STRICT");
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::Damaged, "session"));
}

TEST_F(DeviceOpeningTest, aDamagedHeader) {
    scribble(0, 64);
    EXPECT_TRUE(unusable(Device::open(devicePath()), DeviceErrorCode::Damaged, "damaged"));
}

TEST_F(DeviceOpeningTest, damageInTheMiddleIsFoundBeforeASessionBegins) {
    ASSERT_TRUE(succeeded(install("com.example.atlas")));
    close();
    scribble(4096 * 3, 4096 * 4);
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::Damaged));
    EXPECT_EQ(containers().size(), 1U) << "nothing is removed on the word of a damaged database";
}

TEST_F(DeviceOpeningTest, aDatabaseThatWasCutOff) {
    fs::resize_file(devicePath("device.db"), 4096 * 2 + 100);
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::Damaged));
}

TEST_F(DeviceOpeningTest, theSecondSessionIsTurnedAwayAndToldWhoHoldsTheDevice) {
    static_cast<void>(device());
    EXPECT_TRUE(unusable(openSession(devicePath()), DeviceErrorCode::InUse,
                         "process " + std::to_string(::getpid())));
    close();
    EXPECT_TRUE(openSession(devicePath()).ok());
}

TEST_F(DeviceOpeningTest, aLookWorksDuringASession) {
    ASSERT_TRUE(succeeded(install("com.example.atlas")));
    const std::unique_ptr<Device> other = look();
    EXPECT_EQ(other->applications()->size(), 1U);
    EXPECT_TRUE(succeeded(other->run("com.example.atlas")));
    EXPECT_TRUE(device().status("com.example.atlas")->isRunning);
}

TEST_F(DeviceOpeningTest, aLookMayNotDoWhatNeedsTheSession) {
    const std::unique_ptr<Device> other = look();
    EXPECT_FALSE(other->demote("com.example.atlas", DemotedBy::Person));
    EXPECT_FALSE(other->removeLeftoverSyncPlaceholders().ok());
}

}  // namespace
}  // namespace appsync
