#include <gtest/gtest.h>

#include <sstream>

#include "host/console/Console.h"
#include "host/output/SyncDisplays.h"

namespace appsync {
namespace {

SyncEvent prepared(SyncEventKind kind, std::uint64_t done, SyncState state = SyncState::Active) {
    return {kind, SyncPhase::Prepare, "", done, 400, state, std::nullopt, "reading packages"};
}

class PreparationDisplay : public testing::Test {
  protected:
    void show(SyncDisplayKind kind, const std::vector<SyncEvent>& events) {
        const std::unique_ptr<SyncDisplay> display = makeSyncDisplay(kind, console);
        for (const SyncEvent& each : events) display->show(each);
    }

    std::ostringstream out;
    std::ostringstream err;
    Console console{out, err, false, 80};
};

TEST_F(PreparationDisplay, HasOneLineWithoutATerminal) {
    show(SyncDisplayKind::Text,
         {prepared(SyncEventKind::Started, 0), prepared(SyncEventKind::Progress, 4),
          prepared(SyncEventKind::Progress, 8),
          prepared(SyncEventKind::Ended, 400, SyncState::Finished)});
    EXPECT_EQ(out.str(), "prepare: reading packages\n");
}

TEST_F(PreparationDisplay, HasNoLineWhereItIsOverInAMoment) {
    show(SyncDisplayKind::Text, {prepared(SyncEventKind::Started, 0),
                                 prepared(SyncEventKind::Ended, 400, SyncState::Finished)});
    EXPECT_EQ(out.str(), "");
}

TEST_F(PreparationDisplay, IsOfNoApplicationForPrograms) {
    show(SyncDisplayKind::JsonLines, {prepared(SyncEventKind::Progress, 100)});
    EXPECT_EQ(out.str(), R"({"event":"progress","phase":"prepare","identifier":null,"done":100,)"
                         R"("total":400,"state":"active","nextTry":null})"
                         "\n");
}

}  // namespace
}  // namespace appsync
