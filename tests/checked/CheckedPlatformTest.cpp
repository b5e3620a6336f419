#include <chrono>
#include <functional>
#include <utility>

#include "contract/forwarding/ForwardingAppRegistry.h"
#include "contract/forwarding/ForwardingCoordination.h"
#include "contract/forwarding/ForwardingDeviceServices.h"
#include "contract/forwarding/ForwardingFileSystem.h"
#include "contract/forwarding/ForwardingSystemServices.h"
#include "contract/forwarding/ForwardingWorkQueues.h"
#include "tests/checked/CheckedPlatformFixture.h"

namespace appsync {
namespace {

using std::chrono::seconds;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class CheckedPlatformTest : public CheckedPlatformFixture {};

TEST_F(CheckedPlatformTest, SaysNothingOfAGoodPlatform) {
    check(platform_.services());
    makeClient();
    sync();
    restore();
    client_.reset();
    platform_.advance(seconds(60));
    EXPECT_THAT(told(), IsEmpty());
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB, kC));
}

TEST_F(CheckedPlatformTest, SaysNothingOfAGoodPlatformThatCoordinates) {
    platform_.coordination.setEnabled(true);
    check(platform_.services());
    makeClient();
    sync();
    restore();
    client_.reset();
    platform_.advance(seconds(60));
    EXPECT_THAT(told(), IsEmpty());
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB, kC));
}

/// The same in other orders.
class CheckedSeeds : public CheckedPlatformFixture,
                     public testing::WithParamInterface<std::uint64_t> {
  protected:
    CheckedSeeds() : CheckedPlatformFixture(Scheduling::seeded(GetParam())) {}
};

INSTANTIATE_TEST_SUITE_P(, CheckedSeeds, testing::Range<std::uint64_t>(1, 101));

TEST_P(CheckedSeeds, SaysNothingOfAGoodPlatform) {
    platform_.coordination.setEnabled(GetParam() % 2 == 0);
    check(platform_.services());
    makeClient();
    sync();
    restore();
    client_.reset();
    platform_.advance(seconds(60));
    EXPECT_THAT(told(), IsEmpty());
}

// One that is broken, for each breach.

class IgnoringObserver : public AppRegistryObserver {
  public:
    void applicationInstallsArePrioritized(const std::vector<AppProxy>&,
                                           const std::vector<AppProxy>&) override {
        ++reports;
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>&) override {}

    int reports = 0;
};

class BrokenRegistryTest : public CheckedPlatformFixture {
  protected:
    void observe(AppRegistry& broken) {
        checkWith({.registry = &broken});
        checked_->services().registry.addObserver(observer_);
    }
    const std::shared_ptr<IgnoringObserver> observer_ = std::make_shared<IgnoringObserver>();
};

/// Calls observers itself, as the test says.
class HandmadeReports : public ForwardingAppRegistry {
  public:
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override {
        observer_ = observer.lock();  // not weakly, as it should be
        if (onAdd) onAdd();
    }
    void removeObserver(const AppRegistryObserver* /*observer*/) override {}
    void report() { observer_->applicationInstallsArePrioritized({}, {}); }

    std::function<void()> onAdd;

  private:
    std::shared_ptr<AppRegistryObserver> observer_;
};

TEST_F(BrokenRegistryTest, AFirstReportOnTheCallersThread) {
    HandmadeReports broken(platform_.registry);
    broken.onAdd = [&broken] { broken.report(); };
    observe(broken);
    EXPECT_THAT(told(), ElementsAre(HasSubstr("came on the thread that was in addObserver")));
    EXPECT_EQ(observer_->reports, 1);
}

TEST_F(BrokenRegistryTest, NoFirstReport) {
    HandmadeReports broken(platform_.registry);
    observe(broken);
    platform_.advance(seconds(29));
    EXPECT_THAT(told(), IsEmpty());
    platform_.advance(seconds(2));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("no first report came in time")));
}

