#include <cmath>
#include <limits>

#include "tests/transfer/TransferEventsFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::StartsWith;

class TransferProgress : public TransferEventsFixture {};

TEST_F(TransferProgress, ShowProgressInThousandths) {
    progress(0.4567);
    EXPECT_EQ(values(), (Values{kInstallStateActive, kInstallPhaseLoading, 1000, 456}));
    EXPECT_TRUE(logged(LogLevel::Default, "finished transferring 0.456700 for com.example.a"));
    EXPECT_THAT(outstanding(), ElementsAre(kA));
}

TEST_F(TransferProgress, SetTheTotalOnlyWhenItDiffers) {
    progress(0.1);
    platform_.clearRecording();
    progress(0.2);
    EXPECT_THAT(platform_.callsTo({"InstallProgressRecord.setTotalUnitCount"}), IsEmpty());
    EXPECT_EQ(values().completed, 200);
}

TEST_F(TransferProgress, TruncateAFractionTowardZero) {
    const std::vector<std::pair<double, std::int64_t>> cases{
        {0.0, 0}, {1.0, 1000}, {0.0009, 0}, {0.9999, 999}, {-0.4567, -456}};
    for (const auto& [fraction, completed] : cases) {
        progress(fraction);
        EXPECT_EQ(values().completed, completed) << fraction;
    }
}

TEST_F(TransferProgress, SurviveAFractionThatIsNone) {
    progress(std::nan(""));
    EXPECT_EQ(values().completed, 0);
    progress(std::numeric_limits<double>::infinity());
    progress(-std::numeric_limits<double>::max());
    EXPECT_THAT(outstanding(), ElementsAre(kA));
}

TEST_F(TransferProgress, TakeNoteOfProgressWithoutARecord) {
    client_->assetTransferUpdatedProgress(receivedAsset(kB), 0.5);
    EXPECT_THAT(outstanding(), ElementsAre(kB));
    EXPECT_TRUE(logged(LogLevel::Error, "Returning (null) progress for com.example.b"));
}

TEST_F(TransferProgress, LookTheProgressRecordUpAmongPlaceholdersToo) {
    progress(0.5);
    EXPECT_TRUE(logged(LogLevel::Error,
                       "Returning com.example.a state=0 phase=0 0/0 progress for com.example.a"));
    EXPECT_THAT(platform_.callsTo({"AppRegistry"}),
                ElementsAre("AppRegistry.proxyForIdentifier(com.example.a, placeholders included) "
                            "-> com.example.a (placeholder)",
                            StartsWith("AppRegistry.installProgress(com.example.a (placeholder), "
                                       "0)")));
}

}  // namespace
}  // namespace appsync
