#include <memory>
#include <vector>

#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;

/// Writes down what it hears.
class Listener : public AppRegistryObserver {
  public:
    void applicationInstallsArePrioritized(const std::vector<AppProxy>& prioritized,
                                           const std::vector<AppProxy>& paused) override {
        heard.push_back("installs" + text(prioritized) + ", paused" + text(paused));
    }
    void applicationInstallsDidCancel(const std::vector<AppProxy>& cancelled) override {
        heard.push_back("cancelled" + text(cancelled));
    }

    std::vector<std::string> heard;

  private:
    static std::string text(const std::vector<AppProxy>& proxies) {
        std::string result;
        for (const AppProxy& proxy : proxies) result += " " + proxy.applicationIdentifier;
        return result;
    }
};

// What the contract of the registry promises is tested for every implementation; here stands what
// only the simulation does.
class SimulatedAppRegistryTest : public SimulationFixture {
  protected:
    Status install(const std::string& identifier) {
        platform_.files.addFile("/tmp/package.zip", "package");
        return registry_.installPackage(FileURL::fromPath("/tmp/package.zip", false).value(),
                                        PropertyList::map({{PackageTypeKey, PackageTypeCustomer},
                                                           {BundleIdentifierKey, identifier}}));
    }

    SimulatedAppRegistry& registry_ = platform_.registry;
};

TEST_F(SimulatedAppRegistryTest, ScriptedFailuresAreUsedUpInOrder) {
    const auto first = ErrorRecord::make(kInstallerErrorDomain, 7, "first");
    const auto second = ErrorRecord::make(kRegistryErrorDomain, 8, "second");
    registry_.failNextInstall(kA, first);
    registry_.failNextInstall(kA, second);
    EXPECT_EQ(install(kA).error(), first);
    EXPECT_TRUE(install(kB));
    EXPECT_EQ(install(kA).error(), second);
    EXPECT_TRUE(install(kA));
}

TEST_F(SimulatedAppRegistryTest, UninstallsAndPlaceholdersFailAsScripted) {
    const auto error = ErrorRecord::make(kRegistryErrorDomain, 7, "scripted");
    registry_.addApplication(kA);
    registry_.failNextUninstall(kA, error);
    EXPECT_EQ(registry_.uninstallApplication(kA, {}).error(), error);
    EXPECT_TRUE(registry_.uninstallApplication(kA, {}));
    registry_.failNextPlaceholderInstall(kB, error);
    const auto options = PropertyList::map({{PackageTypeKey, PackageTypePlaceholder},
                                            {BundleIdentifierKey, kB},
                                            {InstallTypeKey, 4U}});
    const FileURL directory = FileURL::fromPath("/tmp", true).value();
    EXPECT_EQ(registry_.installPlaceholderBundle(directory, options).error(), error);
}

TEST_F(SimulatedAppRegistryTest, APackageHoldsWhatTheTestSays) {
    registry_.setPackage(kA, "3.1", "Atlas");
    EXPECT_TRUE(install(kA));
    EXPECT_EQ(registry_.installed(kA)->bundleVersion, "3.1");
    EXPECT_EQ(registry_.installed(kA)->displayName, "Atlas");
}

TEST_F(SimulatedAppRegistryTest, AFailedInstallMarksItsRecord) {
    registry_.addPlaceholder(kA, kInstallTypeSync);
    registry_.failNextInstall(kA, ErrorRecord::make(kInstallerErrorDomain, 7, "scripted"));
    EXPECT_FALSE(install(kA));
    EXPECT_EQ(registry_.progress(kA)->state, std::uint64_t{kInstallStateFailed});
}

TEST_F(SimulatedAppRegistryTest, ACancelledInstallIsNotCarriedOut) {
    registry_.addPlaceholder(kA, kInstallTypeSync);
    registry_.cancelInstalls({kA});
    EXPECT_EQ(install(kA).error().domain, kInstallerErrorDomain);
    EXPECT_EQ(registry_.progress(kA)->state, std::uint64_t{kInstallStateCanceled});
    EXPECT_THAT(registry_.installedIdentifiers(), IsEmpty());
}

