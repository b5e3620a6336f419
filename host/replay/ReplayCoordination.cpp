#include "host/replay/ReplayCoordination.h"

#include <utility>
#include <vector>

#include "host/replay/ReplayRun.h"
#include "platform/Error.h"

namespace appsync {
namespace {

/// A thing of the service's that the plug-in was given under a number.
template <typename Interface>
class ReplayHandle : public Interface {
  public:
    ReplayHandle(ReplayRun& run, std::uint64_t number) : run_(run), number_(number) {}
    [[nodiscard]] std::uint64_t number() const { return number_; }

  protected:
    ReplayRun& run() const { return run_; }
    template <typename... Arguments>
    const RecordLine& call(const std::string& name, const Arguments&... arguments) const {
        return run_.call(name, number_, arguments...);
    }
    template <typename Answer, typename... Arguments>
    Answer ask(const std::string& name, const Arguments&... arguments) const {
        return run_.answer<Answer>(call(name, arguments...));
    }

  private:
    ReplayRun& run_;
    const std::uint64_t number_;
};

template <typename Interface>
std::uint64_t replayNumberOf(const std::shared_ptr<Interface>& handle) {
    if (handle == nullptr) return 0;
    return static_cast<const ReplayHandle<Interface>&>(*handle).number();
}

template <typename Interface>
const std::string kReplayPromise;
template <>
const std::string kReplayPromise<PathTransferPromise> = "PathTransferPromise.";
template <>
const std::string kReplayPromise<OutOfBandPromise> = "OutOfBandPromise.";

template <typename Interface>
class ReplayPromise : public ReplayHandle<Interface> {
  public:
    using ReplayHandle<Interface>::ReplayHandle;

    std::string name() const override { return this->template ask<std::string>(named("name")); }
    CoordinationClient clientIdentifier() const override {
        return this->template ask<CoordinationClient>(named("clientIdentifier"));
    }
    double percentComplete() const override {
        return this->template ask<double>(named("percentComplete"));
    }
    void setPercentComplete(double percent) override {
        this->call(named("setPercentComplete"), percent);
    }
    bool isComplete() const override { return this->template ask<bool>(named("isComplete")); }
    void setComplete() override { this->call(named("setComplete")); }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        this->call(named("cancelForReason"), reason, client);
    }

  private:
    static std::string named(const char* method) { return kReplayPromise<Interface> + method; }
};

using ReplayOutOfBandPromise = ReplayPromise<OutOfBandPromise>;

class ReplayPathPromise : public ReplayPromise<PathTransferPromise> {
  public:
    using ReplayPromise::ReplayPromise;
    std::optional<FileURL> transferPath() const override {
        return ask<std::optional<FileURL>>("PathTransferPromise.transferPath");
    }
    void setTransferPath(const FileURL& path) override {
        call("PathTransferPromise.setTransferPath", path);
    }
};

class ReplayPlaceholder : public ReplayHandle<InstallPlaceholder> {
  public:
    using ReplayHandle::ReplayHandle;

    std::string description() const override {
        return ask<std::string>("InstallPlaceholder.description");
    }
    Status setIconPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return ask<Status>("InstallPlaceholder.setIconPromise", replayNumberOf(promise));
    }
    Status setAttributes(const PlaceholderAttributes& attributes) override {
        return ask<Status>("InstallPlaceholder.setAttributes", attributes);
    }
    Status setMetadata(const std::optional<StoreMetadata>& metadata) override {
        return ask<Status>("InstallPlaceholder.setMetadata", metadata);
    }
    Status setSinf(const Bytes& sinf) override {
        return ask<Status>("InstallPlaceholder.setSinf", sinf);
    }
    Status setConfigurationComplete() override {
        return ask<Status>("InstallPlaceholder.setConfigurationComplete");
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        call("InstallPlaceholder.cancelForReason", reason, client);
    }
};

void hearOfCoordinator(ReplayRun& run, InstallCoordinatorObserver& observer,
                       const RecordLine& line);

ReplayRun::Callback coordinatorCallback(ReplayRun& run,
                                        std::weak_ptr<InstallCoordinatorObserver> observer) {
    return [&run, observer = std::move(observer)](const RecordLine& line) {
        const auto plugIn = observer.lock();
        if (plugIn != nullptr) hearOfCoordinator(run, *plugIn, line);
    };
}

class ReplayCoordinator : public ReplayHandle<InstallCoordinator> {
  public:
    using ReplayHandle::ReplayHandle;

