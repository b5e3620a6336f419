#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileURL.h"
#include "platform/InstallProgressRecord.h"
#include "platform/Result.h"

namespace appsync {

/// Keys of a bundle's info dictionary.
inline constexpr std::string_view BundleIdentifierKey = "BundleIdentifier";
inline constexpr std::string_view BundleVersionKey = "BundleVersion";
inline constexpr std::string_view BundleDisplayNameKey = "BundleDisplayName";
inline constexpr std::string_view BundleExecutableKey = "BundleExecutable";
inline constexpr std::string_view BundleIconFileKey = "BundleIconFile";

/// The "phase" of the progress record of a whole install, the only one that the plug-in asks for.
/// It is no `InstallPhase`, although it has the number of one.
inline constexpr std::uint64_t kWholeInstall = 0;

/// Keys of install options. `BundleIdentifierKey` and "RGInstallType" (unsigned integer) are
/// options too.
inline constexpr std::string_view PackageTypeKey = "PackageType";
inline constexpr std::string_view StoreMetadataKey = "StoreMetadata";  // data
inline constexpr std::string_view AppSinfKey = "ApplicationSINF";      // data, or the null marker
inline constexpr std::string_view InstallTypeKey = "RGInstallType";

/// Values of `PackageTypeKey`.
inline constexpr std::string_view PackageTypeCustomer = "Customer";
inline constexpr std::string_view PackageTypePlaceholder = "Placeholder";

/// Option of an uninstall (boolean): remove the application's placeholder and nothing else.
inline constexpr std::string_view UninstallPlaceholderOnlyKey = "PlaceholderOnly";

/// Values of an AppProxy's application type.
inline constexpr std::string_view kApplicationTypeUser = "User";
inline constexpr std::string_view kApplicationTypeSystem = "System";

/// What a record stands for: exactly one of the two. That of a placeholder is never `installed`,
/// also where it covers an installed application.
struct ApplicationState {
    bool installed = false;
    bool placeholder = false;
};

/// The registry's record of one installed application or of one placeholder, as it was when asked
/// for. An update under way has both: the installed application, and the placeholder that covers
/// it.
struct AppProxy {
    std::string applicationIdentifier;
    std::optional<std::string> bundleVersion;
    std::optional<std::string> displayName;
    /// The directory `<Name>.app`, an absolute device path.
    std::string bundlePath;
    /// The directory that holds the bundle and the store metadata file.
    std::string bundleContainerPath;
    /// "User" or "System".
    std::string applicationType{kApplicationTypeUser};
    /// How it came: an `InstallType`.
    std::uint64_t installType = 0;
    ApplicationState state;
    /// Bytes that the bundle takes on disk.
    std::uint64_t staticDiskUsage = 0;
};

/// Hears from the registry, on a thread of the registry's, one call at a time for one observer.
/// It may call the registry and remove itself meanwhile, so a registry holds no lock when it calls.
class AppRegistryObserver {
  public:
    virtual ~AppRegistryObserver() = default;

    /// `applicationInstallsArePrioritized:arePaused:`: the installs under way, in two lists: the
    /// paused ones (their record's state is 2), and all others, in no particular order. An install
    /// is under way from the moment when its placeholder stands until its package is installed, has
    /// failed or was cancelled, or the placeholder is gone. Comes once soon after the observer was
    /// added, also when both lists are empty, never on the thread that added it before
    /// `addObserver` has returned; then again whenever the lists change, which several changes may
    /// share. The placeholder of a demoted application (`InstallType` 7, 8) awaits no install.
    virtual void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                                   const std::vector<AppProxy>& paused) = 0;

    /// `applicationInstallsDidCancel:`: somebody on the device cancelled these installs. What the
    /// plug-in itself cancels (`InstallProgressRecord::cancel`) need not be told.
    virtual void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) = 0;
};

