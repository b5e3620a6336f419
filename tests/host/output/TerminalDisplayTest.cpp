#include "host/output/TerminalDisplay.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sstream>

#include "host/console/Console.h"
#include "host/console/Text.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

constexpr const char* kErased = "\r\x1b[";

SyncEvent of(SyncEventKind kind, SyncPhase phase, const std::string& identifier,
             std::uint64_t done = 512, SyncState state = SyncState::Active) {
    return {kind, phase, identifier, done, 1024, state, std::nullopt, "damaged"};
}

SyncEvent installing(const std::string& identifier, std::uint64_t done = 512) {
    return of(SyncEventKind::Progress, SyncPhase::Install, identifier, done);
}

SyncEvent failed(const std::string& identifier) {
    return of(SyncEventKind::Ended, SyncPhase::Install, identifier, 0, SyncState::Failed);
}

SyncEvent installedEvent(const std::string& identifier) {
    return of(SyncEventKind::Ended, SyncPhase::Install, identifier, 1024, SyncState::Finished);
}

SyncEvent sending(const std::string& identifier, std::uint64_t done) {
    return of(SyncEventKind::Progress, SyncPhase::Transfer, identifier, done);
}

class TerminalDisplayTest : public testing::Test {
  protected:
    /// What has been written since the last call, and is still on the screen.
    std::string drawn() {
        std::string text = out.str();
        out.str("");
        const std::size_t erased = text.rfind("\x1b[J");
        return erased == std::string::npos ? text : text.substr(erased + 3);
    }
    std::string drawnAfter(const SyncEvent& event, std::chrono::milliseconds time = 100ms) {
        now += time;
        display.show(event);
        return drawn();
    }

    std::ostringstream out;
    std::ostringstream err;
    Console console{out, err, true, 80};
    TerminalDisplay::Clock::time_point now{1000s};
    TerminalDisplay display{console, false, [this] { return now; }};
};

TEST_F(TerminalDisplayTest, SaysAtOnceWhatIsBeingDone) {
    display.doing("opening the device");
    EXPECT_EQ(drawn(), "opening the device  0:00\n");
}

TEST_F(TerminalDisplayTest, TellsThatTimeGoesBy) {
    display.doing("planning");
    drawn();
    now += 61s;
    display.tick();
    EXPECT_EQ(drawn(), "planning  1:01\n");
}

TEST_F(TerminalDisplayTest, OneBarIsOfTheWholeAndTheOthersOfWhatIsActive) {
    display.expect({4, 4096});
    drawnAfter(sending("com.a", 1024));
    EXPECT_EQ(drawnAfter(installing("com.a")),
              "[........]  12 %  0 of 4  1.0 KiB of 4.0 KiB  0:00\n"
              "transfer com.a                        [####################] 100 %\n"
              "install  com.a                        [##########..........]  50 %\n");
}

TEST_F(TerminalDisplayTest, WhatEndsWellGoesAwayAndWhatFailsStays) {
    display.expect({2, 0});
    drawnAfter(installing("com.a"));
    EXPECT_THAT(drawnAfter(installedEvent("com.a")), Not(HasSubstr("com.a")));
    drawnAfter(installing("com.b"));
    now += 100ms;
    display.show(failed("com.b"));
    const std::string text = out.str();
    EXPECT_THAT(text, HasSubstr("\x1b[Jinstall  com.b                        failed\n"));
    EXPECT_THAT(drawn(), HasSubstr("100 %  2 of 2"));
}

TEST_F(TerminalDisplayTest, OfManyFailuresTheFirstStay) {
    display.expect({100, 0});
    for (int number = 0; number < 100; ++number) {
        display.show(failed("com.n" + std::to_string(number)));
    }
    EXPECT_THAT(out.str(), HasSubstr("com.n9 "));
    EXPECT_THAT(out.str(), Not(HasSubstr("com.n10")));
}

TEST_F(TerminalDisplayTest, IsNotDrawnMoreOftenThanEyesFollowWhereThereIsMuch) {
    display.expect({100, 0});
    drawnAfter(installing("com.a", 10));
    EXPECT_EQ(drawnAfter(installing("com.a", 20), 1ms), "");
    EXPECT_NE(drawnAfter(installing("com.a", 30), 50ms), "");
}

// Whether the terminal of these tests takes more.
bool terminalTakesMore = true;

TEST_F(TerminalDisplayTest, IsNotDrawnWhereTheTerminalDoesNotTakeIt) {
    console.hasRoom = [] { return terminalTakesMore; };
    drawnAfter(installing("com.example.a"));
    terminalTakesMore = false;
    EXPECT_EQ(drawnAfter(installing("com.example.b")), "");
    // What has failed is no picture of a moment: it is told in any case.
    EXPECT_THAT(drawnAfter(failed("com.example.b")), HasSubstr("com.example.b"));
    terminalTakesMore = true;
    EXPECT_THAT(drawnAfter(installing("com.example.a")), HasSubstr("com.example.a"));
}

