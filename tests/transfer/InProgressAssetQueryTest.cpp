#include "transfer/InProgressAssetQuery.h"

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Optional;

class InProgressQuery : public AppsClientFixture {
  protected:
    InProgressQuery() {
        client_.reset();
        platform_.clearRecording();
    }
    void query(const Platform& services) {
        InProgressAssetQuery::currentInProgressAssetIDs(services, inProgress_, restoring_);
    }
    void query() { query(platform_.services()); }
    void addInstall(const std::string& identifier, std::uint64_t type, std::uint64_t state,
                    std::uint64_t phase) {
        platform_.registry.addPlaceholder(identifier, type);
        platform_.registry.setProgress(identifier, {state, phase, 0, 0});
    }
    /// The registry reports these, whatever their state.
    void report(const std::vector<std::string>& prioritized,
                const std::vector<std::string>& paused = {}) {
        platform_.registry.setReport(proxies(prioritized), proxies(paused));
    }
    std::vector<AppProxy> proxies(const std::vector<std::string>& identifiers) {
        std::vector<AppProxy> result;
        for (const std::string& identifier : identifiers) {
            result.push_back(*platform_.registry.proxyForIdentifier(
                identifier, AppRegistry::Placeholders::Included));
        }
        return result;
    }

    InProgressAssetQuery::Identifiers inProgress_;
    InProgressAssetQuery::Identifiers restoring_;
};

TEST_F(InProgressQuery, FindsNothingOnADeviceThatInstallsNothing) {
    query();
    EXPECT_THAT(inProgress_, Optional(IsEmpty()));
    EXPECT_THAT(restoring_, Optional(IsEmpty()));
    EXPECT_THAT(
        platform_.messageLines(),
        ElementsAre(
            "8 default Waiting for -applicationInstallsArePrioritized:arePaused: to complete...",
            "14 default prioritized proxies () paused proxies ()",
            "8 default No assets currently in progress.", "8 default signaling semaphore",
            "8 default Wait completed"));
    EXPECT_EQ(platform_.registry.observers(), 0U);
}

TEST_F(InProgressQuery, LogsWhatItIsToldOfEachInstall) {
    addInstall(kA, kInstallTypeSync, kInstallStateActive, kInstallPhaseInstalling);
    query();
    EXPECT_TRUE(loggedInApplications(LogLevel::Default,
                                     "prioritized proxies (com.example.a) paused proxies ()"));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Got install type=RGInstallTypeSync state=RGInstallStateActive "
                       "phase=RGInstallPhaseInstalling for com.example.a"));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.installProgress"}),
                ElementsAre(HasSubstr("(com.example.a (placeholder), 0)")))
        << "of the whole install";
}

TEST_F(InProgressQuery, NamesAnUnknownType) {
    addInstall(kA, 9, 7, 5);
    report({kA});
    query();
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Got install type=Unknown Install Type: 9 state=Unknown Install State: 7 "
                       "phase=Unknown Install Phase: 5 for com.example.a"));
}

TEST_F(InProgressQuery, SkipsWhatIsNoPlaceholder) {
    platform_.registry.addApplication(kA);
    report({kA});
    query();
    EXPECT_THAT(inProgress_, Optional(IsEmpty()));
    EXPECT_TRUE(logged(LogLevel::Default, "No placeholder for asset identifier com.example.a"));
}

TEST_F(InProgressQuery, SkipsWhatHasNoProgress) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync);
    platform_.registry.removeProgress(kA);
    addInstall(kB, kInstallTypeStoreDownload, kInstallStateActive, kInstallPhaseLoading);
    report({kA, kB});
    query();
    EXPECT_THAT(inProgress_, Optional(ElementsAre(kB)));
    EXPECT_TRUE(
        logged(LogLevel::Default, "No install progress found for asset identifier com.example.a"));
}

