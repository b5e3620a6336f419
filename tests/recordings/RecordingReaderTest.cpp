#include "host/replay/RecordingReader.h"

#include <string>
#include <utility>
#include <vector>

#include "host/console/Problem.h"
#include "tests/recordings/SeededRecording.h"

namespace appsync {
namespace {

using testing::HasSubstr;

const std::string kHeader =
    R"({"recording":1,"plug-in":"1","process":"p","bundle":"b","anonymous":false})"
    "\n";
const std::string kHost = R"({"t":1,"w":1,"host":"makeClient"})"
                          "\n";

/// Why the recording is refused; empty when it is not.
std::string refusalOf(const std::string& text) {
    const Result<RecordedSession> session = readRecording(text);
    if (session) return "";
    EXPECT_EQ(exitStatusOf(session.error()), kExitUnusable);
    return session.error().description();
}

TEST(RecordingReader, ReadsWhatWasWritten) {
    const std::string text = SeededRecording(5).record();
    const Result<RecordedSession> session = readRecording(text);
    ASSERT_TRUE(session);
    EXPECT_FALSE(session->isCutOff);
    EXPECT_EQ(session->plugInVersion, "test");
    EXPECT_EQ(session->lines.front().name, "makeClient");
    EXPECT_EQ(session->lines.back().kind, RecordKind::Finished);
}

TEST(RecordingReader, KnowsTheFormatsOfMessagesByTheirNumbers) {
    const auto message = [](const std::string& format) {
        return R"({"t":1,"w":1,"call":"LogFacility.write","a":[8,0,)" + format + ",[]]}\n";
    };
    const std::string longest = '"' + std::string(257, 'x') + '"';
    const std::string lines = kHeader + kHost + message(R"("one")") + message(longest) +
                              message(R"({"bytes":"/w=="})") + message(R"("two")") + message("2") +
                              message("1");
    const Result<RecordedSession> session = readRecording(lines);
    ASSERT_TRUE(session);
    EXPECT_EQ(session->lines[5].arguments[2], "two");
    EXPECT_EQ(session->lines[6].arguments[2], "one");
    EXPECT_THAT(refusalOf(lines + message("3")), HasSubstr("its format is none"));
    EXPECT_THAT(refusalOf(kHeader + kHost + message("0")), HasSubstr("its format is none"));
}

TEST(RecordingReader, ReadsThisVersionAndTheOneBefore) {
    for (const char* version : {"1", "2"}) {
        std::string header = kHeader;
        header.replace(header.find('1'), 1, version);
        EXPECT_EQ(refusalOf(header + kHost), "");
    }
    EXPECT_THAT(refusalOf("{\"recording\":0}\n"), HasSubstr("reads versions 1 to 2"));
}

TEST(RecordingReader, LeavesOutALineThatWasBeingWritten) {
    const Result<RecordedSession> session = readRecording(kHeader + kHost + R"({"t":2,"w":1,"ca)");
    ASSERT_TRUE(session);
    EXPECT_EQ(session->lines.size(), 1U);
    EXPECT_TRUE(session->isCutOff);
}

TEST(RecordingReader, RefusesWhatIsNoRecording) {
    EXPECT_THAT(refusalOf(""), HasSubstr("it is empty"));
    EXPECT_THAT(refusalOf("rubbish"), HasSubstr("no header"));
    EXPECT_THAT(refusalOf("{}\n"), HasSubstr("no header"));
    EXPECT_THAT(refusalOf(std::string(100, '\0')), HasSubstr("it is empty"));
    EXPECT_THAT(refusalOf(std::string(100, '\0') + "{}\n"), HasSubstr("no header"));
    EXPECT_THAT(refusalOf("{\"recording\":1}\n"), HasSubstr("its header lacks something"));
    EXPECT_THAT(refusalOf("{\"recording\":7}\n"), HasSubstr("version 7"));
}

TEST(RecordingReader, RefusesALineThatIsTooLong) {
    const std::string longest(std::size_t{17} * 1024 * 1024, 'x');
    EXPECT_THAT(refusalOf(longest), HasSubstr("too long"));
    EXPECT_THAT(refusalOf(kHeader + longest + "\n"), HasSubstr("line 2"));
}

TEST(RecordingReader, RefusesBracketsThatNestTooDeep) {
    EXPECT_THAT(refusalOf(kHeader + std::string(100'000, '[') + "\n"), HasSubstr("no record"));
}

TEST(RecordingReader, RefusesLinesThatCannotStandThere) {
    const std::vector<std::pair<std::string, std::string>> cases = {
        {R"(rubbish)", "it is no record"},
        {R"({"t":2,"w":1})", "it tells of nothing"},
        {R"({"t":2,"w":1,"call":"A.b","run":"item"})", "two things"},
        {R"({"t":2,"call":"A.b"})", "when or by whom"},
        {R"({"t":-2,"w":1,"call":"A.b"})", "when or by whom"},
        {R"({"t":18446744073709551615,"w":1,"call":"A.b"})", "its time is none"},
        {R"({"t":0,"w":1,"call":"A.b"})", "older than the line before"},
        {R"({"t":2,"w":0,"call":"A.b"})", "its thread is none"},
        {R"({"t":2,"w":99,"call":"A.b"})", "its thread is none"},
        {R"({"t":2,"w":2,"call":"A.b"})", "nobody has called it"},
        {R"({"t":2,"w":1,"call":7})", "its name is none"},
        {R"({"t":2,"w":1,"call":"A.b","on":0})", "has no number"},
        {R"({"t":2,"w":1,"call":"A.b","a":7})", "its arguments are no list"},
        {R"({"t":2,"w":1,"call":"A.b","kept":7})", "what it keeps is no list"},
        {R"({"t":2,"w":1,"call":"A.b","kept":[7]})", "what it keeps is no text"},
        {R"({"t":2,"w":1,"host":"b"})", "the host calls while it is called"},
        {R"({"t":2,"w":2,"host":"b"})", "the host calls on two threads"},
        {R"({"t":2,"w":2,"run":"item","on":3})", "it runs what was not queued"},
        {R"({"t":2,"w":2,"end":true})", "it ends what has not begun"},
        {R"({"t":2,"w":1,"each":"AppProxy"})", "it is a piece of nothing"},
        {R"({"t":2,"w":1,"back":true})", "it comes back from no call"},
        {R"({"t":2,"w":2,"callback":"A.b"})", "does not say who is called"},
        {R"({"t":2,"w":1,"call":"OperationQueue.add","on":1})", "what it queues has no number"}};
    for (const auto& [line, why] : cases) {
        EXPECT_THAT(refusalOf(kHeader + kHost + line + "\n"), HasSubstr(why)) << line;
    }
}

TEST(RecordingReader, RefusesWhatWasReordered) {
    const std::string text = SeededRecording(5).record();
    const std::size_t first = text.find('\n') + 1;
    const std::size_t second = text.find('\n', first) + 1;
    const std::string reordered =
        text.substr(0, first) + text.substr(second) + text.substr(first, second - first);
    EXPECT_THAT(refusalOf(reordered), HasSubstr("line 2"));
}

TEST(RecordingReader, RefusesWhatFollowsTheEnd) {
    EXPECT_THAT(refusalOf(kHeader + R"({"t":1,"w":1,"finished":true})" + "\n" + kHost),
                HasSubstr("after the end"));
}

}  // namespace
}  // namespace appsync
