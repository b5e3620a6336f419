#include <algorithm>
#include <map>
#include <memory>
#include <string>
#include <utility>

#include "contract/forwarding/ForwardingAppRegistry.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

/// A registry that puts a `Wrapper` around each record.
template <typename Wrapper>
struct WithRecord : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Record recordFor(Record record) override {
        return std::make_shared<Wrapper>(std::move(record));
    }
};

/// What is set through this handle is seen through this handle.
struct StatesOfOneHandle : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::uint64_t installState() const override { return state.value_or(target().installState()); }
    void setInstallState(std::uint64_t set) override { state = set; }
    std::optional<std::uint64_t> state;
};
struct PhasesAreNotSet : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    void setInstallPhase(std::uint64_t) override {}
};
struct TotalsAreAThousandth : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    void setTotalUnitCount(std::int64_t count) override {
        target().setTotalUnitCount(count / 1000);
    }
};
struct CountsOfOneHandle : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::int64_t completedUnitCount() const override {
        return count.value_or(target().completedUnitCount());
    }
    void setCompletedUnitCount(std::int64_t set) override { count = set; }
    std::optional<std::int64_t> count;
};
/// Goes back by one with each look.
struct CountsGoBack : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::int64_t completedUnitCount() const override {
        return std::max<std::int64_t>(0, target().completedUnitCount() - looks++);
    }
    mutable std::int64_t looks = 0;
};
struct CountsAreCutAtTheTotal : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    void setCompletedUnitCount(std::int64_t count) override {
        target().setCompletedUnitCount(std::min(count, target().totalUnitCount() / 10));
    }
};
struct CancellingFails : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    void cancel() override { target().setInstallState(kInstallStateFailed); }
};
struct CancellingDoesNothing : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    void cancel() override {}
};
struct DescriptionsOfTwoLines : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::string description() const override { return target().description() + "\nstate"; }
};
struct DescriptionsOfNothing : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::string description() const override { return {}; }
};
/// What is set when all is over is seen all the same.
struct OverButChanging : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::int64_t completedUnitCount() const override {
        return last.value_or(target().completedUnitCount());
    }
    void setCompletedUnitCount(std::int64_t count) override {
        target().setCompletedUnitCount(count);
        if (target().completedUnitCount() != count) last = count;
    }
    std::optional<std::int64_t> last;
};
struct StatesChangeWhenOver : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::uint64_t installState() const override { return last.value_or(target().installState()); }
    void setInstallState(std::uint64_t state) override {
        target().setInstallState(state);
        if (target().installState() != state) last = state;
    }
    std::optional<std::uint64_t> last;
};
struct NeverFinished : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::uint64_t installState() const override {
        const std::uint64_t state = target().installState();
        return state == kInstallStateFinished ? std::uint64_t{kInstallStateActive} : state;
    }
};
struct FailuresAreFinished : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::uint64_t installState() const override {
        const std::uint64_t state = target().installState();
        return state == kInstallStateFailed ? std::uint64_t{kInstallStateFinished} : state;
    }
};
struct BeginningByInstalling : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::uint64_t installPhase() const override {
        return std::max<std::uint64_t>(target().installPhase(), kInstallPhaseInstalling);
    }
};
struct BeginningPaused : ForwardingProgressRecord {
    using ForwardingProgressRecord::ForwardingProgressRecord;
    std::uint64_t installState() const override {
        const std::uint64_t state = target().installState();
        return state == kInstallStateWaiting ? std::uint64_t{kInstallStatePaused} : state;
    }
};

// Of the registry.

