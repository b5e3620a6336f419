#include <ostream>

#include "tests/restore/RestoreFixture.h"

namespace appsync {
namespace {

using testing::ElementsAreArray;
using testing::StartsWith;

/// A coordinated restore that fails, and what is cancelled then.
struct FailedRestore {
    const char* name;
    std::uint64_t demotionStatus;
    /// Nothing: the metadata is damaged.
    std::optional<CoordinationStep> refused;
    bool coordinator;
    bool placeholder;
};

std::ostream& operator<<(std::ostream& out, const FailedRestore& failed) {
    return out << failed.name;
}

const FailedRestore kFailedRestores[] = {
    {"DamagedMetadata", 0, std::nullopt, false, false},
    {"NoCoordinator", 0, CoordinationStep::LookUp, false, false},
    {"UserDataRefused", 0, CoordinationStep::UserDataPromise, true, false},
    {"SinfRefused", 0, CoordinationStep::Sinf, true, false},
    {"PlaceholderRefused", 0, CoordinationStep::PlaceholderPromise, true, true},
    {"AppStoreRefused", 0, CoordinationStep::AppAssetPromiseResponsibleClient, true, false},
    {"DamagedMetadataOfADemotedApp", 1, std::nullopt, false, false},
    {"NoCoordinatorOfADemotedApp", 1, CoordinationStep::LookUp, false, false},
    {"UserDataOfADemotedAppRefused", 1, CoordinationStep::UserDataPromise, true, false},
    {"SinfOfADemotedAppRefused", 2, CoordinationStep::Sinf, true, false},
    {"PlaceholderOfADemotedAppRefused", 2, CoordinationStep::PlaceholderPromise, true, true},
};

/// Its placeholder is awaited from an earlier restore.
class FailedRestores : public RestoreFixture, public testing::WithParamInterface<FailedRestore> {
  protected:
    FailedRestores() {
        coordinate();
        client_->relocantSetPlaceHolderPromiseForRestoreAppBundle(kA);
        platform_.clearRecording();
    }
    bool prepare() {
        if (GetParam().refused) {
            platform_.coordination.failNext(*GetParam().refused, kA, {"Coordination", 7, {}});
        }
        const Bytes metadata = GetParam().refused ? bytesOf(storeMetadata()) : Bytes{'x'};
        return client_->prepareAppForRestoreUsingCoordination(kA, metadata, &sinf_, &icon_,
                                                              GetParam().demotionStatus);
    }
    /// The lines after the message that says how the restore finished, which is the first of them.
    [[nodiscard]] std::vector<std::string> ending() const {
        std::vector<std::string> lines = platform_.lines();
        auto first = lines.begin();
        while (first != lines.end() && first->find(" finished with status ") == first->npos) {
            ++first;
        }
        return {first, lines.end()};
    }
    [[nodiscard]] static std::vector<testing::Matcher<std::string>> expectedEnding() {
        const bool isDemoted = GetParam().demotionStatus != 0;
        std::vector<testing::Matcher<std::string>> lines{
            StartsWith(std::string("8 default processing app restore for ") +
                       (isDemoted ? "demoted app " : "") +
                       "com.example.a finished with status 0 error "),
            std::string("InstallTransactionLog.logStep(2, 1, 2, no, com.example.a, Restore ") +
                (isDemoted ? "demoted app)" : "app)")};
        if (GetParam().coordinator) addCancel(lines, "coordinator", "InstallCoordinator");
        if (GetParam().placeholder) addCancel(lines, "placeholder", "InstallPlaceholder");
        lines.emplace_back("SerialQueue#6.sync()");
        lines.emplace_back("WaitGroup#6.leave()");
        lines.emplace_back(
            "8 default Relocant cancelled coordinator for restoring app bundle com.example.a "
            "_restoringPlaceholderCount 0");
        return lines;
    }

  private:
    static void addCancel(std::vector<testing::Matcher<std::string>>& lines,
                          const std::string& what, const std::string& service) {
        lines.emplace_back("8 default Cancelling " + what +
                           " for appBundleIdentifier:com.example.a");
        lines.emplace_back(service +
                           ".cancelForReason(com.example.a, Error Domain=TRError Code=29 "
                           "\"(null)\", 3)");
    }
};

TEST_P(FailedRestores, AreLoggedThenRecordedThenCancelledThenTakenFromTheBook) {
    EXPECT_FALSE(prepare());
    EXPECT_THAT(ending(), ElementsAreArray(expectedEnding()));
}

INSTANTIATE_TEST_SUITE_P(EveryStep, FailedRestores, testing::ValuesIn(kFailedRestores),
                         [](const auto& each) { return std::string(each.param.name); });

}  // namespace
}  // namespace appsync
