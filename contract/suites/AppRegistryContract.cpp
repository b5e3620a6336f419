#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "contract/DeviceContract.h"
#include "contract/suites/Applications.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class AppRegistryContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(AppRegistryContract, devicePorts());

TEST_P(AppRegistryContract, AnEmptyDeviceKnowsNothing) {
    checks("platform/AppRegistry.h",
           "Whether there is anything under the identifier: an application or a placeholder.");
    EXPECT_FALSE(application(kA));
    EXPECT_FALSE(preferred(kA));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
}

TEST_P(AppRegistryContract, APackageBecomesAnApplication) {
    checks("platform/AppRegistry.h", "What a record stands for: exactly one of the two.");
    ASSERT_TRUE(installPackage({kA, "2.5", "Atlas"}));
    const std::optional<AppProxy> proxy = application(kA);
    ASSERT_TRUE(proxy);
    EXPECT_EQ(proxy->applicationIdentifier, kA);
    EXPECT_EQ(proxy->bundleVersion, "2.5");
    EXPECT_EQ(proxy->displayName, "Atlas");
    EXPECT_EQ(proxy->applicationType, kApplicationTypeUser);
    EXPECT_TRUE(proxy->state.installed);
    EXPECT_FALSE(proxy->state.placeholder);
}

TEST_P(AppRegistryContract, TheBundleStandsInItsContainer) {
    checks("platform/AppRegistry.h",
           "The directory that holds the bundle and the store metadata file.");
    ASSERT_TRUE(installPackage({kA}));
    const std::optional<AppProxy> proxy = application(kA);
    ASSERT_TRUE(proxy);
    EXPECT_TRUE(proxy->bundlePath.starts_with(proxy->bundleContainerPath + "/"));
    EXPECT_TRUE(services_.files.attributes(proxy->bundlePath)->isDirectory);
}

TEST_P(AppRegistryContract, ThePackageIsOnlyRead) {
    checks("platform/AppRegistry.h", "The file is only read: the plug-in removes it afterwards.");
    const std::string path = device_->addPackage({kA});
    const Bytes before = *services_.files.readFile(path);
    ASSERT_TRUE(installFrom(path, kA));
    EXPECT_EQ(*services_.files.readFile(path), before);
}

TEST_P(AppRegistryContract, AnUpdateReplacesTheVersion) {
    checks("platform/AppRegistry.h",
           "Replaces an installed version and takes the placeholder away; on failure both are as "
           "before.");
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    ASSERT_TRUE(installPackage({kA, "2.0"}));
    EXPECT_EQ(application(kA).value().bundleVersion, "2.0");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(AppRegistryContract, APackageOfAnotherIdentifierIsRefused) {
    checks("platform/AppRegistry.h",
           "`BundleIdentifierKey` = the identifier that the package must have.");
    const Status status = installFrom(device_->addPackage({kA}), kB);
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().domain, kInstallerErrorDomain);
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
}

TEST_P(AppRegistryContract, AMissingPackageIsRefused) {
    checks("platform/AppRegistry.h", "An error when there is no package at the path.");
    EXPECT_FALSE(installFrom("/var/mobile/missing.zip", kA));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
}

TEST_P(AppRegistryContract, IllegalIdentifiersAreRefused) {
    checks("platform/AppRegistry.h",
           "It refuses identifiers that are not legal (1 to 255 bytes of letters, digits, '.', "
           "'-', '_'; not \".\" or \"..\") with an error of `kRegistryErrorDomain`;");
    using std::string_literals::operator""s;
    const std::string package = device_->addPackage({kA});
    const std::string bundle = addPlaceholderBundle({kA});
    for (const std::string& identifier :
         {""s, "."s, ".."s, "a/b"s, "a b"s, "a\0b"s, "a\nb"s, "\u00e4"s, std::string(256, 'x')}) {
        const Status installed = installFrom(package, identifier);
        ASSERT_FALSE(installed);
        EXPECT_EQ(installed.error().domain, kRegistryErrorDomain);
        const Status placed =
            registry_.installPlaceholderBundle(FileURL::fromPath(bundle, true).value(),
                                               placeholderOptions(identifier, kInstallTypeSync));
        ASSERT_FALSE(placed);
        EXPECT_EQ(placed.error().domain, kRegistryErrorDomain);
        const Status removed = registry_.uninstallApplication(identifier, {});
        ASSERT_FALSE(removed);
        EXPECT_EQ(removed.error().domain, kRegistryErrorDomain);
        EXPECT_FALSE(registry_.isApplicationInstalled(identifier));
    }
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
}

TEST_P(AppRegistryContract, WhatIsNotThereIsNotRemoved) {
    checks("platform/AppRegistry.h", "An error when there is nothing to remove.");
    const std::string identifier(255, 'x');
    EXPECT_FALSE(registry_.uninstallApplication(identifier, {}));
    EXPECT_FALSE(registry_.isApplicationInstalled(identifier));
}

