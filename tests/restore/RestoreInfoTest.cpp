#include <cerrno>
#include <ostream>

#include "tests/restore/RestoreFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;
using testing::StartsWith;

class RestoreInfo : public RestoreFixture {
  protected:
    /// One application after the bad one, to see that it is restored all the same.
    void restoreBesideB(const std::string& identifier, const PropertyList& info) {
        setRestoreInfo(PropertyList::map({{identifier, info}, {kB, appInfo()}}));
        restore();
        EXPECT_TRUE(platform_.registry.placeholder(kB));
        expectInfoMovedOnce();
    }
    /// Information that cannot be used as a whole.
    void expectOnlyMoved() {
        EXPECT_FALSE(client_->_processVessikRestoreInfo());
        expectInfoMovedOnce();
        EXPECT_FALSE(AppsClientTestAccess::finishedWaitingForPlaceHolderInstalls(*client_));
        EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
        EXPECT_THAT(platform_.callsTo({"WaitGroup"}), IsEmpty());
    }
    void expectRefusedAsDamaged(const std::string& why) {
        expectOnlyMoved();
        EXPECT_THAT(
            platform_.messageLines(),
            ElementsAre("8 default processing vessik restore info",
                        testing::AllOf(
                            StartsWith("8 default failed to parse vessik app restore info. err="),
                            HasSubstr(why))));
    }
};

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

TEST_F(RestoreInfo, ThatIsMissingEndsTheRestoreAtOnce) {
    EXPECT_TRUE(client_->_processVessikRestoreInfo());
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre(
            "FileSystem.itemExists(" + kInfoPath + ") -> no",
            "8 default no vessik restore plist found - skipping processing of vessik restored "
            "apps"));
    EXPECT_FALSE(AppsClientTestAccess::finishedWaitingForPlaceHolderInstalls(*client_));
    EXPECT_EQ(platform_.now(), SimulatedTime(0));
}

TEST_F(RestoreInfo, ThatCannotBeReadIsMovedAway) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
    platform_.files.failNext(FileOperation::ReadFile, kInfoPath, EIO);
    expectOnlyMoved();
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre(StartsWith("8 default failed to read vessik app restore info. "
                                       "err=Error Domain=POSIX Code=5")));
}

TEST_F(RestoreInfo, ThatIsADirectoryIsMovedAway) {
    platform_.files.addDirectory(kInfoPath);
    expectOnlyMoved();
    EXPECT_THAT(platform_.messages(),
                ElementsAre(StartsWith("failed to read vessik app restore info. err=Error")));
}

TEST_F(RestoreInfo, ThatIsEmptyIsDamaged) {
    platform_.files.addFile(kInfoPath, "");
    expectRefusedAsDamaged("Error Domain=PropertyList");
}

TEST_F(RestoreInfo, ThatIsCutShortIsDamaged) {
    Bytes whole = bytesOf(PropertyList::map({{kA, appInfo()}}));
    whole.resize(whole.size() / 2);
    platform_.files.addFile(kInfoPath, whole);
    expectRefusedAsDamaged("Error Domain=PropertyList");
}

TEST_F(RestoreInfo, WhoseTopLevelIsNoMapIsDamaged) {
    setRestoreInfo(PropertyList::array({kA}));
    expectRefusedAsDamaged("the top level is not a map");
}

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

TEST_F(RestoreInfo, OfAnApplicationThatIsNoMapIsSkipped) {
    restoreBesideB(kA, PropertyList::array({"VessikMetadata"}));
    EXPECT_TRUE(logged(LogLevel::Default, "no vessik restore info for 'com.example.a' - skipping"));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
}

TEST_F(RestoreInfo, OfAnApplicationWithoutMetadataIsIgnored) {
    restoreBesideB(kA, PropertyList::map({{"ApplicationSINF", sinf_}}));
    EXPECT_TRUE(logged(LogLevel::Default, "no VessikMetadata for 'com.example.a' - ignoring"));
    EXPECT_FALSE(platform_.registry.placeholder(kA));
}

TEST_F(RestoreInfo, OfAnApplicationWhoseMetadataIsOfAnotherTypeIsIgnored) {
    restoreBesideB(kA, PropertyList::map({{"VessikMetadata", storeMetadata()}}));
    EXPECT_TRUE(logged(LogLevel::Default, "no VessikMetadata for 'com.example.a' - ignoring"));
}