/// The device's book of installed applications and placeholders.
///
/// Callable on any thread, by several at once. Nothing throws. What it changes, it changes whole:
/// after a crash each application is there as before the call or as after it. It refuses
/// identifiers that are not legal (1 to 255 bytes of letters, digits, '.', '-', '_'; not "." or
/// "..") with an error of `kRegistryErrorDomain`; for errors that a package causes see
/// `kInstallerErrorDomain`.
class AppRegistry {
  public:
    /// Whether a look-up may answer with a placeholder.
    enum class Placeholders { Excluded, Included };
    /// Which bundles to walk: the numbers are the registry's.
    enum BundleType : unsigned {
        kEveryBundle = 0,    // every application and placeholder
        kUserBundles = 1,    // every user application and user placeholder
        kSystemBundles = 7,  // system applications and their placeholders
    };
    /// Gets each proxy in turn; sets `stop` to end the walk.
    using ProxyCallback = std::function<void(const AppProxy& proxy, bool& stop)>;

    virtual ~AppRegistry() = default;

    /// The record of an identifier. With placeholders included, one that covers an installed
    /// application is preferred to it; without, only installed applications are looked at.
    [[nodiscard]] virtual std::optional<AppProxy> proxyForIdentifier(const std::string& identifier,
                                                                     Placeholders placeholders) = 0;

    /// Whether there is anything under the identifier: an application or a placeholder.
    [[nodiscard]] virtual bool isApplicationInstalled(const std::string& identifier) = 0;

    /// Calls back, on the calling thread and before it returns, once for each record of the type,
    /// in no particular order. The callback may call the registry, and change what it walks.
    virtual void enumerateBundles(BundleType type, const ProxyCallback& callback) = 0;

    /// The install-progress record of an application or placeholder, fetched synchronously; null
    /// when no install is under way for it. `phase` is `kWholeInstall`. An install begins
    /// waiting (0) or active (1), in the phase loading (0), with nothing completed; what its total
    /// is then is the registry's choice.
    [[nodiscard]] virtual std::shared_ptr<InstallProgressRecord> installProgress(
        const AppProxy& proxy, std::uint64_t phase) = 0;

    /// Ends the install phase that the record is in: loading is over, installing begins.
    virtual void finishInstallPhase(InstallProgressRecord& record) = 0;

    /// Installs a package. `options` is a map: `PackageTypeKey` = `PackageTypeCustomer` (any other
    /// is refused), `BundleIdentifierKey` = the identifier that the package must have. Replaces an
    /// installed version and takes the placeholder away; on failure both are as before. The file is
    /// only read: the plug-in removes it afterwards. An error when there is no package at the path.
    virtual Status installPackage(const FileURL& package, const PropertyList& options) = 0;

    /// Installs a directory as a placeholder; the registry takes its own copy, and leaves the
    /// directory to whoever made it. `options` is a map: `PackageTypeKey` =
    /// `PackageTypePlaceholder` (any other is refused), `BundleIdentifierKey`, `InstallTypeKey`,
    /// and optionally `StoreMetadataKey` and `AppSinfKey`. The store metadata comes to stand in the
    /// placeholder's container, as "VessikMetadata.plist". An error when there is no bundle at the
    /// path. An installed application that the placeholder covers stays usable; a placeholder that
    /// stands already is replaced, and its install begins anew, with a new record.
    virtual Status installPlaceholderBundle(const FileURL& directory,
                                            const PropertyList& options) = 0;

    /// Uninstalls. `options` is a map or null (no options). The placeholder goes first: where one
    /// covers an installed application, it alone is removed. With `UninstallPlaceholderOnlyKey`
    /// true the application is never touched. What is removed goes with its container. An error
    /// when there is nothing to remove.
    ///
    /// The plug-in calls it without options after each direct install that failed, to take the
    /// placeholder away. Where a package comes that nobody asked for, no placeholder covers the
    /// installed version: a registry that does not want to lose that with a failed update tells
    /// this call from a removal, as it comes from the operation queue right after the refused
    /// `installPackage` of the same identifier.
    virtual Status uninstallApplication(const std::string& identifier,
                                        const PropertyList& options) = 0;

    /// From now on the observer hears. It is held weakly; while it is being called it is kept
    /// alive, so that the last of it may go on the registry's thread.
    virtual void addObserver(std::weak_ptr<AppRegistryObserver> observer) = 0;
    /// No call begins after this one has returned. Known by its address: it may be called from the
    /// observer's destructor. Nothing happens where it observes no more: it may be removed twice.
    virtual void removeObserver(const AppRegistryObserver* observer) = 0;
};

}  // namespace appsync
