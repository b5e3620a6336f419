#include "recording/RecordedRegistry.h"

#include <string_view>
#include <utility>
#include <vector>

#include "platform/InstallProgressRecord.h"
#include "recording/Recording.h"

namespace appsync {

/// Stands for an observer of the plug-in's with the registry.
class RecordedRegistryObserver : public AppRegistryObserver {
  public:
    RecordedRegistryObserver(std::weak_ptr<AppRegistryObserver> plugIn, std::uint64_t number,
                             Recording& recording)
        : plugIn_(std::move(plugIn)), number_(number), recording_(recording.shared_from_this()) {}

    [[nodiscard]] std::uint64_t number() const { return number_; }

    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override {
        const SpanRecord span(*recording_, "callback",
                              "AppRegistryObserver.applicationInstallsArePrioritized", number_,
                              prioritized, paused);
        const auto plugIn = plugIn_.lock();
        if (plugIn != nullptr) plugIn->applicationInstallsArePrioritized(prioritized, paused);
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) override {
        const SpanRecord span(*recording_, "callback",
                              "AppRegistryObserver.applicationInstallsDidCancel", number_,
                              cancelled);
        const auto plugIn = plugIn_.lock();
        if (plugIn != nullptr) plugIn->applicationInstallsDidCancel(cancelled);
    }