    std::optional<std::string> bundleIdentifier() const override {
        return ask<std::optional<std::string>>("InstallCoordinator.bundleIdentifier");
    }
    CoordinationClient creatorIdentifier() const override {
        return ask<CoordinationClient>("InstallCoordinator.creatorIdentifier");
    }
    std::optional<ErrorRecord> error() const override {
        return ask<std::optional<ErrorRecord>>("InstallCoordinator.error");
    }
    std::string description() const override {
        return ask<std::string>("InstallCoordinator.description");
    }
    void setObserver(std::weak_ptr<InstallCoordinatorObserver> observer) override {
        const RecordLine& line = run().numberedCall("InstallCoordinator.setObserver", number());
        run().listen(ReplayRun::numberIn(line), coordinatorCallback(run(), std::move(observer)));
    }
    bool hasInstallOptions() const override {
        return ask<bool>("InstallCoordinator.hasInstallOptions");
    }
    Status setInstallOptions(const InstallOptions& options) override {
        return ask<Status>("InstallCoordinator.setInstallOptions", options);
    }
    bool hasInitialODRAssetPromises() const override {
        return ask<bool>("InstallCoordinator.hasInitialODRAssetPromises");
    }
    Status setInitialODRAssetPromises(
        const std::vector<std::shared_ptr<PathTransferPromise>>& promises) override {
        std::vector<std::uint64_t> numbers;
        numbers.reserve(promises.size());
        for (const auto& each : promises) numbers.push_back(replayNumberOf(each));
        return ask<Status>("InstallCoordinator.setInitialODRAssetPromises", numbers);
    }
    std::shared_ptr<PathTransferPromise> appAssetPromise() const override {
        const auto promise = ask<std::uint64_t>("InstallCoordinator.appAssetPromise");
        if (promise == 0) return nullptr;
        return std::make_shared<ReplayPathPromise>(run(), promise);
    }
    Status setAppAssetPromise(const std::shared_ptr<PathTransferPromise>& promise) override {
        return ask<Status>("InstallCoordinator.setAppAssetPromise", replayNumberOf(promise));
    }
    std::optional<CoordinationClient> appAssetPromiseResponsibleClient() const override {
        return ask<std::optional<CoordinationClient>>(
            "InstallCoordinator.appAssetPromiseResponsibleClient");
    }
    Status setAppAssetPromiseResponsibleClient(CoordinationClient client) override {
        return ask<Status>("InstallCoordinator.setAppAssetPromiseResponsibleClient", client);
    }
    bool hasUserDataPromise() const override {
        return ask<bool>("InstallCoordinator.hasUserDataPromise");
    }
    Status setUserDataPromise(const std::shared_ptr<OutOfBandPromise>& promise) override {
        return ask<Status>("InstallCoordinator.setUserDataPromise", replayNumberOf(promise));
    }
    bool hasPlaceholderPromise() const override {
        return ask<bool>("InstallCoordinator.hasPlaceholderPromise");
    }
    Status setPlaceholderPromise(const std::shared_ptr<InstallPlaceholder>& placeholder) override {
        return ask<Status>("InstallCoordinator.setPlaceholderPromise", replayNumberOf(placeholder));
    }
    void cancelForReason(const ErrorRecord& reason, CoordinationClient client) override {
        call("InstallCoordinator.cancelForReason", reason, client);
    }
};

InstallCoordinatorPointer coordinatorOf(ReplayRun& run, std::uint64_t number) {
    return number == 0 ? nullptr : std::make_shared<ReplayCoordinator>(run, number);
}

void hearOfCoordinator(ReplayRun& run, InstallCoordinatorObserver& observer,
                       const RecordLine& line) {
    const std::string method = line.name.substr(line.name.find('.') + 1);
    std::uint64_t number = 0;
    if (method == "coordinatorCanceledWithReason") {
        ErrorRecord reason;
        CoordinationClient client = 0;
        run.readAll(line, line.arguments, number, reason, client);
        return observer.coordinatorCanceledWithReason(coordinatorOf(run, number), reason, client);
    }
    run.readAll(line, line.arguments, number);
    if (method == "promiseDidBeginFulfillmentWithIdentifier") {
        observer.promiseDidBeginFulfillmentWithIdentifier(number);
    } else if (method == "coordinatorDidInstallPlaceholder") {
        observer.coordinatorDidInstallPlaceholder(coordinatorOf(run, number));
    } else if (method == "coordinatorDidCompleteSuccessfully") {
        observer.coordinatorDidCompleteSuccessfully(coordinatorOf(run, number));
    } else if (method == "coordinatorShouldPrioritize") {
        observer.coordinatorShouldPrioritize(coordinatorOf(run, number));
    } else {
        run.giveUp(line, "it is none of the observer's calls");
    }
}

