#pragma once

// simulation/coordination: the install-coordination service in memory. `SimulatedCoordination`
// (this header) keeps the coordinators, installs through the simulated registry and calls
// observers; SimulatedCoordinator.h, SimulatedPlaceholder.h and SimulatedPromises.h are the handles
// that clients hold; SimulatedCoordinationState.h is what they share. Tests script refusals
// (`CoordinationStep`), nulls (`CoordinationObject`) and what other clients do. Includes services,
// files, recording and platform/; the same contract as device/coordination (tests/contract/).

#include <cstddef>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/InstallCoordinatorService.h"
#include "simulation/coordination/SimulatedCoordinationState.h"
#include "simulation/recording/Recorder.h"

namespace appsync {

class SimulatedAppRegistry;
class SimulatedFileSystem;

/// What can be refused with an error; of a coordinator and of a placeholder the piece that is set.
enum class CoordinationStep {
    LookUp,  // `coordinator`
    InstallOptions,
    InitialODRAssetPromises,
    AppAssetPromise,
    AppAssetPromiseResponsibleClient,
    UserDataPromise,
    PlaceholderPromise,
    IconPromise,
    Attributes,
    Metadata,
    Sinf,
    ConfigurationComplete,
};

/// What can come out null.
enum class CoordinationObject {
    Coordinator,          // of `coordinator`, without an error; by bundle identifier
    ExistingCoordinator,  // of `existingCoordinator`; by bundle identifier
    PathTransferPromise,  // by name
    OutOfBandPromise,     // by name
    Placeholder,          // by bundle identifier
    AppInstallObserver,   // by service name
};

/// The install-coordination service in memory: it keeps coordinators, shows placeholders and
/// installs through the simulated registry, whose failures (`failNextInstall`,
/// `failNextPlaceholderInstall`, `failNextUninstall`) and contents are the service's too.
///
/// An install or update needs its install options, the list of its initial assets, its placeholder
/// and its app asset; the restore of an application its placeholder and its app asset; that of a
/// demoted one its placeholder alone, which stays when the coordinator is done. Every other promise
/// that was set must be complete or given up. A placeholder whose configuration is not complete is
/// waited for by a demoted application only. One that cannot be shown ends its coordinator. A
/// coordinator is gone, with the file of its package, before its completion is reported.
///
/// What the service does by itself, observers' callbacks included, is done by tasks named
/// "coordination", at most `kThreads` at once; of one coordinator the placeholder is reported
/// before the completion. A placeholder takes no time, unless the test says otherwise.
/// Coordination is off until the test turns it on.
///
/// The methods below the interface are the test's: they are not recorded.
class SimulatedCoordination : public InstallCoordinatorService {
  public:
    /// All are only borrowed.
    SimulatedCoordination(Recorder& recorder, SimulatedAppRegistry& registry,
                          SimulatedFileSystem& files);
    ~SimulatedCoordination() override;

    [[nodiscard]] bool isCoordinationEnabled() override;
    [[nodiscard]] Coordinator coordinator(CoordinatorKind kind, const std::string& identifier,
                                          CoordinationClient client, Creation creation) override;
    [[nodiscard]] std::shared_ptr<InstallCoordinator> existingCoordinator(
        const std::string& identifier, CoordinationClient client) override;
    [[nodiscard]] std::shared_ptr<PathTransferPromise> makePathTransferPromise(
        const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
        std::uint64_t diskSpaceNeeded) override;
    [[nodiscard]] std::shared_ptr<OutOfBandPromise> makeOutOfBandPromise(
        const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) override;
    [[nodiscard]] std::shared_ptr<InstallPlaceholder> makeAppPlaceholder(
        const std::string& name, const std::string& identifier, std::uint64_t installType,
        CoordinationClient client) override;
    void uninstallApp(const std::string& identifier, UninstallCompletion completion) override;
    [[nodiscard]] ErrorRecord userPresentableError(
        std::int64_t code, const std::optional<ErrorRecord>& underlying) override;
    [[nodiscard]] std::shared_ptr<AppInstallObserver> makeAppInstallObserver(
        const std::string& serviceName, const std::set<CoordinationClient>& clients,
        std::weak_ptr<InstallCoordinatorObserver> delegate) override;

    static constexpr std::size_t kThreads = 4;

