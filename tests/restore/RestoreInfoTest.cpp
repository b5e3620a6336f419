#include <cerrno>

#include "tests/restore/RestoreFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;

// What can be wrong with it: BadRestoreInfoTest.cpp.
class RestoreInfo : public RestoreFixture {};

// The entry point.

TEST_F(RestoreInfo, IsLookedAtForTypes2And3Only) {
    for (const std::int64_t type : {-1, 0, 1, 4, 5}) {
        setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
        platform_.clearRecording();
        restore(type);
        EXPECT_THAT(platform_.messages(),
                    ElementsAre("reconcileRestoreOfType " + std::to_string(type),
                                "Notifying DK we are starting syncing"));
        EXPECT_THAT(platform_.callsTo({"FileSystem"}),
                    ElementsAre(StartsWith("FileSystem.createDirectory(" + std::string(kWorkArea) +
                                           ", with intermediates, (null))")));
        EXPECT_TRUE(platform_.files.exists(std::string(kWorkArea)));
        EXPECT_TRUE(platform_.files.exists(kInfoPath));
    }
    for (const std::int64_t type : {2, 3}) {
        setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
        platform_.clearRecording();
        restore(type);
        expectInfoMovedOnce();
    }
    EXPECT_THAT(platform_.notifications.posts(),
                testing::Each("com.korvu.deskora.trd.wsyncnotify=1"));
    EXPECT_THAT(platform_.notifications.posts(), SizeIs(7));
}

TEST_F(RestoreInfo, NeverTellsTheHostOfAFailure) {
    platform_.files.failNext(FileOperation::CreateDirectory, std::string(kWorkArea), ENOSPC);
    platform_.files.addFile(kInfoPath, "damaged");
    std::optional<ErrorRecord> error = ErrorRecord::make(kPosixErrorDomain, 1, "an earlier one");
    EXPECT_TRUE(client_->reconcileRestoreOfType(2, &error));
    EXPECT_EQ(error, std::nullopt);
    expectInfoMovedOnce();
}

// The file as a whole.

TEST_F(RestoreInfo, MayBeInEitherEncoding) {
    platform_.addPropertyList(kInfoPath, PropertyList::map({{kA, appInfo()}}),
                              PropertyListFormat::Xml);
    restore();
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(RestoreInfo, MayBeEmpty) {
    setRestoreInfo(PropertyList::map());
    EXPECT_TRUE(client_->_processVessikRestoreInfo());
    EXPECT_THAT(platform_.messages(),
                ElementsAre("processing vessik restore info", "Demoted Apps: (null)",
                            "Will wait for 0 seconds for 0 placeholders to install",
                            "Finished waiting for placeholder installs"));
    EXPECT_TRUE(AppsClientTestAccess::finishedWaitingForPlaceHolderInstalls(*client_));
    expectInfoMovedOnce();
}

TEST_F(RestoreInfo, TakesThePlaceOfThatOfAnEarlierRestore) {
    platform_.files.addFile(kMovedPath, "earlier");
    setRestoreInfo(PropertyList::map());
    const auto contents = platform_.files.contents(kInfoPath);
    restore();
    EXPECT_EQ(platform_.files.contents(kMovedPath), contents);
}

TEST_F(RestoreInfo, IsLookedAtOnce) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
    restore();
    platform_.clearRecording();
    restore();
    EXPECT_THAT(platform_.messages(), Contains(StartsWith("no vessik restore plist found")));
    EXPECT_THAT(platform_.callsTo({"AppRegistry", "FileSystem.moveItem"}), IsEmpty());
}

TEST_F(RestoreInfo, ThatCannotBeMovedIsLogged) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
    platform_.files.failNext(FileOperation::MoveItem, kInfoPath, ENOSPC);
    restore();
    EXPECT_THAT(platform_.messageLines().back(),
                StartsWith("8 default failed to copy vessik metadata. err=Error Domain=POSIX"));
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

// One application among others.

TEST_F(RestoreInfo, OfAnApplicationThatHasAPlaceholderIsSkipped) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync, "0.9");
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, appInfo()}}));
    restore();
    EXPECT_TRUE(platform_.registry.placeholder(kB));
    expectInfoMovedOnce();
    EXPECT_EQ(platform_.registry.placeholder(kA)->bundleVersion, "0.9");
    EXPECT_THAT(platform_.messages(),
                testing::IsSupersetOf(
                    {"processing vessik restore info for 'com.example.a' demotionStatus :0",
                     "Found placeholder for bundle com.example.a",
                     "placeholder already exists for 'com.example.a' - skiping'"}));
    EXPECT_THAT(platform_.messageLines(), Not(Contains(StartsWith("8 error"))));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.installPlaceholderBundle"}), SizeIs(1));
}

TEST_F(RestoreInfo, AsksForEachApplicationByKeyWhenItsTurnComes) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, appInfo()}}));
    restore();
    EXPECT_THAT(platform_.callsTo({"AppRegistry"}),
                ElementsAre(StartsWith("AppRegistry.proxyForIdentifier(com.example.a"),
                            StartsWith("AppRegistry.installPlaceholderBundle"),
                            StartsWith("AppRegistry.proxyForIdentifier(com.example.b"),
                            StartsWith("AppRegistry.installPlaceholderBundle")));
}