TEST_F(InProgressQuery, OnlyLogsPausedInstalls) {
    addInstall(kA, kInstallTypeStoreDownload, kInstallStateActive, kInstallPhaseInstalling);
    report({}, {kA});
    query();
    EXPECT_THAT(inProgress_, Optional(IsEmpty()));
    EXPECT_TRUE(loggedInApplications(LogLevel::Default,
                                     "prioritized proxies () paused proxies (com.example.a)"));
}

TEST_F(InProgressQuery, KeepsTheOrderOfTheReport) {
    for (const char* identifier : {kA, kB, kC}) {
        addInstall(identifier, kInstallTypeSync, kInstallStateActive, kInstallPhaseInstalling);
    }
    report({kC, kA, kB});
    query();
    EXPECT_THAT(inProgress_, Optional(ElementsAre(kC, kA, kB)));
}

TEST_F(InProgressQuery, CountsOnlyTheFirstReport) {
    const auto asked = std::make_shared<InProgressAssetQuery>(platform_.services());
    asked->applicationInstallsArePrioritized({}, {});
    addInstall(kA, kInstallTypeSync, kInstallStateActive, kInstallPhaseInstalling);
    platform_.clearRecording();
    asked->applicationInstallsArePrioritized(proxies({kA}), {});
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("14 default prioritized proxies (com.example.a) paused proxies ()"));
    EXPECT_TRUE(asked->_fetchResults());
    EXPECT_THAT(platform_.callsTo({"Semaphore#1.signal"}), IsEmpty());
}

TEST_F(InProgressQuery, AnswersWithTheFirstReportAlthoughAnotherComesBeforeItIsRead) {
    addInstall(kA, kInstallTypeSync, kInstallStateActive, kInstallPhaseInstalling);
    addInstall(kB, kInstallTypeSync, kInstallStateActive, kInstallPhaseInstalling);
    addInstall(kC, kInstallTypeRestore, kInstallStateActive, kInstallPhaseLoading);
    report({kA, kC});
    const std::vector<AppProxy> second = proxies({kB});
    platform_.onCall("Semaphore.signal",
                     [&](const RecordEntry&) { platform_.registry.setReport(second, {}); });
    query();
    EXPECT_THAT(platform_.callsTo({"AppRegistryObserver"}), testing::SizeIs(2));
    EXPECT_THAT(inProgress_, Optional(ElementsAre(kA)));
    EXPECT_THAT(restoring_, Optional(ElementsAre(kC)));
}

TEST_F(InProgressQuery, WaitsForAReportThatComesLate) {
    addInstall(kA, kInstallTypeSync, kInstallStateActive, kInstallPhaseInstalling);
    platform_.registry.withholdReports(true);
    platform_.scheduler.spawnAfter(std::chrono::hours(1), "late",
                                   [this] { platform_.registry.withholdReports(false); });
    query();
    EXPECT_THAT(inProgress_, Optional(ElementsAre(kA)));
    EXPECT_EQ(platform_.now(), std::chrono::hours(1));
}