TEST_F(BrokenRegistryTest, ASecondFirstReport) {
    HandmadeReports broken(platform_.registry);
    observe(broken);
    broken.report();
    EXPECT_THAT(told(), IsEmpty());
    broken.report();
    EXPECT_THAT(told(), ElementsAre(HasSubstr("told the same lists twice")));
}

TEST_F(BrokenRegistryTest, AReportAfterTheRemoval) {
    HandmadeReports broken(platform_.registry);
    observe(broken);
    broken.report();
    checked_->services().registry.removeObserver(observer_.get());
    broken.report();
    EXPECT_THAT(told(), ElementsAre(HasSubstr("was called after removeObserver")));
    EXPECT_EQ(observer_->reports, 1);
}

TEST_F(BrokenRegistryTest, TwoCallsOfOneObserverAtATime) {
    HandmadeReports broken(platform_.registry);
    observe(broken);
    platform_.scheduler.spawn("one", [&broken] { broken.report(); });
    platform_.scheduler.spawn("other", [&broken] { broken.report(); });
    platform_.runUntilIdle();
    EXPECT_THAT(told(), testing::Contains(HasSubstr("while another call of it went on")));
}

/// Holds a lock while it calls.
class LockedReports : public HandmadeReports {
  public:
    LockedReports(AppRegistry& registry, WorkQueues& queues)
        : HandmadeReports(registry), lock_(queues.makeLock()) {}
    bool isApplicationInstalled(const std::string& identifier) override {
        const std::lock_guard held(*lock_);
        return HandmadeReports::isApplicationInstalled(identifier);
    }
    void reportWithLock() {
        const std::lock_guard held(*lock_);
        report();
    }

  private:
    const std::unique_ptr<Lock> lock_;
};

TEST_F(BrokenRegistryTest, ALockThatIsHeld) {
    LockedReports broken(platform_.registry, platform_.queues);
    observe(broken);
    broken.reportWithLock();
    platform_.runUntilIdle();  // the question is answered now
    EXPECT_THAT(told(), ElementsAre(HasSubstr("so a registry holds no lock when it calls.")));
    EXPECT_EQ(observer_->reports, 1);
}

class WalkingBadly : public ForwardingAppRegistry {
  public:
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        ForwardingAppRegistry::enumerateBundles(type, callback);
        ForwardingAppRegistry::enumerateBundles(type, callback);
        late = callback;
    }
    ProxyCallback late;
};

TEST_F(BrokenRegistryTest, AWalkThatMeetsARecordTwice) {
    platform_.registry.addApplication(kA);
    WalkingBadly broken(platform_.registry);
    checkWith({.registry = &broken});
    checked_->services().registry.enumerateBundles(AppRegistry::kEveryBundle,
                                                   [](const AppProxy&, bool&) {});
    EXPECT_THAT(told(), ElementsAre(HasSubstr("called back twice for one record")));
}

TEST_F(BrokenRegistryTest, AWalkThatGoesOnWhenItIsOver) {
    WalkingBadly broken(platform_.registry);
    checkWith({.registry = &broken});
    int calls = 0;
    checked_->services().registry.enumerateBundles(AppRegistry::kEveryBundle,
                                                   [&calls](const AppProxy&, bool&) { ++calls; });
    bool stop = false;
    AppProxy proxy;
    proxy.state.installed = true;
    broken.late(proxy, stop);
    EXPECT_THAT(told(), ElementsAre(HasSubstr("called back elsewhere, or when it was over")));
    EXPECT_EQ(calls, 0);
}

class AnsweringBadly : public ForwardingAppRegistry {
  public:
    using ForwardingAppRegistry::ForwardingAppRegistry;
    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        auto proxy = ForwardingAppRegistry::proxyForIdentifier(identifier, placeholders);
        if (proxy) proxy->state = state;
        return proxy;
    }
    Status uninstallApplication(const std::string& /*identifier*/,
                                const PropertyList& /*options*/) override {
        return ErrorRecord::make(domain, 1, "refused");
    }
    ApplicationState state{true, true};
    std::string domain = "Nobody";
};

