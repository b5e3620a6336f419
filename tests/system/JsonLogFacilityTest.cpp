#include "system/JsonLogFacility.h"

#include <cerrno>
#include <fstream>
#include <stdexcept>
#include <thread>

#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

using std::string_view_literals::operator""sv;
using device_files::Call;
using device_files::FailingCall;
using device_files::kForever;

LogLine lineWith(std::string_view message) {
    return {std::chrono::system_clock::time_point(), LogCategory::Applications, LogLevel::Error,
            message, "f"};
}

/// The message of the JSON object that a line becomes, with its quotes.
std::string jsonOf(std::string_view message) {
    const std::string json = toJson(lineWith(message));
    const std::size_t start = json.find("\"message\":") + 10;
    return json.substr(start, json.rfind(",\"format\"") - start);
}

TEST(LogLineTest, IsOneJsonObject) {
    LogLine line = lineWith("a message");
    line.time += std::chrono::seconds(86'399) + std::chrono::microseconds(42);
    line.format = "a %s";
    EXPECT_EQ(toJson(line),
              R"({"time":"1970-01-01T23:59:59.000042Z","category":14,"level":"error",)"
              R"("message":"a message","format":"a %s"})");
}

TEST(LogLineTest, ATimeBeforeTheEpochIsWrittenRight) {
    LogLine line = lineWith("");
    line.time -= std::chrono::microseconds(1);
    EXPECT_NE(toJson(line).find("1969-12-31T23:59:59.999999Z"), std::string::npos);
}

TEST(LogLineTest, NamesTheLevels) {
    EXPECT_EQ(nameOf(LogLevel::Default), "default");
    EXPECT_EQ(nameOf(LogLevel::Info), "info");
    EXPECT_EQ(nameOf(LogLevel::Debug), "debug");
    EXPECT_EQ(nameOf(LogLevel::Error), "error");
    EXPECT_EQ(nameOf(LogLevel::Fault), "fault");
}

TEST(LogLineTest, EscapesWhatJsonDemands) {
    EXPECT_EQ(jsonOf("a\"b\\c/d"), R"("a\"b\\c/d")");
    EXPECT_EQ(jsonOf("\n\t\r\x01\x1f\x7f\0"sv), R"("\n\t\u000d\u0001\u001f\u007f\u0000")");
}

TEST(LogLineTest, CharactersBeyondAsciiStay) {
    const std::string_view text = "\xC3\xBC \xE2\x82\xAC \xF0\x9F\x8D\x8E \xF4\x8F\xBF\xBF";
    EXPECT_EQ(jsonOf(text), "\"" + std::string(text) + "\"");
}

TEST(LogLineTest, BytesThatAreNoCharacterAreReplacedOneByOne) {
    const std::string mark = "\xEF\xBF\xBD";
    EXPECT_EQ(jsonOf("a\xFFz"), "\"a" + mark + "z\"");
    EXPECT_EQ(jsonOf("\x80"), "\"" + mark + "\"");
    EXPECT_EQ(jsonOf("\xC0\xAF"), "\"" + mark + mark + "\"");             // overlong
    EXPECT_EQ(jsonOf("\xE0\x80\x80"), "\"" + mark + mark + mark + "\"");  // overlong
    EXPECT_EQ(jsonOf("\xED\xA0\x80"), "\"" + mark + mark + mark + "\"");  // a surrogate
    EXPECT_EQ(jsonOf("\xF4\x90\x80\x80").size(), 2 + 4 * mark.size());    // beyond the last
    EXPECT_EQ(jsonOf("\xE2\x82"), "\"" + mark + mark + "\"");             // cut off
    EXPECT_EQ(jsonOf("\xE2\x82z\x82"), "\"" + mark + mark + "z" + mark + "\"");
}

class JsonLogFacilityTest : public ::testing::Test {
  protected:
    JsonLogFacilityTest() : log_(LogFile::open(path()).value()) {}

    [[nodiscard]] std::filesystem::path path() const { return scratch_.path() / "system.log"; }
    [[nodiscard]] std::vector<std::string> lines() const {
        std::vector<std::string> result;
        std::ifstream stream(path());
        for (std::string line; std::getline(stream, line);) result.push_back(line);
        return result;
    }
    void log(std::string_view text, LogLevel level = LogLevel::Default) {
        const LogArgument argument = text;
        log_.write({LogCategory::Coordination, level, "says %s", {&argument, 1}});
    }

    device_files::ScratchDirectory scratch_;
    JsonLogFacility log_;
};

TEST_F(JsonLogFacilityTest, AppendsALineForEachMessage) {
    log("one");
    log("two\n", LogLevel::Info);
    const auto found = lines();
    ASSERT_EQ(found.size(), 2U);
    EXPECT_TRUE(found[0].starts_with(R"({"time":"20)"));
    EXPECT_TRUE(found[0].ends_with(
        R"(Z","category":8,"level":"default","message":"says one","format":"says %s"})"));
    EXPECT_TRUE(found[1].ends_with(R"("level":"info","message":"says two\n","format":"says %s"})"));
}

TEST_F(JsonLogFacilityTest, WritesEachLineInOneCall) {
    // A second call would fail.
    const FailingCall failing(Call::Write, EIO, kForever, 1);
    log(std::string(10'000, 'x'));
    EXPECT_EQ(log_.loss().messages, 0U);
    EXPECT_EQ(failing.failures(), 0);
}

TEST_F(JsonLogFacilityTest, LinesOfManyThreadsStayWhole) {
    std::vector<std::thread> threads;
    for (int i = 0; i < 8; ++i) {
        threads.emplace_back([this] {
            for (int round = 0; round < 50; ++round) log(std::string(500, 'x'));
        });
    }
    for (std::thread& thread : threads) thread.join();
    const auto found = lines();
    EXPECT_EQ(found.size(), 400U);
    for (const std::string& line : found) {
        EXPECT_TRUE(line.starts_with("{\"time\"") && line.ends_with("%s\"}")) << line;
    }
}

TEST_F(JsonLogFacilityTest, TellsOfTheMessagesThatCouldNotBeWritten) {
    {
        const FailingCall failing(Call::Write, ENOSPC);
        log("lost");
        log("lost, too");
    }
    log("kept");
    log("kept, too");
    EXPECT_EQ(log_.loss().messages, 2U);
    EXPECT_EQ(log_.loss().reason, "No space left on device");
    const auto found = lines();
    ASSERT_EQ(found.size(), 3U);
    EXPECT_TRUE(found[0].ends_with(
        R"("category":0,"level":"error","message":"2 messages could not be written: )"
        R"(No space left on device","format":"%llu messages could not be written: %s"})"))
        << found[0];
    EXPECT_NE(found[1].find("\"says kept\""), std::string::npos);
    EXPECT_NE(found[2].find("\"says kept, too\""), std::string::npos);
}

TEST_F(JsonLogFacilityTest, AMessageIsLostWithTheLineThatWouldTellOfAnother) {
    {
        const FailingCall failing(Call::Write, ENOSPC, 2);
        log("lost");
        log("lost, too");
        EXPECT_EQ(failing.failures(), 2);
    }
    EXPECT_EQ(log_.loss().messages, 2U);
    log("kept");
    EXPECT_EQ(log_.loss().messages, 2U);
    ASSERT_EQ(lines().size(), 2U);
    EXPECT_NE(lines()[0].find("\"2 messages could not"), std::string::npos);
}

TEST_F(JsonLogFacilityTest, ALineAfterOneThatWasCutOffIsWhole) {
    {
        const FailingCall failing(Call::CutOffWrite, ENOSPC);
        log("cut off");
    }
    log("next");
    EXPECT_EQ(log_.loss().messages, 1U);
    const auto found = lines();
    ASSERT_EQ(found.size(), 3U);
    EXPECT_FALSE(found[0].ends_with("}"));
    EXPECT_TRUE(found[1].starts_with("{\"time\"")) << found[1];
    EXPECT_NE(found[2].find("\"says next\""), std::string::npos);
}

TEST_F(JsonLogFacilityTest, TheListenerGetsWhatIsWritten) {
    std::vector<std::string> heard;
    log_.setListener([&](const LogLine& line) {
        EXPECT_EQ(line.category, LogCategory::Coordination);
        EXPECT_EQ(line.format, "says %s");
        heard.emplace_back(line.message);
    });
    log("one");
    log_.setListener({});
    log("two");
    EXPECT_EQ(heard, std::vector<std::string>{"says one"});
    EXPECT_EQ(lines().size(), 2U);
}

TEST_F(JsonLogFacilityTest, AListenerThatThrowsHarmsNobody) {
    log_.setListener([](const LogLine&) { throw std::runtime_error("x"); });
    log("one");
    log("two");
    EXPECT_EQ(lines().size(), 2U);
    EXPECT_EQ(log_.loss().messages, 0U);
}

TEST_F(JsonLogFacilityTest, MakesHandles) {
    EXPECT_NE(log_.makeHandle("com.example", "installs"), nullptr);
}

}  // namespace
}  // namespace appsync
