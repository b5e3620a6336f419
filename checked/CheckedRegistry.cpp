#include "checked/CheckedRegistry.h"

#include <set>
#include <utility>

#include "checked/Overdue.h"
#include "platform/LegalIdentifier.h"
#include "platform/PropertyList.h"

namespace appsync {

namespace {

std::vector<std::string> identifiersIn(const std::vector<AppProxy>& proxies) {
    std::vector<std::string> identifiers;
    identifiers.reserve(proxies.size());
    for (const AppProxy& proxy : proxies) identifiers.push_back(proxy.applicationIdentifier);
    return identifiers;
}

/// Counts a change for as long as it lives.
class ChangeUnderWay {
  public:
    ChangeUnderWay(std::atomic<std::size_t>& underWay, std::atomic<std::uint64_t>& changes)
        : underWay_(underWay), changes_(changes) {
        ++underWay_;
        ++changes_;
    }
    ~ChangeUnderWay() {
        ++changes_;
        --underWay_;
    }
    ChangeUnderWay(const ChangeUnderWay&) = delete;
    ChangeUnderWay& operator=(const ChangeUnderWay&) = delete;

  private:
    std::atomic<std::size_t>& underWay_;
    std::atomic<std::uint64_t>& changes_;
};

}  // namespace

/// Stands in an observer's place at the registry.
class CheckedRegistry::Observer final : public AppRegistryObserver {
  public:
    Observer(std::weak_ptr<AppRegistryObserver> observer, CheckedRegistry& registry)
        : address_(observer.lock().get()),
          observer_(std::move(observer)),
          registry_(registry),
          book_(*registry.book_),
          addingThread_(book_.currentThread()) {}

    void wasAdded() { isBeingAdded_ = false; }
    void wasRemoved() { isRemoved_ = true; }
    [[nodiscard]] bool isOf(const AppRegistryObserver* observer) const {
        return address_ == observer && !isRemoved_;
    }
    /// Whether a first report is still to come to somebody who is there.
    [[nodiscard]] bool waits() const { return !hasHeard_ && !isRemoved_ && !observer_.expired(); }

    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override {
        if (!mayBeCalled("applicationInstallsArePrioritized")) return;
        begin();
        if (isBeingAdded_ && book_.currentThread() == addingThread_) {
            book_.broken("platform/AppRegistry.h",
                         "Comes once soon after the observer was added, also when both lists are "
                         "empty, never on the thread that added it before `addObserver` has "
                         "returned;",
                         "the first report came on the thread that was in addObserver");
        }
        lookForRepetition(prioritized, paused);
        hasHeard_ = true;
        lookForLock();
        if (const auto observer = observer_.lock())
            observer->applicationInstallsArePrioritized(prioritized, paused);
        end();
    }

    void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) override {
        if (!mayBeCalled("applicationInstallsDidCancel")) return;
        begin();
        lookForLock();
        if (const auto observer = observer_.lock())
            observer->applicationInstallsDidCancel(cancelled);
        end();
    }

  private:
    bool mayBeCalled(const char* call) {
        if (!isRemoved_) return true;
        book_.broken("platform/AppRegistry.h", "No call begins after this one has returned.",
                     std::string(call) + " was called after removeObserver");
        return false;
    }
    void begin() {
        if (calls_.fetch_add(1) == 0) return;
        book_.broken("platform/AppRegistry.h",
                     "Hears from the registry, on a thread of the registry's, one call at a time "
                     "for one observer.",
                     "an observer was called while another call of it went on");
    }
    void end() { --calls_; }

    void lookForRepetition(const std::vector<AppProxy>& prioritized,
                           const std::vector<AppProxy>& paused) {
        std::vector<std::string> lists = identifiersIn(prioritized);
        lists.emplace_back("paused:");
        for (std::string& identifier : identifiersIn(paused))
            lists.push_back(std::move(identifier));
        const std::uint64_t changes = registry_.changes_;
        if (hasHeard_ && lists == heard_ && changes == changesBefore_ &&
            registry_.changesUnderWay_ == 0 && !book_.othersInstall()) {
            book_.broken("platform/AppRegistry.h",
                         "then again whenever the lists change, which several changes may share.",
                         "an observer was told the same lists twice, and nothing had been changed");
        }
        heard_ = std::move(lists);
        changesBefore_ = changes;
    }

    void lookForLock() {
        if (!registry_.holdsLock()) return;
        book_.broken("platform/AppRegistry.h",
                     "It may call the registry and remove itself meanwhile, so a registry holds no "
                     "lock when it calls.",
                     "a question of another thread was not answered while an observer was called");
    }

    const AppRegistryObserver* const address_;
    const std::weak_ptr<AppRegistryObserver> observer_;
    CheckedRegistry& registry_;
    BreachBook& book_;
    const std::uintptr_t addingThread_;
    std::atomic<bool> isBeingAdded_{true};
    std::atomic<bool> isRemoved_{false};
    std::atomic<bool> hasHeard_{false};
    std::atomic<int> calls_{0};
    // Touched by one call at a time.
    std::vector<std::string> heard_;
    std::uint64_t changesBefore_ = 0;
};

