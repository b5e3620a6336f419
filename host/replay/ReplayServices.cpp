#include "host/replay/ReplayServices.h"

#include <cstdint>
#include <map>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "host/replay/ReplayCoordination.h"
#include "host/replay/ReplayQueues.h"
#include "host/replay/ReplayRun.h"
#include "platform/AppRegistry.h"
#include "platform/BackupService.h"
#include "platform/DevicePolicyService.h"
#include "platform/Error.h"
#include "platform/FileSystem.h"
#include "platform/HomeScreenService.h"
#include "platform/IconRenderer.h"
#include "platform/InstallTransactionLog.h"
#include "platform/InstallerService.h"
#include "platform/LogFacility.h"
#include "platform/Notifications.h"
#include "platform/PropertyListSerialization.h"
#include "platform/SyncAsset.h"
#include "platform/SyncHost.h"
#include "platform/TransferService.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

class ReplayTransfers : public TransferService {
  public:
    explicit ReplayTransfers(ReplayRun& run) : run_(run) {}

    bool canCancelTransfers() const override {
        return run_.answer<bool>(run_.call("TransferService.canCancelTransfers", 0));
    }
    void cancelTransferForFailedAsset(const SyncAsset& asset) override {
        run_.call("TransferService.cancelTransferForFailedAsset", 0, asset.identifier,
                  asset.dataclass);
    }
    bool canPrioritizeAssets() const override {
        return run_.answer<bool>(run_.call("TransferService.canPrioritizeAssets", 0));
    }
    void prioritizeAsset(const SyncAsset& asset, PrioritizeCompletion completion) override {
        const RecordLine& line = run_.numberedCall("TransferService.prioritizeAsset", 0,
                                                   asset.identifier, asset.dataclass);
        run_.complete(ReplayRun::numberIn(line),
                      [&run = run_, completion = std::move(completion)](const RecordLine& heard) {
                          std::optional<ErrorRecord> error;
                          run.readAll(heard, heard.arguments, error);
                          if (completion) completion(error ? &*error : nullptr);
                      });
    }

  private:
    ReplayRun& run_;
};

class ReplayHost : public SyncHost {
  public:
    explicit ReplayHost(ReplayRun& run) : run_(run), transfers_(run) {}

    std::string mainBundleIdentifier() const override { return run_.session().process; }
    std::string pluginBundleIdentifier() const override { return run_.session().bundle; }
    bool isRecoverableError(const ErrorRecord& error) const override {
        return run_.answer<bool>(run_.call("SyncHost.isRecoverableError", 0, error));
    }
    TransferService* transferService() override {
        return run_.answer<bool>(run_.call("SyncHost.transferService", 0)) ? &transfers_ : nullptr;
    }

  private:
    ReplayRun& run_;
    ReplayTransfers transfers_;
};

/// A thing that only has a number.
template <typename Interface>
class ReplayThing : public Interface {
  public:
    explicit ReplayThing(std::uint64_t number) : number_(number) {}
    [[nodiscard]] static std::uint64_t numberOf(const Interface& thing) {
        return static_cast<const ReplayThing&>(thing).number_;
    }

  private:
    const std::uint64_t number_;
};

class ReplayLog : public LogFacility {
  public:
    explicit ReplayLog(ReplayRun& run) : run_(run) {}

    // Only a lack of memory throws here, and ends the command.
    // NOLINTNEXTLINE(bugprone-exception-escape)
    void write(const LogMessage& message) noexcept override {
        run_.call("LogFacility.write", 0, message.category, message.level,
                  PlainText{message.format},
                  MessageArguments{message.arguments, run_.session().bundle});
    }
    std::unique_ptr<LogHandle> makeHandle(std::string_view subsystem,
                                          std::string_view category) override {
        const RecordLine& line = run_.call("LogFacility.makeHandle", 0, subsystem, category);
        if (line.answer.is_null()) return nullptr;
        return std::make_unique<ReplayThing<LogHandle>>(run_.answer<std::uint64_t>(line));
    }

  private:
    ReplayRun& run_;
};

class ReplayProgress : public InstallProgressRecord {
  public:
    ReplayProgress(ReplayRun& run, std::uint64_t number) : run_(run), number_(number) {}
    [[nodiscard]] std::uint64_t number() const { return number_; }