  private:
    const std::weak_ptr<AppRegistryObserver> plugIn_;
    const std::uint64_t number_;
    const std::shared_ptr<Recording> recording_;
};

namespace {

class RecordedProgress : public InstallProgressRecord {
  public:
    RecordedProgress(std::shared_ptr<InstallProgressRecord> inner, std::uint64_t number,
                     Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    [[nodiscard]] InstallProgressRecord& inner() { return *inner_; }
    [[nodiscard]] std::uint64_t number() const { return number_; }

    std::uint64_t installState() const override {
        return ask("InstallProgressRecord.installState", &InstallProgressRecord::installState);
    }
    void setInstallState(std::uint64_t state) override {
        tell("InstallProgressRecord.setInstallState", &InstallProgressRecord::setInstallState,
             state);
    }
    std::uint64_t installPhase() const override {
        return ask("InstallProgressRecord.installPhase", &InstallProgressRecord::installPhase);
    }
    void setInstallPhase(std::uint64_t phase) override {
        tell("InstallProgressRecord.setInstallPhase", &InstallProgressRecord::setInstallPhase,
             phase);
    }
    std::int64_t totalUnitCount() const override {
        return ask("InstallProgressRecord.totalUnitCount", &InstallProgressRecord::totalUnitCount);
    }
    void setTotalUnitCount(std::int64_t count) override {
        tell("InstallProgressRecord.setTotalUnitCount", &InstallProgressRecord::setTotalUnitCount,
             count);
    }
    std::int64_t completedUnitCount() const override {
        return ask("InstallProgressRecord.completedUnitCount",
                   &InstallProgressRecord::completedUnitCount);
    }
    void setCompletedUnitCount(std::int64_t count) override {
        tell("InstallProgressRecord.setCompletedUnitCount",
             &InstallProgressRecord::setCompletedUnitCount, count);
    }
    void cancel() override { tell("InstallProgressRecord.cancel", &InstallProgressRecord::cancel); }
    std::string description() const override {
        return ask("InstallProgressRecord.description", &InstallProgressRecord::description);
    }

  private:
    template <typename Answer>
    Answer ask(std::string_view call, Answer (InstallProgressRecord::*method)() const) const {
        return CallRecord(recording_, call, number_).answer((inner_.get()->*method)());
    }
    template <typename... Arguments>
    void tell(std::string_view call, void (InstallProgressRecord::*method)(Arguments...),
              Arguments... arguments) const {
        const CallRecord record(recording_, call, number_, arguments...);
        (inner_.get()->*method)(arguments...);
    }

    const std::shared_ptr<InstallProgressRecord> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

RecordedProgress& recorded(InstallProgressRecord& record) {
    return static_cast<RecordedProgress&>(record);
}

}  // namespace

RecordedRegistry::RecordedRegistry(AppRegistry& inner, Recording& recording)
    : inner_(inner), recording_(recording) {}

RecordedRegistry::~RecordedRegistry() = default;

std::optional<AppProxy> RecordedRegistry::proxyForIdentifier(const std::string& identifier,
                                                             Placeholders placeholders) {
    return CallRecord(recording_, "AppRegistry.proxyForIdentifier", 0, identifier, placeholders)
        .answer(inner_.proxyForIdentifier(identifier, placeholders));
}

bool RecordedRegistry::isApplicationInstalled(const std::string& identifier) {
    return CallRecord(recording_, "AppRegistry.isApplicationInstalled", 0, identifier)
        .answer(inner_.isApplicationInstalled(identifier));
}

void RecordedRegistry::enumerateBundles(BundleType type, const ProxyCallback& callback) {
    const SpanRecord walk(recording_, "walk", "AppRegistry.enumerateBundles", 0, type);
    inner_.enumerateBundles(type, [&](const AppProxy& proxy, bool& stop) {
        SpanRecord each(recording_, "each", "AppProxy", 0, proxy);
        callback(proxy, stop);
        static_cast<void>(each.answer(stop));
    });
}

std::shared_ptr<InstallProgressRecord> RecordedRegistry::installProgress(const AppProxy& proxy,
                                                                         std::uint64_t phase) {
    CallRecord record(recording_, "AppRegistry.installProgress", 0, proxy.applicationIdentifier,
                      proxy.state.placeholder, phase);
    auto progress = inner_.installProgress(proxy, phase);
    const std::uint64_t number = progress != nullptr ? recording_.newNumber() : 0;
    static_cast<void>(record.answer(number));
    if (progress == nullptr) return nullptr;
    return std::make_shared<RecordedProgress>(std::move(progress), number, recording_);
}

void RecordedRegistry::finishInstallPhase(InstallProgressRecord& record) {
    RecordedProgress& progress = recorded(record);
    const CallRecord call(recording_, "AppRegistry.finishInstallPhase", 0, progress.number());
    inner_.finishInstallPhase(progress.inner());
}

Status RecordedRegistry::installPackage(const FileURL& package, const PropertyList& options) {
    return CallRecord(recording_, "AppRegistry.installPackage", 0, package, options)
        .answer(inner_.installPackage(package, options));
}

Status RecordedRegistry::installPlaceholderBundle(const FileURL& directory,
                                                  const PropertyList& options) {
    return CallRecord(recording_, "AppRegistry.installPlaceholderBundle", 0, directory, options)
        .answer(inner_.installPlaceholderBundle(directory, options));
}

Status RecordedRegistry::uninstallApplication(const std::string& identifier,
                                              const PropertyList& options) {
    return CallRecord(recording_, "AppRegistry.uninstallApplication", 0, identifier, options)
        .answer(inner_.uninstallApplication(identifier, options));
}

void RecordedRegistry::addObserver(std::weak_ptr<AppRegistryObserver> observer) {
    const std::shared_ptr<AppRegistryObserver> plugIn = observer.lock();
    const auto standIn = observers_.standInFor(plugIn.get(), observer, [&] {
        return std::make_shared<RecordedRegistryObserver>(observer, recording_.newNumber(),
                                                          recording_);
    });
    const AnnouncedCall call(recording_, "AppRegistry.addObserver", 0, standIn->number());
    inner_.addObserver(standIn);
}

void RecordedRegistry::removeObserver(const AppRegistryObserver* observer) {
    const std::shared_ptr<RecordedRegistryObserver> standIn = observers_.take(observer);
    const std::uint64_t number = standIn != nullptr ? standIn->number() : 0;
    const CallRecord record(recording_, "AppRegistry.removeObserver", 0, number);
    if (standIn != nullptr) inner_.removeObserver(standIn.get());
}

}  // namespace appsync
