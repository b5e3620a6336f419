#include "system/file/RootedFileSystem.h"

#include <cerrno>
#include <fstream>

#include <sys/stat.h>
#include <unistd.h>

#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using device_files::bytes;
using device_files::Call;
using device_files::FailingCall;
using device_files::kForever;
using device_files::text;

constexpr uid_t kOtherUser = 4242;
constexpr gid_t kOtherGroup = 4343;

std::int64_t codeOf(const Status& status) { return status ? 0 : status.error().code; }

struct stat statusOf(const fs::path& path) {
    struct stat status {};
    EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
    return status;
}

class RootedFileSystemTest : public device_files::DeviceFilesTest {
  protected:
    /// The same device, with an account "guest" whose numbers are nobody's.
    [[nodiscard]] std::unique_ptr<RootedFileSystem> withGuest() const {
        RootedFileSystemOptions options;
        options.accounts["guest"] = {kOtherUser, kOtherGroup};
        return std::move(*RootedFileSystem::open(real("/").string(), options));
    }
};

const FileAttributes kMobile{"mobile", "mobile"};
const FileAttributes kGuest{"guest", "guest"};
const FileAttributes kStranger{"stranger", std::nullopt};

TEST_F(RootedFileSystemTest, ADeviceThatIsMissingCannotBeOpened) {
    const auto opened = RootedFileSystem::open((scratch_.path() / "absent").string());
    ASSERT_FALSE(opened);
    EXPECT_EQ(opened.error().code, ENOENT);
}

TEST_F(RootedFileSystemTest, TheTemporaryDirectoryIsMade) {
    EXPECT_EQ(files_->temporaryDirectory(), "/tmp");
    EXPECT_TRUE(fs::is_directory(real("/tmp")));
    RootedFileSystemOptions options;
    options.temporaryDirectory = "/private/var/tmp";
    ASSERT_TRUE(RootedFileSystem::open(real("/").string(), options));
    EXPECT_TRUE(fs::is_directory(real("/private/var/tmp")));
}

TEST_F(RootedFileSystemTest, ATemporaryDirectoryThatCannotBeMadeIsTold) {
    put("/file", "");
    RootedFileSystemOptions options;
    options.temporaryDirectory = "/file/tmp";
    EXPECT_FALSE(RootedFileSystem::open(real("/").string(), options));
}

TEST_F(RootedFileSystemTest, AnItemExistsWhereAFileOrADirectoryStands) {
    put("/a/file", "");
    link("/link", "/a/file");
    link("/dangling", "/absent");
    link("/escape", outside() / "file");
    pipe("/pipe");
    for (const char* path : {"/", "/a", "/a/file", "/link"}) EXPECT_TRUE(files_->itemExists(path));
    for (const char* path : {"/absent", "/dangling", "/escape", "relative", ""}) {
        EXPECT_FALSE(files_->itemExists(path)) << path;
    }
}

TEST_F(RootedFileSystemTest, AttributesTellSizeAndKind) {
    put("/a/file", "12345");
    const auto file = files_->attributes("/a/file");
    const auto directory = files_->attributes("/a");
    ASSERT_TRUE(file && directory);
    EXPECT_EQ(file->size, 5U);
    EXPECT_FALSE(file->isDirectory);
    EXPECT_TRUE(directory->isDirectory);
    EXPECT_EQ(files_->attributes("/absent").error().description(),
              "cannot examine /absent: No such file or directory");
}

TEST_F(RootedFileSystemTest, AttributesThatCannotBeHadAreTold) {
    put("/file", "");
    const FailingCall failing(Call::Fstat, EIO);
    EXPECT_EQ(files_->attributes("/file").error().code, EIO);
}

TEST_F(RootedFileSystemTest, ReadsAWholeFile) {
    const std::string contents(3'000'000, 'x');
    put("/file", contents);
    put("/empty", "");
    EXPECT_EQ(text(*files_->readFile("/file")), contents);
    EXPECT_TRUE(files_->readFile("/empty")->empty());
}