    void setEnabled(bool enabled) { enabled_ = enabled; }
    [[nodiscard]] bool isEnabled() const { return enabled_; }
    /// How long the service takes from now on to show a placeholder.
    void setPlaceholderDuration(SimulatedTime duration) { placeholderDuration_ = duration; }

    // What other clients do.
    /// A client creates a coordinator (the store: 1, another: any number) where there is none.
    std::shared_ptr<InstallCoordinator> addCoordinator(CoordinatorKind kind,
                                                       const std::string& identifier,
                                                       CoordinationClient client);
    /// A client cancels what there is under the identifier.
    void cancel(const std::string& identifier, const ErrorRecord& reason,
                CoordinationClient client);
    /// Somebody wants the application before the others.
    void prioritize(const std::string& identifier) { postShouldPrioritize(identifier); }

    // Crashes.
    /// The coordinators that there are, each with pieces of its own.
    using Records = std::map<std::string, std::shared_ptr<SimulatedCoordinatorState>>;
    [[nodiscard]] Records records() const;
    /// Takes records over as the service does when the device is opened, after the registry has:
    /// coordinators whose placeholder stood and is lost go, and so do a sync's placeholders without
    /// a coordinator; without coordination everything goes, except placeholders. Who observed is
    /// gone. What is left goes on once somebody observes installs, or `start` is called.
    void reopen(const Records& records);
    /// Goes on with what was left.
    void start() { resume(); }

    // What the test looks at. Null when there is none.
    [[nodiscard]] const SimulatedCoordinatorState* state(const std::string& identifier) const;
    /// The last coordinator of the identifier that is done or cancelled.
    [[nodiscard]] const SimulatedCoordinatorState* ended(const std::string& identifier) const;
    /// The last promise that was made of this name, and the last placeholder of this identifier.
    [[nodiscard]] const SimulatedPromiseState* promise(const std::string& name) const;
    [[nodiscard]] const SimulatedPlaceholderState* placeholder(const std::string& identifier) const;
    /// Whether the coordinator of the identifier has everything that it needs.
    [[nodiscard]] bool isComplete(const std::string& identifier) const;
    /// The paths of the packages that coordinators have and have not used.
    [[nodiscard]] std::set<std::string> deliveredPackages() const;
    /// The identifiers that have a coordinator, sorted.
    [[nodiscard]] std::vector<std::string> identifiers() const;
    /// The service names of the app-install observers that live, in order.
    [[nodiscard]] std::vector<std::string> appInstallObservers() const;

    // Answers. They are used up one by one, in the order given.
    /// The step of this bundle identifier is refused, and changes nothing.
    void failNext(CoordinationStep step, const std::string& identifier, ErrorRecord error);
    /// The next object of this key comes out null (see CoordinationObject).
    void makeNoneNext(CoordinationObject object, const std::string& key);
    /// From now on this is what the coordinators of the identifier answer when they are asked
    /// whether they have the piece, and nothing: the truth. For the steps with a `has` question.
    void setHas(CoordinationStep piece, const std::string& identifier, std::optional<bool> answer);
    /// The coordinator, which goes on, carries this error from now on.
    void setError(const std::string& identifier, std::optional<ErrorRecord> error);

    // Reports by hand, whether they are true or not; each comes by a task of the service's. A
    // coordinator that there is reports to whom it would; of any other identifier, or none, the
    // app-install observers of `SyncClientID` hear, as of a coordinator that carries `error`.
    using Identifier = std::optional<std::string>;
    void postDidBeginFulfillment(std::uint64_t promise);
    void postDidInstallPlaceholder(const Identifier& identifier,
                                   std::optional<ErrorRecord> error = std::nullopt);
    void postDidComplete(const Identifier& identifier,
                         std::optional<ErrorRecord> error = std::nullopt);
    void postCanceled(const Identifier& identifier, const ErrorRecord& reason,
                      CoordinationClient client);
    void postShouldPrioritize(const Identifier& identifier);

  private:
    friend class SimulatedCoordinator;
    friend class SimulatedPlaceholder;
    template <typename Interface>
    friend class SimulatedPromise;
    friend class SimulatedPathTransferPromise;