TEST_F(RestoreInfo, OfAnApplicationWhoseMetadataIsDamagedIsRecorded) {
    restoreBesideB(kA, PropertyList::map({{"VessikMetadata", Bytes{'x'}}}));
    EXPECT_THAT(platform_.messageLines(),
                Contains(StartsWith("8 default failed to parse vessik metadata for "
                                    "'com.example.a'. err=Error Domain=PropertyList")));
    EXPECT_THAT(scenarios(), Contains("Vessik App Restore|com.example.a|no|Failed to parse vessik "
                                      "metadata"));
    EXPECT_FALSE(platform_.files.exists("/tmp/com.korvu.trd.Apps/com.example.a.app"));
}

TEST_F(RestoreInfo, TakesAnIconOrSinfDataOfAnotherTypeForMissing) {
    PropertyList info = appInfo();
    info.set("PlaceholderIcon", "text");
    info.set("ApplicationSINF", PropertyList::map());
    restoreBesideB(kA, info);
    EXPECT_TRUE(logged(LogLevel::Error, "no icon data for 'com.example.a'"));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.installPlaceholderBundle"}).front(),
                HasSubstr("ApplicationSINF = (null);"));
    EXPECT_TRUE(platform_.registry.placeholder(kA));
}

TEST_F(RestoreInfo, OfAnApplicationThatHasAPlaceholderIsSkipped) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync, "0.9");
    restoreBesideB(kA, appInfo());
    EXPECT_EQ(platform_.registry.placeholder(kA)->bundleVersion, "0.9");
    EXPECT_THAT(platform_.messages(),
                testing::IsSupersetOf(
                    {"processing vessik restore info for 'com.example.a' demotionStatus :0",
                     "Found placeholder for bundle com.example.a",
                     "placeholder already exists for 'com.example.a' - skiping'"}));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.installPlaceholderBundle"}), SizeIs(1));
    EXPECT_THAT(platform_.callsTo({"AppRegistry.enumerateBundles"}),
                ElementsAre("AppRegistry.enumerateBundles(1)"));
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

TEST_F(RestoreInfo, OfTenThousandApplicationsIsAllRestored) {
    constexpr int kCount = 10'000;
    platform_.recorder.setEnabled(false);
    PropertyList info = PropertyList::map(kCount);
    const PropertyList each = appInfo();
    for (int i = 0; i < kCount; ++i) info.set("com.example.n" + std::to_string(i), each);
    setRestoreInfo(info);
    restore();
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), SizeIs(kCount));
}

// Identifiers that no application can have: the registry, or the file system, refuses them.

struct Hostile {
    std::string identifier;
    std::string message;  // begins so
    friend void PrintTo(const Hostile& hostile, std::ostream* out) {
        *out << testing::PrintToString(hostile.identifier);
    }
};

class HostileIdentifier : public RestoreInfo, public testing::WithParamInterface<Hostile> {};

TEST_P(HostileIdentifier, GetsNoPlaceholderAndHarmsNobody) {
    const std::string& identifier = GetParam().identifier;
    platform_.files.addFile("/var/mobile/Library/Preferences/kept", "kept");
    const auto before = platform_.files.paths("/var/mobile/Library/Preferences");
    restoreBesideB(identifier, appInfo());
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kB));
    EXPECT_THAT(platform_.messages(), Contains(StartsWith(GetParam().message)));
    EXPECT_THAT(platform_.messages(),
                Contains("failed to process app restore info for '" + identifier +
                         "'. vessikMetadataDictionary={title = Shown; bundleVersion = 1.0;}"));
    EXPECT_EQ(platform_.files.paths("/var/mobile/Library/Preferences"), before);
}

constexpr const char* kRefusedByRegistry = "Placeholder app install failed from path ";
constexpr const char* kRefusedByFiles = "failed to create app directory for '";

INSTANTIATE_TEST_SUITE_P(Each, HostileIdentifier,
                         testing::Values(Hostile{"", kRefusedByRegistry},
                                         Hostile{".", kRefusedByRegistry},
                                         Hostile{"..", kRefusedByRegistry},
                                         Hostile{"a/../../b", kRefusedByRegistry},
                                         Hostile{"/../../../var/mobile", kRefusedByRegistry},
                                         Hostile{"a/b", kRefusedByRegistry},
                                         Hostile{std::string("a\0b", 3), kRefusedByFiles},
                                         Hostile{"a\nb", kRefusedByRegistry},
                                         Hostile{std::string(300, 'a'), kRefusedByFiles}));

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