class ReplayInstallObserver : public AppInstallObserver {
  public:
    ReplayInstallObserver(ReplayRun& run, std::uint64_t number) : run_(run), number_(number) {}
    ReplayInstallObserver(const ReplayInstallObserver&) = delete;
    ReplayInstallObserver& operator=(const ReplayInstallObserver&) = delete;
    // Only a lack of memory throws here, and ends the command.
    // NOLINTNEXTLINE(bugprone-exception-escape)
    ~ReplayInstallObserver() override { run_.call("AppInstallObserver.release", number_); }

  private:
    ReplayRun& run_;
    const std::uint64_t number_;
};

}  // namespace

bool ReplayCoordination::isCoordinationEnabled() {
    return run_.answer<bool>(run_.call("InstallCoordinatorService.isCoordinationEnabled", 0));
}

InstallCoordinatorService::Coordinator ReplayCoordination::coordinator(
    CoordinatorKind kind, const std::string& identifier, CoordinationClient client,
    Creation creation) {
    const RecordLine& line =
        run_.call("InstallCoordinatorService.coordinator", 0, kind, identifier, client, creation);
    Coordinator found;
    std::uint64_t number = 0;
    run_.readAll(line, line.answer, number, found.wasCreated, found.error);
    found.coordinator = coordinatorOf(run_, number);
    return found;
}

InstallCoordinatorPointer ReplayCoordination::existingCoordinator(const std::string& identifier,
                                                                  CoordinationClient client) {
    const RecordLine& line =
        run_.call("InstallCoordinatorService.existingCoordinator", 0, identifier, client);
    return coordinatorOf(run_, run_.answer<std::uint64_t>(line));
}

std::shared_ptr<PathTransferPromise> ReplayCoordination::makePathTransferPromise(
    const std::string& name, CoordinationClient client, const std::optional<FileURL>& path,
    std::uint64_t diskSpaceNeeded) {
    const auto number =
        run_.answer<std::uint64_t>(run_.call("InstallCoordinatorService.makePathTransferPromise", 0,
                                             name, client, path, diskSpaceNeeded));
    return number == 0 ? nullptr : std::make_shared<ReplayPathPromise>(run_, number);
}

std::shared_ptr<OutOfBandPromise> ReplayCoordination::makeOutOfBandPromise(
    const std::string& name, CoordinationClient client, std::uint64_t diskSpaceNeeded) {
    const auto number = run_.answer<std::uint64_t>(run_.call(
        "InstallCoordinatorService.makeOutOfBandPromise", 0, name, client, diskSpaceNeeded));
    return number == 0 ? nullptr : std::make_shared<ReplayOutOfBandPromise>(run_, number);
}

std::shared_ptr<InstallPlaceholder> ReplayCoordination::makeAppPlaceholder(
    const std::string& name, const std::string& identifier, std::uint64_t installType,
    CoordinationClient client) {
    const auto number = run_.answer<std::uint64_t>(run_.call(
        "InstallCoordinatorService.makeAppPlaceholder", 0, name, identifier, installType, client));
    return number == 0 ? nullptr : std::make_shared<ReplayPlaceholder>(run_, number);
}

void ReplayCoordination::uninstallApp(const std::string& identifier,
                                      UninstallCompletion completion) {
    const RecordLine& line =
        run_.numberedCall("InstallCoordinatorService.uninstallApp", 0, identifier);
    run_.complete(ReplayRun::numberIn(line),
                  [&run = run_, completion = std::move(completion)](const RecordLine& heard) {
                      std::optional<ErrorRecord> error;
                      run.readAll(heard, heard.arguments, error);
                      if (completion) completion(error ? &*error : nullptr);
                  });
}

ErrorRecord ReplayCoordination::userPresentableError(std::int64_t code,
                                                     const std::optional<ErrorRecord>& underlying) {
    return run_.answer<ErrorRecord>(
        run_.call("InstallCoordinatorService.userPresentableError", 0, code, underlying));
}

std::shared_ptr<AppInstallObserver> ReplayCoordination::makeAppInstallObserver(
    const std::string& serviceName, const std::set<CoordinationClient>& clients,
    std::weak_ptr<InstallCoordinatorObserver> delegate) {
    const RecordLine& line = run_.numberedCall("InstallCoordinatorService.makeAppInstallObserver",
                                               0, serviceName, clients);
    run_.listen(ReplayRun::numberIn(line), coordinatorCallback(run_, std::move(delegate)));
    const auto number = run_.answer<std::uint64_t>(line);
    return number == 0 ? nullptr : std::make_shared<ReplayInstallObserver>(run_, number);
}

}  // namespace appsync
