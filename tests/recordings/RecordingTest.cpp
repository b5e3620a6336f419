#include "recording/Recording.h"

#include <algorithm>
#include <atomic>
#include <string>
#include <thread>

#include "host/replay/RecordingReader.h"
#include "tests/recordings/SeededRecording.h"

namespace appsync {
namespace {

using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Not;
using testing::StartsWith;

/// A recording whose clock stands still.
struct RecordingFixture : testing::Test {
    RecordingFixture() : recording(make({})) {}

    std::shared_ptr<Recording> make(RecordingOptions options) {
        options.clock = [] { return std::chrono::nanoseconds(0); };
        return std::make_shared<Recording>(sink, world.platform.host, "1.2", std::move(options));
    }
    /// The last line that was written.
    [[nodiscard]] std::string last() const {
        const std::size_t end = sink.text.size() - 1;
        const std::size_t begin = sink.text.rfind('\n', end - 1) + 1;
        return sink.text.substr(begin, end - begin);
    }

    World world;
    TextSink sink;
    std::shared_ptr<Recording> recording;
};

TEST_F(RecordingFixture, BeginsWithAHeader) {
    EXPECT_THAT(sink.text,
                StartsWith(R"({"recording":2,"plug-in":"1.2","process":"com.korvu.trd")"));
}

TEST_F(RecordingFixture, WritesACallWithItsArgumentsAndItsAnswer) {
    EXPECT_TRUE(CallRecord(*recording, "A.b", 0, "x\n\"", 7, true).answer(true));
    EXPECT_EQ(last(), R"({"t":0,"w":1,"call":"A.b","a":["x\u000a\"",7,true],"r":true})");
}

TEST_F(RecordingFixture, EscapesACharacterWhereverItStands) {
    constexpr std::size_t kLength = 20;
    for (std::size_t place = 0; place < kLength; ++place) {
        std::string text(kLength, 'x');
        text[place] = '"';
        CallRecord(*recording, "A.b", 0, text).announce();
        text.insert(place, 1, '\\');
        EXPECT_THAT(last(), HasSubstr("[\"" + text + "\"]"));
    }
}

TEST_F(RecordingFixture, WritesLinesOfAnyLength) {
    for (std::size_t length = 1; length < 2000; length = length * 3 / 2 + 1) {
        const std::string text(length, 'x');
        CallRecord(*recording, CallName("A.", "b"), 0, text, 7, text).announce();
        EXPECT_EQ(last(),
                  "{\"t\":0,\"w\":1,\"call\":\"A.b\",\"a\":[\"" + text + "\",7,\"" + text + "\"]}");
    }
}

TEST_F(RecordingFixture, WritesTextThatIsNoUtf8) {
    CallRecord(*recording, "A.b", 0, "\xff").announce();
    EXPECT_THAT(last(), HasSubstr(R"("a":[{"bytes":"/w=="}])"));
}

TEST_F(RecordingFixture, WritesTheFormatOfAMessageOnce) {
    const auto write = [this](std::string_view format) {
        CallRecord(*recording, "LogFacility.write", 0, 8, MessageFormat{format}, 7).announce();
        return last().substr(last().find("\"a\""));
    };
    EXPECT_EQ(write("one \"%d\""), R"("a":[8,"one \"%d\"",7]})");
    EXPECT_EQ(write("two"), R"("a":[8,"two",7]})");
    EXPECT_EQ(write("one \"%d\""), R"("a":[8,1,7]})");
    EXPECT_EQ(write("two"), R"("a":[8,2,7]})");
    const std::string longest(257, 'x');
    EXPECT_THAT(write(longest), HasSubstr(longest));
    EXPECT_THAT(write(longest), HasSubstr(longest));
    EXPECT_EQ(write("three"), R"("a":[8,"three",7]})");
    EXPECT_EQ(write("three"), R"("a":[8,3,7]})");
}

TEST_F(RecordingFixture, KeepsContentsOnce) {
    const Bytes contents{'a', 'b'};
    CallRecord(*recording, "A.b", 0, contents).announce();
    EXPECT_THAT(last(), HasSubstr(R"("kept":["ab"])"));
    CallRecord(*recording, "A.b", 0, contents).announce();
    EXPECT_THAT(last(), Not(HasSubstr("kept")));
}

