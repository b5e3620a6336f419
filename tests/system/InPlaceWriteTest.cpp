#include <cerrno>
#include <string>

#include <sys/stat.h>

#include "system/file/RootedFileSystem.h"
#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using device_files::bytes;
using device_files::Call;
using device_files::FailingCall;
using device_files::kForever;

class InPlaceWriteTest : public device_files::DeviceFilesTest {
  protected:
    ino_t inode() const {
        struct stat status {};
        EXPECT_EQ(::lstat(real(kFile).c_str(), &status), 0);
        return status.st_ino;
    }

    /// Writes that over a file with these contents; tells whether it is the same file afterwards.
    bool staysTheSame(const std::string& before, const std::string& after) {
        put(kFile, before);
        return staysTheSameWith(after);
    }
    bool staysTheSameWith(const std::string& after) {
        const ino_t first = inode();
        EXPECT_TRUE(files_->writeFileAtomically(std::string(kFile), bytes(after)));
        EXPECT_EQ(contents(kFile), after);
        return inode() == first;
    }

    static constexpr std::string_view kFile = "/file";
};

TEST_F(InPlaceWriteTest, ChangesBytesWithinOneWordInPlace) {
    EXPECT_TRUE(staysTheSame("01234567", "0123456x"));
    EXPECT_TRUE(staysTheSame("01234567", "x123456x"));
    EXPECT_TRUE(staysTheSame("0123456701234567", "01234567x1234567"));
    EXPECT_TRUE(staysTheSame("0", "1"));
    EXPECT_TRUE(staysTheSame("01234567012", "0123456701x"));
}

TEST_F(InPlaceWriteTest, WritesAnewWhatDiffersInTwoWords) {
    EXPECT_FALSE(staysTheSame("0123456701234567", "0123456xx1234567"));
    EXPECT_FALSE(staysTheSame("0123456701234567", "x12345670123456x"));
}

TEST_F(InPlaceWriteTest, WritesAnewWhatHasAnotherSize) {
    EXPECT_FALSE(staysTheSame("0123", "01234"));
    EXPECT_FALSE(staysTheSame("0123", "012"));
    EXPECT_FALSE(staysTheSame("", "0"));
}

TEST_F(InPlaceWriteTest, FindsAWordFarIntoALargeFile) {
    const std::string before(1'000'003, 'a');
    std::string after = before;
    after[1'000'002] = 'b';
    EXPECT_TRUE(staysTheSame(before, after));
    after[5] = 'b';
    EXPECT_TRUE(staysTheSameWith(after));
    after[5] = after[13] = 'c';
    EXPECT_FALSE(staysTheSameWith(after));
}

TEST_F(InPlaceWriteTest, LeavesAnotherNameOfTheFileAlone) {
    put(kFile, "0123");
    fs::create_hard_link(real(kFile), real("/other"));
    ASSERT_TRUE(files_->writeFileAtomically(std::string(kFile), bytes("0124")));
    EXPECT_EQ(contents(kFile), "0124");
    EXPECT_EQ(contents("/other"), "0123");
}

TEST_F(InPlaceWriteTest, LeavesWhatALinkLeadsToAlone) {
    put("/target", "0123");
    link(kFile, "/target");
    ASSERT_TRUE(files_->writeFileAtomically(std::string(kFile), bytes("0124")));
    EXPECT_EQ(contents("/target"), "0123");
    EXPECT_FALSE(fs::is_symlink(real(kFile)));
    EXPECT_EQ(contents(kFile), "0124");
}

TEST_F(InPlaceWriteTest, ReplacesAPipeWithoutWaiting) {
    pipe(kFile);
    ASSERT_TRUE(files_->writeFileAtomically(std::string(kFile), bytes("0")));
    EXPECT_EQ(contents(kFile), "0");
}

TEST_F(InPlaceWriteTest, LooksForTheFileOnce) {
    put(kFile, "0123");
    const FailingCall failing(Call::Openat2, EIO, kForever, 1);
    EXPECT_TRUE(staysTheSameWith("0124"));
}

TEST_F(InPlaceWriteTest, WritesAnewWhenAStepFails) {
    for (const Call call : {Call::Openat2, Call::Fstat, Call::Pread}) {
        put(kFile, "0123");
        const FailingCall failing(call, EIO, 1);
        EXPECT_FALSE(staysTheSameWith("0124"));
        EXPECT_EQ(failing.failures(), 1);
    }
}

}  // namespace
}  // namespace appsync