TEST_F(RootedFileSystemTest, ReadsNothingButRegularFiles) {
    pipe("/pipe");
    link("/link", "/pipe");
    EXPECT_EQ(files_->readFile("/pipe").error().description(),
              "cannot read /pipe: it is not a regular file");
    EXPECT_EQ(files_->readFile("/link").error().code, EINVAL);
    EXPECT_EQ(files_->readFile("/tmp").error().code, EISDIR);
    EXPECT_EQ(files_->readFile("/absent").error().code, ENOENT);
}

TEST_F(RootedFileSystemTest, ReadsNoFileAboveTheLimit) {
    put("/huge", "");
    fs::resize_file(real("/huge"), RootedFileSystem::kLargestFile + 1);
    EXPECT_EQ(files_->readFile("/huge").error().description(), "cannot read /huge: File too large");
}

TEST_F(RootedFileSystemTest, AFailedReadIsTold) {
    put("/file", "x");
    const FailingCall failing(Call::Read, EIO);
    EXPECT_EQ(files_->readFile("/file").error().description(),
              "cannot read /file: Input/output error");
}

TEST_F(RootedFileSystemTest, APathInTheTemporaryDirectoryChangesNothingOutsideOfIt) {
    put("/var/kept", "kept");
    put("/tmp/own", "own");
    for (const char* path : {"/tmp/../var/new", "/tmp/a/../../var/new", "/tmp/./../var/new",
                             "/tmp//../var/new", "/tmp/a/b/../../../var/new", "/tmp/.."}) {
        EXPECT_EQ(codeOf(files_->createDirectory(path, true, nullptr)), EACCES) << path;
        EXPECT_EQ(codeOf(files_->createDirectory(path, false, &kMobile)), EACCES) << path;
        EXPECT_EQ(codeOf(files_->createFile(path, bytes("x"), kMobile)), EACCES) << path;
        EXPECT_EQ(codeOf(files_->writeFileAtomically(path, bytes("x"))), EACCES) << path;
        EXPECT_EQ(codeOf(files_->copyItem("/tmp/own", path)), EACCES) << path;
        EXPECT_EQ(codeOf(files_->moveItem("/tmp/own", path)), EACCES) << path;
    }
    EXPECT_EQ(codeOf(files_->removeItem("/tmp/../var/kept")), EACCES);
    EXPECT_EQ(codeOf(files_->moveItem("/tmp/../var/kept", "/tmp/stolen")), EACCES);
    EXPECT_EQ(files_->createFile("/tmp/../var/kept", bytes("x"), kMobile).error().description(),
              "cannot create /tmp/../var/kept: the path leads out of /tmp");
    EXPECT_EQ(names("/var"), std::vector<std::string>{"kept"});
    EXPECT_EQ(contents("/var/kept"), "kept");
    EXPECT_EQ(contents("/tmp/own"), "own");
}

TEST_F(RootedFileSystemTest, APathMayGoUpWithinTheTemporaryDirectoryAndElsewhere) {
    EXPECT_TRUE(files_->createDirectory("/tmp/a/b", true, nullptr));
    EXPECT_TRUE(files_->createFile("/tmp/a/../file", bytes("x"), kMobile));
    EXPECT_TRUE(files_->createFile("/tmp/a/..file", bytes("x"), kMobile));
    EXPECT_TRUE(files_->createDirectory("/tmpfile/../other", true, nullptr));
    EXPECT_TRUE(files_->createFile("/other/../tmp/up", bytes("x"), kMobile));
    EXPECT_EQ(names("/tmp"), (std::vector<std::string>{"a", "file", "up"}));
}

TEST_F(RootedFileSystemTest, MakesADirectory) {
    EXPECT_TRUE(files_->createDirectory("/new", false, nullptr));
    EXPECT_TRUE(fs::is_directory(real("/new")));
}

TEST_F(RootedFileSystemTest, WithoutIntermediatesTheParentMustExistAndTheDirectoryMustNot) {
    EXPECT_EQ(codeOf(files_->createDirectory("/a/b", false, nullptr)), ENOENT);
    EXPECT_EQ(codeOf(files_->createDirectory("/tmp", false, nullptr)), EEXIST);
}