TEST_P(AppRegistryContract, OptionsOfAnotherKindAreRefused) {
    checks("platform/AppRegistry.h",
           "`options` is a map: `PackageTypeKey` = `PackageTypeCustomer` (any other is refused),");
    const FileURL package = FileURL::fromPath(device_->addPackage({kA}), false).value();
    EXPECT_FALSE(registry_.installPackage(package, {}));
    EXPECT_FALSE(registry_.installPackage(package, PropertyList::map()));
    EXPECT_FALSE(registry_.installPackage(package, placeholderOptions(kA, kInstallTypeSync)));
    const PropertyList nameless = PropertyList::map({{PackageTypeKey, PackageTypeCustomer}});
    EXPECT_FALSE(registry_.installPackage(package, nameless));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
}

TEST_P(AppRegistryContract, APlaceholderIsOnlySeenByThoseWhoAskForIt) {
    checks("platform/AppRegistry.h",
           "With placeholders included, one that covers an installed application is preferred to "
           "it; without, only installed applications are looked at.");
    ASSERT_TRUE(installPlaceholder({kA, "2.5", "Atlas"}, kInstallTypeSync));
    EXPECT_FALSE(application(kA));
    EXPECT_TRUE(registry_.isApplicationInstalled(kA));
    const std::optional<AppProxy> proxy = preferred(kA);
    ASSERT_TRUE(proxy);
    EXPECT_TRUE(proxy->state.placeholder);
    EXPECT_FALSE(proxy->state.installed);
    EXPECT_EQ(proxy->installType, std::uint64_t{kInstallTypeSync});
    EXPECT_EQ(proxy->bundleVersion, "2.5");
    EXPECT_EQ(proxy->displayName, "Atlas");
    EXPECT_THAT(bundles(AppRegistry::kUserBundles), ElementsAre("com.example.a (placeholder)"));
}

TEST_P(AppRegistryContract, APlaceholderIsACopy) {
    checks("platform/AppRegistry.h",
           "Installs a directory as a placeholder; the registry takes its own copy, and leaves the "
           "directory to whoever made it.");
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));  // removes what was copied
    EXPECT_TRUE(services_.files.itemExists(preferred(kA).value().bundlePath + "/Info.plist"));
}

TEST_P(AppRegistryContract, StoreMetadataAndSinfMayComeWithAPlaceholder) {
    checks("platform/AppRegistry.h",
           "`BundleIdentifierKey`, `InstallTypeKey`, and optionally `StoreMetadataKey` and "
           "`AppSinfKey`.");
    const std::string path = addPlaceholderBundle({kA});
    PropertyList options = placeholderOptions(kA, kInstallTypeRestore);
    options.set(StoreMetadataKey, Bytes{1, 2, 3});
    options.set(AppSinfKey, PropertyList());
    EXPECT_TRUE(registry_.installPlaceholderBundle(FileURL::fromPath(path, true).value(), options));
    EXPECT_EQ(preferred(kA).value().installType, std::uint64_t{kInstallTypeRestore});
}

TEST_P(AppRegistryContract, StoreMetadataComesToStandInTheContainer) {
    checks("platform/AppRegistry.h",
           "The store metadata comes to stand in the placeholder's container, as "
           "\"VessikMetadata.plist\".");
    const Result<Bytes> metadata = services_.propertyLists.serialize(
        PropertyList::map({{"title", "Atlas"}}), PropertyListFormat::Binary);
    ASSERT_TRUE(metadata);
    const std::string path = addPlaceholderBundle({kA});
    PropertyList options = placeholderOptions(kA, kInstallTypeRestore);
    options.set(StoreMetadataKey, *metadata);
    ASSERT_TRUE(registry_.installPlaceholderBundle(FileURL::fromPath(path, true).value(), options));
    const Result<Bytes> written = services_.files.readFile(
        preferred(kA).value().bundleContainerPath + "/VessikMetadata.plist");
    ASSERT_TRUE(written) << written.error().description();
    EXPECT_EQ(*written, *metadata);
}

TEST_P(AppRegistryContract, ABundleTakesRoomOnDisk) {
    checks("platform/AppRegistry.h", "Bytes that the bundle takes on disk.");
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_GT(application(kA).value().staticDiskUsage, 0U);
}

TEST_P(AppRegistryContract, AMissingPlaceholderBundleIsRefused) {
    checks("platform/AppRegistry.h", "An error when there is no bundle at the path.");
    EXPECT_FALSE(registry_.installPlaceholderBundle(
        FileURL::fromPath("/var/mobile/missing.app", true).value(),
        placeholderOptions(kA, kInstallTypeSync)));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
}

TEST_P(AppRegistryContract, APlaceholderCoversTheApplication) {
    checks("platform/AppRegistry.h",
           "An installed application that the placeholder covers stays usable;");
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    ASSERT_TRUE(installPlaceholder({kA, "2.0"}, kInstallTypeSync));
    EXPECT_EQ(application(kA).value().bundleVersion, "1.0");
    EXPECT_EQ(preferred(kA).value().bundleVersion, "2.0");
    EXPECT_TRUE(services_.files.itemExists(application(kA).value().bundlePath));
    checks("platform/AppRegistry.h",
           "An update under way has both: the installed application, and the placeholder that "
           "covers it.");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA, "com.example.a (placeholder)"));
}