TEST_F(BrokenRegistryTest, ARecordThatIsBoth) {
    platform_.registry.addApplication(kA);
    AnsweringBadly broken(platform_.registry);
    checkWith({.registry = &broken});
    using Placeholders = AppRegistry::Placeholders;
    static_cast<void>(checked_->services().registry.proxyForIdentifier(kA, Placeholders::Included));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("a record that is both")));
}

TEST_F(BrokenRegistryTest, APlaceholderForWhoHasExcludedThem) {
    platform_.registry.addApplication(kA);
    AnsweringBadly broken(platform_.registry);
    broken.state = {false, true};
    checkWith({.registry = &broken});
    using Placeholders = AppRegistry::Placeholders;
    static_cast<void>(checked_->services().registry.proxyForIdentifier(kA, Placeholders::Excluded));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("only installed applications are looked at")));
}

TEST_F(BrokenRegistryTest, AnErrorOfAnUnknownDomain) {
    AnsweringBadly broken(platform_.registry);
    checkWith({.registry = &broken});
    EXPECT_FALSE(checked_->services().registry.uninstallApplication(kA, {}));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("an error of the unknown domain 'Nobody'")));
}

TEST_F(BrokenRegistryTest, AnIllegalIdentifierRefusedInAnotherDomain) {
    AnsweringBadly broken(platform_.registry);
    broken.domain = kPosixErrorDomain;
    checkWith({.registry = &broken});
    EXPECT_FALSE(checked_->services().registry.uninstallApplication("a/b", {}));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("an error of another domain")));
}

/// A record whose completed units are always one less than were set.
class GoingBack : public ForwardingAppRegistry {
  public:
    using ForwardingAppRegistry::ForwardingAppRegistry;

  private:
    class Record : public ForwardingProgressRecord {
      public:
        using ForwardingProgressRecord::ForwardingProgressRecord;
        void setCompletedUnitCount(std::int64_t count) override {
            ForwardingProgressRecord::setCompletedUnitCount(count - 100);
        }
    };
    std::shared_ptr<InstallProgressRecord> recordFor(
        std::shared_ptr<InstallProgressRecord> record) override {
        return std::make_shared<Record>(std::move(record));
    }
};

TEST_F(BrokenRegistryTest, AProgressThatGoesBack) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync);
    GoingBack broken(platform_.registry);
    checkWith({.registry = &broken});
    AppRegistry& registry = checked_->services().registry;
    const auto proxy = registry.proxyForIdentifier(kA, AppRegistry::Placeholders::Included);
    registry.installProgress(*proxy, kWholeInstall)->setCompletedUnitCount(50);
    EXPECT_THAT(told(), ElementsAre(HasSubstr("completed was set to 50 and is less than it was")));
}

class FailingBadly : public ForwardingFileSystem {
  public:
    using ForwardingFileSystem::ForwardingFileSystem;
    Status removeItem(const std::string& /*path*/) override { return error; }
    std::string temporaryDirectory() override { return "/tmp/"; }
    ErrorRecord error;
};

class BrokenServicesTest : public CheckedPlatformFixture {};

TEST_F(BrokenServicesTest, ErrorsOfFilesWithoutDomainNumberOrSentence) {
    FailingBadly broken(platform_.files);
    checkWith({.files = &broken});
    FileSystem& files = checked_->services().files;
    broken.error = ErrorRecord::make("", 2, "it is not there");
    EXPECT_FALSE(files.removeItem("/a"));
    broken.error = ErrorRecord::make(kPosixErrorDomain, 0, "it is not there");
    EXPECT_FALSE(files.removeItem("/a"));
    broken.error = {std::string(kPosixErrorDomain), 2, {}};
    EXPECT_FALSE(files.removeItem("/a"));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("removeItem gave the code 2 of ''"),
                                    HasSubstr("removeItem gave the code 0 of 'POSIX'"),
                                    HasSubstr("'POSIX', without a sentence")));
}