    std::uint64_t installState() const override { return ask<std::uint64_t>("installState"); }
    void setInstallState(std::uint64_t state) override { tell("setInstallState", state); }
    std::uint64_t installPhase() const override { return ask<std::uint64_t>("installPhase"); }
    void setInstallPhase(std::uint64_t phase) override { tell("setInstallPhase", phase); }
    std::int64_t totalUnitCount() const override { return ask<std::int64_t>("totalUnitCount"); }
    void setTotalUnitCount(std::int64_t count) override { tell("setTotalUnitCount", count); }
    std::int64_t completedUnitCount() const override {
        return ask<std::int64_t>("completedUnitCount");
    }
    void setCompletedUnitCount(std::int64_t count) override {
        tell("setCompletedUnitCount", count);
    }
    void cancel() override { tell("cancel"); }
    std::string description() const override { return ask<std::string>("description"); }

  private:
    template <typename... Arguments>
    const RecordLine& tell(const char* method, const Arguments&... arguments) const {
        return run_.call(std::string("InstallProgressRecord.") + method, number_, arguments...);
    }
    template <typename Answer>
    Answer ask(const char* method) const {
        return run_.answer<Answer>(tell(method));
    }

    ReplayRun& run_;
    const std::uint64_t number_;
};

class ReplayRegistry : public AppRegistry {
  public:
    explicit ReplayRegistry(ReplayRun& run) : run_(run) {}

    std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                               Placeholders placeholders) override {
        return run_.answer<std::optional<AppProxy>>(
            run_.call("AppRegistry.proxyForIdentifier", 0, identifier, placeholders));
    }
    bool isApplicationInstalled(const std::string& identifier) override {
        return run_.answer<bool>(run_.call("AppRegistry.isApplicationInstalled", 0, identifier));
    }
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override {
        RecordText arguments = run_.newText();
        arguments.begin('[');
        arguments.add(type);
        arguments.end(']');
        run_.walk("AppRegistry.enumerateBundles", arguments, [&](const RecordLine& piece) {
            AppProxy proxy;
            run_.readAll(piece, piece.arguments, proxy);
            bool stop = false;
            callback(proxy, stop);
            return stop;
        });
    }
    std::shared_ptr<InstallProgressRecord> installProgress(const AppProxy& proxy,
                                                           std::uint64_t phase) override {
        const auto number = run_.answer<std::uint64_t>(run_.call("AppRegistry.installProgress", 0,
                                                                 proxy.applicationIdentifier,
                                                                 proxy.state.placeholder, phase));
        return number == 0 ? nullptr : std::make_shared<ReplayProgress>(run_, number);
    }
    void finishInstallPhase(InstallProgressRecord& record) override {
        run_.call("AppRegistry.finishInstallPhase", 0,
                  static_cast<const ReplayProgress&>(record).number());
    }
    Status installPackage(const FileURL& package, const PropertyList& options) override {
        return run_.answer<Status>(run_.call("AppRegistry.installPackage", 0, package, options));
    }
    Status installPlaceholderBundle(const FileURL& directory,
                                    const PropertyList& options) override {
        return run_.answer<Status>(
            run_.call("AppRegistry.installPlaceholderBundle", 0, directory, options));
    }
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override {
        return run_.answer<Status>(
            run_.call("AppRegistry.uninstallApplication", 0, identifier, options));
    }
    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override {
        const std::uint64_t number =
            ReplayRun::numberIn(run_.numberedCall("AppRegistry.addObserver", 0));
        numbers_[observer.lock().get()] = number;
        run_.listen(number, [this, observer = std::move(observer)](const RecordLine& line) {
            const std::shared_ptr<AppRegistryObserver> plugIn = observer.lock();
            if (plugIn != nullptr) hear(*plugIn, line);
        });
    }
    void removeObserver(const AppRegistryObserver* observer) override {
        const auto known = numbers_.extract(observer);
        run_.call("AppRegistry.removeObserver", 0, known ? known.mapped() : std::uint64_t{0});
    }

  private:
    void hear(AppRegistryObserver& observer, const RecordLine& line) {
        std::vector<AppProxy> first;
        std::vector<AppProxy> second;
        if (line.name == "AppRegistryObserver.applicationInstallsDidCancel") {
            run_.readAll(line, line.arguments, first);
            return observer.applicationInstallsDidCancel(first);
        }
        run_.readAll(line, line.arguments, first, second);
        observer.applicationInstallsArePrioritized(first, second);
    }

    ReplayRun& run_;
    std::map<const AppRegistryObserver*, std::uint64_t> numbers_;
};

