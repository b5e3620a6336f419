#pragma once

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/AppRegistry.h"
#include "simulation/recording/Recorder.h"
#include "simulation/services/SimulatedProgressRecord.h"

namespace appsync {

class PropertyListSerialization;
class SimulatedFileSystem;

/// The registry in memory: applications, placeholders and progress records behave as the contract
/// says; what a package holds, and what fails, is the test's to say.
///
/// A placeholder that is installed starts an install with a progress record (waiting, loading); it
/// ends when the package is installed, the placeholder is uninstalled, or it is cancelled.
/// Observers are called by tasks named "registry", one at a time for each observer; several changes
/// that one has not heard of yet make one report.
///
/// The methods below the interface are the test's: they are not recorded.
class SimulatedAppRegistry : public AppRegistry {
  public:
    struct PackageContents {
        std::string version;
        std::string displayName;
    };

    /// `codec` reads the Info.plist of placeholder bundles. All are only borrowed.
    SimulatedAppRegistry(Recorder& recorder, SimulatedFileSystem& files,
                         PropertyListSerialization& codec);
    ~SimulatedAppRegistry() override;

    [[nodiscard]] std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                                             Placeholders placeholders) override;
    [[nodiscard]] bool isApplicationInstalled(const std::string& identifier) override;
    void enumerateBundles(BundleType type, const ProxyCallback& callback) override;
    [[nodiscard]] std::shared_ptr<InstallProgressRecord> installProgress(
        const AppProxy& proxy, std::uint64_t phase) override;
    void finishInstallPhase(InstallProgressRecord& record) override;
    Status installPackage(const FileURL& package, const PropertyList& options) override;
    Status installPlaceholderBundle(const FileURL& directory, const PropertyList& options) override;
    Status uninstallApplication(const std::string& identifier,
                                const PropertyList& options) override;
    void addObserver(std::weak_ptr<AppRegistryObserver> observer) override;
    void removeObserver(const AppRegistryObserver* observer) override;

    // What is on the device.
    /// A user application that is installed, with the usual paths.
    void addApplication(const std::string& identifier, const std::string& version = "1.0");
    /// A placeholder of an install type, with the usual paths and a progress record.
    void addPlaceholder(const std::string& identifier, std::uint64_t installType,
                        const std::string& version = "1.0");
    /// Exactly this record: it is a placeholder's when its state says so. Without a progress
    /// record.
    void add(AppProxy proxy);
    /// What the package of this identifier will turn out to hold; at first version "1.0", named as
    /// the placeholder or the identifier. A package file that is a property list says it itself, by
    /// the keys of an info dictionary, and is refused when it is another identifier's; any other
    /// bytes do.
    void setPackage(const std::string& identifier, const std::string& version,
                    const std::string& displayName);
    /// Gives the application or placeholder a progress record with these values.
    void setProgress(const std::string& identifier, const SimulatedProgressRecord::Values& values);
    void removeProgress(const std::string& identifier);

    // What the test looks at.
    [[nodiscard]] std::optional<AppProxy> installed(const std::string& identifier) const;
    [[nodiscard]] std::optional<AppProxy> placeholder(const std::string& identifier) const;
    /// The options with which a placeholder of the identifier was last installed; null when none.
    [[nodiscard]] PropertyList placeholderOptions(const std::string& identifier) const;
    /// The values of the progress record; nothing when no install is under way.
    [[nodiscard]] std::optional<SimulatedProgressRecord::Values> progress(
        const std::string& identifier) const;
    /// The identifiers, sorted.
    [[nodiscard]] std::vector<std::string> installedIdentifiers() const;
    [[nodiscard]] std::vector<std::string> placeholderIdentifiers() const;
    [[nodiscard]] std::size_t observers() const { return subscriptions_.size(); }

    // What other services of the device do with it.
    /// Installs the file at a path as the package of the identifier; fails as `installPackage`
    /// does. Who calls it says that something has changed.
    Status install(const std::string& identifier, const std::string& path);
    /// Shows the placeholder with the usual paths, and says how long that lasts; fails as
    /// `failNextPlaceholderInstall` says.
    Result<Persistence> showPlaceholder(AppProxy proxy);
    /// Takes away the placeholder, if there is one: its install was cancelled or has failed.
    void hidePlaceholder(const std::string& identifier);
    /// Fails as `uninstallApplication` does.
    Status uninstall(const std::string& identifier);

