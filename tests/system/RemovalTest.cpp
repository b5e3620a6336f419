#include <atomic>
#include <cerrno>
#include <cstdio>
#include <functional>
#include <string>
#include <thread>

#include <fcntl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <unistd.h>

#include "system/file/RootedFileSystem.h"
#include "system/file/TreeWalk.h"
#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using device_files::Call;
using device_files::FailingCall;
using device_files::kForever;

class RemovalTest : public device_files::DeviceFilesTest {
  protected:
    /// A chain of directories under `top`, each called "d", with a file in the last.
    void makeChain(const fs::path& top, int depth) const {
        fs::create_directory(top);
        UniqueFd current(::open(top.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        for (int level = 1; level < depth; ++level) {
            ASSERT_EQ(::mkdirat(current.get(), "d", 0700), 0);
            current.reset(::openat(current.get(), "d", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
        }
        EXPECT_TRUE(UniqueFd(::openat(current.get(), "file", O_WRONLY | O_CREAT, 0600)));
    }
};

/// Lets the process open only so many more files while it lives.
class DescriptorLimit {
  public:
    explicit DescriptorLimit(rlim_t count) {
        ::getrlimit(RLIMIT_NOFILE, &before_);
        const rlimit lower{count, before_.rlim_max};
        ::setrlimit(RLIMIT_NOFILE, &lower);
    }
    DescriptorLimit(const DescriptorLimit&) = delete;
    DescriptorLimit& operator=(const DescriptorLimit&) = delete;
    ~DescriptorLimit() { ::setrlimit(RLIMIT_NOFILE, &before_); }

  private:
    rlimit before_{};
};

TEST_F(RemovalTest, RemovesAFile) {
    put("/file", "");
    EXPECT_TRUE(files_->removeItem("/file"));
    EXPECT_FALSE(fs::exists(real("/file")));
}

TEST_F(RemovalTest, WhatIsNotThereCannotBeRemoved) {
    EXPECT_EQ(files_->removeItem("/absent").error().description(),
              "cannot remove /absent: No such file or directory");
    EXPECT_EQ(files_->removeItem("/absent/file").error().code, ENOENT);
}

TEST_F(RemovalTest, TheRootIsNotRemoved) {
    put("/a/file", "");
    for (const char* path : {"/", "/a/..", "/a/.", "", "a"}) {
        EXPECT_EQ(files_->removeItem(path).error().code, EINVAL) << path;
    }
    EXPECT_EQ(contents("/a/file"), "");
}

TEST_F(RemovalTest, RemovesALinkAndNotItsTarget) {
    put("/target/file", "kept");
    link("/inside", "/target");
    link("/escape", outside());
    EXPECT_TRUE(files_->removeItem("/inside"));
    EXPECT_TRUE(files_->removeItem("/escape/"));
    EXPECT_EQ(contents("/target/file"), "kept");
    EXPECT_TRUE(outsideIsUntouched());
    EXPECT_EQ(names("/"), (std::vector<std::string>{"target", "tmp"}));
}

TEST_F(RemovalTest, RemovesADirectoryWithEverythingInIt) {
    put("/a/one/file", "");
    put("/a/two/three/file", "");
    put("/a/file", "");
    pipe("/a/pipe");
    link("/a/one/link", outside());
    link("/a/dangling", "/absent");
    EXPECT_TRUE(files_->removeItem("/a"));
    EXPECT_FALSE(fs::exists(real("/a")));
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(RemovalTest, ALinkOnTheWayIsResolvedInside) {
    link("/escape", outside());
    EXPECT_EQ(files_->removeItem("/escape/file").error().code, ENOENT);
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(RemovalTest, RemovesATreeOfTenThousandLevelsWithFewDescriptors) {
    makeChain(real("/deep"), 10'000);
    const DescriptorLimit limit(64);
    const Status removed = files_->removeItem("/deep");
    EXPECT_TRUE(removed) << removed.error().description();
    EXPECT_FALSE(fs::exists(real("/deep")));
}

TEST_F(RemovalTest, RemovesAWideTree) {
    for (int i = 0; i < 500; ++i) {
        fs::create_directories(real("/wide/" + std::to_string(i) + "/d"));
        put("/wide/file" + std::to_string(i), "");
    }
    EXPECT_TRUE(files_->removeItem("/wide"));
    EXPECT_FALSE(fs::exists(real("/wide")));
}

TEST_F(RemovalTest, AFailureNamesTheItemInside) {
    put("/a/b/file", "");
    // The first call asks whether /a is a file.
    const FailingCall failing(Call::Unlinkat, EPERM, 1, 1);
    EXPECT_EQ(files_->removeItem("/a").error().description(),
              "cannot remove /a/b/file: Operation not permitted");
    EXPECT_EQ(contents("/a/b/file"), "");
}

TEST_F(RemovalTest, ADirectoryThatCannotBeRemovedIsNamed) {
    put("/a/b/file", "");
    const FailingCall failing(Call::RemoveDirectory, EBUSY);
    EXPECT_EQ(files_->removeItem("/a").error().description(),
              "cannot remove /a/b: Device or resource busy");
}

TEST_F(RemovalTest, ADirectoryThatCannotBeOpenedIsNamed) {
    fs::create_directories(real("/a/b"));
    const FailingCall failing(Call::Openat, EACCES, kForever, 1);
    EXPECT_EQ(files_->removeItem("/a").error().description(),
              "cannot remove /a/b: Permission denied");
}

TEST_F(RemovalTest, ADirectoryThatCannotBeExaminedIsTold) {
    makeChain(real("/a"), 20);
    const FailingCall failing(Call::Fstat, EIO);
    EXPECT_EQ(files_->removeItem("/a").error().code, EIO);
}

TEST_F(RemovalTest, NoDirectoryOfAFlatTreeIsExamined) {
    put("/a/b/c/file", "");
    const FailingCall failing(Call::Fstat, EIO);
    EXPECT_TRUE(files_->removeItem("/a"));
    EXPECT_FALSE(fs::exists(real("/a")));
}

TEST_F(RemovalTest, WhatWasAddedMeanwhileIsRemovedToo) {
    put("/a/file", "");
    const FailingCall failing(Call::RemoveDirectory, ENOTEMPTY, 3);
    EXPECT_TRUE(files_->removeItem("/a"));
    EXPECT_EQ(failing.failures(), 3);
}

TEST_F(RemovalTest, ADirectoryThatNeverGetsEmptyIsGivenUp) {
    put("/a/file", "");
    const FailingCall failing(Call::RemoveDirectory, ENOTEMPTY);
    EXPECT_EQ(files_->removeItem("/a").error().code, ENOTEMPTY);
}

TEST_F(RemovalTest, WhatVanishesMeanwhileIsNoFailure) {
    put("/a/b/file", "");
    const FailingCall failing(Call::Unlinkat, ENOENT, 1, 1);
    // It was said to be gone and is not, so that its directory is visited again.
    EXPECT_TRUE(files_->removeItem("/a"));
    EXPECT_FALSE(fs::exists(real("/a")));
}

/// Walks "/a" with actions that remove, and that do something else as well when they meet a name.
class TreeWalkTest : public RemovalTest {
  protected:
    Status walkAndAt(const std::string& trigger, const std::function<void()>& event) {
        TreeActions actions;
        actions.item = [&](int directory, const std::string& name) {
            if (name == trigger) event();
            return ::unlinkat(directory, name.c_str(), 0) == 0 ? 0 : errno;
        };
        actions.afterDirectory = [](int parent, const std::string& name) {
            return ::unlinkat(parent, name.c_str(), AT_REMOVEDIR) == 0 ? 0 : errno;
        };
        return walkTree(files_->root().descriptor(), "a", actions, "remove", "/a");
    }
};

TEST_F(TreeWalkTest, ADirectoryThatIsMovedOutMeanwhileEndsTheWalk) {
    put("/a/b/c/trigger", "");
    put("/a/file", "");
    const Status walked =
        walkAndAt("trigger", [&] { fs::rename(real("/a/b/c"), scratch_.path() / "elsewhere"); });
    ASSERT_FALSE(walked);
    EXPECT_EQ(walked.error().description(),
              "cannot remove /a/b/c: a directory was moved away meanwhile");
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(TreeWalkTest, ADirectoryThatBecomesALinkMeanwhileIsNotEntered) {
    put("/a/b/trigger", "");
    fs::create_directory(real("/a/b/victim"));
    // Entries are met before directories are entered.
    EXPECT_TRUE(walkAndAt("trigger", [&] {
        fs::remove(real("/a/b/victim"));
        fs::create_symlink(outside(), real("/a/b/victim"));
    }));
    EXPECT_FALSE(fs::exists(real("/a")));
    EXPECT_TRUE(outsideIsUntouched());
}

TEST_F(TreeWalkTest, ADirectoryThatVanishesMeanwhileIsPassedOver) {
    put("/a/b/trigger", "");
    fs::create_directory(real("/a/b/victim"));
    EXPECT_TRUE(walkAndAt("trigger", [&] { fs::remove(real("/a/b/victim")); }));
    EXPECT_FALSE(fs::exists(real("/a")));
}

TEST_F(TreeWalkTest, AFileThatBecomesADirectoryMeanwhileIsEntered) {
    put("/a/b/trigger", "");
    EXPECT_TRUE(walkAndAt("trigger", [&] {
        fs::remove(real("/a/b/trigger"));
        fs::create_directories(real("/a/b/trigger/inside"));
    }));
    EXPECT_FALSE(fs::exists(real("/a")));
}

TEST_F(RemovalTest, LinksThatAreSwappedInMeanwhileLeadNowhereOutside) {
    std::atomic<bool> isOver = false;
    link("/link", outside());
    std::thread swapper([&] {
        while (!isOver) {
            ::renameat2(AT_FDCWD, real("/a/b").c_str(), AT_FDCWD, real("/link").c_str(),
                        RENAME_EXCHANGE);
        }
    });
    for (int i = 0; i < 300; ++i) {
        std::error_code ignored;
        fs::create_directories(real("/a/b"), ignored);
        // Whether it succeeds depends on who is first; that nothing outside is touched does not.
        files_->removeItem("/a").ignore();
        files_->removeItem("/a/b/file").ignore();
        EXPECT_FALSE(files_->readFile("/a/b/file"));
    }
    isOver = true;
    swapper.join();
    EXPECT_TRUE(outsideIsUntouched());
}

}  // namespace
}  // namespace appsync
