#include "host/replay/Replay.h"

#include <array>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

#include "host/console/Problem.h"
#include "platform/FileSystem.h"
#include "platform/Platform.h"
#include "platform/SyncClient.h"
#include "platform/WorkQueues.h"
#include "tests/recordings/SeededRecording.h"

namespace appsync {
namespace {

using testing::HasSubstr;
using testing::SizeIs;

/// The environment variables that say how many sessions are replayed, and from which seed on.
constexpr const char* kSeedsVariable = "APPSYNC_SEEDS";
constexpr const char* kFirstVariable = "APPSYNC_FIRST_SEED";
constexpr std::uint64_t kUsualSeeds = 60;

/// Small sessions in which much happens: those that are stored are such.
SeededRecording::Choices eventful(std::uint64_t seed) {
    SeededRecording::Choices choices;
    choices.identifiers = 2 + seed % 2;
    choices.isCoordinated = seed % 4 < 2;
    choices.hasFaults = seed % 3 == 0;
    choices.isEventful = true;
    return choices;
}

/// The same, in which much goes wrong.
SeededRecording::Choices troubled(std::uint64_t seed) {
    SeededRecording::Choices choices = eventful(seed);
    choices.isTroubled = true;
    return choices;
}

std::uint64_t numberOr(const char* variable, std::uint64_t otherwise) {
    const char* text = std::getenv(variable);
    return text != nullptr ? std::stoull(text) : otherwise;
}

/// What is wrong with the replay of the recording; empty when nothing is.
std::string whatDiverges(const std::string& text, bool isStrict = true) {
    const Result<RecordedSession> session = readRecording(text);
    if (!session) return session.error().description();
    const Result<ReplayOutcome> outcome = replay(*session, *appsyncPlugInTable(), isStrict);
    if (!outcome) return outcome.error().description();
    if (outcome->damage) return outcome->damage->description();
    if (!outcome->divergence) {
        return outcome->lines == session->lines.size() ? "" : "it ended too early";
    }
    std::string told = "expected " + outcome->divergence->expected + "\ncame " +
                       outcome->divergence->came + "\nafter";
    for (const std::string& each : outcome->divergence->before) told += "\n  " + each;
    return told;
}

SeededRecording::Choices ordinary(std::uint64_t /*seed*/) { return {}; }

/// Records the session of each seed, and replays it twice, the second time strictly.
void replaySeeds(SeededRecording::Choices (*choicesOf)(std::uint64_t)) {
    const std::uint64_t first = numberOr(kFirstVariable, 0);
    const std::uint64_t count = numberOr(kSeedsVariable, kUsualSeeds);
    const char* test = testing::UnitTest::GetInstance()->current_test_info()->name();
    for (std::uint64_t seed = first; seed < first + count; ++seed) {
        const std::string text = SeededRecording(seed, choicesOf(seed)).record();
        for (const bool isStrict : {false, true}) {
            EXPECT_EQ(whatDiverges(text, isStrict), "")
                << (isStrict ? "strictly" : "at first") << ", again:\n"
                << kFirstVariable << "=" << seed << " " << kSeedsVariable
                << "=1 build/release/tests/test_recordings --gtest_filter=Replay." << test;
        }
    }
    testing::Test::RecordProperty("seeds", static_cast<int>(count));
}

TEST(Replay, RepeatsSessionsOfEveryKind) { replaySeeds(ordinary); }

TEST(Replay, RepeatsSessionsInWhichMuchHappens) { replaySeeds(eventful); }

TEST(Replay, RepeatsSessionsInWhichMuchGoesWrong) { replaySeeds(troubled); }

// What the last one to leave a group does next was replayed too early, when it had come back after
// what others did.
TEST(Replay, HasACallComeBackAsLateAsItDid) {
    for (const std::uint64_t seed : {130U, 570U, 590U, 804U}) {
        EXPECT_EQ(whatDiverges(SeededRecording(seed).record()), "") << "seed " << seed;
    }
}

TEST(Replay, GoesToTheEndOfARecordingThatIsCutOff) {
    for (std::uint64_t seed = 0; seed < 12; ++seed) {
        const std::string text = SeededRecording(seed).record();
        std::mt19937_64 random(seed);
        const std::size_t header = text.find('\n') + 1;
        for (int cut = 0; cut < 4; ++cut) {
            const std::string part = text.substr(0, header + random() % (text.size() - header));
            EXPECT_EQ(whatDiverges(part), "") << "seed " << seed << " at " << part.size();
        }
    }
}

TEST(Replay, SaysThatARecordingIsCutOff) {
    const std::string text = SeededRecording(1).record();
    EXPECT_FALSE(readRecording(text)->isCutOff);
    EXPECT_TRUE(readRecording(text.substr(0, text.size() / 2))->isCutOff);
}

/// The recording with the first `one` replaced.
std::string changed(std::string text, const std::string& one, const std::string& other) {
    const std::size_t place = text.find(one);
    EXPECT_NE(place, std::string::npos) << one;
    return place == std::string::npos ? text : text.replace(place, one.size(), other);
}

SeededRecording::Choices quiet(bool isCoordinated) {
    SeededRecording::Choices choices;
    choices.hasFaults = false;
    choices.isCoordinated = isCoordinated;
    return choices;
}

TEST(Replay, ShowsTheFirstCallThatIsNotAsRecorded) {
    const std::string text = changed(SeededRecording(2, quiet(false)).record(),
                                     "\"/var/mobile/Media/PublicStaging/App", "\"/elsewhere/App");
    const Result<RecordedSession> session = readRecording(text);
    ASSERT_TRUE(session);
    const Result<ReplayOutcome> outcome = replay(*session, *appsyncPlugInTable(), false);
    ASSERT_TRUE(outcome && outcome->divergence);
    EXPECT_THAT(outcome->divergence->expected, HasSubstr("/elsewhere/App"));
    EXPECT_THAT(outcome->divergence->came, HasSubstr("/var/mobile/Media/PublicStaging/App"));
    EXPECT_THAT(outcome->divergence->before, SizeIs(10));
    EXPECT_LT(outcome->lines, session->lines.size());
}

TEST(Replay, NoticesWhatThePlugInAnswersToTheHost) {
    const std::string text =
        changed(SeededRecording(2, quiet(false)).record(), "\"end\":true,\"r\":[\"Application\"]",
                "\"end\":true,\"r\":[\"Another\"]");
    EXPECT_THAT(whatDiverges(text), HasSubstr("expected end -> [\"Another\"]"));
}

TEST(Replay, RefusesAnAnonymousRecording) {
    SeededRecording::Choices choices;
    choices.isAnonymous = true;
    const Result<RecordedSession> session = readRecording(SeededRecording(3, choices).record());
    ASSERT_TRUE(session);
    const Result<ReplayOutcome> outcome = replay(*session, *appsyncPlugInTable(), false);
    ASSERT_FALSE(outcome);
    EXPECT_EQ(exitStatusOf(outcome.error()), kExitUnusable);
}

/// A plug-in that asks whether two files exist: one on the host's thread, one as an item of work,
/// for whose queue it waits before the first.
class ImpatientClient : public SyncClient {
  public:
    explicit ImpatientClient(const Platform& platform) : platform_(platform) {}