/// The record of an application stays, through placeholders and removals.
struct RecordsStay : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Record installProgress(const AppProxy& proxy, std::uint64_t phase) override {
        auto record = target().installProgress(proxy, phase);
        if (record == nullptr) return record;
        return records.emplace(proxy.applicationIdentifier, record).first->second;
    }
    std::map<std::string, Record> records;
};
/// A record for each application, also where nothing is under way.
struct RecordsWithoutInstalls : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    struct Idle : InstallProgressRecord {
        std::uint64_t installState() const override { return kInstallStateFinished; }
        void setInstallState(std::uint64_t) override {}
        std::uint64_t installPhase() const override { return kInstallPhaseLoading; }
        void setInstallPhase(std::uint64_t) override {}
        std::int64_t totalUnitCount() const override { return 0; }
        void setTotalUnitCount(std::int64_t) override {}
        std::int64_t completedUnitCount() const override { return 0; }
        void setCompletedUnitCount(std::int64_t) override {}
        void cancel() override {}
        std::string description() const override { return "idle"; }
    };
    Record installProgress(const AppProxy& proxy, std::uint64_t phase) override {
        auto record = target().installProgress(proxy, phase);
        return record == nullptr ? std::make_shared<Idle>() : record;
    }
};
struct NoRecords : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    Record installProgress(const AppProxy&, std::uint64_t) override { return nullptr; }
};
struct PhasesDoNotEnd : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void finishInstallPhase(InstallProgressRecord&) override {}
};
struct EndingAPhaseEndsTheInstall : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    void finishInstallPhase(InstallProgressRecord& record) override {
        target().finishInstallPhase(record);
        record.setInstallPhase(kInstallPhaseRestoringData);
    }
};
struct CancellingRemovesThePlaceholder : ForwardingAppRegistry {
    using ForwardingAppRegistry::ForwardingAppRegistry;
    struct Removing : ForwardingProgressRecord {
        Removing(Record record, AppRegistry& from, std::string name)
            : ForwardingProgressRecord(std::move(record)),
              registry(from),
              identifier(std::move(name)) {}
        void cancel() override {
            target().cancel();
            registry.uninstallApplication(identifier, {}).ignore();
        }
        AppRegistry& registry;
        const std::string identifier;
    };
    Record installProgress(const AppProxy& proxy, std::uint64_t phase) override {
        auto record = target().installProgress(proxy, phase);
        if (record == nullptr) return record;
        return std::make_shared<Removing>(std::move(record), target(), proxy.applicationIdentifier);
    }
};

}  // namespace

std::vector<Violator> progressViolators() {
    Violators v("platform/InstallProgressRecord.h", "*InstallProgress*:*RegistryObserver*");
    const std::string at = "Every call takes effect at once for everybody who looks.";
    v.device<WithRecord<StatesOfOneHandle>>("StatesOfOneHandle", at);
    v.device<WithRecord<PhasesAreNotSet>>("PhasesAreNotSet", at);
    v.device<WithRecord<TotalsAreAThousandth>>("TotalsAreAThousandth", at);
    v.device<WithRecord<CountsOfOneHandle>>("CountsOfOneHandle", at);
    v.device<WithRecord<CountsGoBack>>("CountsGoBack", at);
    v.device<WithRecord<CountsAreCutAtTheTotal>>("CountsAreCutAtTheTotal", at);
    const std::string cancel = "Cancels the install: its state becomes canceled (3).";
    v.device<WithRecord<CancellingFails>>("CancellingFails", cancel);
    v.device<WithRecord<CancellingDoesNothing>>("CancellingDoesNothing", cancel);
    v.device<CancellingRemovesThePlaceholder>("CancellingRemovesThePlaceholder", cancel);
    v.device<WithRecord<DescriptionsOfTwoLines>>("DescriptionsOfTwoLines", "One line for a log.");
    v.device<WithRecord<DescriptionsOfNothing>>("DescriptionsOfNothing", "One line for a log.");
    const std::string over =
        "When the install ends, the state becomes finished (5), failed (4) or canceled (3); from "
        "then on the record keeps its values and changes nothing any more.";
    v.device<WithRecord<OverButChanging>>("OverButChanging", over);
    v.device<WithRecord<StatesChangeWhenOver>>("StatesChangeWhenOver", over);
    v.device<WithRecord<NeverFinished>>("NeverFinished", over);
    v.device<WithRecord<FailuresAreFinished>>("FailuresAreFinished", over);

    Violators registry("platform/AppRegistry.h", "*InstallProgress*:*RegistryObserver*");
    const std::string begins =
        "An install begins waiting (0) or active (1), in the phase loading (0), with nothing "
        "completed; what its total is then is the registry's choice.";
    registry.device<WithRecord<BeginningByInstalling>>("BeginningByInstalling", begins);
    registry.device<WithRecord<BeginningPaused>>("BeginningPaused", begins);
    registry.device<RecordsStay>(
        "RecordsStay",
        "An installed application that the placeholder covers stays usable; a placeholder that "
        "stands already is replaced, and its install begins anew, with a new record.");
    const std::string fetched =
        "The install-progress record of an application or placeholder, fetched synchronously; null "
        "when no install is under way for it.";
    registry.device<RecordsWithoutInstalls>("RecordsWithoutInstalls", fetched);
    registry.device<NoRecords>("NoRecords", fetched);
    const std::string ends =
        "Ends the install phase that the record is in: loading is over, installing begins.";
    registry.device<PhasesDoNotEnd>("PhasesDoNotEnd", ends);
    registry.device<EndingAPhaseEndsTheInstall>("EndingAPhaseEndsTheInstall", ends);

    std::vector<Violator> all = v.take();
    for (Violator& each : registry.take()) all.push_back(std::move(each));
    return all;
}

}  // namespace appsync