TEST_F(RestoreInfo, SeesAPlaceholderThatAppearsMeanwhile) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, appInfo()}}));
    platform_.onCall("AppRegistry.installPlaceholderBundle", [this](const RecordEntry&) {
        platform_.registry.addPlaceholder(kB, kInstallTypeStoreDownload, "0.9");
    });
    restore();
    EXPECT_TRUE(
        logged(LogLevel::Default, "placeholder already exists for 'com.example.b' - skiping'"));
    EXPECT_EQ(platform_.registry.placeholder(kB)->bundleVersion, "0.9");
}

TEST_F(RestoreInfo, GivesTheOutcomeOfTheLastApplicationThatWasHandedOn) {
    const PropertyList nameless = appInfo(PropertyList::map());
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, nameless}, {kC, "skipped"}}));
    EXPECT_FALSE(client_->_processVessikRestoreInfo());
    setRestoreInfo(PropertyList::map({{kB, nameless}, {kC, appInfo()}}));
    EXPECT_TRUE(client_->_processVessikRestoreInfo());
    setRestoreInfo(PropertyList::map({{"com.example.d", 1}}));
    EXPECT_TRUE(client_->_processVessikRestoreInfo()) << "none was handed on";
}

TEST_F(RestoreInfo, GivesTheOutcomeOfTheLastCoordinatorThatWasSetUp) {
    coordinate();
    platform_.coordination.makeNoneNext(CoordinationObject::Coordinator, kB);
    setRestoreInfo(PropertyList::map({{kA, appInfo()}, {kB, appInfo()}}));
    EXPECT_FALSE(client_->_processVessikRestoreInfo());
    platform_.coordination.makeNoneNext(CoordinationObject::Coordinator, kB);
    setRestoreInfo(PropertyList::map({{kB, appInfo()}, {kC, appInfo()}}));
    EXPECT_TRUE(client_->_processVessikRestoreInfo());
}

// The demoted-apps list.

class DemotedAppsList : public RestoreInfo {
  protected:
    /// The demotion status that is told for A, B and C.
    std::vector<std::string> statuses() {
        setRestoreInfo(PropertyList::map({{kA, 1}, {kB, 1}, {kC, 1}}));
        platform_.clearRecording();
        restore();
        std::vector<std::string> result;
        for (const std::string& text : platform_.messages()) {
            if (text.find("demotionStatus") != text.npos)
                result.push_back(text.substr(text.size() - 1));
        }
        return result;
    }
};

TEST_F(DemotedAppsList, DecidesTheDemotionStatus) {
    setDemotedApps(PropertyList::map({{"AutomaticDowngrades", PropertyList::array({kA})},
                                      {"IntentionalDowngrades", PropertyList::array({kA, kB})}}));
    EXPECT_THAT(statuses(), ElementsAre("2", "1", "0")) << "A is in both";
    EXPECT_TRUE(loggedInApplications(
        LogLevel::Default,
        "Demoted Apps: {AutomaticDowngrades = (com.example.a); IntentionalDowngrades = "
        "(com.example.a, com.example.b);}"));
}

TEST_F(DemotedAppsList, ThatIsMissingOrEmptyDemotesNothingSilently) {
    EXPECT_THAT(statuses(), ElementsAre("0", "0", "0"));
    platform_.files.addFile(std::string(kDemotedAppsPath), "");
    EXPECT_THAT(statuses(), ElementsAre("0", "0", "0"));
    EXPECT_TRUE(loggedInApplications(LogLevel::Default, "Demoted Apps: (null)"));
    EXPECT_THAT(platform_.messageLines(), Not(Contains(StartsWith("8 error"))));
}

TEST_F(DemotedAppsList, ThatIsDamagedDemotesNothing) {
    platform_.files.addFile(std::string(kDemotedAppsPath), "damaged");
    EXPECT_THAT(statuses(), ElementsAre("0", "0", "0"));
    EXPECT_TRUE(logged(LogLevel::Error, "couldn't parse demoted apps list"));
}

TEST_F(DemotedAppsList, ThatIsNoMapDemotesNothing) {
    setDemotedApps(PropertyList::array({kA}));
    EXPECT_THAT(statuses(), ElementsAre("0", "0", "0"));
    EXPECT_TRUE(logged(LogLevel::Error, "demoted apps list is not a dictionary"));
}

TEST_F(DemotedAppsList, MayHoldAnythingInThePlaceOfItsArrays) {
    setDemotedApps(PropertyList::map(
        {{"AutomaticDowngrades", PropertyList::map({{kA, kA}})},
         {"IntentionalDowngrades", PropertyList::array({1, PropertyList::array({kA}), kB})}}));
    EXPECT_THAT(statuses(), ElementsAre("0", "1", "0"));
    setDemotedApps(PropertyList::map({{"AutomaticDowngrades", kA}, {"IntentionalDowngrades", 7}}));
    EXPECT_THAT(statuses(), ElementsAre("0", "0", "0"));
}

TEST_F(DemotedAppsList, ReportsWhatIsWrongWithIt) {
    std::optional<ErrorRecord> error;
    const auto load = [&](const char* path) {
        return AppsClient::_loadDemotedAppsPlist(platform_.services(), path, &error);
    };
    EXPECT_EQ(load("/none"), std::nullopt);
    EXPECT_EQ(error.value().code, ENOENT);
    platform_.files.addFile("/damaged", "damaged");
    EXPECT_EQ(load("/damaged"), std::nullopt);
    EXPECT_EQ(error.value().domain, kPropertyListErrorDomain);
    platform_.addPropertyList("/list", PropertyList::map({{"other", 1}}));
    EXPECT_EQ(load("/list"), PropertyList::map({{"other", 1}}));
}

}  // namespace
}  // namespace appsync