    std::vector<std::string> supportedDataclasses() override { return {}; }
    std::string currentSyncAnchor() override {
        {
            const auto queue = platform_.queues.makeOperationQueue();
            queue->add([this] { static_cast<void>(platform_.files.itemExists("/b")); });
        }
        static_cast<void>(platform_.files.itemExists("/a"));
        return "";
    }
    bool prepareForSyncWithHostAnchor(const std::string&, const SyncProgressCallback&,
                                      ErrorOut) override {
        return true;
    }
    std::optional<std::set<std::string>> disabledAssetTypes() override { return std::nullopt; }
    bool reconcileSync(const PropertyList&, const std::string&, const SyncProgressCallback&,
                       ErrorOut) override {
        return true;
    }
    bool reconcileRestoreOfType(std::int64_t, ErrorOut) override { return true; }
    void syncEndedWithSuccess(bool) override {}
    PropertyList installedAssets() override { return {}; }
    void clearSyncData() override {}
    PropertyList installedAssetMetrics() override { return {}; }
    std::set<std::string> korvuIDsForAssets() override { return {}; }
    std::set<SyncAccountInfo> accountsForAssets() override { return {}; }
    void prepareForBackup() override {}
    std::vector<SyncAssetPointer> outstandingAssetTransfers() override { return {}; }
    void assetTransferUpdatedProgress(const SyncAssetPointer&, double) override {}
    void assetTransferSucceeded(const SyncAssetPointer&, bool, const ErrorRecord*) override {}
    void assetTransferEndedWithSuccess(bool) override {}
    void assetInstallSucceeded(const SyncAssetPointer&) override {}
    void assetInstallFailed(const SyncAssetPointer&, const ErrorRecord&) override {}

