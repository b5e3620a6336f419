#include "system/LogFile.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <fstream>
#include <limits>
#include <optional>
#include <thread>

#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using device_files::Call;
using device_files::FailingCall;
using Lines = std::vector<std::string>;

constexpr off_t kMost = std::numeric_limits<off_t>::max();

class LogFileTest : public ::testing::Test {
  protected:
    /// Where a part holds two of the lines below.
    static constexpr LogLimits kTwoLines{
        .part = 10, .scarceSpace = 0, .shortPart = 10, .unawareness = {}};

    [[nodiscard]] LogFile open(const LogLimits& limits = kTwoLines) const {
        return LogFile::open(path(), limits).value();
    }
    static void append(LogFile& log, const Lines& lines) {
        for (const std::string& line : lines) EXPECT_EQ(log.append(line), 0) << line;
    }
    [[nodiscard]] fs::path directory() const { return scratch_.path() / "log"; }
    [[nodiscard]] fs::path path() const { return directory() / "system.log"; }
    [[nodiscard]] Lines current() const { return linesOf(path()); }
    [[nodiscard]] Lines older() const { return linesOf(olderPartOf(path())); }
    static Lines linesOf(const fs::path& file) {
        Lines result;
        std::ifstream stream(file);
        for (std::string line; std::getline(stream, line);) result.push_back(line);
        return result;
    }

    device_files::ScratchDirectory scratch_;
};

TEST_F(LogFileTest, AppendsToWhatIsThere) {
    LogFile first = open();
    append(first, {"1234"});
    LogFile second = open();
    append(second, {"5678"});
    EXPECT_EQ(current(), (Lines{"1234", "5678"}));
    EXPECT_FALSE(fs::exists(olderPartOf(path())));
}

TEST_F(LogFileTest, ALineThatWouldPassTheLimitBeginsAFileAndTheOlderPartIsKeptOnce) {
    LogFile log = open();
    append(log, {"1111", "2222", "3333"});
    EXPECT_EQ(older(), (Lines{"1111", "2222"}));
    EXPECT_EQ(current(), (Lines{"3333"}));
    append(log, {"4444", "5555"});
    EXPECT_EQ(older(), (Lines{"3333", "4444"}));
    EXPECT_EQ(current(), (Lines{"5555"}));
    EXPECT_EQ(std::distance(fs::directory_iterator(directory()), fs::directory_iterator()), 2);
}

TEST_F(LogFileTest, ALineThatIsLongerThanAPartHasOneToItself) {
    LogFile log = open();
    append(log, {std::string(20, 'x'), "1234"});
    EXPECT_EQ(older(), Lines{std::string(20, 'x')});
    EXPECT_EQ(current(), Lines{"1234"});
}

TEST_F(LogFileTest, PartsAreShortWhereSpaceIsScarce) {
    LogFile plenty = open({.part = 100, .scarceSpace = 0, .shortPart = 10});
    append(plenty, {"1111", "2222", "3333"});
    EXPECT_EQ(older(), Lines());
    LogFile scarce = open({.part = 100, .scarceSpace = kMost, .shortPart = 10});
    append(scarce, {"4444", "5555", "6666"});
    EXPECT_EQ(older(), (Lines{"1111", "2222", "3333", "4444"}));
    EXPECT_EQ(current(), (Lines{"5555", "6666"}));
    append(scarce, {"7777"});
    EXPECT_EQ(older(), (Lines{"5555", "6666"}));
}

TEST_F(LogFileTest, WhoHasTheFileOpenFollowsToTheNext) {
    LogFile one = open();
    LogFile other = open();
    append(other, {"1111"});
    append(one, {"2222", "3333"});
    append(other, {"4444"});
    EXPECT_EQ(older(), (Lines{"1111", "2222"}));
    EXPECT_EQ(current(), (Lines{"3333", "4444"}));
}

TEST_F(LogFileTest, NoLineIsLostWhileManyPutTheFileAside) {
    // Each its own descriptors, as processes have.
    constexpr int kWriters = 4;
    constexpr int kLines = 500;
    std::vector<std::thread> writers;
    for (int writer = 0; writer < kWriters; ++writer) {
        writers.emplace_back([this, writer] {
            LogFile log =
                open({.part = 8000, .scarceSpace = 0, .shortPart = 8000, .unawareness = {}});
            for (int line = 0; line < kLines; ++line) {
                EXPECT_EQ(log.append(std::to_string(1000 + writer * kLines + line)), 0);
            }
        });
    }
    for (std::thread& writer : writers) writer.join();
    // 2,000 lines of 5 bytes: one full part, and the rest, but for lines on their way meanwhile.
    Lines all = older();
    const Lines rest = current();
    all.insert(all.end(), rest.begin(), rest.end());
    std::sort(all.begin(), all.end());
    ASSERT_EQ(all.size(), 2000U);
    for (std::size_t i = 0; i < all.size(); ++i) EXPECT_EQ(all[i], std::to_string(1000 + i));
    EXPECT_GE(older().size(), 1600U);
}

