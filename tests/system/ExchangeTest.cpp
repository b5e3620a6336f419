#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "contract/TemporaryMachineDirectory.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

/// Two directories of a device that change places.
class ExchangeTest : public testing::Test {
  protected:
    ExchangeTest() {
        write("new/letter", "new");
        write("old/letter", "old");
    }
    void write(const std::string& name, const std::string& contents) const {
        const std::string path = directory.path() + "/" + name;
        fs::create_directories(fs::path(path).parent_path());
        std::ofstream(path) << contents;
    }
    [[nodiscard]] std::string read(const std::string& name) const {
        std::ifstream file(directory.path() + "/" + name);
        return {std::istreambuf_iterator<char>(file), {}};
    }

    const TemporaryMachineDirectory directory;
    std::unique_ptr<RootedFileSystem> files = *RootedFileSystem::open(directory.path());
};

TEST_F(ExchangeTest, PutsEachInThePlaceOfTheOther) {
    ASSERT_TRUE(files->exchangeItem("/new", "/old").ok());
    EXPECT_EQ(read("old/letter"), "new");
    EXPECT_EQ(read("new/letter"), "old");
}

TEST_F(ExchangeTest, MovesWhereNothingIsToBeReplaced) {
    ASSERT_TRUE(files->exchangeItem("/new", "/absent").ok());
    EXPECT_EQ(read("absent/letter"), "new");
    EXPECT_FALSE(files->itemExists("/new"));
}

TEST_F(ExchangeTest, ExchangesALinkAndNotWhatItLeadsTo) {
    fs::create_directory_symlink("old", directory.path() + "/link");
    ASSERT_TRUE(files->exchangeItem("/new", "/link").ok());
    EXPECT_EQ(read("link/letter"), "new");
    EXPECT_EQ(read("old/letter"), "old");
    EXPECT_TRUE(fs::is_symlink(directory.path() + "/new"));
}

TEST_F(ExchangeTest, ChangesNothingWithoutANewItem) {
    const Status status = files->exchangeItem("/absent", "/old");
    EXPECT_EQ(status.error().code, ENOENT);
    EXPECT_EQ(read("old/letter"), "old");
}

TEST_F(ExchangeTest, IsRefusedOutOfTheTemporaryDirectory) {
    EXPECT_EQ(files->exchangeItem("/tmp/../new", "/old").error().code, EACCES);
    EXPECT_EQ(files->exchangeItem("/new", "/tmp/../old").error().code, EACCES);
    EXPECT_EQ(read("old/letter"), "old");
}

}  // namespace

}  // namespace appsync