TEST_F(BrokenServicesTest, ATemporaryDirectoryWithASlash) {
    FailingBadly broken(platform_.files);
    checkWith({.files = &broken});
    static_cast<void>(checked_->services().files.temporaryDirectory());
    EXPECT_THAT(told(), ElementsAre(HasSubstr("without a slash at its end")));
}

class ParsingBadly : public ForwardingPropertyLists {
  public:
    using ForwardingPropertyLists::ForwardingPropertyLists;
    Result<PropertyList> parse(ByteView /*bytes*/) override {
        return ErrorRecord::make(kSyncErrorDomain, 1, "no");
    }
};

TEST_F(BrokenServicesTest, AnErrorOfPropertyListsInAnotherDomain) {
    ParsingBadly broken(platform_.propertyLists);
    checkWith({.propertyLists = &broken});
    EXPECT_FALSE(checked_->services().propertyLists.parse({}));
    EXPECT_THAT(told(), ElementsAre(HasSubstr("parse gave an error of 'TRError'")));
}

/// Queues whose tasks run in no other way than the test says.
class HandmadeQueues : public ForwardingWorkQueues {
  public:
    using ForwardingWorkQueues::ForwardingWorkQueues;
    std::unique_ptr<SerialQueue> makeSerialQueue(std::string_view /*label*/) override {
        return std::make_unique<Forgetful>();
    }
    std::unique_ptr<WaitGroup> makeWaitGroup() override { return nullptr; }
    std::unique_ptr<OperationQueue> makeOperationQueue() override {
        return std::make_unique<Boundless>();
    }

  private:
    class Forgetful : public SerialQueue {
      public:
        void sync(const Task& /*task*/) override {}
    };
    /// Runs each task within the one before, and once more.
    class Boundless : public OperationQueue {
      public:
        void add(Task task) override { tasks_.push_back(std::move(task)); }
        void setMaximumConcurrentOperations(std::size_t /*count*/) override {}
        ~Boundless() override {
            for (const Task& task : tasks_) task();
            for (const Task& task : tasks_) task();
        }

      private:
        std::vector<Task> tasks_;
    };
};

TEST_F(BrokenServicesTest, QueuesThatForgetAndRepeatAndAreNotThere) {
    HandmadeQueues broken(platform_.queues);
    checkWith({.queues = &broken});
    WorkQueues& queues = checked_->services().queues;
    EXPECT_EQ(queues.makeWaitGroup(), nullptr);
    queues.makeSerialQueue("queue")->sync([] {});
    int runs = 0;
    queues.makeOperationQueue()->add([&runs] { ++runs; });
    EXPECT_EQ(runs, 1);
    EXPECT_THAT(told(), ElementsAre(HasSubstr("makeWaitGroup gave null"),
                                    HasSubstr("sync returned before the task was done"),
                                    HasSubstr("an operation queue ran a task twice")));
}

/// Keeps completions and delegates for the test to call.
class HandmadeCoordination : public ForwardingCoordination {
  public:
    using ForwardingCoordination::ForwardingCoordination;
    void uninstallApp(const std::string& /*identifier*/, UninstallCompletion completion) override {
        if (completesAtOnce) completion(nullptr);
        completed = std::move(completion);
    }
    std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& /*serviceName*/, const std::set<CoordinationClient>& /*clients*/,
        std::weak_ptr<InstallCoordinatorObserver> observer) override {
        delegate = observer.lock();
        return std::make_shared<AppInstallObserver>();
    }
    bool completesAtOnce = false;
    UninstallCompletion completed;
    std::shared_ptr<InstallCoordinatorObserver> delegate;
};

TEST_F(BrokenServicesTest, ACompletionThatIsLost) {
    HandmadeCoordination broken(platform_.coordination);
    checkWith({.coordination = &broken});
    checked_->services().coordination.uninstallApp(kA, [](const ErrorRecord*) {});
    platform_.advance(seconds(31));
    EXPECT_THAT(told(),
                ElementsAre(HasSubstr("the completion of uninstallApp was not called in time")));
}