TEST_P(AppRegistryContract, InstallingThePackageTakesThePlaceholderAway) {
    checks("platform/AppRegistry.h",
           "Replaces an installed version and takes the placeholder away; on failure both are as "
           "before.");
    ASSERT_TRUE(installPlaceholder({kA, "2.0"}, kInstallTypeSync));
    ASSERT_TRUE(installPackage({kA, "2.0"}));
    EXPECT_TRUE(preferred(kA).value().state.installed);
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(AppRegistryContract, AFailedInstallLeavesBothAsTheyWere) {
    checks("platform/AppRegistry.h",
           "Replaces an installed version and takes the placeholder away; on failure both are as "
           "before.");
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    ASSERT_TRUE(installPlaceholder({kA, "2.0"}, kInstallTypeSync));
    EXPECT_FALSE(installFrom(device_->addPackage({kB}), kA));
    EXPECT_EQ(application(kA).value().bundleVersion, "1.0");
    EXPECT_EQ(preferred(kA).value().bundleVersion, "2.0");
    EXPECT_NE(progress(kA), nullptr);
}

TEST_P(AppRegistryContract, UninstallingTakesThePlaceholderFirst) {
    checks("platform/AppRegistry.h",
           "The placeholder goes first: where one covers an installed application, it alone is "
           "removed.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    EXPECT_TRUE(registry_.uninstallApplication(kA, {}));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
    EXPECT_TRUE(registry_.uninstallApplication(kA, PropertyList::map()));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
    checks("platform/AppRegistry.h", "An error when there is nothing to remove.");
    EXPECT_FALSE(registry_.uninstallApplication(kA, {}));
}

TEST_P(AppRegistryContract, AnUninstallLimitedToPlaceholdersSparesTheApplication) {
    checks("platform/AppRegistry.h",
           "With `UninstallPlaceholderOnlyKey` true the application is never touched.");
    const PropertyList only = PropertyList::map({{UninstallPlaceholderOnlyKey, true}});
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_FALSE(registry_.uninstallApplication(kA, only));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    EXPECT_TRUE(registry_.uninstallApplication(kA, only));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(AppRegistryContract, UninstallingRemovesTheFiles) {
    checks("platform/AppRegistry.h", "What is removed goes with its container.");
    ASSERT_TRUE(installPackage({kA}));
    const std::string container = application(kA).value().bundleContainerPath;
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    EXPECT_FALSE(services_.files.itemExists(container));
}

TEST_P(AppRegistryContract, BundlesAreWalkedByType) {
    checks("platform/AppRegistry.h",
           "Calls back, on the calling thread and before it returns, once for each record of the "
           "type, in no particular order.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA, "com.example.b (placeholder)"));
    EXPECT_THAT(bundles(AppRegistry::kUserBundles), ElementsAre(kA, "com.example.b (placeholder)"));
    EXPECT_THAT(bundles(AppRegistry::kSystemBundles), IsEmpty());
}

TEST_P(AppRegistryContract, AWalkStopsWhenItIsTold) {
    checks("platform/AppRegistry.h", "Gets each proxy in turn; sets `stop` to end the walk.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPackage({kB}));
    int count = 0;
    registry_.enumerateBundles(AppRegistry::kEveryBundle, [&](const AppProxy&, bool& stop) {
        ++count;
        stop = true;
    });
    EXPECT_EQ(count, 1);
}

TEST_P(AppRegistryContract, AWalkMayChangeWhatItWalks) {
    checks("platform/AppRegistry.h",
           "The callback may call the registry, and change what it walks.");
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPackage({kB}));
    int count = 0;
    registry_.enumerateBundles(AppRegistry::kEveryBundle, [&](const AppProxy& proxy, bool&) {
        ++count;
        EXPECT_TRUE(registry_.uninstallApplication(proxy.applicationIdentifier, {}));
    });
    EXPECT_EQ(count, 2);
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
}

TEST_P(AppRegistryContract, SeveralInstallAtOnce) {
    checks("platform/AppRegistry.h", "Callable on any thread, by several at once.");
    std::vector<std::string> packages;
    for (int i = 0; i < 10; ++i) {
        packages.push_back(device_->addPackage({"com.example.n" + std::to_string(i)}));
    }
    {
        const auto operations = services_.queues.makeOperationQueue();
        operations->setMaximumConcurrentOperations(10);
        for (int i = 0; i < 10; ++i) {
            operations->add([&, i, identifier = "com.example.n" + std::to_string(i)] {
                EXPECT_TRUE(installFrom(packages[static_cast<std::size_t>(i)], identifier));
            });
        }
    }
    EXPECT_EQ(bundles(AppRegistry::kEveryBundle).size(), 10U);
}

}  // namespace

void linkAppRegistryContract() {}

}  // namespace appsync
