#include <gmock/gmock.h>

#include <fcntl.h>
#include <sys/stat.h>

#include <cstdint>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "contract/TemporaryMachineDirectory.h"
#include "device/package/DataArchive.h"
#include "system/file/RootDirectory.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;

/// A directory of data that is read, copied, packed and unpacked.
class DataCopyTest : public testing::Test {
  protected:
    DataCopyTest() {
        write("root/data/b/two", std::string(300'000, '2'));
        write("root/data/a", "one");
        fs::create_symlink("/etc/passwd", path("root/data/link"));
        fs::create_directory(path("to"));
    }
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
    [[nodiscard]] RootDirectory root() const { return *RootDirectory::open(path("root")); }
    [[nodiscard]] UniqueFd target() const {
        return UniqueFd(::open(path("to").c_str(), O_RDONLY | O_DIRECTORY));
    }

    /// What was read of each file, as "name size sum-of-bytes".
    struct Heard {
        std::vector<std::string> files;
        std::vector<std::string> contents;
        DataReader reader() {
            return {[this](const std::string& name, std::uint64_t size) {
                        files.push_back(name + " " + std::to_string(size));
                        contents.emplace_back();
                    },
                    [this](ByteView piece) { contents.back().append(piece.begin(), piece.end()); }};
        }
    };

  private:
    const TemporaryMachineDirectory directory_;
};

TEST_F(DataCopyTest, CopiesWhatAnArchiveWouldHold) {
    std::uint64_t heard = 0;
    const auto copied =
        copyData(root(), "/data", target().get(), [&](std::uint64_t bytes) { heard += bytes; });
    ASSERT_TRUE(copied);
    EXPECT_EQ(read("to/a"), "one");
    EXPECT_EQ(read("to/b/two"), std::string(300'000, '2'));
    EXPECT_EQ(copied->files(), 2U);
    EXPECT_EQ(copied->bytes, 300'003U);
    EXPECT_EQ(heard, 300'003U);
    ASSERT_EQ(copied->leftOut.size(), 1U);
    EXPECT_EQ(copied->leftOut.front().name, "link");
    EXPECT_FALSE(fs::exists(fs::symlink_status(path("to/link"))));
}

TEST_F(DataCopyTest, KeepsTheTimesOfFiles) {
    const fs::file_time_type before =
        fs::last_write_time(path("root/data/a")) - std::chrono::hours(1);
    fs::last_write_time(path("root/data/a"), before);
    ASSERT_TRUE(copyData(root(), "/data", target().get()));
    EXPECT_EQ(fs::last_write_time(path("to/a")), before);
}

TEST_F(DataCopyTest, DropsWhatLetsOthersWriteOrRunAsTheOwner) {
    ASSERT_EQ(::chmod(path("root/data/a").c_str(), 06777), 0);
    ASSERT_TRUE(copyData(root(), "/data", target().get()));
    struct stat status = {};
    ASSERT_EQ(::stat(path("to/a").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777, 0755U);
}

TEST_F(DataCopyTest, ReplacesNothingThatStandsInTheWay) {
    write("to/a", "mine");
    EXPECT_FALSE(copyData(root(), "/data", target().get()));
    EXPECT_EQ(read("to/a"), "mine");
}

TEST_F(DataCopyTest, HoldsNothingWhereTheDirectoryIsMissing) {
    const auto copied = copyData(root(), "/nowhere", target().get());
    ASSERT_TRUE(copied);
    EXPECT_TRUE(copied->entries.empty());
    EXPECT_TRUE(listData(root(), "/nowhere")->entries.empty());
}

TEST_F(DataCopyTest, ALinkToADirectoryOutsideLeadsNowhere) {
    write("outside/secret", "x");
    fs::create_directory_symlink(path("outside"), path("root/linked"));
    const auto copied = copyData(root(), "/linked", target().get());
    EXPECT_TRUE(!copied || copied->entries.empty());
    EXPECT_TRUE(fs::is_empty(path("to")));
}

TEST_F(DataCopyTest, ReadsTheSameOfADirectoryAndOfItsArchive) {
    ASSERT_TRUE(writeDataArchive(root(), "/data", path("data.zip")));
    Heard folder;
    Heard archive;
    ASSERT_TRUE(readData(root(), "/data", folder.reader()).ok());
    ASSERT_TRUE(readDataArchive(path("data.zip"), archive.reader()).ok());
    EXPECT_THAT(folder.files, ElementsAre("a 3", "b/two 300000"));
    EXPECT_EQ(folder.files, archive.files);
    EXPECT_EQ(folder.contents, archive.contents);
}

TEST_F(DataCopyTest, UnpackingTellsHowMuchWasWritten) {
    ASSERT_TRUE(writeDataArchive(root(), "/data", path("data.zip")));
    const UniqueFd archive(::open(path("data.zip").c_str(), O_RDONLY));
    std::uint64_t heard = 0;
    const Status unpacked = unpackDataArchive(archive.get(), "data.zip", target().get(),
                                              [&](std::uint64_t bytes) { heard += bytes; });
    ASSERT_TRUE(unpacked.ok());
    EXPECT_EQ(heard, 300'003U);
}

}  // namespace

}  // namespace appsync
