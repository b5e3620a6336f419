#include "system/ActingAccount.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>
#include <string>
#include <thread>

#include "tests/system/DeviceFilesTest.h"

namespace appsync {
namespace {

constexpr uid_t kSomebody = 12345;
constexpr uid_t kAnother = 54321;

/// Whose a file is that this thread makes there.
uid_t ownerOfNew(const std::string& path) {
    std::ofstream(path) << "x";
    struct stat status = {};
    EXPECT_EQ(::stat(path.c_str(), &status), 0) << path;
    return status.st_uid;
}

bool mayBeSomebodyElse() {
    bool may = false;
    std::thread([&may] {
        actOnThisThreadAs(kSomebody, kSomebody);
        may = ::geteuid() == kSomebody;
    }).join();
    return may;
}

class ActingAccount : public ::testing::Test {
  protected:
    void SetUp() override {
        if (::geteuid() != 0) GTEST_SKIP() << "only root can be somebody else";
        if (!mayBeSomebodyElse()) GTEST_SKIP() << "this machine lets nobody be somebody else";
    }

    [[nodiscard]] std::string path(const char* name) const {
        return (directory_.path() / name).string();
    }

  private:
    const device_files::ScratchDirectory directory_;
};

TEST_F(ActingAccount, OfOneThreadIsThatOfItAloneAndOfThoseThatItStarts) {
    uid_t own = 0;
    uid_t started = 0;
    std::thread([&] {
        actOnThisThreadAs(kSomebody, kSomebody);
        own = ownerOfNew(path("own"));
        std::thread([&] { started = ownerOfNew(path("started")); }).join();
    }).join();
    EXPECT_EQ(own, kSomebody);
    EXPECT_EQ(started, kSomebody);
    EXPECT_EQ(ownerOfNew(path("other")), 0U);
}

// The directory is root's, and closed to everybody else.
TEST_F(ActingAccount, OfOneThreadMayBecomeAnother) {
    std::thread([&] {
        actOnThisThreadAs(kSomebody, kSomebody);
        actOnThisThreadAs(kAnother, kAnother);
        EXPECT_EQ(ownerOfNew(path("another")), kAnother);
        actOnThisThreadAs(0, kAnother);
        EXPECT_EQ(ownerOfNew(path("root")), 0U);
    }).join();
}

TEST_F(ActingAccount, OfOneThreadStaysWhereTheProcessWouldChange) {
    std::thread([&] {
        actOnThisThreadAs(0, 0);
        actAs(kSomebody, kSomebody);
        EXPECT_EQ(ownerOfNew(path("mine")), 0U);
    }).join();
    EXPECT_EQ(ownerOfNew(path("other")), 0U);
}

}  // namespace
}  // namespace appsync
