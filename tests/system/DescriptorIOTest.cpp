#include "system/file/DescriptorIO.h"

#include <array>
#include <cerrno>

#include <fcntl.h>
#include <unistd.h>

#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

using device_files::bytes;
using device_files::Call;
using device_files::FailingCall;
using device_files::kForever;
using device_files::text;

class DescriptorIOTest : public ::testing::Test {
  protected:
    DescriptorIOTest()
        : file_(::open((scratch_.path() / "file").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600)) {}

    void fill(std::string_view contents) {
        ASSERT_EQ(writeWhole(file_.get(), bytes(contents)).error, 0);
        ASSERT_EQ(::lseek(file_.get(), 0, SEEK_SET), 0);
    }

    device_files::ScratchDirectory scratch_;
    UniqueFd file_;
};

TEST_F(DescriptorIOTest, ReadsMoreThanWasExpected) {
    const std::string contents(100'000, 'x');
    fill(contents);
    Bytes read;
    EXPECT_EQ(readWhole(file_.get(), 0, 1'000'000, read), 0);
    EXPECT_EQ(text(read), contents);
}

TEST_F(DescriptorIOTest, ReadsLessThanWasExpected) {
    fill("short");
    Bytes read;
    EXPECT_EQ(readWhole(file_.get(), 5000, 1'000'000, read), 0);
    EXPECT_EQ(text(read), "short");
}

TEST_F(DescriptorIOTest, AFileThatGrowsBeyondTheLimitIsRefused) {
    fill("123456");
    Bytes read;
    EXPECT_EQ(readWhole(file_.get(), 1, 5, read), EFBIG);
}

TEST_F(DescriptorIOTest, AFileOfExactlyTheLimitIsRead) {
    fill("12345");
    Bytes read;
    EXPECT_EQ(readWhole(file_.get(), 5, 5, read), 0);
    EXPECT_EQ(text(read), "12345");
}

TEST_F(DescriptorIOTest, ASignalInterruptsNeitherReadingNorWriting) {
    {
        const FailingCall failing(Call::Write, EINTR, 3);
        fill("contents");
    }
    const FailingCall failing(Call::Read, EINTR, 3);
    Bytes read;
    EXPECT_EQ(readWhole(file_.get(), 8, 100, read), 0);
    EXPECT_EQ(text(read), "contents");
}

TEST_F(DescriptorIOTest, WhatIsAsLongAsExpectedTakesOneRead) {
    fill("contents");
    const FailingCall failing(Call::Read, EIO, kForever, 1);
    Bytes read;
    EXPECT_EQ(readWhole(file_.get(), 8, 100, read), 0);
    EXPECT_EQ(text(read), "contents");
}

TEST_F(DescriptorIOTest, AFailedReadIsTold) {
    fill("contents");
    const FailingCall failing(Call::Read, EIO);
    Bytes read;
    EXPECT_EQ(readWhole(file_.get(), 8, 100, read), EIO);
    EXPECT_EQ(copyWhole(file_.get(), file_.get()), EIO);
}

TEST_F(DescriptorIOTest, AFailedWriteTellsHowFarItCame) {
    std::array<int, 2> ends{};
    ASSERT_EQ(::pipe2(ends.data(), O_NONBLOCK | O_CLOEXEC), 0);
    const UniqueFd reader(ends[0]);
    const UniqueFd writer(ends[1]);
    const WriteOutcome outcome = writeWhole(writer.get(), Bytes(1'000'000));
    EXPECT_EQ(outcome.error, EAGAIN);
    EXPECT_GT(outcome.written, 0U);
    EXPECT_LT(outcome.written, 1'000'000U);
}

TEST_F(DescriptorIOTest, CopiesWhatIsLargerThanItsBuffer) {
    const std::string contents(1'000'000, 'x');
    fill(contents);
    const UniqueFd copy(
        ::open((scratch_.path() / "copy").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600));
    ASSERT_EQ(copyWhole(file_.get(), copy.get()), 0);
    EXPECT_EQ(std::filesystem::file_size(scratch_.path() / "copy"), contents.size());
}

TEST_F(DescriptorIOTest, ACopyThatCannotBeWrittenIsTold) {
    fill("contents");
    const UniqueFd readOnly(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    EXPECT_EQ(copyWhole(file_.get(), readOnly.get()), EBADF);
}

}  // namespace
}  // namespace appsync
