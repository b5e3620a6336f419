#include "device/archive/ArchiveWriter.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>

#include "contract/TemporaryMachineDirectory.h"
#include "device/archive/PackageFolder.h"
#include "device/package/DataArchive.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

/// Archives are written to "out.zip" and looked at by unpacking them.
class ArchiveWriterTest : public ::testing::Test {
  protected:
    [[nodiscard]] std::string path(const std::string& name) const {
        return directory_.path() + "/" + name;
    }
    void write(const std::string& name, const std::string& contents) const {
        std::ofstream(path(name), std::ios::binary) << contents;
    }
    [[nodiscard]] std::string read(const std::string& name) const {
        std::ifstream file(path(name), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }
    /// The file of that name, as an entry of the same name.
    [[nodiscard]] PackageItem item(const std::string& name, std::uint32_t mode = 0644) const {
        return {path(name), name, S_IFREG | mode, fs::file_size(path(name))};
    }
    Status pack(const std::vector<PackageItem>& items) {
        return writeArchive(items, path("out.zip"));
    }
    void unpack() {
        fs::remove_all(path("unpacked"));
        fs::create_directory(path("unpacked"));
        const UniqueFd archive(::open(path("out.zip").c_str(), O_RDONLY | O_CLOEXEC));
        const UniqueFd target(::open(path("unpacked").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        const Status status = unpackDataArchive(archive.get(), "out.zip", target.get());
        EXPECT_TRUE(status.ok()) << status.error().description();
    }

    const TemporaryMachineDirectory directory_;
};

TEST_F(ArchiveWriterTest, itemsComeOutAsTheyWentIn) {
    const std::string noise("\0\xff\r\n", 4);
    write("empty", "");
    write("binary", noise);
    write("long", std::string(3'000'000, 'l'));
    ASSERT_TRUE(pack({item("empty"),
                      item("binary"),
                      item("long", 0755),
                      {"", "folder/", S_IFDIR | 0755, 0},
                      {path("binary"), "folder/again é", S_IFREG | 0644, noise.size()}})
                    .ok());
    unpack();
    EXPECT_EQ(read("unpacked/empty"), "");
    EXPECT_EQ(read("unpacked/binary"), noise);
    EXPECT_EQ(read("unpacked/long"), std::string(3'000'000, 'l'));
    EXPECT_EQ(read("unpacked/folder/again é"), noise);
    EXPECT_EQ(fs::status(path("unpacked/long")).permissions(), fs::perms(0755));
    EXPECT_EQ(fs::status(path("unpacked/binary")).permissions(), fs::perms(0644));
    EXPECT_LT(fs::file_size(path("out.zip")), 20'000U) << "it is compressed";
}

TEST_F(ArchiveWriterTest, theSameItemsGiveTheSameBytesWheneverTheyWereWritten) {
    write("file", "contents");
    ASSERT_TRUE(pack({item("file")}).ok());
    const std::string first = read("out.zip");
    fs::last_write_time(path("file"), fs::file_time_type::clock::now() - std::chrono::hours(48));
    ASSERT_TRUE(pack({item("file")}).ok());
    EXPECT_EQ(read("out.zip"), first);
    EXPECT_FALSE(first.empty());
}

TEST_F(ArchiveWriterTest, whatStoodThereIsReplaced) {
    write("out.zip", std::string(10'000, 'o'));
    write("file", "contents");
    ASSERT_TRUE(pack({item("file")}).ok());
    unpack();
    EXPECT_EQ(read("unpacked/file"), "contents");
}

TEST_F(ArchiveWriterTest, anArchiveMayHaveTheLongestName) {
    write("file", "contents");
    for (const std::size_t length : {248U, 249U, 251U, 255U}) {
        const std::string name(length, 'n');
        const Status status = writeArchive({item("file")}, path(name));
        EXPECT_TRUE(status.ok()) << status.error().description();
        EXPECT_TRUE(checkDataArchive(path(name)).ok());
        fs::remove(path(name));
    }
    EXPECT_EQ(std::distance(fs::directory_iterator(directory_.path()), {}), 1) << "only the file";
}

TEST_F(ArchiveWriterTest, aFileThatHasGoneFailsTheArchive) {
    write("file", "contents");
    const PackageItem gone = item("file");
    fs::remove(path("file"));
    const Status status = pack({gone});
    ASSERT_FALSE(status.ok());
    EXPECT_EQ(status.error().domain, kPosixErrorDomain);
    EXPECT_EQ(status.error().code, ENOENT);
    EXPECT_FALSE(fs::exists(path("out.zip")));
}

TEST_F(ArchiveWriterTest, aFileThatBecameALinkOrAPipeIsNotFollowed) {
    write("secret", "secret");
    write("file", "contents");
    const PackageItem listed = item("file");
    fs::remove(path("file"));
    fs::create_symlink(path("secret"), path("file"));
    EXPECT_FALSE(pack({listed}).ok());
    fs::remove(path("file"));
    ASSERT_EQ(::mkfifo(path("file").c_str(), 0600), 0);
    EXPECT_FALSE(pack({listed}).ok());
    EXPECT_FALSE(fs::exists(path("out.zip")));
}

TEST_F(ArchiveWriterTest, twoItemsOfOneNameAreRefused) {
    write("file", "contents");
    EXPECT_FALSE(pack({item("file"), item("file")}).ok());
    EXPECT_FALSE(fs::exists(path("out.zip")));
}

TEST_F(ArchiveWriterTest, aPlaceThatCannotBeWrittenIsSaid) {
    write("file", "contents");
    const Status status = writeArchive({item("file")}, path("absent/out.zip"));
    ASSERT_FALSE(status.ok());
    EXPECT_NE(status.error().description().find("absent/out.zip"), std::string::npos);
}

}  // namespace

}  // namespace appsync
