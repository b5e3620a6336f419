#include "recording/RecordedServices.h"

#include <algorithm>
#include <string>
#include <utility>

#include "platform/Error.h"
#include "platform/SyncAsset.h"
#include "recording/Recording.h"

namespace appsync {

bool RecordedTransfers::canCancelTransfers() const {
    return CallRecord(recording_, "TransferService.canCancelTransfers", 0)
        .answer(inner_->canCancelTransfers());
}

void RecordedTransfers::cancelTransferForFailedAsset(const SyncAsset& asset) {
    const CallRecord record(recording_, "TransferService.cancelTransferForFailedAsset", 0,
                            asset.identifier, asset.dataclass);
    inner_->cancelTransferForFailedAsset(asset);
}

bool RecordedTransfers::canPrioritizeAssets() const {
    return CallRecord(recording_, "TransferService.canPrioritizeAssets", 0)
        .answer(inner_->canPrioritizeAssets());
}

void RecordedTransfers::prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) {
    const std::uint64_t number = recording_.newNumber();
    const AnnouncedCall call(recording_, "TransferService.prioritizeAsset", 0, asset.identifier,
                             asset.dataclass, number);
    inner_->prioritizeAsset(
        asset, [recording = recording_.shared_from_this(), number,
                completion = std::move(completion)](const ErrorRecord* error) mutable {
            const SpanRecord span(*recording, "callback", "TransferService.PrioritizeCompletion",
                                  number, error);
            const PrioritizeCompletion own = std::move(completion);
            if (own) own(error);
        });
}

bool RecordedHost::isRecoverableError(const ErrorRecord& error) const {
    return CallRecord(recording_, "SyncHost.isRecoverableError", 0, error)
        .answer(inner_.isRecoverableError(error));
}

TransferService* RecordedHost::transferService() {
    CallRecord record(recording_, "SyncHost.transferService", 0);
    return record.answer(inner_.transferService() != nullptr) ? &transfers_ : nullptr;
}

namespace {

class RecordedLogHandle : public LogHandle {
  public:
    RecordedLogHandle(std::unique_ptr<LogHandle> inner, std::uint64_t number)
        : inner_(std::move(inner)), number_(number) {}
    [[nodiscard]] const LogHandle& inner() const { return *inner_; }
    [[nodiscard]] std::uint64_t number() const { return number_; }

  private:
    const std::unique_ptr<LogHandle> inner_;
    const std::uint64_t number_;
};

}  // namespace

void RecordedLog::write(const LogMessage& message) noexcept {
    inner_.write(message);
    try {
        CallRecord(recording_, "LogFacility.write", 0, message.category, message.level,
                   MessageFormat{message.format},
                   MessageArguments{message.arguments, ownIdentifier_})
            .announce();
    } catch (...) {
        // Out of memory: the message is in the log, and the recording goes without it.
        return;
    }
}

std::unique_ptr<LogHandle> RecordedLog::makeHandle(std::string_view subsystem,
                                                   std::string_view category) {
    CallRecord record(recording_, "LogFacility.makeHandle", 0, subsystem, category);
    auto handle = inner_.makeHandle(subsystem, category);
    if (handle == nullptr) return nullptr;
    return std::make_unique<RecordedLogHandle>(std::move(handle),
                                               record.answer(recording_.newNumber()));
}

std::optional<PropertyList> RecordedInstaller::lookupUninstalled() {
    return CallRecord(recording_, "InstallerService.lookupUninstalled", 0)
        .answer(inner_.lookupUninstalled());
}

bool RecordedInstaller::clearUninstalled(std::span<const std::string> identifiers) {
    return CallRecord(recording_, "InstallerService.clearUninstalled", 0, identifiers)
        .answer(inner_.clearUninstalled(identifiers));
}

PolicyAnswer RecordedPolicy::effectiveValue(PolicyFeature feature) {
    return CallRecord(recording_, "DevicePolicyService.effectiveValue", 0, feature)
        .answer(inner_.effectiveValue(feature));
}