TEST_F(BrokenServicesTest, ACompletionThatComesTwice) {
    HandmadeCoordination broken(platform_.coordination);
    checkWith({.coordination = &broken});
    int completions = 0;
    checked_->services().coordination.uninstallApp(
        kA, [&completions](const ErrorRecord*) { ++completions; });
    broken.completed(nullptr);
    broken.completed(nullptr);
    EXPECT_EQ(completions, 1);
    EXPECT_THAT(told(), ElementsAre(HasSubstr("the completion of uninstallApp was called again")));
}

TEST_F(BrokenServicesTest, ACompletionOnTheCallersThread) {
    HandmadeCoordination broken(platform_.coordination);
    broken.completesAtOnce = true;
    checkWith({.coordination = &broken});
    checked_->services().coordination.uninstallApp(kA, [](const ErrorRecord*) {});
    EXPECT_THAT(told(), ElementsAre(HasSubstr("on the thread that was in uninstallApp")));
}

TEST_F(BrokenServicesTest, ADelegateThatIsCalledWithNullAndAfterItsEnd) {
    HandmadeCoordination broken(platform_.coordination);
    checkWith({.coordination = &broken});
    client_ = AppsClient::create(checked_->services());
    auto observer =
        checked_->services().coordination.makeAppInstallObserver("name", {SyncClientID}, client_);
    broken.delegate->coordinatorShouldPrioritize(nullptr);
    observer.reset();
    broken.delegate->promiseDidBeginFulfillmentWithIdentifier(1);
    EXPECT_THAT(told(), ElementsAre(HasSubstr("called with null in the place of a coordinator"),
                                    HasSubstr("called after its observer's end")));
}

/// Answers with what must not be.
struct EmptyServices {
    class Log : public LogFacility {
      public:
        void write(const LogMessage& /*message*/) noexcept override {}
        std::unique_ptr<LogHandle> makeHandle(std::string_view /*subsystem*/,
                                              std::string_view /*category*/) override {
            return nullptr;
        }
    } log;
    class Backup : public BackupService {
      public:
        std::unique_ptr<BackupManager> makeManager() override { return nullptr; }
    } backup;
    class Policy : public DevicePolicyService {
      public:
        PolicyAnswer effectiveValue(PolicyFeature /*feature*/) override {
            return static_cast<PolicyAnswer>(7);
        }
    } policy;
    class Installer : public InstallerService {
      public:
        std::optional<PropertyList> lookupUninstalled() override { return PropertyList::array(); }
        bool clearUninstalled(std::span<const std::string> /*identifiers*/) override {
            return true;
        }
    } installer;
    class HomeScreen : public HomeScreenService {
      public:
        std::shared_ptr<HomeScreenConnection> blockableConnection() override { return nullptr; }
        TerminationAssertionResult takeTerminationAssertion(const std::string& /*identifier*/,
                                                            std::uint64_t /*reason*/) override {
            return {TerminationAssertionResult::kGranted, nullptr};
        }
    } homeScreen;
};

TEST_F(BrokenServicesTest, NullAndOddAnswersAreToldAndAClientGoesOn) {
    EmptyServices empty;
    checkWith({.homeScreen = &empty.homeScreen,
               .log = &empty.log,
               .backup = &empty.backup,
               .policy = &empty.policy,
               .installer = &empty.installer});
    makeClient();
    sync();
    EXPECT_THAT(told(),
                testing::UnorderedElementsAre(
                    HasSubstr("makeManager gave null"), HasSubstr("makeHandle gave null"),
                    HasSubstr("the answer 7"), HasSubstr("lookupUninstalled gave something else"),
                    HasSubstr("an assertion was granted and is null")));
    EXPECT_THAT(platform_.registry.installedIdentifiers(), ElementsAre(kB, kC));
    client_.reset();  // before what it was made with
}

}  // namespace
}  // namespace appsync