TEST_F(RecordingFixture, NamesLongContentsBySizeAndSum) {
    CallRecord(*recording, "A.b", 0, Bytes(kPassedContentLimit + 1)).announce();
    EXPECT_THAT(last(), MatchesRegex(R"(.*"a":\[\{"size":513,"sum":"[0-9a-f]+"\}\]\})"));
}

TEST_F(RecordingFixture, KeepsLongContentsThatAreAnswered) {
    static_cast<void>(CallRecord(*recording, "A.b", 0).answer(Bytes(kPassedContentLimit + 1, 'x')));
    EXPECT_THAT(last(), HasSubstr("kept"));
}

TEST_F(RecordingFixture, TellsWhenACallCameBackAfterWhatAnotherThreadDid) {
    const std::pair<int, int> threads;
    const void* runs = &threads.first;
    RecordingOptions options;
    options.thread = [&runs] { return runs; };
    const auto shared = make(std::move(options));
    {
        const AnnouncedCall call(*shared, "WaitGroup.leave", 1);
        EXPECT_THAT(last(), HasSubstr("WaitGroup.leave"));
        runs = &threads.second;
        CallRecord(*shared, "A.b", 0).announce();
        runs = &threads.first;
    }
    EXPECT_EQ(last(), R"({"t":0,"w":1,"back":true})");
    { const AnnouncedCall call(*shared, "WaitGroup.leave", 1); }
    EXPECT_THAT(last(), HasSubstr("WaitGroup.leave"));
}

TEST_F(RecordingFixture, WritesNothingOfOtherThreadsAfterItsEnd) {
    for (int i = 0; i < 200; ++i) {
        std::atomic<bool> isOver = false;
        std::atomic<int> written = 0;
        const auto shared = make({});
        std::thread other([&] {
            while (!isOver) {
                CallRecord(*shared, "A.b", 0).announce();
                ++written;
            }
        });
        while (written == 0) std::this_thread::yield();
        shared->finish();
        isOver = true;
        other.join();
        ASSERT_THAT(last(), HasSubstr("finished"));
        sink.text.clear();
    }
}

TEST_F(RecordingFixture, WritesNothingAfterItsEnd) {
    recording->finish();
    const std::string before = sink.text;
    CallRecord(*recording, "A.b", 0).announce();
    EXPECT_EQ(sink.text, before);
}

TEST_F(RecordingFixture, MakesUpTheSameForTheSameWhenItIsAnonymous) {
    RecordingOptions options;
    options.isAnonymous = true;
    const auto anonymous = make(std::move(options));
    CallRecord(*anonymous, "A.b", 0, "org.Maker7.game", "/var/mobile/org.Maker7.game.zip")
        .announce();
    EXPECT_THAT(
        last(),
        MatchesRegex(
            R"(.*\["[a-z][a-z][a-z]\.[A-Z][a-z][a-z][a-z][a-z][0-9]\.[a-z][a-z][a-z][a-z]",.*)"));
    const std::string line = last();
    const std::size_t begin = line.find("[\"") + 2;
    const std::string made = line.substr(begin, line.find('"', begin) - begin);
    EXPECT_THAT(line, HasSubstr("/var/mobile/" + made + ".zip"));
    EXPECT_THAT(line, Not(HasSubstr("Maker")));
}

TEST(AnonymousRecording, HoldsNothingOfTheOriginal) {
    for (std::uint64_t seed = 0; seed < 20; ++seed) {
        SeededRecording::Choices choices;
        choices.isAnonymous = true;
        const std::string text = SeededRecording(seed, choices).record();
        EXPECT_TRUE(readRecording(text)) << seed;
        for (const char* original : {"example", "app0", "app1", "app2", "app3", "app4", "app5",
                                     "Shown", "Sold", "Example", "artwork", "itemName"}) {
            EXPECT_THAT(text, Not(HasSubstr(original))) << seed;
        }
    }
}

}  // namespace
}  // namespace appsync
