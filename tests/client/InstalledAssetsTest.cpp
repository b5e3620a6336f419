#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using Access = AppsClientTestAccess;

class InstalledAssets : public AppsClientFixture {
  protected:
    void setLastSynced(const PropertyList& list) {
        platform_.addPropertyList(std::string(kLastSyncAppStatePath), list);
    }
    std::vector<std::string> deleted() {
        const PropertyList result = client_->installedAssets();
        EXPECT_EQ(result.size(), 1U);
        const PropertyList* list = result.find("_Deleted");
        if (list == nullptr || !list->isArray()) return {"no list"};
        std::vector<std::string> identifiers;
        for (const PropertyList& element : list->elements()) {
            EXPECT_EQ(element.size(), 1U);
            identifiers.push_back(*element.findString("BundleIdentifier"));
        }
        return identifiers;
    }
};

TEST_F(InstalledAssets, AreNoneDeletedOnAFreshDevice) {
    EXPECT_EQ(client_->installedAssets(), PropertyList::map({{"_Deleted", PropertyList::array()}}));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default getting installed assets",
                            "8 default finished getting installed assets toDoList:(null), "
                            "uninstalled apps (), last synced apps(null)"));
}

TEST_F(InstalledAssets, AreDeletedWhenUninstalledWithoutATodo) {
    platform_.installer.addUninstalled(kA);
    EXPECT_THAT(deleted(), ElementsAre(kA));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "com.example.a not installed, and no todo (found=0 pi=0 failed=0) Marking "
                       "as deleted"));
}

struct TodoCase {
    const char* operation;
    bool deleted;
    const char* flags;
};

class InstalledAssetsWithATodo : public InstalledAssets,
                                 public testing::WithParamInterface<TodoCase> {};

TEST_P(InstalledAssetsWithATodo, AreDeletedOnlyOnceTheTodoIsDone) {
    platform_.installer.addUninstalled(kA);
    setTodoList(PropertyList::array(
        {todoEntry(kB, "install"), todoEntry(kA, GetParam().operation), todoEntry(kA, "FAILED")}));
    if (GetParam().deleted) {
        EXPECT_THAT(deleted(), ElementsAre(kA));
        EXPECT_THAT(platform_.messages(), Contains(HasSubstr(GetParam().flags)));
    } else {
        EXPECT_THAT(deleted(), IsEmpty());
        EXPECT_TRUE(
            logged(LogLevel::Default,
                   "com.example.a not installed, but is in our todo list. Not marking deleted"));
    }
}

INSTANTIATE_TEST_SUITE_P(EveryOperation, InstalledAssetsWithATodo,
                         testing::Values(TodoCase{"install", false, ""},
                                         TodoCase{"SENT", false, ""},
                                         TodoCase{"DOWNLOADED", false, ""},
                                         TodoCase{"remove", false, ""},
                                         TodoCase{"INSTALLED", true, "(found=1 pi=1 failed=0)"},
                                         TodoCase{"FAILED", true, "(found=1 pi=0 failed=1)"}),
                         [](const auto& test) { return std::string(test.param.operation); });

TEST_F(InstalledAssets, AreDeletedWhenGoneSinceTheLastSync) {
    platform_.registry.addApplication(kA);
    platform_.registry.addPlaceholder(kC, kInstallTypeSync);
    setLastSynced(PropertyList::array({kA, kB, 7, kC}));
    EXPECT_THAT(deleted(), ElementsAre(kB));
}

TEST_F(InstalledAssets, AreNotDeletedSinceTheLastSyncWhileATodoIsPending) {
    setLastSynced(PropertyList::array({kA, kB}));
    setTodoList(PropertyList::array({todoEntry(kA, "DOWNLOADED")}));
    EXPECT_THAT(deleted(), ElementsAre(kB));
}

TEST_F(InstalledAssets, AreDeletedOnceWhenBothListsNameThem) {
    platform_.installer.addUninstalled(kB);
    platform_.installer.addUninstalled(kA);
    setLastSynced(PropertyList::array({kB}));
    EXPECT_THAT(deleted(), ElementsAre(kA, kB));
}

TEST_F(InstalledAssets, GoOnWithoutTheInstallersAnswer) {
    platform_.installer.setUninstalled(std::nullopt);
    setLastSynced(PropertyList::array({kA}));
    EXPECT_THAT(deleted(), ElementsAre(kA));
    EXPECT_TRUE(logged(LogLevel::Error, "PakmountLookupUninstalled returned NULL"));
    EXPECT_FALSE(Access::hasUninstalledApps(*client_));
}

TEST_F(InstalledAssets, KeepTheInstallersLastAnswer) {
    platform_.installer.addUninstalled(kA);
    static_cast<void>(deleted());
    platform_.installer.setUninstalled(std::nullopt);
    static_cast<void>(deleted());
    EXPECT_TRUE(Access::hasUninstalledApps(*client_));
    platform_.installer.setUninstalled(PropertyList::map({{kB, true}}));
    static_cast<void>(deleted());
    client_->syncEndedWithSuccess(true);
    EXPECT_TRUE(logged(LogLevel::Default, "clearing uninstalled apps: (com.example.b)"));
}

TEST_F(InstalledAssets, ReportALastSyncFileThatIsDamagedAsATodoList) {
    platform_.files.addFile(std::string(kLastSyncAppStatePath), "damaged");
    EXPECT_THAT(deleted(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Error, "couldn't parse todo list"));
}

TEST_F(InstalledAssets, LogEverythingThatTheyLookedAt) {
    platform_.installer.addUninstalled(kA);
    setLastSynced(PropertyList::array({kB}));
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    static_cast<void>(deleted());
    EXPECT_TRUE(logged(LogLevel::Default,
                       "finished getting installed assets toDoList:({identifier = com.example.a; "
                       "operation = install; version = 1.0; name = Example;}), uninstalled apps "
                       "(com.example.a), last synced apps(com.example.b)"));
}

}  // namespace
}  // namespace appsync