TEST_F(RootedFileSystemTest, MakesTheParentsToo) {
    EXPECT_TRUE(files_->createDirectory("/a//b/../c/d/", true, nullptr));
    EXPECT_TRUE(fs::is_directory(real("/a/c/d")));
    EXPECT_TRUE(files_->createDirectory("/a/c/d", true, nullptr));
    EXPECT_TRUE(files_->createDirectory("/", true, nullptr));
}

TEST_F(RootedFileSystemTest, MakesDirectoriesThroughALinkInsideTheRootOnly) {
    fs::create_directory(real("/target"));
    link("/inside", "/target");
    link("/escape", outside());
    EXPECT_TRUE(files_->createDirectory("/inside/a/b", true, nullptr));
    EXPECT_TRUE(fs::is_directory(real("/target/a/b")));
    EXPECT_FALSE(files_->createDirectory("/escape/a/b", true, nullptr));
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(RootedFileSystemTest, AFileInTheWayOfADirectoryIsNamed) {
    put("/a/file", "");
    EXPECT_EQ(files_->createDirectory("/a/file", true, nullptr).error().description(),
              "cannot create the directory /a/file: File exists");
    EXPECT_EQ(files_->createDirectory("/a/file/b/c", true, nullptr).error().description(),
              "cannot create the directory /a/file: File exists");
}

TEST_F(RootedFileSystemTest, ABadPathMakesNoDirectoryAtAll) {
    using std::string_literals::operator""s;
    EXPECT_EQ(codeOf(files_->createDirectory("/a/b\0/c"s, true, nullptr)), EINVAL);
    EXPECT_EQ(codeOf(files_->createDirectory("a/b", true, nullptr)), EINVAL);
    EXPECT_FALSE(fs::exists(real("/a")));
}

TEST_F(RootedFileSystemTest, ADirectoryThatAppearsMeanwhileIsNoFailure) {
    fs::create_directory(real("/new"));
    const FailingCall failing(Call::Openat2, ENOENT, 2);
    EXPECT_TRUE(files_->createDirectory("/new", true, nullptr));
    EXPECT_EQ(failing.failures(), 2);
}

TEST_F(RootedFileSystemTest, ADirectoryThatCannotBeMadeIsTold) {
    const FailingCall failing(Call::Mkdirat, ENOSPC);
    EXPECT_EQ(files_->createDirectory("/a/b", true, nullptr).error().description(),
              "cannot create the directory /a: No space left on device");
}

TEST_F(RootedFileSystemTest, AnUnknownAccountMakesNothing) {
    EXPECT_EQ(files_->createDirectory("/new", true, &kStranger).error().description(),
              "cannot create the directory /new: the device has no account named 'stranger'");
    EXPECT_EQ(codeOf(files_->createFile("/file", {}, kStranger)), EINVAL);
    EXPECT_EQ(codeOf(files_->createFile("/file", {}, {std::nullopt, "stranger"})), EINVAL);
    EXPECT_EQ(names("/"), std::vector<std::string>{"tmp"});
}

TEST_F(RootedFileSystemTest, MobileIsWhoeverOwnsTheRoot) {
    if (::geteuid() != 0) GTEST_SKIP() << "only root can give files away";
    ASSERT_EQ(::chown(real("/").c_str(), kOtherUser, kOtherGroup), 0);
    const auto reopened = std::move(*RootedFileSystem::open(real("/").string()));
    ASSERT_TRUE(reopened->createDirectory("/new", false, &kMobile));
    ASSERT_TRUE(reopened->createFile("/file", bytes("x"), kMobile));
    EXPECT_EQ(statusOf(real("/new")).st_uid, kOtherUser);
    EXPECT_EQ(statusOf(real("/file")).st_gid, kOtherGroup);
}

TEST_F(RootedFileSystemTest, EveryDirectoryThatItMakesIsGivenAway) {
    if (::geteuid() != 0) GTEST_SKIP() << "only root can give files away";
    ASSERT_TRUE(withGuest()->createDirectory("/a/b", true, &kGuest));
    for (const char* path : {"/a", "/a/b"}) {
        EXPECT_EQ(statusOf(real(path)).st_uid, kOtherUser);
        EXPECT_EQ(statusOf(real(path)).st_gid, kOtherGroup);
    }
    EXPECT_NE(statusOf(real("/")).st_uid, kOtherUser);
}

TEST_F(RootedFileSystemTest, WhatHasTheRightOwnerIsNotGivenAgain) {
    const FailingCall failing(Call::Fchown, EPERM);
    EXPECT_TRUE(files_->createDirectory("/new", false, &kMobile));
    EXPECT_TRUE(files_->createFile("/file", bytes("x"), kMobile));
    EXPECT_EQ(failing.failures(), 0);
}

TEST_F(RootedFileSystemTest, WhatCannotBeGivenAwayIsNotLeftBehind) {
    const auto files = withGuest();
    const FailingCall failing(Call::Fchown, EPERM);
    EXPECT_EQ(codeOf(files->createDirectory("/new", true, &kGuest)), EPERM);
    EXPECT_EQ(codeOf(files->createFile("/file", bytes("x"), kGuest)), EPERM);
    EXPECT_EQ(names("/"), std::vector<std::string>{"tmp"});
}

TEST_F(RootedFileSystemTest, ADirectoryThatCannotBeExaminedIsNotLeftBehind) {
    const FailingCall failing(Call::Fstatat, EIO);
    EXPECT_EQ(codeOf(files_->createDirectory("/new", false, &kMobile)), EIO);
    EXPECT_FALSE(fs::exists(real("/new")));
}

TEST_F(RootedFileSystemTest, ADirectoryThatIsItsOwnersAlreadyIsNotOpened) {
    const FailingCall failing(Call::Openat, EMFILE);
    EXPECT_TRUE(files_->createDirectory("/new", false, &kMobile));
    EXPECT_EQ(failing.failures(), 0);
}

TEST_F(RootedFileSystemTest, WhereOnlyTheLastDirectoryIsMissingNoOtherIsLookedFor) {
    put("/a/b/c/file", "");
    const FailingCall failing(Call::Openat2, EIO, kForever, 2);
    EXPECT_TRUE(files_->createDirectory("/a/b/c/new", true, nullptr));
    EXPECT_EQ(failing.failures(), 0);
}

TEST_F(RootedFileSystemTest, MovesFilesAndDirectories) {
    put("/a/file", "contents");
    EXPECT_TRUE(files_->moveItem("/a/file", "/moved"));
    EXPECT_TRUE(files_->moveItem("/a", "/b/"));
    EXPECT_EQ(contents("/moved"), "contents");
    EXPECT_FALSE(fs::exists(real("/a")));
    EXPECT_TRUE(fs::is_directory(real("/b")));
}

TEST_F(RootedFileSystemTest, MovesALinkAndNotItsTarget) {
    link("/link", outside() / "file");
    EXPECT_TRUE(files_->moveItem("/link", "/moved"));
    EXPECT_TRUE(fs::is_symlink(real("/moved")));
    EXPECT_TRUE(outsideIsUntouched());
}

/// Does the file system know how to refuse a target that exists?
class MoveTest : public RootedFileSystemTest, public ::testing::WithParamInterface<int> {};

INSTANTIATE_TEST_SUITE_P(ByFileSystem, MoveTest, ::testing::Values(0, EINVAL, ENOSYS));

TEST_P(MoveTest, NeverReplacesAnything) {
    put("/from", "new");
    put("/file", "old");
    fs::create_directory(real("/directory"));
    link("/dangling", "/absent");
    const FailingCall failing(Call::Renameat2, GetParam(), GetParam() == 0 ? 0 : 9);
    for (const char* target : {"/file", "/directory", "/dangling"}) {
        EXPECT_EQ(codeOf(files_->moveItem("/from", target)), EEXIST) << target;
    }
    EXPECT_EQ(contents("/file"), "old");
    EXPECT_TRUE(files_->moveItem("/from", "/to"));
    EXPECT_EQ(contents("/to"), "new");
}

TEST_F(RootedFileSystemTest, AFailedMoveNamesBothPaths) {
    put("/there", "");
    EXPECT_EQ(files_->moveItem("/absent", "/to").error().description(),
              "cannot move /absent to /to: No such file or directory");
    EXPECT_EQ(files_->moveItem("/there", "/absent/to").error().code, ENOENT);
    EXPECT_EQ(files_->moveItem("relative", "/to").error().code, EINVAL);
}

TEST_F(RootedFileSystemTest, AMoveThatFailsWithoutTheFlagTooIsTold) {
    std::filesystem::create_directory(real("/a"));
    EXPECT_EQ(codeOf(files_->moveItem("/a", "/a/b")), EINVAL);
}

TEST_F(RootedFileSystemTest, CopiesAFileWithItsPermissions) {
    put("/from", "contents");
    fs::permissions(real("/from"), fs::perms(0600));
    link("/link", "/from");
    EXPECT_TRUE(files_->copyItem("/from", "/to"));
    EXPECT_TRUE(files_->copyItem("/link", "/linked"));
    EXPECT_EQ(contents("/to"), "contents");
    EXPECT_EQ(fs::status(real("/to")).permissions(), fs::perms(0600));
    EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(real("/linked"))));
}