TEST_F(InProgressQuery, HasNoUseForCancelledInstalls) {
    InProgressAssetQuery asked(platform_.services());
    asked.applicationInstallsDidCancel({AppProxy()});
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

// Which list an install belongs to, for every type, state and phase.

std::string listOf(std::uint64_t type, std::uint64_t state, std::uint64_t phase) {
    if (state != 1) return "neither";
    if (type == 2) return phase <= 1 ? "restoring" : "neither";
    if (phase == 1) return "in progress";
    return type == 1 && phase == 0 ? "in progress" : "neither";
}

class InstallOfType : public InProgressQuery, public testing::WithParamInterface<int> {
  protected:
    std::string foundFor(std::uint64_t state, std::uint64_t phase) {
        platform_.registry.setProgress(kA, {state, phase, 0, 0});
        report({kA});
        query();
        if (!inProgress_->empty()) return "in progress";
        return restoring_->empty() ? "neither" : "restoring";
    }
};

TEST_P(InstallOfType, IsSortedByStateAndPhase) {
    const auto type = static_cast<std::uint64_t>(GetParam());
    platform_.registry.addPlaceholder(kA, type);
    for (std::uint64_t state = 0; state <= 6; ++state) {
        for (std::uint64_t phase = 0; phase <= 4; ++phase) {
            EXPECT_EQ(foundFor(state, phase), listOf(type, state, phase))
                << "state " << state << " phase " << phase;
        }
    }
}

INSTANTIATE_TEST_SUITE_P(EveryType, InstallOfType, testing::Range(0, 10));

TEST_F(InProgressQuery, CountsAStoreDownloadAlreadyWhileItLoads) {
    addInstall(kA, 1, 1, 0);
    addInstall(kB, 3, 1, 0);
    addInstall(kC, 4, 2, 1);
    report({kA, kB, kC});
    query();
    EXPECT_THAT(inProgress_, Optional(ElementsAre(kA)));
    EXPECT_THAT(restoring_, Optional(IsEmpty()));
}

TEST_F(InProgressQuery, CountsARestoreUntilItsDataIsRestored) {
    addInstall(kA, 2, 1, 1);
    addInstall(kB, 2, 1, 2);
    query();
    EXPECT_THAT(inProgress_, Optional(IsEmpty()));
    EXPECT_THAT(restoring_, Optional(ElementsAre(kA)));
}

// A wait that times out: no platform's does today, since there is no limit.

/// Fails after a time in which everything has come that was to come.
class ImpatientSemaphore : public Semaphore {
  public:
    explicit ImpatientSemaphore(Scheduler& scheduler) : scheduler_(scheduler) {}
    void signal() override {}
    [[nodiscard]] bool wait() override {
        scheduler_.runUntilIdle();
        return false;
    }

  private:
    Scheduler& scheduler_;
};

class ImpatientQueues : public SimulatedWorkQueues {
  public:
    explicit ImpatientQueues(Recorder& recorder)
        : SimulatedWorkQueues(recorder), scheduler_(recorder.scheduler()) {}
    [[nodiscard]] std::unique_ptr<Semaphore> makeSemaphore(std::int64_t) override {
        return std::make_unique<ImpatientSemaphore>(scheduler_);
    }

  private:
    Scheduler& scheduler_;
};

class ImpatientQuery : public InProgressQuery {
  protected:
    [[nodiscard]] Platform impatient() {
        return {platform_.host,
                platform_.log,
                platform_.registry,
                platform_.installer,
                platform_.coordination,
                platform_.policy,
                platform_.backup,
                platform_.homeScreen,
                platform_.icons,
                platform_.transactions,
                queues_,
                platform_.files,
                platform_.propertyLists,
                platform_.notifications,
                platform_.notificationCenter};
    }
    ImpatientQueues queues_{platform_.recorder};
};

TEST_F(ImpatientQuery, FindsNeitherListWhenTheWaitTimesOut) {
    inProgress_.emplace();
    restoring_.emplace();
    query(impatient());
    EXPECT_EQ(inProgress_, std::nullopt);
    EXPECT_EQ(restoring_, std::nullopt);
    EXPECT_TRUE(logged(LogLevel::Error, "Query for in progress assets timed out"));
    EXPECT_EQ(platform_.registry.observers(), 0U);
}

TEST_F(ImpatientQuery, LeavesThePlanUnfiltered) {
    addInstall(kA, kInstallTypeStoreDownload, kInstallStateActive, kInstallPhaseLoading);
    client_ = AppsClient::create(impatient());
    EXPECT_THAT(client_->outstandingAssetTransfers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Error, "Failed to get list of assets already in progress!"));
    EXPECT_TRUE(logged(LogLevel::Error, "Failed to get list of assets currently restoring!"));
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("Asset com.example.a (pretty=")));
    client_.reset();
}

}  // namespace
}  // namespace appsync
