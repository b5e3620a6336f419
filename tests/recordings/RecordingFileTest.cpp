#include "host/replay/RecordingFile.h"

#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <deque>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "host/console/Console.h"
#include "host/replay/RecordingReader.h"
#include "tests/recordings/SeededRecording.h"

namespace appsync {
namespace {

/// The next calls of fallocate fail with these.
std::deque<int> roomFailures;

}  // namespace
}  // namespace appsync

// The linker sends every call of fallocate to the first, and of the second to the system.
extern "C" {

int __real_fallocate(int file, int mode, off_t offset, off_t length);
int __wrap_fallocate(int file, int mode, off_t offset, off_t length) {
    if (appsync::roomFailures.empty()) return __real_fallocate(file, mode, offset, length);
    errno = appsync::roomFailures.front();
    appsync::roomFailures.pop_front();
    return -1;
}

}  // extern "C"

namespace appsync {
namespace {

struct RecordingFileTest : testing::Test {
    RecordingFileTest()
        : path(testing::TempDir() + "recording." + std::to_string(::getpid()) + "." +
               testing::UnitTest::GetInstance()->current_test_info()->name()) {}
    RecordingFileTest(const RecordingFileTest&) = delete;
    RecordingFileTest& operator=(const RecordingFileTest&) = delete;
    ~RecordingFileTest() override { std::filesystem::remove(path); }

    [[nodiscard]] std::string contents() const {
        std::ostringstream text;
        text << std::ifstream(path).rdbuf();
        return text.str();
    }

    /// The text as it stands in the file while its piece is mapped.
    static std::string withPiece(std::string text) {
        constexpr std::size_t kPiece = std::size_t{256} * 1024;
        text.resize(kPiece, '\0');
        return text;
    }

    const std::string path;
};

TEST_F(RecordingFileTest, HoldsItsLinesAndNothingElse) {
    {
        const auto file = *RecordingFile::create(path);
        file->write("one\n");
        file->write("two\n");
    }
    EXPECT_EQ(contents(), "one\ntwo\n");
}

TEST_F(RecordingFileTest, TakesALineThatIsLongerThanItsPieces) {
    const std::string line = std::string(1'000'000, 'x') + "\n";
    {
        const auto file = *RecordingFile::create(path);
        file->write(line);
        file->write("one\n");
    }
    EXPECT_EQ(contents(), line + "one\n");
}

TEST_F(RecordingFileTest, LosesNothingToASignalAndIsWrittenLineByLineWhereThereAreNoPieces) {
    for (const int error : {EINTR, EOPNOTSUPP}) {
        std::filesystem::remove(path);
        roomFailures = {error};
        {
            const auto file = *RecordingFile::create(path);
            EXPECT_EQ(roomFailures.size(), 0U);
            file->write("one\n");
            EXPECT_EQ(contents(), error == EINTR ? withPiece("one\n") : "one\n");
        }
        EXPECT_EQ(contents(), "one\n");
    }
}

TEST_F(RecordingFileTest, EndsWithItsLastWholeLineWhereTheDiskIsFull) {
    const std::string line = std::string(100'000, 'x') + "\n";
    std::ostringstream out;
    std::ostringstream err;
    {
        const auto file = *RecordingFile::create(path);
        roomFailures = {ENOSPC};
        for (int i = 0; i < 4; ++i) file->write(line);
        file->tellLoss(Console{out, err});
    }
    EXPECT_TRUE(contents().starts_with(line + line));
    EXPECT_EQ(contents().find('\n', 2 * line.size()), std::string::npos);
    EXPECT_THAT(err.str(), testing::HasSubstr("No space left on device"));
}

TEST_F(RecordingFileTest, IsNotKeptWhereTheDiskHasNoRoomForItsFirstLine) {
    roomFailures = {ENOSPC};
    std::ostringstream out;
    std::ostringstream err;
    {
        const auto file = *RecordingFile::create(path);
        file->write("a line\n");
        file->tellLoss(Console{out, err});
    }
    EXPECT_EQ(err.str(),
              "appsync: the recording " + path + " is not kept: write: No space left on device\n");
    EXPECT_FALSE(std::filesystem::exists(path));
}

TEST_F(RecordingFileTest, BelongsToOneSessionBeforeItsFirstLine) {
    roomFailures = {EOPNOTSUPP};
    const auto file = *RecordingFile::create(path);
    ASSERT_EQ(std::filesystem::file_size(path), 0U);
    EXPECT_FALSE(static_cast<bool>(RecordingFile::create(path)));
}

TEST_F(RecordingFileTest, IsGoneWhenNothingWasWritten) {
    static_cast<void>(*RecordingFile::create(path));
    EXPECT_FALSE(std::filesystem::exists(path));
}

TEST_F(RecordingFileTest, LosesNoLineToAKill) {
    const std::string text = SeededRecording(5).record();
    const pid_t child = ::fork();
    if (child == 0) {
        const auto file = *RecordingFile::create(path);
        std::istringstream lines(text);
        for (std::string line; std::getline(lines, line);) file->write(line + "\n");
        file->write("{\"t\"");
        ::raise(SIGKILL);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    ASSERT_TRUE(WIFSIGNALED(status));
    EXPECT_EQ(contents().substr(0, text.size()), text);
    const Result<RecordedSession> session = readRecordingFile(path);
    ASSERT_TRUE(session);
    EXPECT_EQ(session->lines.size(), readRecording(text)->lines.size());
}

}  // namespace
}  // namespace appsync
