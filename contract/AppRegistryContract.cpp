#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "contract/DeviceContract.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

constexpr const char* kA = "com.example.a";
constexpr const char* kB = "com.example.b";

class AppRegistryContract : public DeviceContract {};

APPSYNC_CONTRACT_SUITE(AppRegistryContract, devicePorts());

TEST_P(AppRegistryContract, AnEmptyDeviceKnowsNothing) {
    EXPECT_FALSE(application(kA));
    EXPECT_FALSE(preferred(kA));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
}

TEST_P(AppRegistryContract, APackageBecomesAnApplication) {
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
    ASSERT_TRUE(installPackage({kA}));
    const std::optional<AppProxy> proxy = application(kA);
    ASSERT_TRUE(proxy);
    EXPECT_TRUE(proxy->bundlePath.starts_with(proxy->bundleContainerPath + "/"));
    EXPECT_TRUE(services_.files.attributes(proxy->bundlePath)->isDirectory);
}

TEST_P(AppRegistryContract, ThePackageIsOnlyRead) {
    const std::string path = device_->addPackage({kA});
    const Bytes before = *services_.files.readFile(path);
    ASSERT_TRUE(installFrom(path, kA));
    EXPECT_EQ(*services_.files.readFile(path), before);
}

TEST_P(AppRegistryContract, AnUpdateReplacesTheVersion) {
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    ASSERT_TRUE(installPackage({kA, "2.0"}));
    EXPECT_EQ(application(kA)->bundleVersion, "2.0");
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(AppRegistryContract, APackageOfAnotherIdentifierIsRefused) {
    const Status status = installFrom(device_->addPackage({kA}), kB);
    ASSERT_FALSE(status);
    EXPECT_EQ(status.error().domain, kInstallerErrorDomain);
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
}

TEST_P(AppRegistryContract, AMissingPackageIsRefused) {
    EXPECT_FALSE(installFrom("/var/mobile/missing.zip", kA));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
}

TEST_P(AppRegistryContract, IllegalIdentifiersAreRefused) {
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

TEST_P(AppRegistryContract, TheLongestIdentifierIsLegal) {
    const std::string identifier(255, 'x');
    EXPECT_EQ(registry_.uninstallApplication(identifier, {}).error().domain, kRegistryErrorDomain);
    EXPECT_FALSE(registry_.isApplicationInstalled(identifier));
}

TEST_P(AppRegistryContract, OptionsOfAnotherKindAreRefused) {
    const FileURL package = FileURL::fromPath(device_->addPackage({kA}), false).value();
    EXPECT_FALSE(registry_.installPackage(package, {}));
    EXPECT_FALSE(registry_.installPackage(package, PropertyList::map()));
    EXPECT_FALSE(registry_.installPackage(package, placeholderOptions(kA, kInstallTypeSync)));
    const PropertyList nameless = PropertyList::map({{PackageTypeKey, PackageTypeCustomer}});
    EXPECT_FALSE(registry_.installPackage(package, nameless));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
}

TEST_P(AppRegistryContract, APlaceholderIsOnlySeenByThoseWhoAskForIt) {
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
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));  // removes what was copied
    EXPECT_TRUE(services_.files.itemExists(preferred(kA)->bundlePath + "/Info.plist"));
}

TEST_P(AppRegistryContract, StoreMetadataAndSinfMayComeWithAPlaceholder) {
    const std::string path = addPlaceholderBundle({kA});
    PropertyList options = placeholderOptions(kA, kInstallTypeRestore);
    options.set(StoreMetadataKey, Bytes{1, 2, 3});
    options.set(AppSinfKey, PropertyList());
    EXPECT_TRUE(registry_.installPlaceholderBundle(FileURL::fromPath(path, true).value(), options));
    EXPECT_EQ(preferred(kA)->installType, std::uint64_t{kInstallTypeRestore});
}

TEST_P(AppRegistryContract, AMissingPlaceholderBundleIsRefused) {
    EXPECT_FALSE(registry_.installPlaceholderBundle(
        FileURL::fromPath("/var/mobile/missing.app", true).value(),
        placeholderOptions(kA, kInstallTypeSync)));
    EXPECT_FALSE(registry_.isApplicationInstalled(kA));
}

TEST_P(AppRegistryContract, APlaceholderCoversTheApplication) {
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    ASSERT_TRUE(installPlaceholder({kA, "2.0"}, kInstallTypeSync));
    EXPECT_EQ(application(kA)->bundleVersion, "1.0");
    EXPECT_EQ(preferred(kA)->bundleVersion, "2.0");
    EXPECT_TRUE(services_.files.itemExists(application(kA)->bundlePath));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA, "com.example.a (placeholder)"));
}

TEST_P(AppRegistryContract, InstallingThePackageTakesThePlaceholderAway) {
    ASSERT_TRUE(installPlaceholder({kA, "2.0"}, kInstallTypeSync));
    ASSERT_TRUE(installPackage({kA, "2.0"}));
    EXPECT_TRUE(preferred(kA)->state.installed);
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(AppRegistryContract, AFailedInstallLeavesBothAsTheyWere) {
    ASSERT_TRUE(installPackage({kA, "1.0"}));
    ASSERT_TRUE(installPlaceholder({kA, "2.0"}, kInstallTypeSync));
    EXPECT_FALSE(installFrom(device_->addPackage({kB}), kA));
    EXPECT_EQ(application(kA)->bundleVersion, "1.0");
    EXPECT_EQ(preferred(kA)->bundleVersion, "2.0");
    EXPECT_NE(progress(kA), nullptr);
}

TEST_P(AppRegistryContract, UninstallingTakesThePlaceholderFirst) {
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    EXPECT_TRUE(registry_.uninstallApplication(kA, {}));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
    EXPECT_TRUE(registry_.uninstallApplication(kA, PropertyList::map()));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), IsEmpty());
    EXPECT_FALSE(registry_.uninstallApplication(kA, {}));
}

TEST_P(AppRegistryContract, AnUninstallLimitedToPlaceholdersSparesTheApplication) {
    const PropertyList only = PropertyList::map({{UninstallPlaceholderOnlyKey, true}});
    ASSERT_TRUE(installPackage({kA}));
    EXPECT_FALSE(registry_.uninstallApplication(kA, only));
    ASSERT_TRUE(installPlaceholder({kA}, kInstallTypeSync));
    EXPECT_TRUE(registry_.uninstallApplication(kA, only));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA));
}

TEST_P(AppRegistryContract, UninstallingRemovesTheFiles) {
    ASSERT_TRUE(installPackage({kA}));
    const std::string container = application(kA)->bundleContainerPath;
    ASSERT_TRUE(registry_.uninstallApplication(kA, {}));
    EXPECT_FALSE(services_.files.itemExists(container));
}

TEST_P(AppRegistryContract, BundlesAreWalkedByType) {
    ASSERT_TRUE(installPackage({kA}));
    ASSERT_TRUE(installPlaceholder({kB}, kInstallTypeSync));
    EXPECT_THAT(bundles(AppRegistry::kEveryBundle), ElementsAre(kA, "com.example.b (placeholder)"));
    EXPECT_THAT(bundles(AppRegistry::kUserBundles), ElementsAre(kA, "com.example.b (placeholder)"));
    EXPECT_THAT(bundles(AppRegistry::kSystemBundles), IsEmpty());
}

TEST_P(AppRegistryContract, AWalkStopsWhenItIsTold) {
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