    using State = std::shared_ptr<SimulatedCoordinatorState>;
    using Work = std::function<void()>;
    using Call = std::function<void(InstallCoordinatorObserver&,
                                    const std::shared_ptr<InstallCoordinator>&)>;
    struct Registration;
    class Observer;
    struct Listener;
    using Listeners = std::vector<Listener>;

    // For the handles.
    [[nodiscard]] Status takeFailure(CoordinationStep step, const std::string& identifier);
    [[nodiscard]] bool has(CoordinationStep piece, const SimulatedCoordinatorState& state,
                           bool truth) const;
    /// Whether a piece of a coordinator can be set now: the error if not.
    [[nodiscard]] Status checkSet(CoordinationStep piece, const SimulatedCoordinatorState& state,
                                  bool there);
    /// The same for a piece of a placeholder.
    [[nodiscard]] Status checkChange(CoordinationStep piece,
                                     const SimulatedPlaceholderState& state);
    /// Refuses null, and the placeholder of another application.
    [[nodiscard]] static Status checkPlaceholder(const SimulatedCoordinatorState& state,
                                                 const SimulatedPlaceholderState* placeholder);
    /// The error of a set that was given null.
    [[nodiscard]] static ErrorRecord nothingGiven();
    void cancelNow(const State& state, const ErrorRecord& reason, CoordinationClient client);
    void cancelPromise(SimulatedPromiseState& promise, const ErrorRecord& reason,
                       CoordinationClient client);
    /// Lets the service look at what the coordinator has now.
    void advance(const State& state);

    void willHandPlaceholder(SimulatedCoordinatorState& state) const;
    /// Tells that the records have changed.
    void tell(std::string_view what, const std::string& identifier, Persistence persistence) const;
    void resume();

    // Threads.
    void submit(Work work);
    void workerLoop();
    void goOn(const State& state);
    void showPlaceholder(const State& state);
    void install(const State& state);
    [[nodiscard]] Status installPackage(const SimulatedCoordinatorState& state);
    void end(const State& state, std::optional<ErrorRecord> error);
    void takePlaceholderAway(SimulatedCoordinatorState& state);

    // Reports.
    [[nodiscard]] State find(const std::string& identifier) const;
    [[nodiscard]] State reported(const Identifier& identifier, std::optional<ErrorRecord> error);
    [[nodiscard]] Listeners listeners(const SimulatedCoordinatorState& state);
    [[nodiscard]] Listeners delegates(CoordinationClient client);
    void report(const State& state, std::string_view method, const std::string& arguments,
                const Call& call);
    void reportPlaceholder(const State& state);
    void reportCompletion(const State& state);
    void reportCancel(const State& state, const ErrorRecord& reason, CoordinationClient client);
    void reportPriority(const State& state);

    [[nodiscard]] State create(CoordinatorKind kind, const std::string& identifier,
                               CoordinationClient client);
    [[nodiscard]] Coordinator lookUp(CoordinatorKind kind, const std::string& identifier,
                                     CoordinationClient client, Creation creation);
    [[nodiscard]] std::shared_ptr<InstallCoordinator> handle(const State& state);
    [[nodiscard]] bool takeNone(CoordinationObject object, const std::string& key);
    [[nodiscard]] std::shared_ptr<SimulatedPromiseState> newPromise(const std::string& name,
                                                                    CoordinationClient client,
                                                                    std::uint64_t diskSpaceNeeded);

    Recorder& recorder_;
    SimulatedAppRegistry& registry_;
    SimulatedFileSystem& files_;
    bool enabled_ = false;
    bool isReopened_ = false;
    SimulatedTime placeholderDuration_{0};
    std::map<std::string, State> coordinators_;
    std::map<std::string, State> ended_;
    std::map<std::string, std::shared_ptr<SimulatedPromiseState>> promises_;
    std::map<std::string, std::shared_ptr<SimulatedPlaceholderState>> placeholders_;
    std::vector<std::weak_ptr<Registration>> registrations_;
    std::map<std::pair<CoordinationStep, std::string>, std::deque<ErrorRecord>> failures_;
    std::map<std::pair<CoordinationObject, std::string>, std::size_t> nones_;
    std::map<std::pair<CoordinationStep, std::string>, bool> answers_;
    std::deque<Work> work_;
    std::size_t workers_ = 0;
};

}  // namespace appsync