  private:
    const Platform platform_;
};

const PlugInTable& impatientPlugIn() {
    static const PlugInTable table = {kModuleMajorVersion, kModuleMinorVersion, "test",
                                      [](const Platform& platform) noexcept -> PlugInClient {
                                          return {new ImpatientClient(platform), nullptr, nullptr};
                                      },
                                      [](PlugInClient made) noexcept { delete made.client; }};
    return table;
}

/// The same plug-in, which waited for its queue after the first.
std::string patientRecording(const std::string& fileOfItem) {
    return "{\"recording\":1,\"plug-in\":\"test\",\"process\":\"p\",\"bundle\":\"b\","
           "\"anonymous\":false}\n"
           "{\"t\":0,\"w\":1,\"host\":\"makeClient\"}\n"
           "{\"t\":1,\"w\":1,\"end\":true}\n"
           "{\"t\":2,\"w\":1,\"host\":\"currentSyncAnchor\"}\n"
           "{\"t\":3,\"w\":1,\"call\":\"WorkQueues.makeOperationQueue\",\"r\":1}\n"
           "{\"t\":4,\"w\":1,\"call\":\"OperationQueue.add\",\"on\":1,\"a\":[2]}\n"
           "{\"t\":5,\"w\":1,\"call\":\"FileSystem.itemExists\",\"a\":[\"/a\"],\"r\":true}\n"
           "{\"t\":6,\"w\":2,\"run\":\"item\",\"on\":2}\n"
           "{\"t\":7,\"w\":2,\"call\":\"FileSystem.itemExists\",\"a\":[\"" +
           fileOfItem +
           "\"],\"r\":true}\n"
           "{\"t\":8,\"w\":2,\"end\":true}\n"
           "{\"t\":9,\"w\":1,\"end\":true,\"r\":\"\"}\n";
}

TEST(Replay, LetsThreadsThatDoNotTouchEachOtherTakeAnotherOrder) {
    const RecordedSession session = *readRecording(patientRecording("/b"));
    const Result<ReplayOutcome> outcome = replay(session, impatientPlugIn(), false);
    ASSERT_TRUE(outcome);
    EXPECT_FALSE(outcome->divergence);
    EXPECT_EQ(outcome->lines, session.lines.size());
}

TEST(Replay, HoldsThreadsToTheRecordedOrderWhenItIsStrict) {
    const RecordedSession session = *readRecording(patientRecording("/b"));
    const Result<ReplayOutcome> outcome = replay(session, impatientPlugIn(), true);
    ASSERT_TRUE(outcome && outcome->divergence);
    EXPECT_THAT(outcome->divergence->expected, HasSubstr("FileSystem.itemExists(\"/a\")"));
    EXPECT_THAT(outcome->divergence->came, HasSubstr("nothing"));
}

TEST(Replay, LetsNoCallOvertakeOneAboutTheSameFile) {
    const RecordedSession session = *readRecording(patientRecording("/a"));
    const Result<ReplayOutcome> outcome = replay(session, impatientPlugIn(), false);
    ASSERT_TRUE(outcome && outcome->divergence);
}

/// Small recordings of every kind, made by scripts/make_recordings of seeds whose sessions reach,
/// one after another, most of what those before have not.
constexpr const char* kStored = RECORDINGS;
constexpr std::array kStoredSeeds = {
    6,   11,  18,  19,  34,  48,  53,  83,  86,  114, 145, 153, 156, 166, 186, 193,
    195, 198, 201, 203, 205, 264, 291, 311, 327, 329, 333, 345, 349, 350, 363, 366,
    374, 396, 411, 461, 465, 489, 490, 514, 516, 517, 529, 543, 601, 639, 672, 687,
    699, 705, 708, 727, 736, 738, 744, 757, 771, 798, 807, 810, 837, 852, 858, 888};

/// The same of sessions in which much goes wrong.
constexpr std::array kStoredTroubledSeeds = {2,  5,  6,  8,   10,  11,  16,  20,  29,  38,
                                             45, 71, 87, 112, 135, 136, 149, 185, 195, 205};

void store(std::uint64_t seed, const char* sort, const std::string& text) {
    const char* path = seed % 4 < 2 ? "coordinated" : "direct";
    std::ofstream(std::string(kStored) + "/" + std::to_string(seed) + "-" + path + sort + ".jsonl")
        << text;
}

// Makes them; scripts/make_recordings runs it.
TEST(StoredRecordings, DISABLED_AreMade) {
    std::filesystem::remove_all(kStored);
    std::filesystem::create_directories(kStored);
    std::size_t number = 0;
    for (const int each : kStoredSeeds) {
        const auto seed = static_cast<std::uint64_t>(each);
        std::string text = SeededRecording(seed, eventful(seed)).record();
        if (++number % 12 == 0) text.resize(text.size() * 3 / 4);
        store(seed, "", text);
    }
    for (const int each : kStoredTroubledSeeds) {
        const auto seed = static_cast<std::uint64_t>(each);
        store(seed, "-troubled", SeededRecording(seed, troubled(seed)).record());
    }
}

TEST(StoredRecordings, AreWhatThePlugInStillDoes) {
    std::size_t count = 0;
    for (const auto& entry : std::filesystem::directory_iterator(kStored)) {
        std::ostringstream text;
        text << std::ifstream(entry.path()).rdbuf();
        ASSERT_EQ(whatDiverges(text.str()), "")
            << entry.path().filename() << ": where that is meant, run scripts/make_recordings";
        ++count;
    }
    EXPECT_GE(count, 40U);
}

}  // namespace
}  // namespace appsync