class ReplayInstaller : public InstallerService {
  public:
    explicit ReplayInstaller(ReplayRun& run) : run_(run) {}

    std::optional<PropertyList> lookupUninstalled() override {
        return run_.answer<std::optional<PropertyList>>(
            run_.call("InstallerService.lookupUninstalled", 0));
    }
    bool clearUninstalled(std::span<const std::string> identifiers) override {
        return run_.answer<bool>(run_.call("InstallerService.clearUninstalled", 0, identifiers));
    }

  private:
    ReplayRun& run_;
};

class ReplayPolicy : public DevicePolicyService {
  public:
    explicit ReplayPolicy(ReplayRun& run) : run_(run) {}

    PolicyAnswer effectiveValue(PolicyFeature feature) override {
        return static_cast<PolicyAnswer>(
            run_.answer<int>(run_.call("DevicePolicyService.effectiveValue", 0, feature)));
    }

  private:
    ReplayRun& run_;
};

class ReplayBackupManager : public BackupManager {
  public:
    ReplayBackupManager(ReplayRun& run, std::uint64_t number) : run_(run), number_(number) {}

    bool restoreDataExists(const std::string& identifier) override {
        return run_.answer<bool>(run_.call("BackupManager.restoreDataExists", number_, identifier));
    }
    void cancelApplicationRestore(const std::string& identifier) override {
        run_.call("BackupManager.cancelApplicationRestore", number_, identifier);
    }

  private:
    ReplayRun& run_;
    const std::uint64_t number_;
};

class ReplayBackup : public BackupService {
  public:
    explicit ReplayBackup(ReplayRun& run) : run_(run) {}

    std::unique_ptr<BackupManager> makeManager() override {
        return std::make_unique<ReplayBackupManager>(
            run_, run_.answer<std::uint64_t>(run_.call("BackupService.makeManager", 0)));
    }

  private:
    ReplayRun& run_;
};

class ReplayConnection : public HomeScreenConnection {
  public:
    ReplayConnection(ReplayRun& run, std::uint64_t number) : run_(run), number_(number) {}

    bool setIconState(ByteView state) override {
        return run_.answer<bool>(run_.call("HomeScreenConnection.setIconState", number_, state));
    }
    std::optional<Bytes> flattenedIconState(std::uint64_t variant) override {
        return run_.answer<std::optional<Bytes>>(
            run_.call("HomeScreenConnection.flattenedIconState", number_, variant));
    }

  private:
    ReplayRun& run_;
    const std::uint64_t number_;
};

class ReplayAssertion : public TerminationAssertion {
  public:
    ReplayAssertion(ReplayRun& run, std::uint64_t number) : run_(run), number_(number) {}
    ReplayAssertion(const ReplayAssertion&) = delete;
    ReplayAssertion& operator=(const ReplayAssertion&) = delete;
    // Only a lack of memory throws here, and ends the command.
    // NOLINTNEXTLINE(bugprone-exception-escape)
    ~ReplayAssertion() override { run_.call("TerminationAssertion.release", number_); }

  private:
    ReplayRun& run_;
    const std::uint64_t number_;
};

class ReplayHomeScreen : public HomeScreenService {
  public:
    explicit ReplayHomeScreen(ReplayRun& run) : run_(run) {}

    std::shared_ptr<HomeScreenConnection> blockableConnection() override {
        const auto number =
            run_.answer<std::uint64_t>(run_.call("HomeScreenService.blockableConnection", 0));
        return number == 0 ? nullptr : std::make_shared<ReplayConnection>(run_, number);
    }
    TerminationAssertionResult takeTerminationAssertion(const std::string& identifier,
                                                        std::uint64_t reason) override {
        const RecordLine& line =
            run_.call("HomeScreenService.takeTerminationAssertion", 0, identifier, reason);
        TerminationAssertionResult result;
        std::uint64_t number = 0;
        run_.readAll(line, line.answer, result.outcome, number);
        if (number != 0) result.assertion = std::make_unique<ReplayAssertion>(run_, number);
        return result;
    }

  private:
    ReplayRun& run_;
};

class ReplayDestination : public ImageDestination {
  public:
    ReplayDestination(ReplayRun& run, std::uint64_t number, Bytes& buffer)
        : run_(run), number_(number), buffer_(buffer) {}

    void addImage(const IconImage& image) override {
        run_.call("ImageDestination.addImage", number_, ReplayThing<IconImage>::numberOf(image));
    }
    bool finalize() override {
        auto written =
            run_.answer<std::optional<Bytes>>(run_.call("ImageDestination.finalize", number_));
        if (!written) return false;
        buffer_ = *std::move(written);
        return true;
    }

