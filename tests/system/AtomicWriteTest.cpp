#include <atomic>
#include <cerrno>
#include <csignal>
#include <thread>

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include "system/file/RootedFileSystem.h"
#include "system/file/TemporaryFile.h"
#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using device_files::bytes;
using device_files::Call;
using device_files::FailingCall;
using device_files::text;

using Names = std::vector<std::string>;

class AtomicWriteTest : public device_files::DeviceFilesTest {
  protected:
    AtomicWriteTest() { fs::create_directory(real("/a")); }
};

TEST_F(AtomicWriteTest, MakesAFile) {
    ASSERT_TRUE(files_->writeFileAtomically("/a/file", bytes("contents")));
    EXPECT_EQ(contents("/a/file"), "contents");
    EXPECT_EQ(names("/a"), Names{"file"});
}

TEST_F(AtomicWriteTest, ReplacesAFileAndKeepsItsPermissions) {
    put("/a/file", "old and longer");
    fs::permissions(real("/a/file"), fs::perms(0640));
    ASSERT_TRUE(files_->writeFileAtomically("/a/file", bytes("new")));
    EXPECT_EQ(contents("/a/file"), "new");
    EXPECT_EQ(fs::status(real("/a/file")).permissions(), fs::perms(0640));
}

TEST_F(AtomicWriteTest, KeepsTheOwnerOfAFile) {
    if (::geteuid() != 0) GTEST_SKIP() << "only root can give files away";
    put("/a/file", "old one");
    ASSERT_EQ(::chown(real("/a/file").c_str(), 4242, 4343), 0);
    ASSERT_TRUE(files_->writeFileAtomically("/a/file", bytes("new")));
    struct stat status {};
    ASSERT_EQ(::stat(real("/a/file").c_str(), &status), 0);
    EXPECT_EQ(status.st_uid, 4242U);
    EXPECT_EQ(status.st_gid, 4343U);
}

TEST_F(AtomicWriteTest, AnOwnerThatCannotBeKeptIsNoFailure) {
    if (::geteuid() != 0) GTEST_SKIP() << "only root can give files away";
    put("/a/file", "old one");
    ASSERT_EQ(::chown(real("/a/file").c_str(), 4242, 4343), 0);
    const FailingCall failing(Call::Fchown, EPERM);
    EXPECT_TRUE(files_->writeFileAtomically("/a/file", bytes("new")));
    EXPECT_EQ(failing.failures(), 1);
    EXPECT_EQ(contents("/a/file"), "new");
}