/// Looks at one install's progress, as one holder of its record sees it.
class CheckedRegistry::Record final : public InstallProgressRecord {
  public:
    Record(std::shared_ptr<InstallProgressRecord> record, std::shared_ptr<BreachBook> book,
           std::atomic<std::uint64_t>& changes)
        : record_(std::move(record)), book_(std::move(book)), changes_(changes) {}

    [[nodiscard]] InstallProgressRecord& checked() { return *record_; }

    [[nodiscard]] std::uint64_t installState() const override { return record_->installState(); }
    void setInstallState(std::uint64_t state) override {
        set("state", &InstallProgressRecord::setInstallState, &InstallProgressRecord::installState,
            state);
    }
    [[nodiscard]] std::uint64_t installPhase() const override { return record_->installPhase(); }
    void setInstallPhase(std::uint64_t phase) override {
        set("phase", &InstallProgressRecord::setInstallPhase, &InstallProgressRecord::installPhase,
            phase);
    }
    [[nodiscard]] std::int64_t totalUnitCount() const override { return record_->totalUnitCount(); }
    void setTotalUnitCount(std::int64_t count) override {
        set("total", &InstallProgressRecord::setTotalUnitCount,
            &InstallProgressRecord::totalUnitCount, count);
    }
    [[nodiscard]] std::int64_t completedUnitCount() const override {
        return record_->completedUnitCount();
    }
    void setCompletedUnitCount(std::int64_t count) override {
        set("completed", &InstallProgressRecord::setCompletedUnitCount,
            &InstallProgressRecord::completedUnitCount, count);
    }
    void cancel() override {
        ++changes_;
        record_->cancel();
        ++changes_;
    }
    [[nodiscard]] std::string description() const override { return record_->description(); }

  private:
    /// Sets, and asks whether it took effect, where nobody else changes anything meanwhile.
    template <typename Value>
    void set(const char* what, void (InstallProgressRecord::*setter)(Value),
             Value (InstallProgressRecord::*getter)() const, Value value) {
        const std::uint64_t before = ++changes_;
        const Value former = (record_.get()->*getter)();
        (record_.get()->*setter)(value);
        const Value latter = (record_.get()->*getter)();
        const bool isOver = record_->installState() >= kInstallStateCanceled;
        const bool wasAlone = changes_ == before;
        ++changes_;
        if (latter == value || isOver || !wasAlone) return;
        book_->broken("platform/InstallProgressRecord.h",
                      "Every call takes effect at once for everybody who looks.",
                      std::string(what) + " was set to " + std::to_string(value) + " and is " +
                          (latter < former ? "less than it was before" : "another"));
    }

    const std::shared_ptr<InstallProgressRecord> record_;
    const std::shared_ptr<BreachBook> book_;
    std::atomic<std::uint64_t>& changes_;
};

CheckedRegistry::CheckedRegistry(AppRegistry& registry, WorkQueues& queues,
                                 std::shared_ptr<BreachBook> book, Patience patience)
    : registry_(registry),
      queues_(queues),
      book_(std::move(book)),
      patience_(patience),
      questions_(queues.makeOperationQueue()) {}

CheckedRegistry::~CheckedRegistry() = default;

void CheckedRegistry::checkProxy(const AppProxy& proxy) const {
    if (proxy.state.installed != proxy.state.placeholder) return;
    book_->broken("platform/AppRegistry.h", "What a record stands for: exactly one of the two.",
                  "a record that is " + std::string(proxy.state.installed ? "both" : "neither"));
}

void CheckedRegistry::checkRefusal(std::string_view identifier, const Status& status) const {
    if (!status) book_->checkDomain(status.error(), "the registry");
    if (isLegalIdentifier(identifier)) return;
    if (!status && status.error().domain == kRegistryErrorDomain) return;
    book_->broken("platform/AppRegistry.h",
                  "It refuses identifiers that are not legal (1 to 255 bytes of letters, digits, "
                  "'.', '-', '_'; not \".\" or \"..\") with an error of `kRegistryErrorDomain`;",
                  status ? "an illegal identifier was taken" : "an error of another domain");
}

void CheckedRegistry::checkIdentifier(const PropertyList& options, const Status& status) const {
    const std::string* identifier = options.findString(BundleIdentifierKey);
    checkRefusal(identifier != nullptr ? *identifier : std::string(), status);
}