TEST_F(RootedFileSystemTest, CopiesNothingButRegularFiles) {
    pipe("/pipe");
    link("/escape", outside() / "file");
    EXPECT_EQ(codeOf(files_->copyItem("/pipe", "/to")), EINVAL);
    EXPECT_EQ(codeOf(files_->copyItem("/tmp", "/to")), EISDIR);
    EXPECT_EQ(codeOf(files_->copyItem("/escape", "/to")), ENOENT);
    EXPECT_FALSE(fs::exists(real("/to")));
}

TEST_F(RootedFileSystemTest, NeverCopiesOverAnything) {
    put("/from", "new");
    put("/file", "old");
    link("/dangling", outside() / "new");
    EXPECT_EQ(files_->copyItem("/from", "/file").error().description(),
              "cannot copy /from to /file: File exists");
    EXPECT_EQ(codeOf(files_->copyItem("/from", "/dangling")), EEXIST);
    EXPECT_EQ(codeOf(files_->copyItem("/from", "/to/")), EISDIR);
    EXPECT_EQ(codeOf(files_->copyItem("/from", "/absent/to")), ENOENT);
    EXPECT_EQ(contents("/file"), "old");
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(RootedFileSystemTest, AFailedCopyLeavesNothingBehind) {
    put("/from", "contents");
    const FailingCall failing(Call::Write, ENOSPC);
    EXPECT_EQ(codeOf(files_->copyItem("/from", "/to")), ENOSPC);
    EXPECT_FALSE(fs::exists(real("/to")));
}

TEST_F(RootedFileSystemTest, SetsTheTimesToNow) {
    put("/file", "");
    const auto longAgo = fs::file_time_type::clock::now() - std::chrono::hours(1000);
    fs::last_write_time(real("/file"), longAgo);
    EXPECT_TRUE(files_->setTimesToNow("/file"));
    EXPECT_GT(fs::last_write_time(real("/file")), longAgo + std::chrono::hours(999));
    EXPECT_TRUE(files_->setTimesToNow("/tmp"));
}

TEST_F(RootedFileSystemTest, TimesThatCannotBeSetAreTold) {
    put("/file", "");
    EXPECT_EQ(codeOf(files_->setTimesToNow("/absent")), ENOENT);
    const FailingCall failing(Call::Utimensat, EPERM);
    EXPECT_EQ(files_->setTimesToNow("/file").error().description(),
              "cannot set the times of /file: Operation not permitted");
}

}  // namespace
}  // namespace appsync
