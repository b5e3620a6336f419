#include <atomic>
#include <filesystem>

#include "device/values/DevicePaths.h"
#include "host/plan/LibraryReader.h"
#include "host/plan/StagingArea.h"
#include "host/plan/SyncPlan.h"
#include "host/session/PlugIn.h"
#include "host/session/Session.h"
#include "host/watch/SessionFacts.h"
#include "host/watch/SyncEvents.h"
#include "platform/AppRegistry.h"
#include "platform/FileURL.h"
#include "platform/InstallCoordinator.h"
#include "platform/InstallCoordinatorService.h"
#include "platform/Platform.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;

constexpr std::chrono::seconds kLong{60};

class NoDisplay final : public SyncDisplay {
  public:
    void complain(std::string_view) override {}
    void show(const SyncEvent&) override {}
    void finish(const SyncSummary&) override {}
};

class ResumedInstall : public HostFixture {
  protected:
    ResumedInstall() : HostFixture(true) {}

    /// A session that ends when the package has been delivered, and the install has not begun.
    void deliverAndLeave(const std::string& identifier) {
        const std::unique_ptr<Device> opened = open(DeviceAccess::Session);
        const std::string package = std::string(kPublicStagingDirectory) + "/" + identifier;
        std::filesystem::copy(library + "/" + identifier + ".zip", root + package);
        const Result<std::unique_ptr<PlugIn>> plugIn =
            PlugIn::load(*opened, events, facts, console);
        ASSERT_TRUE(plugIn.ok());
        InstallCoordinatorService& service = (*plugIn)->platform().coordination;
        const auto made =
            service.coordinator(CoordinatorKind::Initiating, identifier, SyncClientID,
                                InstallCoordinatorService::Creation::CreateIfNotExisting);
        ASSERT_NE(made.coordinator, nullptr);
        EXPECT_TRUE(made.coordinator->setInstallOptions({StoreMetadata{}, kInstallTypeSync, 1}));
        EXPECT_TRUE(made.coordinator->setInitialODRAssetPromises({}));
        const auto shown =
            service.makeAppPlaceholder("A", identifier, kInstallTypeSync, SyncClientID);
        EXPECT_TRUE(shown->setConfigurationComplete());
        EXPECT_TRUE(made.coordinator->setPlaceholderPromise(shown));
        const auto asset = service.makePathTransferPromise(identifier + "-Asset", SyncClientID,
                                                           FileURL::fromPath(package, false), 0);
        EXPECT_TRUE(made.coordinator->setAppAssetPromise(asset));
        asset->setComplete();
    }

    NoDisplay display;
    SyncEvents events{display};
    SessionFacts facts;
    const Console console{out, err};
};

TEST_F(ResumedInstall, EndsOnlyWhenTheDeviceHasSaidWhatItWants) {
    addPackage("com.a", "1");
    addPackage("com.b", "1");
    deliverAndLeave("com.a");
    const std::unique_ptr<Device> opened = open(DeviceAccess::Session);
    const Result<Library> packages = readLibrary(library, opened->propertyLists());
    ASSERT_TRUE(packages.ok());
    SyncPlan plan;
    plan.install.resize(1);
    plan.install[0].identifier = "com.b";
    ASSERT_TRUE(writeStagingArea(*opened, plan, *packages));
    const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::load(*opened, events, facts, console);
    ASSERT_TRUE(plugIn.ok());
    const std::atomic<bool> stopRequested = false;
    Session session(*opened, **plugIn, events, facts, stopRequested);
    std::vector<std::string> asked;
    const SessionEnd end = session.sync(
        {[this](const std::string& identifier) { return library + "/" + identifier + ".zip"; },
         [&](const std::string& identifier) {
             asked.push_back(identifier);
             // Whatever begins would end while this waits.
             EXPECT_FALSE(opened->waitForCoordinatedInstalls(kLong));
             EXPECT_THAT(opened->coordinatedInstallsUnderWay(), ElementsAre("com.a"));
             return identifier != "com.a";
         }});
    EXPECT_TRUE(end.isSuccess());
    // The first question is the host's own, about what was delivered.
    EXPECT_THAT(asked, ElementsAre("com.a", "com.b"));
    EXPECT_THAT(applications(), ElementsAre("com.a 1", "com.b 1"));
    const auto left = opened->coordinators();
    ASSERT_TRUE(left.ok());
    EXPECT_TRUE(left->empty());
}

}  // namespace
}  // namespace appsync