bool CheckedRegistry::holdsLock() {
    struct Question {
        std::unique_ptr<WaitGroup> answered;
    };
    const auto question = std::make_shared<Question>(Question{queues_.makeWaitGroup()});
    const std::uint64_t before = changes_;
    question->answered->enter();
    questions_->add([question, &registry = registry_] {
        static_cast<void>(registry.isApplicationInstalled("com.example.question"));
        question->answered->leave();
    });
    bool isAnswered = false;
    for (int wait = 0; wait < kWaits && !isAnswered; ++wait)
        isAnswered = question->answered->waitFor(patience_.forLocks / kWaits);
    return !isAnswered && changes_ == before && changesUnderWay_ == 0;
}

std::optional<AppProxy> CheckedRegistry::proxyForIdentifier(const std::string& identifier,
                                                            Placeholders placeholders) {
    std::optional<AppProxy> proxy = registry_.proxyForIdentifier(identifier, placeholders);
    if (!proxy) return proxy;
    checkProxy(*proxy);
    if (placeholders == Placeholders::Excluded && proxy->state.placeholder) {
        book_->broken("platform/AppRegistry.h",
                      "without, only installed applications are looked at.",
                      "a placeholder was given to who had excluded them");
    }
    return proxy;
}

bool CheckedRegistry::isApplicationInstalled(const std::string& identifier) {
    return registry_.isApplicationInstalled(identifier);
}

void CheckedRegistry::enumerateBundles(BundleType type, const ProxyCallback& callback) {
    const auto isOver = std::make_shared<std::atomic<bool>>(false);
    const auto book = book_;
    const std::uintptr_t thread = book->currentThread();
    std::set<std::pair<std::string, bool>> seen;
    registry_.enumerateBundles(type, [&, isOver, book, thread](const AppProxy& proxy, bool& stop) {
        if (*isOver || book->currentThread() != thread) {
            book->broken("platform/AppRegistry.h",
                         "Calls back, on the calling thread and before it returns, once for each "
                         "record of the type, in no particular order.",
                         "a walk called back elsewhere, or when it was over");
            return;
        }
        checkProxy(proxy);
        if (!seen.emplace(proxy.applicationIdentifier, proxy.state.placeholder).second)
            book->broken("platform/AppRegistry.h",
                         "Calls back, on the calling thread and before it returns, once for each "
                         "record of the type, in no particular order.",
                         "a walk called back twice for one record");
        callback(proxy, stop);
    });
    *isOver = true;
}

std::shared_ptr<InstallProgressRecord> CheckedRegistry::installProgress(const AppProxy& proxy,
                                                                        std::uint64_t phase) {
    auto record = registry_.installProgress(proxy, phase);
    if (record == nullptr) return record;
    return std::make_shared<Record>(std::move(record), book_, changes_);
}

void CheckedRegistry::finishInstallPhase(InstallProgressRecord& record) {
    const ChangeUnderWay change(changesUnderWay_, changes_);
    auto* ours = dynamic_cast<Record*>(&record);
    registry_.finishInstallPhase(ours != nullptr ? ours->checked() : record);
}

Status CheckedRegistry::installPackage(const FileURL& package, const PropertyList& options) {
    const ChangeUnderWay change(changesUnderWay_, changes_);
    Status status = registry_.installPackage(package, options);
    checkIdentifier(options, status);
    return status;
}

Status CheckedRegistry::installPlaceholderBundle(const FileURL& directory,
                                                 const PropertyList& options) {
    const ChangeUnderWay change(changesUnderWay_, changes_);
    Status status = registry_.installPlaceholderBundle(directory, options);
    checkIdentifier(options, status);
    return status;
}

Status CheckedRegistry::uninstallApplication(const std::string& identifier,
                                             const PropertyList& options) {
    const ChangeUnderWay change(changesUnderWay_, changes_);
    Status status = registry_.uninstallApplication(identifier, options);
    checkRefusal(identifier, status);
    return status;
}

void CheckedRegistry::addObserver(std::weak_ptr<AppRegistryObserver> observer) {
    const auto checked = std::make_shared<Observer>(std::move(observer), *this);
    {
        const std::lock_guard guard(mutex_);
        observers_.push_back(checked);
    }
    registry_.addObserver(checked);
    checked->wasAdded();
    const auto waits = [weakly = std::weak_ptr(checked)] {
        const auto waiting = weakly.lock();
        return waiting != nullptr && waiting->waits();
    };
    reportIfOverdue(queues_, patience_.forCalls / kWaits, waits, [book = book_] {
        book->broken("platform/AppRegistry.h",
                     "Comes once soon after the observer was added, also when both lists are "
                     "empty, never on the thread that added it before `addObserver` has returned;",
                     "no first report came in time");
    });
}

void CheckedRegistry::removeObserver(const AppRegistryObserver* observer) {
    std::shared_ptr<Observer> removed;
    {
        const std::lock_guard guard(mutex_);
        for (const auto& each : observers_) {
            if (each->isOf(observer)) removed = each;
        }
    }
    registry_.removeObserver(removed != nullptr ? removed.get() : observer);
    if (removed != nullptr) removed->wasRemoved();
}

}  // namespace appsync