TEST_F(AtomicWriteTest, ReplacesALinkAndNotItsTarget) {
    put("/target", "kept");
    link("/a/inside", "/target");
    link("/a/escape", outside() / "file");
    EXPECT_TRUE(files_->writeFileAtomically("/a/inside", bytes("new")));
    EXPECT_TRUE(files_->writeFileAtomically("/a/escape", bytes("new")));
    EXPECT_EQ(contents("/target"), "kept");
    EXPECT_EQ(contents("/a/escape"), "new");
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(AtomicWriteTest, ADirectoryIsNotReplaced) {
    put("/a/b/file", "kept");
    EXPECT_EQ(files_->writeFileAtomically("/a/b", bytes("new")).error().code, EISDIR);
    EXPECT_EQ(files_->writeFileAtomically("/a/new/", bytes("new")).error().code, EISDIR);
    EXPECT_EQ(names("/a"), Names{"b"});
}

TEST_F(AtomicWriteTest, ItsDirectoryMustExist) {
    EXPECT_EQ(files_->writeFileAtomically("/absent/file", {}).error().description(),
              "cannot write /absent/file: No such file or directory");
}

TEST_F(AtomicWriteTest, ANameAsLongAsNamesMayBeWorks) {
    const std::string name(255, 'x');
    ASSERT_TRUE(files_->writeFileAtomically("/a/" + name, bytes("contents")));
    EXPECT_EQ(names("/a"), Names{name});
    EXPECT_EQ(files_->writeFileAtomically("/a/" + name + "x", {}).error().code, ENAMETOOLONG);
    EXPECT_EQ(names("/a"), Names{name});
}

struct FailingStep {
    const char* name;
    Call call;
    int error;
};

/// Every step before the last: after it the new file is there.
class FailingStepTest : public AtomicWriteTest,
                        public ::testing::WithParamInterface<FailingStep> {};

INSTANTIATE_TEST_SUITE_P(Each, FailingStepTest,
                         ::testing::Values(FailingStep{"Write", Call::Write, ENOSPC},
                                           FailingStep{"WriteQuota", Call::Write, EDQUOT},
                                           FailingStep{"Sync", Call::Fsync, EIO},
                                           FailingStep{"Rename", Call::Renameat, EIO},
                                           FailingStep{"Open", Call::Openat, EMFILE},
                                           FailingStep{"Lock", Call::Flock, ENOLCK}),
                         [](const auto& parameters) { return std::string(parameters.param.name); });

TEST_P(FailingStepTest, LeavesTheOldFileAndNothingElse) {
    put("/a/file", "old one");
    {
        const FailingCall failing(GetParam().call, GetParam().error);
        const Status written = files_->writeFileAtomically("/a/file", bytes("new"));
        ASSERT_FALSE(written);
        EXPECT_EQ(written.error().code, GetParam().error);
        EXPECT_TRUE(written.error().description().starts_with("cannot write /a/file: "));
    }
    EXPECT_EQ(contents("/a/file"), "old one");
    EXPECT_EQ(names("/a"), Names{"file"});
}

TEST_F(AtomicWriteTest, InTheTemporaryDirectoryNothingWaitsForTheDisk) {
    const FailingCall failing(Call::Fsync, EIO);
    EXPECT_TRUE(files_->writeFileAtomically("/tmp/file", bytes("new")));
    EXPECT_EQ(failing.failures(), 0);
    EXPECT_FALSE(files_->writeFileAtomically("/tmpfile", bytes("new")));
    EXPECT_EQ(failing.failures(), 1);
}

TEST_F(AtomicWriteTest, ATakenNameIsPassedOver) {
    const FailingCall failing(Call::Openat, EEXIST, 3);
    EXPECT_TRUE(files_->writeFileAtomically("/a/file", bytes("new")));
    EXPECT_EQ(failing.failures(), 3);
    EXPECT_EQ(names("/a"), Names{"file"});
}

TEST_F(AtomicWriteTest, NamesThatAreAllTakenAreAFailure) {
    const FailingCall failing(Call::Openat, EEXIST);
    EXPECT_EQ(files_->writeFileAtomically("/a/file", bytes("new")).error().code, EEXIST);
}

TEST_F(AtomicWriteTest, ATemporaryFileThatIsBeingClearedIsMadeAnew) {
    const FailingCall failing(Call::Flock, EWOULDBLOCK, 2);
    EXPECT_TRUE(files_->writeFileAtomically("/a/file", bytes("new")));
    EXPECT_EQ(names("/a"), Names{"file"});
}

constexpr int kCannotMount = 77;

/// Makes a small disk of a directory, in a name space of this process.
bool mountSmallDisk(const fs::path& directory) {
    return ::unshare(CLONE_NEWNS) == 0 &&
           ::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) == 0 &&
           ::mount("tmpfs", directory.c_str(), "tmpfs", 0, "size=256k") == 0;
}

/// The exit status of a process that fills a small disk: 0 when everything is as it should be.
int fillSmallDisk(const fs::path& root) {
    if (!mountSmallDisk(root)) return kCannotMount;
    const auto files = RootedFileSystem::open(root.string());
    if (!files || !(*files)->writeFileAtomically("/file", bytes("old one"))) return 1;
    const Status full = (*files)->writeFileAtomically("/file", Bytes(1'000'000));
    if (full || full.error().code != ENOSPC) return 2;
    if (text(*(*files)->readFile("/file")) != "old one") return 3;
    // What the failure left behind would not leave room for this.
    return (*files)->writeFileAtomically("/file", Bytes(200'000)) ? 0 : 4;
}

TEST_F(AtomicWriteTest, AFullDiskLeavesTheOldFile) {
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) ::_exit(fillSmallDisk(real("/a")));
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFEXITED(status));
    if (WEXITSTATUS(status) == kCannotMount) {
        GTEST_SKIP() << "this account may not mount a small disk";
    }
    EXPECT_EQ(WEXITSTATUS(status), 0);
}