TEST_F(LogFileTest, WhoHasJustLookedWritesIntoThePartThatWasPutAside) {
    LogLimits unaware = kTwoLines;
    unaware.unawareness = std::chrono::hours(1);
    LogFile one = open(unaware);
    LogFile other = open();
    append(one, {"1111"});
    append(other, {"2222", "3333"});
    append(one, {"4444"});
    EXPECT_EQ(older(), (Lines{"1111", "2222", "4444"}));
    // Where its own lines fill the part it looks again, and takes nothing aside a second time.
    append(one, {"5555"});
    EXPECT_EQ(older(), (Lines{"1111", "2222", "4444"}));
    EXPECT_EQ(current(), (Lines{"3333", "5555"}));
}

TEST_F(LogFileTest, WhoDoesNotGetTheLockWritesOn) {
    LogFile log = open();
    append(log, {"1111", "2222"});
    {
        const FailingCall busy(Call::Flock, EWOULDBLOCK);
        append(log, {"3333"});
    }
    EXPECT_EQ(current(), (Lines{"1111", "2222", "3333"}));
    append(log, {"4444"});
    EXPECT_EQ(current(), (Lines{"4444"}));
}

TEST_F(LogFileTest, WhatCannotBePutAsideGrowsNoFurther) {
    LogFile log = open();
    append(log, {"1111", "2222"});
    {
        const FailingCall failing(Call::Renameat, EACCES);
        EXPECT_EQ(log.append("3333"), EACCES);
    }
    EXPECT_EQ(current(), (Lines{"1111", "2222"}));
    append(log, {"4444"});
    EXPECT_EQ(current(), (Lines{"4444"}));
}

TEST_F(LogFileTest, AFileThatCannotBeMadeIsTriedWithEachLine) {
    LogFile log = open();
    append(log, {"1111", "2222"});
    {
        const FailingCall failing(Call::Openat, ENOSPC);
        EXPECT_EQ(log.append("3333"), ENOSPC);
        EXPECT_EQ(log.append("4444"), ENOSPC);
    }
    append(log, {"5555"});
    EXPECT_EQ(older(), (Lines{"1111", "2222"}));
    EXPECT_EQ(current(), (Lines{"5555"}));
}

TEST_F(LogFileTest, OpensAlthoughNoFileCanBeMadeYet) {
    std::optional<LogFile> log;
    {
        const FailingCall failing(Call::Openat, EACCES);
        log = LogFile::open(path());
        ASSERT_TRUE(log);
        EXPECT_EQ(log->append("1111"), EACCES);
    }
    append(*log, {"2222"});
    EXPECT_EQ(current(), Lines{"2222"});
}

TEST_F(LogFileTest, AFileThatIsTakenAwayIsMadeAnew) {
    LogFile log = open();
    append(log, {"1111"});
    fs::remove(path());
    append(log, {"2222"});
    EXPECT_EQ(current(), Lines{"2222"});
}

TEST_F(LogFileTest, ADirectoryThatIsTakenAwayIsMadeAnew) {
    LogFile log = open();
    append(log, {"1111"});
    fs::remove_all(directory());
    append(log, {"2222"});
    EXPECT_EQ(current(), Lines{"2222"});
    LogFile other = open();
    fs::remove_all(directory());
    append(other, {"3333"});
    append(log, {"4444"});
    EXPECT_EQ(current(), (Lines{"3333", "4444"}));
}

TEST_F(LogFileTest, ALineAfterAnEarlierProcessesHalfOneIsWhole) {
    fs::create_directory(directory());
    std::ofstream(path()) << "1111\n22";
    LogFile log = open({});
    append(log, {"3333"});
    EXPECT_EQ(current(), (Lines{"1111", "22", "3333"}));
}

TEST_F(LogFileTest, SomethingElseInItsPlaceIsRefused) {
    fs::create_directory(directory());
    fs::create_symlink(scratch_.path() / "elsewhere", path());
    EXPECT_FALSE(LogFile::open(path()));
    fs::remove(path());
    ASSERT_EQ(::mkfifo(path().c_str(), 0600), 0);
    EXPECT_FALSE(LogFile::open(path()));
    fs::remove_all(directory());
    fs::create_directory_symlink(scratch_.path(), directory());
    EXPECT_FALSE(LogFile::open(path()));
}

TEST_F(LogFileTest, NothingIsWrittenToWhatTakesItsPlace) {
    LogFile log = open();
    append(log, {"1111"});
    fs::remove(path());
    fs::create_symlink(scratch_.path() / "elsewhere", path());
    EXPECT_EQ(log.append("2222"), ELOOP);
    EXPECT_FALSE(fs::exists(scratch_.path() / "elsewhere"));
    fs::remove(path());
    ASSERT_EQ(::mkfifo(path().c_str(), 0600), 0);
    EXPECT_EQ(log.append("3333"), ENXIO);
}

}  // namespace
}  // namespace appsync