  private:
    ReplayRun& run_;
    const std::uint64_t number_;
    Bytes& buffer_;
};

class ReplayIcons : public IconRenderer {
  public:
    explicit ReplayIcons(ReplayRun& run) : run_(run) {}

    std::unique_ptr<AppBundle> openBundle(const FileURL& url) override {
        const auto number =
            run_.answer<std::uint64_t>(run_.call("IconRenderer.openBundle", 0, url));
        return number == 0 ? nullptr : std::make_unique<ReplayThing<AppBundle>>(number);
    }
    std::unique_ptr<IconImage> homeScreenIcon(const AppBundle& bundle) override {
        const auto number = run_.answer<std::uint64_t>(
            run_.call("IconRenderer.homeScreenIcon", 0, ReplayThing<AppBundle>::numberOf(bundle)));
        return number == 0 ? nullptr : std::make_unique<ReplayThing<IconImage>>(number);
    }
    std::unique_ptr<ImageDestination> createImageDestination(std::string_view typeIdentifier,
                                                             std::size_t imageCount,
                                                             Bytes& buffer) override {
        const auto number = run_.answer<std::uint64_t>(
            run_.call("IconRenderer.createImageDestination", 0, typeIdentifier, imageCount));
        return number == 0 ? nullptr : std::make_unique<ReplayDestination>(run_, number, buffer);
    }

  private:
    ReplayRun& run_;
};

class ReplayTransactions : public InstallTransactionLog {
  public:
    explicit ReplayTransactions(ReplayRun& run) : run_(run) {}

    void initialize(const LogHandle& handle) override {
        run_.call("InstallTransactionLog.initialize", 0, ReplayThing<LogHandle>::numberOf(handle));
    }
    void logStep(std::uint64_t kind, std::uint64_t party, std::uint64_t phase, bool success,
                 std::string_view identifier, std::string_view description) override {
        run_.call("InstallTransactionLog.logStep", 0, kind, party, phase, success, identifier,
                  description);
    }
    void logScenario(std::string_view scenario, std::uint64_t step, bool success,
                     std::string_view identifier, std::string_view description) override {
        run_.call("InstallTransactionLog.logScenario", 0, scenario, step, success, identifier,
                  description);
    }

  private:
    ReplayRun& run_;
};

class ReplayFiles : public FileSystem {
  public:
    explicit ReplayFiles(ReplayRun& run) : run_(run) {}

    bool itemExists(const std::string& path) override {
        return run_.answer<bool>(run_.call("FileSystem.itemExists", 0, path));
    }
    Result<ItemAttributes> attributes(const std::string& path) override {
        const RecordLine& line = run_.call("FileSystem.attributes", 0, path);
        Result<ItemAttributes> attributes = ItemAttributes();
        readResult(line, attributes);
        return attributes;
    }
    Status createDirectory(const std::string& path, bool withIntermediates,
                           const FileAttributes* attributes) override {
        return run_.answer<Status>(
            run_.call("FileSystem.createDirectory", 0, path, withIntermediates, attributes));
    }
    Status removeItem(const std::string& path) override {
        return run_.answer<Status>(run_.call("FileSystem.removeItem", 0, path));
    }
    Status moveItem(const std::string& from, const std::string& to) override {
        return run_.answer<Status>(run_.call("FileSystem.moveItem", 0, from, to));
    }
    Status copyItem(const std::string& from, const std::string& to) override {
        return run_.answer<Status>(run_.call("FileSystem.copyItem", 0, from, to));
    }
    Result<Bytes> readFile(const std::string& path) override {
        const RecordLine& line = run_.call("FileSystem.readFile", 0, path);
        Result<Bytes> bytes = Bytes();
        readResult(line, bytes);
        return bytes;
    }
    Status writeFileAtomically(const std::string& path, ByteView contents) override {
        return run_.answer<Status>(run_.call("FileSystem.writeFileAtomically", 0, path, contents));
    }
    Status createFile(const std::string& path, ByteView contents,
                      const FileAttributes& attributes) override {
        return run_.answer<Status>(
            run_.call("FileSystem.createFile", 0, path, contents, attributes));
    }
    Status setTimesToNow(const std::string& path) override {
        return run_.answer<Status>(run_.call("FileSystem.setTimesToNow", 0, path));
    }
    std::string temporaryDirectory() override {
        return run_.answer<std::string>(run_.call("FileSystem.temporaryDirectory", 0));
    }

