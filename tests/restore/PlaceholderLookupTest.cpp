#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class PlaceholderLookup : public AppsClientFixture {
  protected:
    void addSystemPlaceholder(const std::string& identifier, bool placeholder) {
        AppProxy proxy;
        proxy.applicationIdentifier = identifier;
        proxy.applicationType = kApplicationTypeSystem;
        proxy.state.installed = !placeholder;
        proxy.state.placeholder = placeholder;
        platform_.registry.add(proxy);
    }
};

TEST_F(PlaceholderLookup, FindsAUserBundleByItsExactIdentifier) {
    platform_.registry.addPlaceholder(kA, kInstallTypeRestore);
    platform_.registry.addApplication(kB);
    EXPECT_TRUE(client_->_placeholderExistsForApplication(kA));
    EXPECT_TRUE(logged(LogLevel::Default, "Found placeholder for bundle com.example.a"));
    EXPECT_TRUE(client_->_placeholderExistsForApplication(kB)) << "no further state is looked at";
    EXPECT_FALSE(client_->_placeholderExistsForApplication("com.example.A"));
    EXPECT_THAT(platform_.calls(),
                testing::Each(testing::StartsWith("AppRegistry.proxyForIdentifier(com.example.")));
}

TEST_F(PlaceholderLookup, PassesOverSystemBundles) {
    addSystemPlaceholder(kA, true);
    addSystemPlaceholder(kB, false);
    EXPECT_FALSE(client_->_placeholderExistsForApplication(kA));
    EXPECT_FALSE(client_->_placeholderExistsForApplication(kB));
    EXPECT_THAT(platform_.messages(), IsEmpty());
    platform_.registry.addApplication(kA);
    EXPECT_TRUE(client_->_placeholderExistsForApplication(kA)) << "the placeholder covers it";
}

TEST_F(PlaceholderLookup, TellsOnceOfAnApplicationAndItsPlaceholder) {
    platform_.registry.addApplication(kA);
    platform_.registry.addPlaceholder(kA, kInstallTypeSync);
    EXPECT_TRUE(client_->_placeholderExistsForApplication(kA));
    EXPECT_EQ(platform_.countMessages("Found placeholder for bundle com.example.a"), 1U);
}

TEST_F(PlaceholderLookup, FindsNothingWhileInstallsAreCoordinated) {
    platform_.registry.addPlaceholder(kA, kInstallTypeRestore);
    AppsClientTestAccess::setUseInstallCoordinator(*client_, true);
    EXPECT_FALSE(client_->_placeholderExistsForApplication(kA));
    EXPECT_THAT(platform_.lines(), IsEmpty());
}

TEST_F(PlaceholderLookup, WalksThePlaceholdersOnly) {
    platform_.registry.addApplication(kA);
    platform_.registry.addPlaceholder(kB, kInstallTypeSync);
    addSystemPlaceholder(kC, true);
    std::vector<std::string> seen;
    client_->_enumeratePlaceholdersWithBlock(
        [&](const AppProxy& proxy, bool&) { seen.push_back(proxy.applicationIdentifier); });
    EXPECT_THAT(seen, ElementsAre(kB, kC));
    EXPECT_THAT(platform_.calls(), ElementsAre("AppRegistry.enumerateBundles(0)"));
}

TEST_F(PlaceholderLookup, LetsTheCallbackStopTheWalk) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync);
    platform_.registry.addPlaceholder(kB, kInstallTypeSync);
    int calls = 0;
    client_->_enumeratePlaceholdersWithBlock([&](const AppProxy&, bool& stop) {
        ++calls;
        stop = true;
    });
    EXPECT_EQ(calls, 1);
}

TEST_F(PlaceholderLookup, ListsSystemPlaceholders) {
    addSystemPlaceholder(kA, true);
    addSystemPlaceholder(kB, false);
    platform_.registry.addPlaceholder(kC, kInstallTypeSync);
    EXPECT_THAT(client_->_getSystemAppPlaceholders(), ElementsAre(kA));
    EXPECT_THAT(platform_.lines(), ElementsAre("AppRegistry.enumerateBundles(7)",
                                               "8 default SystemAppPlaceholders (com.example.a)"));
}

TEST_F(PlaceholderLookup, ListsNoSystemPlaceholdersWhenThereAreNone) {
    EXPECT_THAT(client_->_getSystemAppPlaceholders(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, "SystemAppPlaceholders ()"));
}

}  // namespace
}  // namespace appsync
