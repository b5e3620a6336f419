#include <cerrno>

#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::HasSubstr;

// What the contract of files promises is tested for every implementation; here stands what only the
// simulation does.
class SimulatedFileSystemTest : public SimulationFixture {
  protected:
    SimulatedFileSystem& files_ = platform_.files;

    template <typename Value>
    static std::int64_t codeOf(const Result<Value>& result) {
        return result ? 0 : result.error().code;
    }
};

TEST_F(SimulatedFileSystemTest, TheUsualDirectoriesAreThere) {
    EXPECT_THAT(files_.paths("/"),
                ElementsAre("/tmp/", "/var/", "/var/mobile/", "/var/mobile/Library/",
                            "/var/mobile/Library/Preferences/", "/var/mobile/Media/",
                            "/var/mobile/Media/PublicStaging/"));
}

TEST_F(SimulatedFileSystemTest, TheNextCallsFailAsOftenAsTold) {
    files_.failNext(FileOperation::WriteFileAtomically, "/tmp/x", ENOSPC, 2);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/tmp/x", {})), ENOSPC);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/tmp/y", {})), 0);
    EXPECT_EQ(codeOf(files_.createFile("/tmp/x", {}, {})), 0);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/tmp/x", {})), ENOSPC);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/tmp/x", {})), 0);
}

TEST_F(SimulatedFileSystemTest, EveryCallFailsUntilToldOtherwise) {
    files_.addFile("/tmp/x", "text");
    files_.failEvery(FileOperation::ReadFile, SimulatedFileSystem::kAnyPath, EIO);
    for (int i = 0; i < 3; ++i) EXPECT_EQ(codeOf(files_.readFile("/tmp/x")), EIO);
    files_.stopFailing();
    EXPECT_EQ(codeOf(files_.readFile("/tmp/x")), 0);
}

TEST_F(SimulatedFileSystemTest, EachOperationCanFail) {
    using Operation = FileOperation;
    files_.addFile("/tmp/x", "text");
    for (const Operation operation :
         {Operation::Attributes, Operation::CreateDirectory, Operation::RemoveItem,
          Operation::MoveItem, Operation::CopyItem, Operation::ReadFile,
          Operation::WriteFileAtomically, Operation::CreateFile, Operation::SetTimesToNow}) {
        files_.failNext(operation, "/tmp/x", EIO);
    }
    EXPECT_EQ(codeOf(files_.attributes("/tmp/x")), EIO);
    EXPECT_EQ(codeOf(files_.createDirectory("/tmp/x", true, nullptr)), EIO);
    EXPECT_EQ(codeOf(files_.removeItem("/tmp/x")), EIO);
    EXPECT_EQ(codeOf(files_.moveItem("/tmp/x", "/tmp/y")), EIO);
    EXPECT_EQ(codeOf(files_.copyItem("/tmp/x", "/tmp/y")), EIO);
    EXPECT_EQ(codeOf(files_.readFile("/tmp/x")), EIO);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/tmp/x", {})), EIO);
    EXPECT_EQ(codeOf(files_.createFile("/tmp/x", {}, {})), EIO);
    EXPECT_EQ(codeOf(files_.setTimesToNow("/tmp/x")), EIO);
    EXPECT_EQ(files_.text("/tmp/x"), "text");
}

TEST_F(SimulatedFileSystemTest, AFullDiskRefusesWhatDoesNotFit) {
    files_.addFile("/tmp/x", "12345");
    files_.setCapacity(8);
    EXPECT_EQ(codeOf(files_.createFile("/tmp/y", Bytes(4), {})), ENOSPC);
    EXPECT_EQ(codeOf(files_.createFile("/tmp/y", Bytes(3), {})), 0);
    EXPECT_EQ(codeOf(files_.copyItem("/tmp/y", "/tmp/z")), ENOSPC);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/tmp/x", Bytes(5))), 0);
    EXPECT_EQ(codeOf(files_.removeItem("/tmp/x")), 0);
    EXPECT_EQ(codeOf(files_.copyItem("/tmp/y", "/tmp/z")), 0);
    EXPECT_EQ(files_.usedBytes(), 6U);
}

TEST_F(SimulatedFileSystemTest, ItemsHaveOwnersAndTimesOfTheVirtualClock) {
    const FileAttributes root{"root", std::nullopt};
    platform_.advance(7s);
    EXPECT_EQ(codeOf(files_.createFile("/tmp/x", {}, root)), 0);
    EXPECT_EQ(files_.ownership("/tmp/x"), "root:mobile");
    EXPECT_EQ(files_.modificationTime("/tmp/x"), 7s);
    platform_.advance(3s);
    EXPECT_EQ(codeOf(files_.setTimesToNow("/tmp/x")), 0);
    EXPECT_EQ(files_.modificationTime("/tmp/x"), 10s);
}

TEST_F(SimulatedFileSystemTest, AReplacedFileKeepsItsOwner) {
    EXPECT_EQ(codeOf(files_.createFile("/tmp/x", {}, {"root", "root"})), 0);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/tmp/x", Bytes(1))), 0);
    EXPECT_EQ(files_.ownership("/tmp/x"), "root:root");
}

TEST_F(SimulatedFileSystemTest, ATreeIsCopiedWhole) {
    files_.addFile("/tmp/from/sub/x", "text");
    files_.addFile("/tmp/to/old", "gone");
    EXPECT_TRUE(files_.copyTree("/tmp/from", "/tmp/to"));
    files_.addFile("/tmp/from/sub/x", "changed");
    EXPECT_THAT(files_.paths("/tmp/to"), ElementsAre("/tmp/to/sub/", "/tmp/to/sub/x"));
    EXPECT_EQ(files_.text("/tmp/to/sub/x"), "text");
    EXPECT_FALSE(files_.copyTree("/tmp/missing", "/tmp/to"));
}

TEST_F(SimulatedFileSystemTest, WhatTheTestCannotAddIsAFailure) {
    files_.addFile("/tmp/x", "text");
    EXPECT_THAT(failureOf([&] { files_.addFile("/tmp/x/y", "text"); }), HasSubstr("/tmp/x"));
    EXPECT_THAT(failureOf([&] { files_.addDirectory("relative"); }), HasSubstr("relative"));
}

TEST_F(SimulatedFileSystemTest, TheTestsOwnChangesAreNotRecorded) {
    files_.addFile("/tmp/x", "text");
    files_.remove("/tmp/x");
    (void)files_.paths("/");
    EXPECT_THAT(platform_.recording(), testing::IsEmpty());
}

}  // namespace
}  // namespace appsync