TEST_F(TerminalDisplayTest, BeginningAndEndAreDrawnWhereThereIsLittle) {
    display.expect({2, 0});
    drawnAfter(installing("com.a", 10));
    const SyncEvent begins = of(SyncEventKind::Started, SyncPhase::Install, "com.b", 0);
    EXPECT_THAT(drawnAfter(begins, 0ms), HasSubstr("com.b"));
    EXPECT_EQ(drawnAfter(installing("com.b", 20), 0ms), "");
}

TEST_F(TerminalDisplayTest, HasNoMoreLinesThanTheTerminal) {
    console.height = 5;
    display.expect({9, 0});
    for (int number = 0; number < 9; ++number) {
        drawnAfter(installing("com.n" + std::to_string(number)));
    }
    const std::string text = drawnAfter(installing("com.n8", 600));
    EXPECT_EQ(std::count(text.begin(), text.end(), '\n'), 4);
}

TEST_F(TerminalDisplayTest, NoLineIsWiderThanTheTerminal) {
    display.expect({1234, 1ULL << 40});
    SyncEvent waits = installing(std::string(200, 'x'));
    waits.state = SyncState::Waiting;
    for (std::size_t width = 0; width < 120; ++width) {
        console.width = width;
        std::istringstream lines(drawnAfter(waits, 5s));
        for (std::string line; std::getline(lines, line);) {
            EXPECT_LE(displayWidth(line), std::max<std::size_t>(width, 1) - 1) << line;
        }
    }
}

TEST_F(TerminalDisplayTest, WhatIsLeftIsToldAsAnEstimateAndNotWhileAllWaits) {
    display.expect({2, 2048});
    drawnAfter(sending("com.a", 10));
    EXPECT_THAT(drawnAfter(sending("com.a", 1024), 10s), HasSubstr("  about 30 s left"));
    drawnAfter(of(SyncEventKind::Ended, SyncPhase::Transfer, "com.a", 1024, SyncState::Finished));
    SyncEvent waits = installing("com.a");
    waits.state = SyncState::Waiting;
    EXPECT_THAT(drawnAfter(waits), Not(HasSubstr("left")));
}

TEST_F(TerminalDisplayTest, ThePreparationHasItsOwnBar) {
    SyncEvent prepares = of(SyncEventKind::Progress, SyncPhase::Prepare, "", 256);
    prepares.text = "reading packages, 3 of 9";
    EXPECT_EQ(drawnAfter(prepares), "prepare  reading packages, 3 of 9  [##......]  25 %  0:00\n");
    display.expect({1, 0});
    prepares.kind = SyncEventKind::Ended;
    EXPECT_THAT(drawnAfter(prepares), HasSubstr("0 of 1"));
}

TEST_F(TerminalDisplayTest, OnANarrowTerminalTheCountOfThePreparationIsWhatStays) {
    SyncEvent prepares = of(SyncEventKind::Progress, SyncPhase::Prepare, "", 256);
    prepares.text = "asking the device, 790 of 1000";
    for (const auto& [width, text] :
         {std::pair(40U, "prepare  asking the device, 790 of 1000\n"),
          std::pair(31U, "asking the device, 790 of 1000\n"),
          std::pair(20U, "asking 790 of 1000\n"), std::pair(13U, "790 of 1000\n")}) {
        out.str("");
        const Console narrow{out, err, true, width};
        TerminalDisplay shown(narrow, false, [this] { return now += 100ms; });
        shown.show(prepares);
        EXPECT_EQ(drawn(), text);
    }
}

TEST_F(TerminalDisplayTest, ANoticeStandsAboveTheBars) {
    display.expect({1, 0});
    drawnAfter(installing("com.a"));
    display.complain("stopping");
    EXPECT_EQ(err.str(), "appsync: stopping\n");
    // What was typed meanwhile stands there too.
    EXPECT_THAT(out.str(), StartsWith(std::string(kErased) + "2A\x1b[J"));
    EXPECT_THAT(out.str(), HasSubstr("install  com.a"));
}

TEST_F(TerminalDisplayTest, NothingOfItIsLeftInTheEnd) {
    display.doing("planning");
    drawn();
    display.close();
    EXPECT_EQ(out.str(), std::string(kErased) + "1A\x1b[J");
    out.str("");
    display.finish({});
    EXPECT_EQ(out.str(), "Nothing to do: all is in step.\n");
}

}  // namespace
}  // namespace appsync
