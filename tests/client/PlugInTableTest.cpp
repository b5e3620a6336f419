#include "platform/PlugInTable.h"

#include <new>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;

class PlugInTableTest : public AppsClientFixture {
  protected:
    PlugInTableTest() { client_.reset(); }

    const PlugInTable& table_ = *appsyncPlugInTable();
};

TEST_F(PlugInTableTest, HasTheVersionThatItsHeaderNames) {
    EXPECT_EQ(table_.majorVersion, kModuleMajorVersion);
    EXPECT_EQ(table_.minorVersion, kModuleMinorVersion);
    EXPECT_THAT(table_.plugInVersion, testing::MatchesRegex("[0-9]+\\.[0-9]+\\.[0-9]+"));
}

TEST_F(PlugInTableTest, MakesAClientAndLetsItGo) {
    const PlugInClient made = table_.makeClient(platform_.services());
    ASSERT_NE(made.client, nullptr);
    EXPECT_EQ(dynamic_cast<SyncClient*>(made.observer), made.client);
    EXPECT_THAT(made.client->supportedDataclasses(), ElementsAre("Application"));
    platform_.clearRecording();
    table_.destroyClient(made);
    EXPECT_THAT(platform_.callsTo({"AppRegistry"}), ElementsAre("AppRegistry.removeObserver()"));
}

TEST_F(PlugInTableTest, LetsNothingBeThrownAtWhoAsksForAClient) {
    platform_.host.setMainBundleIdentifier("com.example.other");
    platform_.onCall("InstallCoordinatorService.isCoordinationEnabled",
                     [](const RecordEntry&) { throw std::bad_alloc(); });
    const PlugInClient made = table_.makeClient(platform_.services());
    EXPECT_EQ(made.client, nullptr);
    table_.destroyClient(made);
}

}  // namespace
}  // namespace appsync