TEST_F(SimulatedAppRegistryTest, AnInstallTakesAsLongAsTold) {
    registry_.setInstallDuration(20s);
    {
        const auto operations = platform_.queues.makeOperationQueue();
        operations->add([&] { EXPECT_TRUE(install(kA)); });
        operations->add([&] { EXPECT_TRUE(install(kB)); });
    }
    EXPECT_EQ(platform_.now(), 20s);
    EXPECT_THAT(registry_.installedIdentifiers(), ElementsAre(kA, kB));
}

TEST_F(SimulatedAppRegistryTest, CancelledInstallsAreReported) {
    registry_.addPlaceholder(kA, kInstallTypeRestore);
    registry_.addPlaceholder(kB, kInstallTypeSync);
    const auto listener = std::make_shared<Listener>();
    registry_.addObserver(listener);
    platform_.runUntilIdle();
    registry_.cancelInstalls({kA});
    platform_.runUntilIdle();
    EXPECT_THAT(listener->heard,
                ElementsAre("installs com.example.a com.example.b, paused",
                            "installs com.example.b, paused", "cancelled com.example.a"));
    registry_.removeObserver(listener.get());
}

TEST_F(SimulatedAppRegistryTest, ReportsAreDeliveredByARegistryTask) {
    const auto listener = std::make_shared<Listener>();
    registry_.addObserver(listener);
    EXPECT_THAT(listener->heard, IsEmpty());
    platform_.runUntilIdle();
    EXPECT_THAT(listener->heard, ElementsAre("installs, paused"));
    EXPECT_EQ(platform_.recording().back().task, "registry");
    registry_.removeObserver(listener.get());
}

TEST_F(SimulatedAppRegistryTest, AScriptedReportReplacesTheRegistrysOwn) {
    AppProxy proxy;
    proxy.applicationIdentifier = "com.example.scripted";
    registry_.addPlaceholder(kA, kInstallTypeSync);
    registry_.setReport({}, {proxy});
    const auto listener = std::make_shared<Listener>();
    registry_.addObserver(listener);
    platform_.runUntilIdle();
    EXPECT_THAT(listener->heard, ElementsAre("installs, paused com.example.scripted"));
    registry_.removeObserver(listener.get());
}

TEST_F(SimulatedAppRegistryTest, WithheldReportsComeLater) {
    registry_.withholdReports(true);
    const auto listener = std::make_shared<Listener>();
    registry_.addObserver(listener);
    platform_.runUntilIdle();
    EXPECT_THAT(listener->heard, IsEmpty());
    registry_.withholdReports(false);
    platform_.runUntilIdle();
    EXPECT_THAT(listener->heard, ElementsAre("installs, paused"));
    registry_.removeObserver(listener.get());
}

TEST_F(SimulatedAppRegistryTest, ListsThatDidNotChangeAreNotReportedAgain) {
    registry_.addPlaceholder(kA, kInstallTypeSync);
    const auto listener = std::make_shared<Listener>();
    registry_.addObserver(listener);
    platform_.runUntilIdle();
    registry_.setProgress(kA, {.state = kInstallStateActive});
    platform_.runUntilIdle();
    EXPECT_EQ(listener->heard.size(), 1U);
    registry_.removeObserver(listener.get());
}

TEST_F(SimulatedAppRegistryTest, BundlesHaveTheirTypes) {
    AppProxy system;
    system.applicationIdentifier = "com.example.system";
    system.applicationType = kApplicationTypeSystem;
    system.state.placeholder = true;
    registry_.add(system);
    registry_.addApplication(kA);
    std::vector<std::string> found;
    registry_.enumerateBundles(AppRegistry::kSystemBundles, [&](const AppProxy& proxy, bool&) {
        found.push_back(proxy.applicationIdentifier);
    });
    EXPECT_THAT(found, ElementsAre("com.example.system"));
    EXPECT_THAT(registry_.placeholderIdentifiers(), ElementsAre("com.example.system"));
}

TEST_F(SimulatedAppRegistryTest, MisuseIsAFailure) {
    EXPECT_EQ(failureOf([&] { registry_.addObserver({}); }), "the observer has gone already");
    EXPECT_EQ(failureOf([&] { registry_.cancelInstalls({kA}); }),
              "there is no install of com.example.a to cancel");
    EXPECT_EQ(failureOf([&] { registry_.setProgress(kA, {}); }), "there is no com.example.a");
}

}  // namespace
}  // namespace appsync
