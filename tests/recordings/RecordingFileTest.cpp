#include "host/replay/RecordingFile.h"

#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "host/replay/RecordingReader.h"
#include "tests/recordings/SeededRecording.h"

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