    // Crashes.
    /// What the registry has written down of an identifier.
    struct Record {
        std::optional<AppProxy> installed;
        std::optional<AppProxy> placeholder;
        std::optional<SimulatedProgressRecord::Values> progress;
        std::uint64_t installNumber = 0;
        /// A loss of power may take the placeholder's files.
        bool isUnsynced = false;
    };
    struct Records {
        std::map<std::string, Record> applications;
        std::map<std::string, PackageContents> packages;
    };
    [[nodiscard]] Records records() const;
    /// Takes records over as the registry does when it is started: those whose files are gone go,
    /// and so do files without a record, and placeholders whose files were not synced before power
    /// was lost; nothing is at work on an install.
    void reopen(const Records& records, bool powerWasLost);

    // Answers. Each identifier's failures are used up one by one, in the order given.
    void failNextInstall(const std::string& identifier, ErrorRecord error);
    void failNextPlaceholderInstall(const std::string& identifier, ErrorRecord error);
    void failNextUninstall(const std::string& identifier, ErrorRecord error);
    /// How much virtual time installing a package takes; none at first.
    void setInstallDuration(SimulatedTime duration) { installDuration_ = duration; }
    /// From now on this is what reports say, whatever the registry holds; observers hear at once.
    void setReport(std::vector<AppProxy> prioritized, std::vector<AppProxy> paused);
    /// While withheld, no report is delivered. Reports that were withheld come as one afterwards.
    void withholdReports(bool withheld);
    /// Somebody cancels these installs: their records become cancelled, and the observers hear of
    /// it by `applicationInstallsDidCancel`. (What the plug-in cancels itself it is not told.)
    void cancelInstalls(const std::vector<std::string>& identifiers);

  private:
    struct Application {
        bool isUnsynced = false;  // of the placeholder
        std::optional<AppProxy> installed;
        std::optional<AppProxy> placeholder;
        PropertyList placeholderOptions{};
        std::shared_ptr<SimulatedProgressRecord> progress;
        std::uint64_t installNumber = 0;  // of the install that `progress` is of
    };
    struct Report {
        std::vector<AppProxy> prioritized;
        std::vector<AppProxy> paused;
    };
    struct Subscription;
    using Failures = std::map<std::string, std::deque<ErrorRecord>>;

    [[nodiscard]] Application* find(const std::string& identifier);
    [[nodiscard]] const Application* find(const std::string& identifier) const;
    [[nodiscard]] static const AppProxy& preferred(const Application& application);
    [[nodiscard]] std::vector<AppProxy> bundles(BundleType type) const;
    [[nodiscard]] Status installPackageNow(const FileURL& package, const PropertyList& options);
    [[nodiscard]] Status installPlaceholderNow(const FileURL& directory,
                                               const PropertyList& options);
    [[nodiscard]] Status uninstallNow(const std::string& identifier, const PropertyList& options);
    [[nodiscard]] Status checkPackage(const std::string& identifier, const std::string& path);
    void markFailed(const std::string& identifier);
    void commitPackage(const std::string& identifier, const std::string& path);
    void removePlaceholder(Application& application, std::uint64_t finalState);
    void startProgress(const std::string& identifier, Application& application);
    void endProgress(Application& application, std::uint64_t state);
    void dropIfEmpty(const std::string& identifier);
    [[nodiscard]] bool hasContainer(const std::optional<AppProxy>& proxy) const;
    void removeStrayContainers();
    [[nodiscard]] Persistence beginPlaceholder(const std::string& identifier, AppProxy proxy);
    [[nodiscard]] Status describeFromBundle(const std::string& directory, AppProxy& proxy) const;
    [[nodiscard]] Report report() const;
    void reportChange();
    void reportCancel(const std::vector<AppProxy>& cancelled);
    void enqueue(const std::shared_ptr<Subscription>& subscription);
    void deliver(const std::shared_ptr<Subscription>& subscription);
    void deliverReport(Subscription& subscription, AppRegistryObserver& observer) const;
    void deliverCancel(Subscription& subscription, AppRegistryObserver& observer) const;
    [[nodiscard]] static Status takeFailure(Failures& failures, const std::string& identifier);

    Recorder& recorder_;
    SimulatedFileSystem& files_;
    PropertyListSerialization& codec_;
    std::map<std::string, Application> applications_;
    std::map<std::uint64_t, std::string> installs_;  // those under way, by their numbers
    std::uint64_t installsBegun_ = 0;
    std::map<std::string, PackageContents> packages_;
    Failures installFailures_;
    Failures placeholderFailures_;
    Failures uninstallFailures_;
    SimulatedTime installDuration_{0};
    std::optional<Report> scriptedReport_;
    bool reportsWithheld_ = false;
    std::vector<std::shared_ptr<Subscription>> subscriptions_;
};

}  // namespace appsync
