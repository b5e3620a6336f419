#include <algorithm>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "contract/forwarding/ForwardingDeviceServices.h"
#include "platform/PropertyListSerialization.h"
#include "tests/violators/Violator.h"

namespace appsync {
namespace {

// Policy.

struct UnsetIsNo : ForwardingDevicePolicy {
    using ForwardingDevicePolicy::ForwardingDevicePolicy;
    PolicyAnswer effectiveValue(PolicyFeature feature) override {
        const PolicyAnswer answer = target().effectiveValue(feature);
        return answer == PolicyAnswer::Unset ? PolicyAnswer::No : answer;
    }
};
struct FeaturesAreMixedUp : ForwardingDevicePolicy {
    using ForwardingDevicePolicy::ForwardingDevicePolicy;
    PolicyAnswer effectiveValue(PolicyFeature) override {
        return target().effectiveValue(PolicyFeature::AppInstallationAllowed);
    }
};
struct AnswersAreKept : ForwardingDevicePolicy {
    using ForwardingDevicePolicy::ForwardingDevicePolicy;
    PolicyAnswer effectiveValue(PolicyFeature feature) override {
        return known.emplace(feature, target().effectiveValue(feature)).first->second;
    }
    std::map<PolicyFeature, PolicyAnswer> known;
};

// Backup.

template <typename Manager>
struct WithManager : ForwardingBackupService {
    using ForwardingBackupService::ForwardingBackupService;
    std::unique_ptr<BackupManager> makeManager() override {
        return std::make_unique<Manager>(target().makeManager());
    }
};
struct NoRestoreData : ForwardingBackupManager {
    using ForwardingBackupManager::ForwardingBackupManager;
    bool restoreDataExists(const std::string&) override { return false; }
};
struct RestoreDataOfEverybody : ForwardingBackupManager {
    using ForwardingBackupManager::ForwardingBackupManager;
    bool restoreDataExists(const std::string& identifier) override {
        any = any || target_->restoreDataExists(identifier);
        return any;
    }
    bool any = false;
};
struct RestoresAreNotGivenUp : ForwardingBackupManager {
    using ForwardingBackupManager::ForwardingBackupManager;
    void cancelApplicationRestore(const std::string&) override {}
};
struct EveryRestoreIsGivenUp : WithManager<ForwardingBackupManager> {
    using WithManager::WithManager;
    struct Manager : ForwardingBackupManager {
        Manager(std::unique_ptr<BackupManager> target, std::set<std::string>& all)
            : ForwardingBackupManager(std::move(target)), seen(all) {}
        bool restoreDataExists(const std::string& identifier) override {
            seen.insert(identifier);
            return target_->restoreDataExists(identifier);
        }
        void cancelApplicationRestore(const std::string& identifier) override {
            target_->cancelApplicationRestore(identifier);
            for (const std::string& each : seen) target_->cancelApplicationRestore(each);
        }
        std::set<std::string>& seen;
    };
    std::unique_ptr<BackupManager> makeManager() override {
        return std::make_unique<Manager>(target().makeManager(), known);
    }
    std::set<std::string> known;
};

// Home screen.

template <typename Connection>
struct WithConnection : ForwardingHomeScreen {
    WithConnection(HomeScreenService& target, const Platform& all)
        : ForwardingHomeScreen(target), platform(all) {}
    std::shared_ptr<HomeScreenConnection> blockableConnection() override {
        return std::make_shared<Connection>(target().blockableConnection(), platform.propertyLists);
    }
    const Platform platform;
};
struct ConnectionWithLists : ForwardingHomeScreenConnection {
    ConnectionWithLists(std::shared_ptr<HomeScreenConnection> target,
                        PropertyListSerialization& codec)
        : ForwardingHomeScreenConnection(std::move(target)), lists(codec) {}
    PropertyListSerialization& lists;
};
struct LayoutsAreNotKept : ConnectionWithLists {
    using ConnectionWithLists::ConnectionWithLists;
    bool setIconState(ByteView state) override {
        if (known) return lists.parse(state).ok();
        known = target_->setIconState(state);
        return known;
    }
    bool known = false;
};
struct LayoutsComeBackReversed : ConnectionWithLists {
    using ConnectionWithLists::ConnectionWithLists;
    std::optional<Bytes> flattenedIconState(std::uint64_t variant) override {
        const auto state = target_->flattenedIconState(variant);
        const auto layout = state ? lists.parse(*state) : PropertyList();
        if (!layout) return state;
        PropertyList reversed = PropertyList::array();
        for (std::size_t i = layout->size(); i > 0; --i) reversed.append(*layout->at(i - 1));
        return *lists.serialize(reversed, PropertyListFormat::Binary);
    }
};
struct LayoutsAreNotFlat : ConnectionWithLists {
    using ConnectionWithLists::ConnectionWithLists;
    std::optional<Bytes> flattenedIconState(std::uint64_t variant) override {
        const auto state = target_->flattenedIconState(variant);
        const auto layout = state ? lists.parse(*state) : PropertyList();
        if (!layout) return state;
        return *lists.serialize(PropertyList::array({*layout}), PropertyListFormat::Binary);
    }
};
struct NoLayoutIsTaken : ConnectionWithLists {
    using ConnectionWithLists::ConnectionWithLists;
    bool setIconState(ByteView) override { return false; }
};
struct EveryLayoutIsTaken : ConnectionWithLists {
    using ConnectionWithLists::ConnectionWithLists;
    bool setIconState(ByteView state) override { return target_->setIconState(state) || true; }
};
struct NoLayoutIsTold : ConnectionWithLists {
    using ConnectionWithLists::ConnectionWithLists;
    std::optional<Bytes> flattenedIconState(std::uint64_t) override { return std::nullopt; }
};
struct NoConnection : ForwardingHomeScreen {
    using ForwardingHomeScreen::ForwardingHomeScreen;
    std::shared_ptr<HomeScreenConnection> blockableConnection() override { return nullptr; }
};

/// Answers `Told` where the outcome is `Outcome`.
template <TerminationAssertionResult::Outcome Outcome, TerminationAssertionResult::Outcome Told>
struct OutcomeIsToldAs : ForwardingHomeScreen {
    using ForwardingHomeScreen::ForwardingHomeScreen;
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override {
        auto result = target().takeTerminationAssertion(identifier, reason);
        if (result.outcome == Outcome) result.outcome = Told;
        return result;
    }
};
using RunningApplicationsAreGranted =
    OutcomeIsToldAs<TerminationAssertionResult::kDenied, TerminationAssertionResult::kGranted>;
using UnknownApplicationsAreGranted =
    OutcomeIsToldAs<TerminationAssertionResult::kNoSuchApplication,
                    TerminationAssertionResult::kGranted>;
using EverythingIsDenied =
    OutcomeIsToldAs<TerminationAssertionResult::kGranted, TerminationAssertionResult::kDenied>;
struct AssertionsDoNotHold : ForwardingHomeScreen {
    using ForwardingHomeScreen::ForwardingHomeScreen;
    struct Nothing : TerminationAssertion {};
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override {
        auto result = target().takeTerminationAssertion(identifier, reason);
        if (result.assertion != nullptr) result.assertion = std::make_unique<Nothing>();
        return result;
    }
};
struct AssertionsAreNeverReleased : ForwardingHomeScreen {
    using ForwardingHomeScreen::ForwardingHomeScreen;
    struct Nothing : TerminationAssertion {};
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override {
        auto result = target().takeTerminationAssertion(identifier, reason);
        if (result.assertion == nullptr) return result;
        held.push_back(std::exchange(result.assertion, std::make_unique<Nothing>()));
        return result;
    }
    std::vector<std::unique_ptr<TerminationAssertion>> held;
};
struct TheFirstReleaseIsEverybodys : ForwardingHomeScreen {
    using ForwardingHomeScreen::ForwardingHomeScreen;
    using Held = std::map<std::string, std::unique_ptr<TerminationAssertion>>;
    struct Shared : TerminationAssertion {
        Shared(Held& all, std::string name) : held(all), identifier(std::move(name)) {}
        ~Shared() override { const auto released = held.extract(identifier); }
        Held& held;
        const std::string identifier;
    };
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override {
        auto result = target().takeTerminationAssertion(identifier, reason);
        if (result.assertion == nullptr) return result;
        const auto earlier = std::exchange(held[identifier], std::move(result.assertion));
        result.assertion = std::make_unique<Shared>(held, identifier);
        return result;
    }
    Held held;
};
struct GrantedWithoutAnAssertion : ForwardingHomeScreen {
    using ForwardingHomeScreen::ForwardingHomeScreen;
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override {
        auto result = target().takeTerminationAssertion(identifier, reason);
        result.assertion.reset();
        return result;
    }
};

// The list of uninstalled applications.

struct NothingWasUninstalled : ForwardingInstaller {
    using ForwardingInstaller::ForwardingInstaller;
    std::optional<PropertyList> lookupUninstalled() override { return PropertyList::map(); }
};
struct TheListIsAnArray : ForwardingInstaller {
    using ForwardingInstaller::ForwardingInstaller;
    std::optional<PropertyList> lookupUninstalled() override {
        const auto list = target().lookupUninstalled();
        if (!list) return list;
        PropertyList array = PropertyList::array();
        for (const auto& [identifier, value] : list->entries()) array.append(identifier);
        return array;
    }
};
struct ClearingClearsAll : ForwardingInstaller {
    using ForwardingInstaller::ForwardingInstaller;
    bool clearUninstalled(std::span<const std::string> identifiers) override {
        std::vector<std::string> all(identifiers.begin(), identifiers.end());
        if (const auto list = target().lookupUninstalled()) {
            for (const auto& [identifier, value] : list->entries()) all.push_back(identifier);
        }
        return target().clearUninstalled(all);
    }
};
struct ClearingDoesNothing : ForwardingInstaller {
    using ForwardingInstaller::ForwardingInstaller;
    bool clearUninstalled(std::span<const std::string>) override { return true; }
};
struct UnknownIdentifiersStopTheClearing : ForwardingInstaller {
    using ForwardingInstaller::ForwardingInstaller;
    bool clearUninstalled(std::span<const std::string> identifiers) override {
        const auto list = target().lookupUninstalled();
        for (const std::string& identifier : identifiers) {
            if (!list || list->find(identifier) == nullptr) return false;
        }
        return target().clearUninstalled(identifiers);
    }
};
struct ClearingSaysThatItFailed : ForwardingInstaller {
    using ForwardingInstaller::ForwardingInstaller;
    bool clearUninstalled(std::span<const std::string> identifiers) override {
        return target().clearUninstalled(identifiers) && false;
    }
};
/// The list ends with the process.
class TheListDoesNotLast : public ForwardingDevice {
  public:
    using ForwardingDevice::ForwardingDevice;
    bool reopen() override {
        const bool reopened = ForwardingDevice::reopen();
        InstallerService& installer = services().installer;
        std::vector<std::string> all;
        for (const auto& [identifier, value] : installer.lookupUninstalled()->entries()) {
            all.push_back(identifier);
        }
        return installer.clearUninstalled(all) && reopened;
    }
};

// The transaction log.

struct ScenariosAreLost : ForwardingTransactionLog {
    using ForwardingTransactionLog::ForwardingTransactionLog;
    void logScenario(std::string_view, std::uint64_t, bool, std::string_view,
                     std::string_view) override {}
};
struct OutcomesAreInverted : ForwardingTransactionLog {
    using ForwardingTransactionLog::ForwardingTransactionLog;
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override {
        target().logScenario(scenario, step, !success, identifier, description);
    }
};
struct ScenariosComeLate : ForwardingTransactionLog {
    using ForwardingTransactionLog::ForwardingTransactionLog;
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override {
        if (!first) {
            first = {std::string(scenario), std::string(identifier), std::string(description)};
            firstSucceeded = success;
            return;
        }
        target().logScenario(scenario, step, success, identifier, description);
        target().logScenario(first->at(0), step, firstSucceeded, first->at(1), first->at(2));
    }
    std::optional<std::vector<std::string>> first;
    bool firstSucceeded = false;
};
/// A second initialisation ends the log.
struct TheSecondInitialisationCounts : ForwardingTransactionLog {
    using ForwardingTransactionLog::ForwardingTransactionLog;
    void initialize(const LogHandle& handle) override {
        target().initialize(handle);
        ++count;
    }
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override {
        if (count < 2) target().logScenario(scenario, step, success, identifier, description);
    }
    int count = 0;
};

// Icons.

struct EveryImageTypeIsKnown : ForwardingIconRenderer {
    using ForwardingIconRenderer::ForwardingIconRenderer;
    std::unique_ptr<ImageDestination> createImageDestination(std::string_view,
                                                             std::size_t imageCount,
                                                             Bytes& buffer) override {
        return target().createImageDestination("public.png", imageCount, buffer);
    }
};
struct NoImageTypeIsKnown : ForwardingIconRenderer {
    using ForwardingIconRenderer::ForwardingIconRenderer;
    std::unique_ptr<ImageDestination> createImageDestination(std::string_view, std::size_t,
                                                             Bytes&) override {
        return nullptr;
    }
};
struct WritesImagesOfNothing : ForwardingIconRenderer {
    using ForwardingIconRenderer::ForwardingIconRenderer;
    struct Destination : ImageDestination {
        void addImage(const IconImage&) override {}
        bool finalize() override { return true; }
    };
    std::unique_ptr<ImageDestination> createImageDestination(std::string_view type, std::size_t,
                                                             Bytes&) override {
        return type == "public.png" ? std::make_unique<Destination>() : nullptr;
    }
};
struct WritesBeforeItIsFinished : ForwardingIconRenderer {
    using ForwardingIconRenderer::ForwardingIconRenderer;
    std::unique_ptr<ImageDestination> createImageDestination(std::string_view type,
                                                             std::size_t imageCount,
                                                             Bytes& buffer) override {
        auto destination = target().createImageDestination(type, imageCount, buffer);
        if (destination != nullptr) buffer.push_back(0);
        return destination;
    }
};

void addHomeScreen(std::vector<Violator>& all) {
    Violators v("platform/HomeScreenService.h", "*HomeScreen*");
    const std::string sets =
        "Sets the icon layout from bytes that the host left in \"DeskoraIconState.plist\": the "
        "home screen's own form, which the plug-in does not look into.";
    v.device<WithConnection<LayoutsAreNotKept>>("LayoutsAreNotKept", sets);
    v.device<WithConnection<NoLayoutIsTaken>>("NoLayoutIsTaken", "False when they were not taken.");
    v.device<WithConnection<EveryLayoutIsTaken>>("EveryLayoutIsTaken",
                                                 "False when they were not taken.");
    const std::string flat =
        "The icon layout flattened: a property list whose root is an array of bundle identifiers "
        "in home-screen order.";
    v.device<WithConnection<LayoutsComeBackReversed>>("LayoutsComeBackReversed", flat);
    v.device<WithConnection<LayoutsAreNotFlat>>("LayoutsAreNotFlat", flat);
    v.device<WithConnection<NoLayoutIsTold>>("NoLayoutIsTold",
                                             "Nothing when the home screen does not answer.");
    v.device<NoConnection>("NoConnection",
                           "The connection; null when the home screen cannot be reached.");
    v.device<RunningApplicationsAreGranted>("RunningApplicationsAreGranted",
                                            "Denied while the application goes on running.");
    v.device<UnknownApplicationsAreGranted>("UnknownApplicationsAreGranted",
                                            "No such application when it is not installed.");
    v.device<EverythingIsDenied>(
        "EverythingIsDenied", "Else granted, with an assertion; several may hold one application.");
    const std::string keeps =
        "Keeps a running application from running until the assertion is released, that is "
        "destroyed.";
    v.device<AssertionsDoNotHold>("AssertionsDoNotHold", keeps);
    v.device<AssertionsAreNeverReleased>("AssertionsAreNeverReleased", keeps);
    v.device<TheFirstReleaseIsEverybodys>("TheFirstReleaseIsEverybodys", keeps);
    v.device<GrantedWithoutAnAssertion>(
        "GrantedWithoutAnAssertion",
        "Else granted, with an assertion; several may hold one application.");
    for (Violator& each : v.take()) all.push_back(std::move(each));
}

void addPolicyAndBackup(std::vector<Violator>& all) {
    Violators policy("platform/DevicePolicyService.h", "*Policy*");
    policy.device<UnsetIsNo>("UnsetIsNo", "The policy service's tri-state answer; its numbers.");
    policy.device<FeaturesAreMixedUp>("FeaturesAreMixedUp", "The effective value at this moment.");
    policy.device<AnswersAreKept>("AnswersAreKept", "The effective value at this moment.");
    for (Violator& each : policy.take()) all.push_back(std::move(each));

    Violators backup("platform/BackupService.h", "*Backup*");
    const std::string holds = "Whether the service holds data to restore for the application.";
    backup.device<WithManager<NoRestoreData>>("NoRestoreData", holds);
    backup.device<WithManager<RestoreDataOfEverybody>>("RestoreDataOfEverybody", holds);
    const std::string gives = "Gives the application's restore up.";
    backup.device<WithManager<RestoresAreNotGivenUp>>("RestoresAreNotGivenUp", gives);
    backup.device<EveryRestoreIsGivenUp>("EveryRestoreIsGivenUp", gives);
    for (Violator& each : backup.take()) all.push_back(std::move(each));
}

void addInstaller(std::vector<Violator>& all) {
    Violators v("platform/InstallerService.h", "*Installer*:*Lasting*");
    const std::string map =
        "A map keyed by bundle identifier; nothing when the installer does not answer.";
    v.device<NothingWasUninstalled>("NothingWasUninstalled", map);
    v.device<TheListIsAnArray>("TheListIsAnArray", map);
    const std::string takes =
        "Takes identifiers off the list; those that are not on it are passed over.";
    v.device<ClearingClearsAll>("ClearingClearsAll", takes);
    v.device<ClearingDoesNothing>("ClearingDoesNothing", takes);
    v.device<UnknownIdentifiersStopTheClearing>("UnknownIdentifiersStopTheClearing", takes);
    v.device<ClearingSaysThatItFailed>("ClearingSaysThatItFailed",
                                       "False when it could not: the list is then as before.");
    v.add({"TheListDoesNotLast",
           nullptr,
           [] { return std::make_unique<TheListDoesNotLast>(referencePort().makeDevice()); },
           {}},
          "The list outlives the process.");
    for (Violator& each : v.take()) all.push_back(std::move(each));
}

void addLogAndIcons(std::vector<Violator>& all) {
    Violators log("platform/InstallTransactionLog.h", "*TransactionLog*");
    const std::string keeps = "Keeps the steps of installs for those who look into them later.";
    log.device<ScenariosAreLost>("ScenariosAreLost", keeps);
    log.device<ScenariosComeLate>("ScenariosComeLate", "Records stand in the order of the calls.");
    log.device<OutcomesAreInverted>("OutcomesAreInverted",
                                    "`logScenario`: something happened in a scenario.");
    log.device<TheSecondInitialisationCounts>("TheSecondInitialisationCounts",
                                              "One-time initialisation; a second one changes "
                                              "nothing.");
    for (Violator& each : log.take()) all.push_back(std::move(each));

    Violators icons("platform/IconRenderer.h", "*IconRenderer*");
    icons.device<EveryImageTypeIsKnown>("EveryImageTypeIsKnown",
                                        "Null for a type that it does not know.");
    icons.device<NoImageTypeIsKnown>(
        "NoImageTypeIsKnown",
        "A destination for `imageCount` images of a type (\"public.png\") that writes into "
        "`buffer`.");
    const std::string writes =
        "Writes what was added into the buffer; false when that fails or nothing was added.";
    icons.device<WritesImagesOfNothing>("WritesImagesOfNothing", writes);
    icons.device<WritesBeforeItIsFinished>("WritesBeforeItIsFinished", writes);
    for (Violator& each : icons.take()) all.push_back(std::move(each));
}

}  // namespace

std::vector<Violator> deviceServiceViolators() {
    std::vector<Violator> all;
    addHomeScreen(all);
    addPolicyAndBackup(all);
    addInstaller(all);
    addLogAndIcons(all);
    return all;
}

}  // namespace appsync