TEST_F(AtomicWriteTest, ManyWritersOfOneFileLeaveOneWholeFile) {
    constexpr int kWriters = 8;
    const auto version = [](int i) { return std::string(20'000, static_cast<char>('a' + i)); };
    ASSERT_TRUE(files_->writeFileAtomically("/a/file", bytes(version(0))));
    std::vector<std::thread> writers;
    for (int i = 0; i < kWriters; ++i) {
        writers.emplace_back([&, i] {
            for (int round = 0; round < 5; ++round) {
                EXPECT_TRUE(files_->writeFileAtomically("/a/file", bytes(version(i))));
                const std::string read = text(*files_->readFile("/a/file"));
                EXPECT_EQ(read, std::string(20'000, read.empty() ? '?' : read[0]));
            }
        });
    }
    for (std::thread& writer : writers) writer.join();
    EXPECT_EQ(names("/a"), Names{"file"});
}

TEST_F(AtomicWriteTest, ClearingMeanwhileDisturbsNoWriter) {
    std::atomic<bool> isOver = false;
    std::thread clearer([&] {
        while (!isOver) EXPECT_TRUE(files_->removeStaleTemporaries("/a"));
    });
    for (int round = 0; round < 50; ++round) {
        const Status written = files_->writeFileAtomically("/a/file", bytes("contents"));
        EXPECT_TRUE(written) << written.error().description();
    }
    isOver = true;
    clearer.join();
    EXPECT_EQ(names("/a"), Names{"file"});
}

TEST_F(AtomicWriteTest, CreatesAFileAndReplacesIt) {
    EXPECT_TRUE(files_->createFile("/a/file", bytes("first"), {"mobile", "mobile"}));
    EXPECT_TRUE(files_->createFile("/a/file", bytes("second"), {}));
    EXPECT_EQ(contents("/a/file"), "second");
    EXPECT_EQ(names("/a"), Names{"file"});
}

TEST_F(AtomicWriteTest, AFileThatCannotBeCreatedLeavesTheOldOne) {
    put("/a/file", "old one");
    const FailingCall failing(Call::Write, ENOSPC);
    EXPECT_EQ(files_->createFile("/a/file", bytes("new"), {}).error().code, ENOSPC);
    EXPECT_EQ(contents("/a/file"), "old one");
    EXPECT_EQ(names("/a"), Names{"file"});
    EXPECT_EQ(files_->createFile("/absent/file", {}, {}).error().code, ENOENT);
}

TEST_F(AtomicWriteTest, APipeIsReplacedWithoutWaitingOnIt) {
    pipe("/a/pipe");
    EXPECT_TRUE(files_->createFile("/a/pipe", bytes("contents"), {}));
    EXPECT_EQ(contents("/a/pipe"), "contents");
}

TEST(TemporaryNameTest, IsRecognised) {
    EXPECT_TRUE(isTemporaryName(".todo.plist.appsync-a1b2c3"));
    EXPECT_TRUE(isTemporaryName(".x.appsync-zzzzzz"));
    for (const char* name :
         {"", ".", "todo.plist", "x.appsync-a1b2c3", ".x.appsync-a1b2c", ".x.appsync-A1B2C3",
          ".x.appsync-a1b2c3.plist", ".appsync-a1b2c3", ".x-appsync-a1b2c3"}) {
        EXPECT_FALSE(isTemporaryName(name)) << name;
    }
}

class TemporaryFileTest : public AtomicWriteTest {
  protected:
    /// The name of the temporary file that is made for a target.
    [[nodiscard]] std::string temporaryNameFor(const std::string& target) const {
        const auto file = TemporaryFile::create(files_->root(), "/a/" + target);
        EXPECT_TRUE(file);
        return names("/a").front();
    }
};

TEST_F(TemporaryFileTest, IsNamedAfterItsTarget) {
    const std::string name = temporaryNameFor("todo.plist");
    EXPECT_TRUE(name.starts_with(".todo.plist.appsync-")) << name;
    EXPECT_TRUE(isTemporaryName(name));
}

TEST_F(TemporaryFileTest, ALongNameIsCutBetweenCharacters) {
    std::string target;
    while (target.size() < 240) target += "\xE2\x82\xAC";
    const std::string name = temporaryNameFor(target);
    EXPECT_LE(name.size(), 255U);
    EXPECT_TRUE(isTemporaryName(name));
    EXPECT_EQ((name.size() - 16) % 3, 0U);
}

TEST_F(TemporaryFileTest, IsRemovedUnlessItIsCommitted) {
    {
        auto file = TemporaryFile::create(files_->root(), "/a/file");
        ASSERT_TRUE(file && file->write(bytes("new")));
        TemporaryFile moved = std::move(*file);
        EXPECT_EQ(names("/a").size(), 1U);
    }
    EXPECT_EQ(names("/a"), Names{});
}

class StaleTemporariesTest : public AtomicWriteTest {};

TEST_F(StaleTemporariesTest, AreClearedWhereverTheyStand) {
    put("/a/.file.appsync-a1b2c3", "");
    put("/a/b/c/.file.appsync-a1b2c3", "");
    put("/a/b/file", "kept");
    EXPECT_TRUE(files_->removeStaleTemporaries("/a"));
    EXPECT_EQ(names("/a"), Names{"b"});
    EXPECT_EQ(names("/a/b/c"), Names{});
    EXPECT_EQ(contents("/a/b/file"), "kept");
}

TEST_F(StaleTemporariesTest, AreRegularFilesOnly) {
    link("/a/.link.appsync-a1b2c3", outside() / "file");
    fs::create_directory(real("/a/.directory.appsync-a1b2c3"));
    pipe("/a/.pipe.appsync-a1b2c3");
    EXPECT_TRUE(files_->removeStaleTemporaries("/a"));
    EXPECT_EQ(names("/a").size(), 3U);
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(StaleTemporariesTest, AreNotThoseThatAreBeingWritten) {
    auto file = TemporaryFile::create(files_->root(), "/a/file");
    ASSERT_TRUE(file && file->write(bytes("new")));
    EXPECT_TRUE(files_->removeStaleTemporaries("/"));
    EXPECT_TRUE(file->commit());
    EXPECT_EQ(contents("/a/file"), "new");
}

TEST_F(StaleTemporariesTest, AreThoseOfAProcessThatWasKilled) {
    const pid_t child = ::fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        const auto file = TemporaryFile::create(files_->root(), "/a/file");
        ::kill(::getpid(), SIGKILL);
    }
    ASSERT_EQ(::waitpid(child, nullptr, 0), child);
    EXPECT_EQ(names("/a").size(), 1U);
    EXPECT_TRUE(files_->removeStaleTemporaries("/a"));
    EXPECT_EQ(names("/a"), Names{});
}

TEST_F(StaleTemporariesTest, OfADirectoryThatIsMissingAreNone) {
    EXPECT_TRUE(files_->removeStaleTemporaries("/absent"));
    put("/file", "");
    EXPECT_EQ(files_->removeStaleTemporaries("/file").error().description(),
              "cannot clear temporary files in /file: Not a directory");
}

TEST_F(StaleTemporariesTest, ThatCannotBeRemovedAreTold) {
    put("/a/.file.appsync-a1b2c3", "");
    for (const Call call : {Call::Unlinkat, Call::Flock, Call::Fstat}) {
        const FailingCall failing(call, EIO);
        EXPECT_EQ(files_->removeStaleTemporaries("/a").error().code, EIO);
    }
    EXPECT_EQ(names("/a").size(), 1U);
}

}  // namespace
}  // namespace appsync
