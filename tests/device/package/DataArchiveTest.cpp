#include "device/package/DataArchive.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/stat.h>

#include <array>
#include <cerrno>
#include <cstdint>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "contract/TemporaryMachineDirectory.h"
#include "device/archive/PackageError.h"
#include "system/file/RootDirectory.h"
#include "tests/device/package/PackageZip.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::UnorderedElementsAre;

/// A device's root with the data of one application, "/data", and archives beside it.
class DataArchiveTest : public testing::Test {
  protected:
    DataArchiveTest() { fs::create_directories(path("root/data")); }

    [[nodiscard]] std::string path(const std::string& name) const {
        return directory_.path() + "/" + name;
    }
    void write(const std::string& name, const std::string& contents) const {
        fs::create_directories(fs::path(path(name)).parent_path());
        std::ofstream(path(name), std::ios::binary) << contents;
    }
    [[nodiscard]] std::string read(const std::string& name) const {
        std::ifstream file(path(name), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }
    Result<DataArchiveContents> archive(const std::string& data = "/data") {
        const Result<RootDirectory> root = RootDirectory::open(path("root"));
        return writeDataArchive(*root, data, path("data.zip"));
    }
    Status unpack(const std::string& name = "data.zip") {
        fs::remove_all(path("unpacked"));
        fs::create_directory(path("unpacked"));
        const UniqueFd file(::open(path(name).c_str(), O_RDONLY | O_CLOEXEC));
        const UniqueFd target(::open(path("unpacked").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        return unpackDataArchive(file.get(), name, target.get());
    }
    /// What an archive with these entries is refused for, on both sides.
    std::string refusalOf(const std::vector<ZipEntry>& entries) {
        write("bad.zip", ZipBuilder().add(entries).bytes());
        const Status checked = verifyDataArchive(path("bad.zip"));
        const Status unpacked = unpack("bad.zip");
        EXPECT_FALSE(checked.ok());
        EXPECT_FALSE(checkDataArchive(path("bad.zip")).ok());
        EXPECT_FALSE(unpacked.ok());
        EXPECT_TRUE(fs::is_empty(path("unpacked"))) << "nothing comes of it";
        return checked ? "" : checked.error().description();
    }

    const TemporaryMachineDirectory directory_;
};

// What was left out, under its name, and why.
auto leftOut(const std::string& name, const std::string& why) {
    return testing::AllOf(testing::Field(&LeftOutItem::name, name),
                          testing::Field(&LeftOutItem::why, HasSubstr(why)));
}

TEST_F(DataArchiveTest, filesKeepTheTimesOfTheirLastChange) {
    const std::vector<std::pair<std::string, std::time_t>> files = {
        {"new", 1'700'000'001}, {"of 1969", -1}, {"of 1901", INT32_MIN}, {"of 2038", INT32_MAX}};
    for (const auto& [name, seconds] : files) {
        write("root/data/" + name, name);
        const std::array<timespec, 2> times = {{{0, 0}, {seconds, 500'000'000}}};
        ASSERT_EQ(::utimensat(AT_FDCWD, path("root/data/" + name).c_str(), times.data(), 0), 0);
    }
    ASSERT_TRUE(archive().ok());
    ASSERT_TRUE(unpack().ok());
    for (const auto& [name, seconds] : files) {
        struct stat found = {};
        ASSERT_EQ(::stat(path("unpacked/" + name).c_str(), &found), 0);
        EXPECT_EQ(found.st_mtim.tv_sec, seconds) << name;
    }
}

TEST_F(DataArchiveTest, aTimeThatNoArchiveHoldsIsLost) {
    write("root/data/late", "late");
    const std::array<timespec, 2> times = {{{0, 0}, {std::int64_t{INT32_MAX} + 1, 0}}};
    ASSERT_EQ(::utimensat(AT_FDCWD, path("root/data/late").c_str(), times.data(), 0), 0);
    ASSERT_TRUE(archive().ok());
    ASSERT_TRUE(unpack().ok());
    EXPECT_EQ(read("unpacked/late"), "late");
}

TEST_F(DataArchiveTest, dataComesBackAsItWas) {
    write("root/data/Documents/letter é.txt", "Dear");
    write("root/data/Library/deep/er/cache", std::string(700'000, 'c'));
    write("root/data/empty", "");
    fs::create_directories(path("root/data/tmp/nothing in it"));
    ::chmod(path("root/data/empty").c_str(), 0600);
    const Result<DataArchiveContents> contents = archive();
    ASSERT_TRUE(contents.ok()) << contents.error().description();
    EXPECT_EQ(contents->entries, 9U) << "three files and six directories";
    EXPECT_THAT(contents->leftOut, IsEmpty());
    EXPECT_TRUE(checkDataArchive(path("data.zip")).ok());
    ASSERT_TRUE(unpack().ok());
    EXPECT_EQ(read("unpacked/Documents/letter é.txt"), "Dear");
    EXPECT_EQ(read("unpacked/Library/deep/er/cache"), std::string(700'000, 'c'));
    EXPECT_TRUE(fs::is_regular_file(path("unpacked/empty")));
    EXPECT_EQ(fs::status(path("unpacked/empty")).permissions(), fs::perms(0600));
    EXPECT_TRUE(fs::is_directory(path("unpacked/tmp/nothing in it")));
}

TEST_F(DataArchiveTest, noDataGivesNoArchive) {
    for (const char* data : {"/data", "/absent"}) {
        const Result<DataArchiveContents> contents = archive(data);
        ASSERT_TRUE(contents.ok()) << data;
        EXPECT_EQ(contents->entries, 0U);
        EXPECT_FALSE(fs::exists(path("data.zip")));
    }
}

TEST_F(DataArchiveTest, whatNoArchiveHoldsIsLeftOutAndNamed) {
    write("secret", "secret");
    write("root/data/kept", "kept");
    write("root/data/two\nlines", "");
    write("root/data/back\\slash", "");
    fs::create_symlink(path("secret"), path("root/data/link"));
    fs::create_directory_symlink("/", path("root/data/linked directory"));
    ASSERT_EQ(::mkfifo(path("root/data/pipe").c_str(), 0600), 0);
    const Result<DataArchiveContents> contents = archive();
    ASSERT_TRUE(contents.ok());
    EXPECT_EQ(contents->entries, 1U);
    EXPECT_THAT(
        contents->leftOut,
        UnorderedElementsAre(leftOut("two\nlines", "'two\\x0alines' has a control character"),
                             leftOut("back\\slash", "'back\\slash' has a backslash"),
                             leftOut("link", "'link' is a symbolic link"),
                             leftOut("linked directory", "'linked directory' is a symbolic link"),
                             leftOut("pipe", "'pipe' is a pipe")));
    ASSERT_TRUE(unpack().ok());
    EXPECT_EQ(read("unpacked/kept"), "kept");
    EXPECT_FALSE(fs::exists(path("unpacked/link")));
}

TEST_F(DataArchiveTest, onlyThingsThatAreLeftOutGiveNoArchive) {
    fs::create_symlink("/", path("root/data/link"));
    const Result<DataArchiveContents> contents = archive();
    ASSERT_TRUE(contents.ok());
    EXPECT_EQ(contents->entries, 0U);
    EXPECT_THAT(contents->leftOut, testing::SizeIs(1));
    EXPECT_FALSE(fs::exists(path("data.zip")));
}

TEST_F(DataArchiveTest, aLinkInThePlaceOfTheDataStaysInsideTheDevice) {
    write("outside/secret", "secret");
    write("root/inside/file", "inside");
    fs::remove(path("root/data"));
    fs::create_directory_symlink(path("outside"), path("root/data"));
    const Result<DataArchiveContents> outside = archive();
    EXPECT_TRUE(!outside.ok() || outside->entries == 0);
    fs::remove(path("root/data"));
    fs::create_directory_symlink("/inside", path("root/data"));
    const Result<DataArchiveContents> inside = archive();
    ASSERT_TRUE(inside.ok());
    EXPECT_EQ(inside->entries, 1U);
}

TEST_F(DataArchiveTest, aFileInThePlaceOfTheDataIsAnError) {
    write("root/file", "no directory");
    EXPECT_FALSE(archive("/file").ok());
}

TEST_F(DataArchiveTest, manySmallFilesAndWellCompressedOnesAreFine) {
    for (int i = 0; i < 500; ++i) write("root/data/many/" + std::to_string(i), std::to_string(i));
    write("root/data/zeros", std::string(std::size_t{32} << 20U, '\0'));
    ASSERT_TRUE(archive().ok());
    EXPECT_EQ(*checkDataArchive(path("data.zip")), (std::size_t{32} << 20U) + 1390U + 502U * 4096U);
    EXPECT_TRUE(verifyDataArchive(path("data.zip")).ok());
    ASSERT_TRUE(unpack().ok());
    EXPECT_EQ(read("unpacked/many/499"), "499");
    EXPECT_EQ(fs::file_size(path("unpacked/zeros")), std::size_t{32} << 20U);
}

TEST_F(DataArchiveTest, dataThatLiesDeepComesBack) {
    std::string deep;
    for (int i = 0; i < 700; ++i) deep += "d/";
    write("root/data/" + deep + "file", "deep");
    ASSERT_TRUE(archive().ok());
    ASSERT_TRUE(unpack().ok());
    EXPECT_EQ(read("unpacked/" + deep + "file"), "deep");
}

TEST_F(DataArchiveTest, whatLiesTooDeepForAnyPathIsLeftOutAndNamed) {
    write("root/data/kept", "kept");
    const std::string component(230, 'd');
    const UniqueFd top(::open(path("root/data").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    int parent = top.get();
    std::vector<UniqueFd> made;
    for (int i = 0; i < 25; ++i) {
        ASSERT_EQ(::mkdirat(parent, component.c_str(), 0755), 0);
        made.emplace_back(::openat(parent, component.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        parent = made.back().get();
    }
    const Result<DataArchiveContents> contents = archive();
    ASSERT_TRUE(contents.ok()) << contents.error().description();
    EXPECT_EQ(contents->entries, 18U) << "17 directories, and the file beside them";
    EXPECT_THAT(
        contents->leftOut,
        ElementsAre(testing::Field(&LeftOutItem::why, HasSubstr("has a name that is too long"))));
    EXPECT_TRUE(unpack().ok());
    for (std::size_t i = made.size() - 1; i > 0; --i) {
        ::unlinkat(made[i - 1].get(), component.c_str(), AT_REMOVEDIR);
    }
}

// Archives that came from somewhere.

TEST_F(DataArchiveTest, noEntryLeadsOutOfTheData) {
    EXPECT_THAT(refusalOf({zipFile("fine", "1"), zipFile("../escape", "2")}),
                HasSubstr("'.' or '..'"));
    EXPECT_THAT(refusalOf({zipFile("/absolute", "2")}), HasSubstr("absolute"));
    EXPECT_THAT(refusalOf({zipOfMode("link", S_IFLNK | 0777)}), HasSubstr("symbolic link"));
    EXPECT_THAT(refusalOf({zipFile("a", "1"), zipFile("a", "2")}), HasSubstr("twice"));
    EXPECT_THAT(refusalOf({zipFile("a", "1"), zipFile("a/b", "2")}), testing::Not(IsEmpty()));
}

TEST_F(DataArchiveTest, whatIsNoArchiveIsRefused) {
    for (const char* contents : {"", "text", "PK\3\4 cut off"}) {
        write("none.zip", contents);
        const Result<std::uint64_t> checked = checkDataArchive(path("none.zip"));
        ASSERT_FALSE(checked.ok());
        EXPECT_EQ(checked.error().domain, kInstallerErrorDomain);
        EXPECT_THAT(checked.error().description(), testing::Not(HasSubstr("; "))) << "no advice";
        EXPECT_FALSE(unpack("none.zip").ok());
    }
    EXPECT_FALSE(checkDataArchive(path("absent.zip")).ok());
    fs::create_directory(path("directory.zip"));
    EXPECT_FALSE(checkDataArchive(path("directory.zip")).ok());
}

TEST_F(DataArchiveTest, anArchiveThatIsCutOffIsRefusedBeforeAnythingIsUnpacked) {
    write("root/data/file", std::string(100'000, 'f'));
    ASSERT_TRUE(archive().ok());
    fs::resize_file(path("data.zip"), fs::file_size(path("data.zip")) - 10);
    EXPECT_FALSE(checkDataArchive(path("data.zip")).ok());
    EXPECT_FALSE(unpack().ok());
    EXPECT_TRUE(fs::is_empty(path("unpacked")));
}

TEST_F(DataArchiveTest, alteredContentsAreNoticedWhileTheyAreUnpacked) {
    ZipEntry entry = zipFile("file", "contents");
    entry.crc = 12345;
    write("bad.zip", ZipBuilder().add(entry).bytes());
    const Status status = unpack("bad.zip");
    ASSERT_FALSE(status.ok());
    EXPECT_TRUE(isPackageError(status.error(), PackageErrorCode::DamagedEntry));
}

TEST_F(DataArchiveTest, contentsThatAreNotWhatTheArchiveSaysAreFoundByReadingThem) {
    ZipEntry altered = zipFile("altered", "contents");
    altered.crc = 12345;
    ZipEntry longer = zipZeros("longer", 1000);
    longer.size = longer.localSize = 2000;
    for (const ZipEntry& entry : {altered, longer}) {
        write("bad.zip", ZipBuilder().add({zipFile("good", "1"), entry}).bytes());
        const Status verified = verifyDataArchive(path("bad.zip"));
        ASSERT_FALSE(verified.ok()) << entry.name;
        EXPECT_THAT(verified.error().description(), HasSubstr("entry '" + entry.name + "': "));
    }
}

TEST_F(DataArchiveTest, moreThanThereIsRoomForIsRefusedBeforeTheFirstByte) {
    ZipEntry entry = zipZeros("zeros", 1000);
    entry.size = 0xfffffff0U;
    std::vector<ZipEntry> entries;
    for (int i = 0; i < 4000; ++i) {
        entry.name = "zeros" + std::to_string(i);
        entries.push_back(entry);
    }
    write("bomb.zip", ZipBuilder().add(entries).bytes());
    const Status status = unpack("bomb.zip");
    ASSERT_FALSE(status.ok());
    EXPECT_TRUE(fs::is_empty(path("unpacked")));
}

}  // namespace

}  // namespace appsync