namespace {

class RecordedBackupManager : public BackupManager {
  public:
    RecordedBackupManager(std::unique_ptr<BackupManager> inner, std::uint64_t number,
                          Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    bool restoreDataExists(const std::string& identifier) override {
        return CallRecord(recording_, "BackupManager.restoreDataExists", number_, identifier)
            .answer(inner_->restoreDataExists(identifier));
    }
    void cancelApplicationRestore(const std::string& identifier) override {
        const CallRecord record(recording_, "BackupManager.cancelApplicationRestore", number_,
                                identifier);
        inner_->cancelApplicationRestore(identifier);
    }

  private:
    const std::unique_ptr<BackupManager> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

class RecordedConnection : public HomeScreenConnection {
  public:
    RecordedConnection(std::shared_ptr<HomeScreenConnection> inner, std::uint64_t number,
                       Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}

    bool setIconState(ByteView state) override {
        return CallRecord(recording_, "HomeScreenConnection.setIconState", number_, state)
            .answer(inner_->setIconState(state));
    }
    std::optional<Bytes> flattenedIconState(std::uint64_t variant) override {
        return CallRecord(recording_, "HomeScreenConnection.flattenedIconState", number_, variant)
            .answer(inner_->flattenedIconState(variant));
    }

  private:
    const std::shared_ptr<HomeScreenConnection> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

class RecordedAssertion : public TerminationAssertion {
  public:
    RecordedAssertion(std::unique_ptr<TerminationAssertion> inner, std::uint64_t number,
                      Recording& recording)
        : inner_(std::move(inner)), number_(number), recording_(recording) {}
    RecordedAssertion(const RecordedAssertion&) = delete;
    RecordedAssertion& operator=(const RecordedAssertion&) = delete;
    ~RecordedAssertion() override {
        const AnnouncedCall call(recording_, "TerminationAssertion.release", number_);
        inner_.reset();
    }

  private:
    std::unique_ptr<TerminationAssertion> inner_;
    const std::uint64_t number_;
    Recording& recording_;
};

}  // namespace

std::unique_ptr<BackupManager> RecordedBackup::makeManager() {
    CallRecord record(recording_, "BackupService.makeManager", 0);
    return std::make_unique<RecordedBackupManager>(
        inner_.makeManager(), record.answer(recording_.newNumber()), recording_);
}

std::shared_ptr<HomeScreenConnection> RecordedHomeScreen::blockableConnection() {
    CallRecord record(recording_, "HomeScreenService.blockableConnection", 0);
    auto connection = inner_.blockableConnection();
    const std::uint64_t number = connection != nullptr ? recording_.newNumber() : 0;
    static_cast<void>(record.answer(number));
    if (connection == nullptr) return nullptr;
    return std::make_shared<RecordedConnection>(std::move(connection), number, recording_);
}

TerminationAssertionResult RecordedHomeScreen::takeTerminationAssertion(
    const std::string& identifier, std::uint64_t reason) {
    CallRecord record(recording_, "HomeScreenService.takeTerminationAssertion", 0, identifier,
                      reason);
    TerminationAssertionResult result = inner_.takeTerminationAssertion(identifier, reason);
    const std::uint64_t number = result.assertion != nullptr ? recording_.newNumber() : 0;
    RecordText answer = recording_.newText();
    answer.begin('[');
    answer.add(result.outcome);
    answer.add(number);
    answer.end(']');
    static_cast<void>(record.answer(std::move(answer)));
    if (number != 0) {
        result.assertion =
            std::make_unique<RecordedAssertion>(std::move(result.assertion), number, recording_);
    }
    return result;
}

namespace {

class RecordedBundle : public AppBundle {
  public:
    RecordedBundle(std::unique_ptr<AppBundle> inner, std::uint64_t number)
        : inner_(std::move(inner)), number_(number) {}
    [[nodiscard]] const AppBundle& inner() const { return *inner_; }
    [[nodiscard]] std::uint64_t number() const { return number_; }

  private:
    const std::unique_ptr<AppBundle> inner_;
    const std::uint64_t number_;
};

class RecordedImage : public IconImage {
  public:
    RecordedImage(std::unique_ptr<IconImage> inner, std::uint64_t number)
        : inner_(std::move(inner)), number_(number) {}
    [[nodiscard]] const IconImage& inner() const { return *inner_; }
    [[nodiscard]] std::uint64_t number() const { return number_; }

  private:
    const std::unique_ptr<IconImage> inner_;
    const std::uint64_t number_;
};

class RecordedDestination : public ImageDestination {
  public:
    RecordedDestination(std::unique_ptr<ImageDestination> inner, std::uint64_t number,
                        Bytes& buffer, Recording& recording)
        : inner_(std::move(inner)), number_(number), buffer_(buffer), recording_(recording) {}

    void addImage(const IconImage& image) override {
        const auto& recorded = static_cast<const RecordedImage&>(image);
        const CallRecord record(recording_, "ImageDestination.addImage", number_,
                                recorded.number());
        inner_->addImage(recorded.inner());
    }
    bool finalize() override {
        CallRecord record(recording_, "ImageDestination.finalize", number_);
        const bool isWritten = inner_->finalize();
        static_cast<void>(record.shortAnswer(isWritten ? &buffer_ : nullptr));
        return isWritten;
    }

  private:
    const std::unique_ptr<ImageDestination> inner_;
    const std::uint64_t number_;
    Bytes& buffer_;
    Recording& recording_;
};

/// Tells of what was made, and wraps it; null stays null.
template <typename Made, typename Wrap>
auto recordMade(CallRecord& record, Recording& recording, Made made, Wrap wrap)
    -> decltype(wrap(std::move(made), std::uint64_t{0})) {
    const std::uint64_t number = made != nullptr ? recording.newNumber() : 0;
    static_cast<void>(record.answer(number));
    if (number == 0) return nullptr;
    return wrap(std::move(made), number);
}

}  // namespace

std::unique_ptr<AppBundle> RecordedIcons::openBundle(const FileURL& url) {
    CallRecord record(recording_, "IconRenderer.openBundle", 0, url);
    return recordMade(record, recording_, inner_.openBundle(url),
                      [](auto made, std::uint64_t number) -> std::unique_ptr<AppBundle> {
                          return std::make_unique<RecordedBundle>(std::move(made), number);
                      });
}

std::unique_ptr<IconImage> RecordedIcons::homeScreenIcon(const AppBundle& bundle) {
    const auto& recorded = static_cast<const RecordedBundle&>(bundle);
    CallRecord record(recording_, "IconRenderer.homeScreenIcon", 0, recorded.number());
    return recordMade(record, recording_, inner_.homeScreenIcon(recorded.inner()),
                      [](auto made, std::uint64_t number) -> std::unique_ptr<IconImage> {
                          return std::make_unique<RecordedImage>(std::move(made), number);
                      });
}

std::unique_ptr<ImageDestination> RecordedIcons::createImageDestination(
    std::string_view typeIdentifier, std::size_t imageCount, Bytes& buffer) {
    CallRecord record(recording_, "IconRenderer.createImageDestination", 0, typeIdentifier,
                      imageCount);
    return recordMade(record, recording_,
                      inner_.createImageDestination(typeIdentifier, imageCount, buffer),
                      [&](auto made, std::uint64_t number) -> std::unique_ptr<ImageDestination> {
                          return std::make_unique<RecordedDestination>(std::move(made), number,
                                                                       buffer, recording_);
                      });
}

void RecordedTransactions::initialize(const LogHandle& handle) {
    const auto& recorded = static_cast<const RecordedLogHandle&>(handle);
    const CallRecord record(recording_, "InstallTransactionLog.initialize", 0, recorded.number());
    inner_.initialize(recorded.inner());
}

void RecordedTransactions::logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase,
                                   bool success, std::string_view identifier,
                                   std::string_view description) {
    const CallRecord record(recording_, "InstallTransactionLog.logStep", 0, kind, party, phase,
                            success, identifier, description);
    inner_.logStep(kind, party, phase, success, identifier, description);
}

void RecordedTransactions::logScenario(std::string_view scenario, std::uint64_t step, bool success,
                                       std::string_view identifier, std::string_view description) {
    const CallRecord record(recording_, "InstallTransactionLog.logScenario", 0, scenario, step,
                            success, identifier, description);
    inner_.logScenario(scenario, step, success, identifier, description);
}

NamedNotifications::Registration RecordedNotifications::registerForState(std::string_view name) {
    CallRecord record(recording_, "NamedNotifications.registerForState", 0, name);
    const Registration registration = inner_.registerForState(name);
    RecordText answer = recording_.newText();
    answer.begin('[');
    answer.add(registration.status);
    answer.add(registration.token);
    answer.end(']');
    static_cast<void>(record.answer(std::move(answer)));
    return registration;
}

void RecordedNotifications::setState(int token, std::uint64_t state) {
    const CallRecord record(recording_, "NamedNotifications.setState", 0, token, state);
    inner_.setState(token, state);
}

void RecordedNotifications::post(std::string_view name) {
    const AnnouncedCall call(recording_, "NamedNotifications.post", 0, name);
    inner_.post(name);
}

/// Stands for one observer of one name with the notification centre.
struct RecordedNotificationCenter::StandIn {
    const void* address = nullptr;
    std::string name;
    std::weak_ptr<void> observer;
    Callback callback = nullptr;
    std::uint64_t number = 0;
    const std::shared_ptr<Recording> recording;
};

void RecordedNotificationCenter::hear(void* standIn) {
    if (standIn == nullptr) return;
    const auto& heard = *static_cast<const StandIn*>(standIn);
    const SpanRecord span(*heard.recording, "callback", "NotificationCenter.Callback",
                          heard.number);
    const std::shared_ptr<void> observer = heard.observer.lock();
    heard.callback(observer.get());
}

void RecordedNotificationCenter::addObserver(std::weak_ptr<void> observer, std::string_view name,
                                             Callback callback, SuspensionBehavior behavior) {
    const auto standIn = std::make_shared<StandIn>(
        StandIn{observer.lock().get(), std::string(name), observer, callback,
                recording_.newNumber(), recording_.shared_from_this()});
    {
        const std::lock_guard guard(mutex_);
        standIns_.push_back(standIn);
    }
    const AnnouncedCall call(recording_, "NotificationCenter.addObserver", 0, name,
                             standIn->number);
    inner_.addObserver(standIn, name, &RecordedNotificationCenter::hear, behavior);
}

void RecordedNotificationCenter::removeObserver(const void* observer, std::string_view name) {
    std::shared_ptr<StandIn> standIn;
    {
        const std::lock_guard guard(mutex_);
        const auto found = std::find_if(standIns_.begin(), standIns_.end(), [&](const auto& each) {
            return each->address == observer && each->name == name;
        });
        if (found != standIns_.end()) {
            standIn = *found;
            standIns_.erase(found);
        }
    }
    const std::uint64_t number = standIn != nullptr ? standIn->number : 0;
    const CallRecord record(recording_, "NotificationCenter.removeObserver", 0, name, number);
    inner_.removeObserver(standIn.get(), name);
}

// For the process that hosts the plug-in, which is no part of what it does.
void RecordedNotificationCenter::post(std::string_view name) { inner_.post(name); }

}  // namespace appsync
