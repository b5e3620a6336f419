#include "host/backup/Backup.h"

#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>

#include "device/archive/ArchiveWriter.h"
#include "device/archive/PackageFolder.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::UnorderedElementsAre;

std::string readAll(const std::string& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

std::vector<std::string> textsOf(const std::vector<BackupFault>& faults) {
    std::vector<std::string> texts;
    for (const BackupFault& fault : faults) texts.push_back(fault.file + ": " + fault.error);
    return texts;
}

// The manifest of a backup.
class BackupManifestFile : public HostFixture {
  protected:
    BackupManifestFile() {
        fs::create_directories(backup + "/data");
        for (const char* name :
             {"RestoreApplications.plist", "DemotedApps.plist", "IconOrder.plist"}) {
            add(name, std::string("contents of ") + name);
        }
        addArchive("data/com.example.a.zip");
        manifest.made = "2026-01-02T03:04:05Z";
        manifest.applications = {{"com.example.a", "1.0", "A & é", true},
                                 {"com.example.b", std::nullopt, "B", false}};
    }
    void add(const std::string& name, const std::string& contents) {
        write(backup + "/" + name, contents);
        manifest.files[name] = *sumOfFile(backup + "/" + name);
    }
    void addArchive(const std::string& name) {
        write(directory.path() + "/letter", "Dear");
        const std::string file = backup + "/" + name;
        const Status written =
            writeArchive({{directory.path() + "/letter", "letter", S_IFREG | 0644, 4}}, file);
        ASSERT_TRUE(written.ok()) << written.error().description();
        manifest.files[name] = *sumOfFile(file);
    }
    void writeManifest() {
        const Bytes text = manifestText(manifest);
        write(path, std::string(text.begin(), text.end()));
    }
    /// Why the backup cannot be used; empty when it can.
    [[nodiscard]] std::string refusal() const {
        const Result<BackupManifest> read = readBackupManifest(backup);
        return read ? "" : read.error().description();
    }
    /// The same, with this manifest.
    std::string refusalOf(const std::string& text) {
        write(path, text);
        return refusal();
    }
    /// The same, with that text of the true manifest replaced.
    std::string refusalWith(const std::string& from, const std::string& to) {
        writeManifest();
        std::string text = readAll(path);
        const std::size_t at = text.find(from);
        EXPECT_NE(at, text.npos) << from;
        return refusalOf(text.replace(at, from.size(), to));
    }

    const std::string backup = directory.path() + "/backup";
    const std::string path = backup + "/manifest.json";
    BackupManifest manifest;
};

TEST_F(BackupManifestFile, SaysWhatIsInTheBackup) {
    writeManifest();
    const Result<BackupManifest> read = readBackupManifest(backup);
    ASSERT_TRUE(read.ok()) << read.error().description();
    EXPECT_EQ(read->made, manifest.made);
    EXPECT_EQ(read->files, manifest.files);
    ASSERT_EQ(read->applications.size(), 2U);
    EXPECT_EQ(read->applications[0].identifier, "com.example.a");
    EXPECT_EQ(read->applications[0].version, "1.0");
    EXPECT_EQ(read->applications[0].name, "A & é");
    EXPECT_TRUE(read->applications[0].hasData);
    EXPECT_EQ(read->applications[1].version, std::nullopt);
    EXPECT_FALSE(read->applications[1].hasData);
    EXPECT_THAT(checkBackup(backup, *read), IsEmpty());
}

TEST_F(BackupManifestFile, MakesAFolderABackup) {
    EXPECT_THAT(refusal(), HasSubstr("has no manifest.json: it was cut off, or it is no backup"));
    fs::remove_all(backup);
    EXPECT_THAT(refusal(), HasSubstr("there is no backup " + backup));
    write(backup, "a file");
    EXPECT_THAT(refusal(), HasSubstr("there is no backup " + backup));
}

TEST_F(BackupManifestFile, ThatIsCutOffAnywhereIsNone) {
    writeManifest();
    const std::string whole = readAll(path);
    ASSERT_TRUE(whole.ends_with("}\n"));
    for (std::size_t length = 0; length + 1 < whole.size(); ++length) {
        EXPECT_THAT(refusalOf(whole.substr(0, length)), HasSubstr("it is not JSON")) << length;
    }
}

TEST_F(BackupManifestFile, ThatIsDamagedIsRefusedWithTheReason) {
    EXPECT_THAT(refusalOf("[]"), HasSubstr("it tells no format"));
    EXPECT_THAT(refusalOf("{}"), HasSubstr("it tells no format"));
    EXPECT_THAT(refusalWith("\"format\": 1", "\"format\": \"1\""), HasSubstr("it tells no format"));
    EXPECT_THAT(refusalWith("\"format\": 1", "\"format\": 2"),
                HasSubstr("this version does not know its format 2"));
    EXPECT_THAT(refusalOf(R"({"format": 1})"), HasSubstr("it lists no applications"));
    EXPECT_THAT(refusalOf(R"({"format": 1, "applications": []})"), HasSubstr("it lists no files"));
    EXPECT_THAT(refusalOf(R"({"format": 1, "applications": {}, "files": {}})"),
                HasSubstr("it lists no applications"));
    EXPECT_THAT(refusalOf(R"({"format": 1, "applications": [], "files": {}})"),
                HasSubstr("it does not name the restore information"));
    EXPECT_THAT(refusalWith("\"data\": true", "\"data\": 1"), HasSubstr("an application in it"));
    EXPECT_THAT(refusalWith("\"com.example.a\"", "\"../a\""), HasSubstr("an application in it"));
}

TEST_F(BackupManifestFile, NamesNoFileThatIsNoneOfABackup) {
    for (const char* name :
         {"data/../../escape.zip", "/etc/passwd", "data/a/b.zip", "data/.zip", "data/.zip.zip/x",
          "data", "data/", "database.zip", "other.plist", "data/a b.zip", "manifest.json", ""}) {
        EXPECT_THAT(refusalWith("data/com.example.a.zip", name),
                    HasSubstr("which is no file of a backup"))
            << name;
    }
    EXPECT_EQ(refusalWith("data/com.example.a.zip", "data/com.example.b.zip"), "");
}

TEST_F(BackupManifestFile, NeedsASizeAndASumForEachFile) {
    const std::string sum = manifest.files.at("DemotedApps.plist").sha256;
    for (const std::string& wrong :
         {std::string(), sum.substr(1), sum + "0", "G" + sum.substr(1), std::string(64, 'A')}) {
        EXPECT_THAT(refusalWith(sum, wrong), HasSubstr("has no size or no sum")) << wrong;
    }
    for (const char* size : {"\"1\"", "-1", "1.5", "null"}) {
        EXPECT_THAT(refusalWith("\"size\": 29", std::string("\"size\": ") + size),
                    HasSubstr("has no size or no sum"))
            << size;
    }
}

// What is checked.

TEST_F(BackupManifestFile, TellsEveryFileThatIsNotAsItWas) {
    add("IconOrder.plist", "order");
    write(backup + "/DemotedApps.plist", "Contents of DemotedApps.plist");
    write(backup + "/data/com.example.a.zip", "other");
    fs::remove(backup + "/IconOrder.plist");
    write(backup + "/data/com.example.c.zip", "foreign");
    fs::create_symlink("/etc", backup + "/link");
    writeManifest();
    EXPECT_THAT(
        textsOf(checkBackup(backup, manifest)),
        ElementsAre("DemotedApps.plist: its contents are altered", "IconOrder.plist: it is missing",
                    HasSubstr("data/com.example.a.zip: it is altered: 5 bytes instead of "),
                    "data/com.example.c.zip: the manifest does not name it",
                    "link: the manifest does not name it"));
}

TEST_F(BackupManifestFile, TellsAFileThatBecameADirectory) {
    fs::remove(backup + "/DemotedApps.plist");
    fs::create_directory(backup + "/DemotedApps.plist");
    EXPECT_THAT(textsOf(checkBackup(backup, manifest)),
                ElementsAre(HasSubstr("DemotedApps.plist: ")));
}

TEST_F(BackupManifestFile, TellsAnArchiveThatIsAsItWasAndYetIsNone) {
    add("data/com.example.a.zip", "no archive");
    EXPECT_THAT(
        textsOf(checkBackup(backup, manifest)),
        ElementsAre("data/com.example.a.zip: no device can unpack it: it is not a zip archive"));
}

// The layout.

TEST(BackupLayout, NamesTheArchiveOfDataByItsIdentifier) {
    EXPECT_EQ(dataArchiveName("com.example.a"), "data/com.example.a.zip");
    EXPECT_EQ(identifierOfData("data/com.example.a.zip"), "com.example.a");
    for (const char* name : {"com.example.a.zip", "data.zip", "datacom.example.a.zip", "data/",
                             "data/a/b.zip", "RestoreApplications.plist"}) {
        EXPECT_EQ(identifierOfData(name), std::nullopt) << name;
    }
    for (const std::string& longest : {std::string(255, 'x'), std::string(251, 'x') + ".zip"}) {
        EXPECT_LE(dataArchiveName(longest).size(), std::string("data/").size() + 255);
        EXPECT_EQ(identifierOfData(dataArchiveName(longest)), longest);
    }
}

// Backups of a device.
class WholeBackup : public HostFixture {
  protected:
    WholeBackup() {
        addPackage("com.example.a", "1.0");
        EXPECT_EQ(sync(), 0) << err.str();
    }
    void writeData(const std::string& identifier, const std::string& name,
                   const std::string& contents) {
        write(root + Device::dataPath(identifier) + "/" + name, contents);
    }
    const std::string backup = directory.path() + "/backup";
};

TEST_F(WholeBackup, HoldsTheListsTheDataAndTheManifestThatNamesThem) {
    writeData("com.example.a", "letter", "Dear");
    ASSERT_EQ(run({"backup", device, backup}), 0) << err.str();
    const Result<BackupManifest> manifest = readBackupManifest(backup);
    ASSERT_TRUE(manifest.ok());
    std::vector<std::string> files;
    for (const auto& [name, sum] : manifest->files) files.push_back(name);
    EXPECT_THAT(files, ElementsAre("DemotedApps.plist", "IconOrder.plist",
                                   "RestoreApplications.plist", "data/com.example.a.zip"));
    EXPECT_THAT(checkBackup(backup, *manifest), IsEmpty());
    EXPECT_EQ(run({"backup", "--check", backup}), 0);
}

TEST_F(WholeBackup, ThatWasCutOffIsNeverTakenForAWholeOne) {
    writeData("com.example.a", "letter", "Dear");
    ASSERT_EQ(run({"backup", device, backup}), 0) << err.str();
    // The manifest gets its name when it is whole, after everything else.
    fs::rename(backup + "/manifest.json", backup + "/manifest.json.part");
    EXPECT_EQ(run({"backup", "--check", backup}), 1);
    EXPECT_THAT(err.str(), HasSubstr("it was cut off"));
    EXPECT_EQ(run({"restore", device, backup}), 3);
    EXPECT_THAT(err.str(), HasSubstr("it was cut off"));
    EXPECT_EQ(run({"backup", device, backup}), 0) << "it is taken over: " << err.str();
    EXPECT_EQ(run({"backup", "--check", backup}), 0) << err.str();
}

TEST_F(WholeBackup, OfTheLongestIdentifierHoldsItsData) {
    const std::string longest(255, 'x');
    addPackageAs("long.zip", longest, "1.0");
    ASSERT_EQ(sync(), 0) << err.str();
    EXPECT_THAT(applications(), testing::Contains(longest + " 1.0"));
    writeData(longest, "letter", "Dear");
    ASSERT_EQ(run({"backup", device, backup}), 0) << err.str();
    EXPECT_EQ(run({"backup", "--check", backup}), 0) << err.str();
    EXPECT_TRUE(readBackupManifest(backup)->holds(dataArchiveName(longest)));
    fs::rename(backup + "/manifest.json", backup + "/manifest.json.part");
    EXPECT_EQ(run({"backup", device, backup}), 0) << "it is taken over: " << err.str();
}

}  // namespace
}  // namespace appsync
