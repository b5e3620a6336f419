#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <set>
#include <string>
#include <vector>

#include "simulation/recording/KnownCalls.h"
#include "tests/reliability/Invariants.h"
#include "tests/reliability/World.h"

namespace appsync {
namespace {

using testing::IsEmpty;
using testing::IsSupersetOf;

constexpr const char* kNew = "com.example.new";
constexpr const char* kRunning = "com.example.running";
constexpr const char* kRefused = "com.example.refused";
constexpr const char* kUnwanted = "com.example.unwanted";
constexpr const char* kRestoring = "com.example.restoring";
constexpr std::uint64_t kSeedsToEnd = 20;
/// The answer to a wish of the client's, which is logged whether or not the client is still there.
constexpr std::string_view kLateAnswer = "Prioritize ";

/// What crosses platform/ once nobody holds the client any more: its destructor's calls, what an
/// install holds besides the client, and a start-up that is told to nobody.
const std::set<std::string> kLastCalls{
    "AppRegistry.removeObserver", "SyncHost.mainBundleIdentifier",
    "NotificationCenter.removeObserver", "NotificationCenterObserver.callback", "WaitGroup.leave"};

/// A session that the host leaves after one of its calls: no wait, no end of a phase. Installs run,
/// wait for their queue or for their second try, others cancel and prioritize, and the registry and
/// the coordination service have reports on their way.
class LeftSession {
  public:
    LeftSession(bool coordinated, std::uint64_t seed)
        : world_(Scheduling::seeded(seed)), invariants_(world_) {
        world_.coordinated = coordinated;
        for (const char* identifier : {kRunning, kUnwanted}) {
            world_.platform.registry.addApplication(identifier, "0.9");
        }
        world_.platform.registry.addPlaceholder(kRestoring, kInstallTypeRestore);
        world_.platform.registry.setInstallDuration(std::chrono::seconds(seed % 3));
        world_.platform.registry.failNextInstall(
            kRefused, ErrorRecord::make(kInstallerErrorDomain, 1, "refused"));
        world_.platform.homeScreen.setRunning(kRunning, true);
        invariants_.mustKeep(kRunning);
        invariants_.mayRemove(kUnwanted);
        world_.startClient();
        const PropertyList list = PropertyList::array(
            {World::entry(kNew, "install"), World::entry(kRunning, "install"),
             World::entry(kRefused, "install"), World::entry(kUnwanted, "remove")});
        world_.stage(list);
        world_.stageRestore({"com.example.backedup"});
        invariants_.sessionBegins(list);
        invariants_.restoreBegins();
    }

    /// Leaves after so many calls. Whether there were so many.
    bool leaveAfter(std::size_t calls) {
        client_ = world_.client;
        std::size_t made = 0;
        while (made < calls && makeCall(made)) ++made;
        disturb();
        world_.platform.onCall("AppRegistry.removeObserver", [this](const RecordEntry& entry) {
            if (!client_.expired()) return;
            lastHolder_ = entry.task;
            end_ = world_.platform.recording().size();
        });
        invariants_.clientGoes();
        invariants_.sessionHasEnded();
        return made == calls;
    }

    [[nodiscard]] const std::vector<std::string>& violations() const {
        return invariants_.violations();
    }
    /// The flow of control that let the client go last.
    [[nodiscard]] const std::string& lastHolder() const { return lastHolder_; }
    /// What came after the end of the client and is not of it.
    [[nodiscard]] std::vector<std::string> strangeCalls() const {
        std::vector<std::string> result;
        const std::vector<RecordEntry>& recording = world_.platform.recording();
        for (auto entry = recording.begin() + static_cast<std::ptrdiff_t>(end_);
             entry != recording.end(); ++entry) {
            const std::string name =
                std::string(withoutNumber(entry->service)) + "." + entry->method;
            const bool isOfTheEnd = entry->kind == RecordEntry::Kind::Call
                                        ? kLastCalls.contains(name)
                                        : entry->text.starts_with(kLateAnswer);
            if (!isOfTheEnd) result.push_back(entry->line());
        }
        return result;
    }

  private:
    /// The call of this number. False: there are not so many.
    bool makeCall(std::size_t number) {
        AppsClient& client = *world_.client;
        switch (number) {
            case 0:
                client.reconcileRestoreOfType(2, nullptr);
                return true;
            case 1:
                client.reconcileSync({}, "anchor", {}, nullptr);
                return true;
            case 2:
                static_cast<void>(client.installedAssets());
                return true;
            case 3:
                assets_ = client.outstandingAssetTransfers();
                return true;
            default:
                return transfer(number - 4);
        }
    }

    /// Each asset first arrives in part, then whole.
    bool transfer(std::size_t number) {
        if (number / 2 >= assets_.size()) return false;
        const SyncAssetPointer& asset = assets_.at(number / 2);
        if (number % 2 == 0) {
            world_.client->assetTransferUpdatedProgress(asset, 0.5);
        } else {
            world_.receive(asset);
            world_.client->assetTransferSucceeded(asset, true, nullptr);
        }
        return true;
    }

    /// What others do while the host leaves.
    void disturb() {
        const ErrorRecord reason = ErrorRecord::make("Person", 1, "cancelled");
        world_.platform.registry.cancelInstalls({kRestoring});
        world_.platform.notificationCenter.post(kStartUp);
        if (!world_.coordinated) return;
        SimulatedCoordination& service = world_.platform.coordination;
        service.postDidInstallPlaceholder(kNew);
        service.prioritize(kNew);
        if (service.state(kRunning) != nullptr) service.cancel(kRunning, reason, AppStoreClientID);
    }

    World world_;
    Invariants invariants_;
    std::vector<SyncAssetPointer> assets_;
    std::weak_ptr<AppsClient> client_;
    std::string lastHolder_;
    std::size_t end_ = 0;
};

class ClientEnd : public testing::TestWithParam<bool> {
  protected:
    /// Leaves after each call, with each seed. Who let the client go last.
    std::set<std::string> leaveAfterEachCall() {
        std::set<std::string> holders;
        for (std::uint64_t seed = 0; seed < kSeedsToEnd; ++seed) {
            std::size_t calls = 0;
            while (leave(calls, seed, holders)) ++calls;
            EXPECT_GE(calls, 10U);
        }
        return holders;
    }

  private:
    static bool leave(std::size_t calls, std::uint64_t seed, std::set<std::string>& holders) {
        SCOPED_TRACE("after " + std::to_string(calls) + " calls, seed " + std::to_string(seed));
        LeftSession session(GetParam(), seed);
        const bool left = session.leaveAfter(calls);
        EXPECT_THAT(session.violations(), IsEmpty());
        EXPECT_THAT(session.strangeCalls(), IsEmpty());
        EXPECT_NE(session.lastHolder(), "") << "it has not ended";
        holders.insert(withoutDigits(session.lastHolder()));
        return left;
    }
    static std::string withoutDigits(const std::string& task) {
        return task.substr(0, task.find_last_not_of("0123456789 ") + 1);
    }
};

TEST_P(ClientEnd, ReachesNobodyWhoeverHoldsTheClientLast) {
    const std::set<std::string> holders = leaveAfterEachCall();
    const std::set<std::string> expected =
        GetParam() ? std::set<std::string>{"host", "coordination"}
                   : std::set<std::string>{"host", "registry", "operation"};
    EXPECT_THAT(holders, IsSupersetOf(expected));
}

INSTANTIATE_TEST_SUITE_P(Of, ClientEnd, testing::Bool(), [](const auto& tested) {
    return tested.param ? "CoordinatedInstalls" : "DirectInstalls";
});

}  // namespace
}  // namespace appsync
