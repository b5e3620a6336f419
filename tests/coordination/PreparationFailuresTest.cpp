#include <algorithm>
#include <ostream>

#include "tests/coordination/CoordinationFixture.h"

namespace appsync {
namespace {

using testing::ElementsAreArray;

/// What becomes of a preparation in which one step fails.
struct FailureCase {
    const char* name;
    void (*breakStep)(SimulatedPlatform& platform, SyncAsset& asset);
    bool status = false;
    /// What is cancelled, in order, as calls read without the service's name.
    std::vector<std::string> cancelled;
    /// Its own messages at error level.
    std::vector<std::string> errors;
    /// The error that the finishing message shows.
    const char* lastError = "(null)";
};

std::ostream& operator<<(std::ostream& out, const FailureCase& failure) {
    return out << failure.name;
}

constexpr const char* kShown = "Error Domain=Coordination Code=7 \"(null)\"";

ErrorRecord refusal() { return {"Coordination", 7, {}}; }

template <CoordinationStep step>
void refuse(SimulatedPlatform& platform, SyncAsset& /*asset*/) {
    platform.coordination.failNext(step, kA, refusal());
}

void leaveNameless(SimulatedPlatform& /*platform*/, SyncAsset& asset) {
    asset.prettyName = "";
    asset.identifier = "";
}
void giveToAnotherClient(SimulatedPlatform& platform, SyncAsset& /*asset*/) {
    platform.coordination.addCoordinator(CoordinatorKind::Initiating, kA, AppStoreClientID);
}
void makeNoAssetPromise(SimulatedPlatform& platform, SyncAsset& /*asset*/) {
    platform.coordination.makeNoneNext(CoordinationObject::PathTransferPromise,
                                       std::string(kA) + "-Asset");
}
void makeNoPlaceholder(SimulatedPlatform& platform, SyncAsset& /*asset*/) {
    platform.coordination.makeNoneNext(CoordinationObject::Placeholder, kA);
}
void refuseAttributesAndPlaceholder(SimulatedPlatform& platform, SyncAsset& asset) {
    refuse<CoordinationStep::Attributes>(platform, asset);
    platform.coordination.failNext(CoordinationStep::PlaceholderPromise, kA,
                                   {"Coordination", 8, {}});
}

const std::string kCancelsCoordinator =
    "InstallCoordinator.cancelForReason(com.example.a, Error Domain=TRError Code=1 \"(null)\", 3)";
const std::string kCancelsPlaceholder =
    "InstallPlaceholder.cancelForReason(com.example.a, Error Domain=TRError Code=1 \"(null)\", 3)";
const std::string kError = std::string("Error ") + kShown + " ";

const FailureCase kFailures[] = {
    {"NoName", leaveNameless, false, {}, {}},
    {"NoCoordinator", refuse<CoordinationStep::LookUp>, false, {}, {}, kShown},
    {"CoordinatorOfAnotherClient", giveToAnotherClient, false, {}, {}},
    {"InstallOptionsRefused",
     refuse<CoordinationStep::InstallOptions>,
     false,
     {kCancelsCoordinator},
     {kError + "setting install options on coordinator for 'com.example.a'"},
     kShown},
    {"InitialAssetsRefused",
     refuse<CoordinationStep::InitialODRAssetPromises>,
     false,
     {kCancelsCoordinator},
     {kError + "setting ZEL asset promise for 'com.example.a'"},
     kShown},
    {"AppAssetPromiseNotMade",
     makeNoAssetPromise,
     false,
     {kCancelsCoordinator},
     {"Error creating asset promise for 'com.example.a'"}},
    {"AppAssetPromiseRefused",
     refuse<CoordinationStep::AppAssetPromise>,
     false,
     {"PathTransferPromise.cancelForReason(com.example.a-Asset, Error Domain=TRError Code=30 "
      "\"(null)\", 3)",
      kCancelsCoordinator},
     {kError + "adding app asset promise at (null) to 'com.example.a'",
      "Cancelling asset promise for 'com.example.a'"},
     kShown},
    {"IconPromiseRefused",
     refuse<CoordinationStep::IconPromise>,
     true,
     {"PathTransferPromise.cancelForReason(com.example.a-Icon, Error Domain=TRError Code=30 "
      "\"(null)\", 3)"},
     {kError + "adding icon promise to placeholder for 'com.example.a'"},
     kShown},
    {"AttributesRefused",
     refuse<CoordinationStep::Attributes>,
     true,
     {},
     {kError + "setting attributes on placeholder for 'com.example.a'"},
     kShown},
    {"MetadataRefused",
     refuse<CoordinationStep::Metadata>,
     true,
     {},
     {kError + "setting store metadata on placeholder for 'com.example.a'"},
     kShown},
    {"ConfigurationCompleteRefused",
     refuse<CoordinationStep::ConfigurationComplete>,
     true,
     {},
     {kError + "setting placeholder configuration as complete for 'com.example.a'"},
     kShown},
    {"PlaceholderPromiseRefused",
     refuse<CoordinationStep::PlaceholderPromise>,
     false,
     {kCancelsPlaceholder, kCancelsCoordinator},
     {kError + "adding placeholder promise to coordinator for 'com.example.a'"},
     kShown},
    {"AttributesAndPlaceholderPromiseRefused",
     refuseAttributesAndPlaceholder,
     false,
     {kCancelsPlaceholder, kCancelsCoordinator},
     {kError + "setting attributes on placeholder for 'com.example.a'",
      "Error Error Domain=Coordination Code=8 \"(null)\" adding placeholder promise to coordinator "
      "for 'com.example.a'"},
     "Error Domain=Coordination Code=8 \"(null)\""},
};

class PreparationFailures : public PreparedAppFixture,
                            public testing::WithParamInterface<FailureCase> {
  protected:
    void prepareWithFailure() {
        GetParam().breakStep(platform_, *asset_);
        EXPECT_EQ(client_->prepareAppForInstallUsingCoordination(*asset_, false),
                  GetParam().status);
    }
    [[nodiscard]] std::vector<std::string> errors() const {
        std::vector<std::string> texts;
        for (const RecordEntry& entry : platform_.recording()) {
            if (entry.kind == RecordEntry::Kind::Message && entry.level == LogLevel::Error) {
                texts.push_back(entry.text);
            }
        }
        return texts;
    }
    /// The lines from the one that says how the preparation finished.
    [[nodiscard]] std::vector<std::string> ending() const {
        std::vector<std::string> lines = platform_.lines();
        const auto finished = std::find_if(lines.begin(), lines.end(), [](const auto& line) {
            return line.find(" finished with status ") != std::string::npos;
        });
        return {finished, lines.end()};
    }
    /// What the ending should be: the message, the step, then each cancel with its message.
    [[nodiscard]] std::vector<std::string> expectedEnding() const {
        const std::string& identifier = asset_->identifier;
        std::vector<std::string> lines{
            "8 default processing app install for bundle " + identifier + " finished with status " +
                (GetParam().status ? "1" : "0") + " error " + GetParam().lastError,
            std::string("InstallTransactionLog.logStep(1, 1, 2, ") +
                (GetParam().status ? "yes, " : "no, ") + identifier + ", Install app)"};
        for (const std::string& cancel : GetParam().cancelled) {
            if (cancel.starts_with("PathTransferPromise")) continue;
            const bool isPlaceholder = cancel.starts_with("InstallPlaceholder");
            lines.push_back(std::string("8 default Cancelling ") +
                            (isPlaceholder ? "placeholder" : "coordinator") +
                            " for appBundleIdentifier:" + identifier);
            lines.push_back(cancel);
        }
        return lines;
    }
};

TEST_P(PreparationFailures, CancelWhatTheyMustInOrder) {
    prepareWithFailure();
    EXPECT_THAT(platform_.callsTo({"InstallCoordinator.cancelForReason",
                                   "InstallPlaceholder.cancelForReason",
                                   "PathTransferPromise.cancelForReason"}),
                ElementsAreArray(GetParam().cancelled));
}

TEST_P(PreparationFailures, AreLogged) {
    prepareWithFailure();
    EXPECT_THAT(errors(), ElementsAreArray(GetParam().errors));
}

TEST_P(PreparationFailures, AreToldOfBeforeAnythingIsCancelled) {
    prepareWithFailure();
    EXPECT_THAT(ending(), ElementsAreArray(expectedEnding()));
    EXPECT_EQ(steps().front(), "InstallTransactionLog.logStep(1, 1, 1, yes, " + asset_->identifier +
                                   ", Install App)");
}

TEST_P(PreparationFailures, LeaveNoCoordinatorOfOursBehind) {
    prepareWithFailure();
    platform_.runUntilIdle();
    const bool isOurs = state() != nullptr && state()->creator == SyncClientID;
    EXPECT_EQ(isOurs, GetParam().status);
    EXPECT_EQ(service().identifiers().empty(), state() == nullptr);
}

TEST_P(PreparationFailures, StandInTheWayOfALaterOneOnlyWithAnotherClient) {
    prepareWithFailure();
    platform_.runUntilIdle();
    const bool isOfAnotherClient = state() != nullptr && state()->creator != SyncClientID;
    asset_->identifier = kA;
    asset_->prettyName = "Example";
    EXPECT_EQ(prepare(), !isOfAnotherClient);
}

INSTANTIATE_TEST_SUITE_P(EveryStep, PreparationFailures, testing::ValuesIn(kFailures),
                         [](const auto& each) { return std::string(each.param.name); });

class IncompletePlaceholder : public PreparedAppFixture {};

TEST_F(IncompletePlaceholder, WithARefusedIconGoesToTheCoordinatorAsItIs) {
    service().failNext(CoordinationStep::IconPromise, kA, refusal_);
    EXPECT_TRUE(prepare());
    EXPECT_FALSE(state()->placeholder->attributes);
    EXPECT_FALSE(state()->placeholder->metadataSet);
    EXPECT_FALSE(state()->placeholder->configurationComplete);
}

TEST_F(IncompletePlaceholder, WithRefusedAttributesGetsNoMetadata) {
    service().failNext(CoordinationStep::Attributes, kA, refusal_);
    EXPECT_TRUE(prepare());
    EXPECT_FALSE(state()->placeholder->metadataSet);
    EXPECT_FALSE(state()->placeholder->configurationComplete);
}

TEST_F(IncompletePlaceholder, WithRefusedMetadataIsNotCompleted) {
    service().failNext(CoordinationStep::Metadata, kA, refusal_);
    EXPECT_TRUE(prepare());
    EXPECT_TRUE(state()->placeholder->attributes);
    EXPECT_FALSE(state()->placeholder->configurationComplete);
}

TEST_F(IncompletePlaceholder, ThatWasNeverMadeIsRefusedAndOnlyTheCoordinatorCancelled) {
    makeNoPlaceholder(platform_, *asset_);
    EXPECT_FALSE(prepare());
    EXPECT_THAT(platform_.callsTo({"InstallPlaceholder"}), testing::IsEmpty());
    EXPECT_THAT(
        platform_.callsTo(
            {"InstallCoordinator.setPlaceholderPromise", "InstallCoordinator.cancelForReason"}),
        testing::ElementsAre(testing::HasSubstr("setPlaceholderPromise"), kCancelsCoordinator));
    EXPECT_TRUE(
        logged(LogLevel::Default, "Created placeholder (null) for 'com.example.a' of type 4"));
}

}  // namespace
}  // namespace appsync