  private:
    template <typename Value>
    void readResult(const RecordLine& line, Result<Value>& result) {
        if (!run_.values().read(line.answer, result)) run_.giveUp(line, "its answer is none");
    }

    ReplayRun& run_;
};

/// What the recording says was refused is refused; everything else is read and written again.
class ReplayPropertyLists : public PropertyListSerialization {
  public:
    explicit ReplayPropertyLists(ReplayRun& run) : run_(run) {}

    Result<PropertyList> parse(ByteView bytes) override {
        const Status recorded =
            run_.answer<Status>(run_.call("PropertyListSerialization.parse", 0, bytes.size()));
        if (!recorded) return recorded.error();
        return codec_.parse(bytes);
    }
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        const Status recorded =
            run_.answer<Status>(run_.call("PropertyListSerialization.serialize", 0, format));
        if (!recorded) return recorded.error();
        return codec_.serialize(value, format);
    }
    bool replaceText(Bytes& bytes, std::size_t index, std::string_view key,
                     std::string_view text) override {
        const bool isReplaced = run_.answer<bool>(
            run_.call("PropertyListSerialization.replaceText", 0, bytes.size(), index, key, text));
        return isReplaced && codec_.replaceText(bytes, index, key, text);
    }

  private:
    ReplayRun& run_;
    SystemPropertyLists codec_;
};

class ReplayNotifications : public NamedNotifications {
  public:
    explicit ReplayNotifications(ReplayRun& run) : run_(run) {}

    Registration registerForState(std::string_view name) override {
        const RecordLine& line = run_.call("NamedNotifications.registerForState", 0, name);
        Registration registration;
        run_.readAll(line, line.answer, registration.status, registration.token);
        return registration;
    }
    void setState(int token, std::uint64_t state) override {
        run_.call("NamedNotifications.setState", 0, token, state);
    }
    void post(std::string_view name) override { run_.call("NamedNotifications.post", 0, name); }

  private:
    ReplayRun& run_;
};

class ReplayNotificationCenter : public NotificationCenter {
  public:
    explicit ReplayNotificationCenter(ReplayRun& run) : run_(run) {}

    void addObserver(std::weak_ptr<void> observer, std::string_view name, Callback callback,
                     SuspensionBehavior) override {
        const std::uint64_t number =
            ReplayRun::numberIn(run_.numberedCall("NotificationCenter.addObserver", 0, name));
        numbers_[{observer.lock().get(), std::string(name)}] = number;
        run_.listen(number, [observer = std::move(observer), callback](const RecordLine&) {
            callback(observer.lock().get());
        });
    }
    void removeObserver(const void* observer, std::string_view name) override {
        const auto known = numbers_.extract({observer, std::string(name)});
        run_.call("NotificationCenter.removeObserver", 0, name,
                  known ? known.mapped() : std::uint64_t{0});
    }
    void post(std::string_view) override {}

  private:
    ReplayRun& run_;
    std::map<std::pair<const void*, std::string>, std::uint64_t> numbers_;
};

}  // namespace

struct ReplayServices::All {
    explicit All(ReplayRun& run)
        : host(run),
          log(run),
          registry(run),
          installer(run),
          coordination(run),
          policy(run),
          backup(run),
          homeScreen(run),
          icons(run),
          transactions(run),
          queues(run),
          files(run),
          propertyLists(run),
          notifications(run),
          notificationCenter(run) {}

    ReplayHost host;
    ReplayLog log;
    ReplayRegistry registry;
    ReplayInstaller installer;
    ReplayCoordination coordination;
    ReplayPolicy policy;
    ReplayBackup backup;
    ReplayHomeScreen homeScreen;
    ReplayIcons icons;
    ReplayTransactions transactions;
    ReplayQueues queues;
    ReplayFiles files;
    ReplayPropertyLists propertyLists;
    ReplayNotifications notifications;
    ReplayNotificationCenter notificationCenter;
    const Platform platform{host,   log,    registry,      installer,     coordination,
                            policy, backup, homeScreen,    icons,         transactions,
                            queues, files,  propertyLists, notifications, notificationCenter};
};

ReplayServices::ReplayServices(ReplayRun& run) : all_(std::make_unique<All>(run)) {}

ReplayServices::~ReplayServices() = default;

const Platform& ReplayServices::platform() const { return all_->platform; }

}  // namespace appsync
