// Restore information as no backup should make it, on the direct path and through coordinators:
// each application fails alone, the others are restored, and the file is moved once.

#include <cerrno>
#include <ostream>

#include "tests/restore/RestoreFixture.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;
using testing::StartsWith;

enum class Path { Direct, Coordinated };

std::string nameOf(const testing::TestParamInfo<Path>& info) {
    return info.param == Path::Direct ? "Direct" : "Coordinated";
}

class BadRestoreInfo : public RestoreFixture, public testing::WithParamInterface<Path> {
  protected:
    BadRestoreInfo() {
        if (isCoordinated()) coordinate();
        platform_.clearRecording();
    }
    static bool isCoordinated() { return GetParam() == Path::Coordinated; }

    /// The information of A is restored between two applications that have everything.
    void restoreA(const PropertyList& info) { restoreBetween(kA, info); }
    void restoreBetween(const std::string& identifier, const PropertyList& info) {
        setRestoreInfo(PropertyList::map({{kB, appInfo()}, {identifier, info}, {kC, appInfo()}}));
        const SimulatedTime start = platform_.now();
        restore();
        EXPECT_EQ(platform_.now(), start) << "nothing is waited for";
        EXPECT_TRUE(platform_.registry.placeholder(kB));
        EXPECT_TRUE(platform_.registry.placeholder(kC));
        EXPECT_THAT(AppsClientTestAccess::placeholdersForRestoringApps(*client_), IsEmpty());
        expectInfoMovedOnce();
    }
    void forgetEarlierRestores() {
        for (const char* identifier : {kB, kC}) {
            if (platform_.coordination.state(identifier) != nullptr) {
                platform_.coordination.cancel(identifier, {"Test", 1, {}}, SyncClientID);
            }
            platform_.registry.hidePlaceholder(identifier);
        }
        platform_.runUntilIdle();
        makeClient();  // one that has waited before counts no reports
        platform_.clearRecording();
    }
    void expectNoPlaceholder() {
        EXPECT_FALSE(platform_.registry.placeholder(kA));
        EXPECT_EQ(platform_.coordination.state(kA), nullptr);
    }
    void expectPlaceholder(const std::string& name) {
        const auto placeholder = platform_.registry.placeholder(kA);
        ASSERT_TRUE(placeholder);
        EXPECT_EQ(placeholder->displayName, name);
        EXPECT_EQ(placeholder->installType, kInstallTypeRestore);
    }
    /// A restore of information that cannot be used at all, with these messages or what begins so.
    void expectOnlyMoved(const std::vector<std::string>& messages) {
        EXPECT_FALSE(client_->_processVessikRestoreInfo());
        expectInfoMovedOnce();
        std::vector<testing::Matcher<std::string>> beginnings;
        for (const std::string& each : messages) beginnings.push_back(StartsWith(each));
        EXPECT_THAT(platform_.messageLines(), testing::ElementsAreArray(beginnings));
        EXPECT_FALSE(AppsClientTestAccess::finishedWaitingForPlaceHolderInstalls(*client_));
        EXPECT_THAT(platform_.callsTo({"WaitGroup", "AppRegistry", "InstallCoordinatorService"}),
                    IsEmpty());
    }
    void expectDamaged(const Bytes& contents) {
        platform_.files.addFile(kInfoPath, contents);
        expectOnlyMoved({"8 default processing vessik restore info",
                         "8 default failed to parse vessik app restore info. err=Error "
                         "Domain=PropertyList"});
    }
};

// The file as a whole.

TEST_P(BadRestoreInfo, ThatIsMissingIsNotMoved) {
    EXPECT_TRUE(client_->_processVessikRestoreInfo());
    EXPECT_THAT(platform_.lines(),
                ElementsAre("FileSystem.itemExists(" + kInfoPath + ") -> no",
                            "8 default no vessik restore plist found - skipping processing of "
                            "vessik restored apps"));
    EXPECT_FALSE(AppsClientTestAccess::finishedWaitingForPlaceHolderInstalls(*client_));
}

TEST_P(BadRestoreInfo, ThatCannotBeReadIsOnlyMoved) {
    setRestoreInfo(PropertyList::map({{kA, appInfo()}}));
    platform_.files.failNext(FileOperation::ReadFile, kInfoPath, EIO);
    expectOnlyMoved(
        {"8 default failed to read vessik app restore info. err=Error Domain=POSIX Code=5"});
}

TEST_P(BadRestoreInfo, ThatIsADirectoryIsOnlyMoved) {
    platform_.files.addDirectory(kInfoPath);
    expectOnlyMoved({"8 default failed to read vessik app restore info. err=Error Domain=POSIX"});
}

TEST_P(BadRestoreInfo, ThatIsEmptyIsOnlyMoved) { expectDamaged({}); }

TEST_P(BadRestoreInfo, ThatIsCutOffAnywhereIsOnlyMoved) {
    const Bytes whole = bytesOf(PropertyList::map({{kA, bareAppInfo()}}));
    for (std::size_t length = 1; length < whole.size(); length += 7) {
        platform_.files.remove(kMovedPath);
        platform_.clearRecording();
        expectDamaged(Bytes(whole.begin(), whole.begin() + static_cast<std::ptrdiff_t>(length)));
    }
}

TEST_P(BadRestoreInfo, ThatIsNoMapIsOnlyMoved) {
    for (const PropertyList& value :
         {PropertyList::array({kA}), PropertyList("text"), PropertyList(7), PropertyList(true)}) {
        platform_.files.remove(kMovedPath);
        platform_.clearRecording();
        expectDamaged(bytesOf(value));
        EXPECT_THAT(platform_.messages().back(), HasSubstr("the top level is not a map"));
    }
}

// One application among others.

TEST_P(BadRestoreInfo, OfAnApplicationThatIsNoMapIsSkipped) {
    for (const PropertyList& value : {PropertyList::array({"VessikMetadata"}), PropertyList("text"),
                                      PropertyList(1), PropertyList(icon_)}) {
        forgetEarlierRestores();
        restoreA(value);
        EXPECT_TRUE(
            logged(LogLevel::Default, "no vessik restore info for 'com.example.a' - skipping"));
        expectNoPlaceholder();
    }
}

TEST_P(BadRestoreInfo, WithoutMetadataIsIgnored) {
    restoreA(PropertyList::map({{"ApplicationSINF", sinf_}, {"PlaceholderIcon", icon_}}));
    EXPECT_TRUE(logged(LogLevel::Default, "no VessikMetadata for 'com.example.a' - ignoring"));
    expectNoPlaceholder();
}

TEST_P(BadRestoreInfo, WithMetadataThatIsNoDataIsIgnored) {
    restoreA(PropertyList::map({{"VessikMetadata", storeMetadata()}}));
    EXPECT_TRUE(logged(LogLevel::Default, "no VessikMetadata for 'com.example.a' - ignoring"));
    expectNoPlaceholder();
}

TEST_P(BadRestoreInfo, WithDamagedMetadataFailsAlone) {
    const std::string level = isCoordinated() ? "8 error " : "8 default ";
    for (const Bytes& metadata :
         {Bytes(), Bytes{'x'}, bytesOf(PropertyList::array({1})), bytesOf(PropertyList("text"))}) {
        forgetEarlierRestores();
        restoreA(PropertyList::map({{"VessikMetadata", metadata}}));
        EXPECT_THAT(platform_.messageLines(),
                    Contains(StartsWith(level + "failed to parse vessik metadata for "
                                                "'com.example.a'. err=Error Domain=PropertyList")));
        expectNoPlaceholder();
        EXPECT_FALSE(platform_.files.exists("/tmp/com.korvu.trd.Apps/com.example.a.app"));
    }
}

TEST_P(BadRestoreInfo, WithoutATitleIsNamedByTheIdentifierOrNotMade) {
    restoreA(appInfo(PropertyList::map({{"bundleVersion", "1.0"}})));
    if (isCoordinated()) return expectPlaceholder(kA);
    expectNoPlaceholder();
    EXPECT_THAT(scenarios(),
                Contains("Vessik App Restore|com.example.a|no|Failed to create placeholder info"));
}

TEST_P(BadRestoreInfo, WithoutAVersionIsMadeThroughCoordinatorsOnly) {
    restoreA(appInfo(PropertyList::map({{"title", "Shown"}})));
    if (isCoordinated()) return expectPlaceholder("Shown");
    expectNoPlaceholder();
    EXPECT_THAT(platform_.messageLines(),
                Contains(StartsWith("8 default failed to create placeholder info at ")));
}

TEST_P(BadRestoreInfo, WithAnIconThatIsNoDataIsRestoredWithoutIt) {
    PropertyList info = appInfo();
    info.set("PlaceholderIcon", "text");
    restoreA(info);
    EXPECT_TRUE(logged(LogLevel::Error, "no icon data for 'com.example.a'"));
    expectPlaceholder("Shown");
}

TEST_P(BadRestoreInfo, WithADamagedIconIsRestoredWithWhatThereIs) {
    PropertyList info = appInfo();
    info.set("PlaceholderIcon", Bytes{0xff, 0x00, 0xff});
    restoreA(info);
    expectPlaceholder("Shown");
    EXPECT_EQ(platform_.files.contents("/tmp/com.korvu.trd.Apps/com.example.a.app/Icon.png"),
              (Bytes{0xff, 0x00, 0xff}));
}

TEST_P(BadRestoreInfo, WithAnEmptyIconIsRestored) {
    PropertyList info = appInfo();
    info.set("PlaceholderIcon", Bytes());
    restoreA(info);
    EXPECT_THAT(platform_.messages(), Contains(testing::EndsWith("with status:1 fileSize:0")));
    expectPlaceholder("Shown");
}

TEST_P(BadRestoreInfo, WithSinfDataThatIsNoDataIsRestoredWithoutIt) {
    PropertyList info = appInfo();
    info.set("ApplicationSINF", PropertyList::map({{"sinf", sinf_}}));
    restoreA(info);
    expectPlaceholder("Shown");
    if (isCoordinated()) {
        EXPECT_EQ(platform_.coordination.placeholder(kA)->sinf, std::nullopt);
    } else {
        const PropertyList options = platform_.registry.placeholderOptions(kA);
        EXPECT_THAT(options.find("ApplicationSINF"), testing::Pointee(PropertyList()));
    }
}

TEST_P(BadRestoreInfo, OfIdentifiersThatNoApplicationCanHaveFailsAlone) {
    platform_.files.addFile("/var/mobile/Library/Preferences/kept", "kept");
    const auto before = platform_.files.paths("/var/mobile/Library/Preferences");
    for (const std::string& identifier :
         {std::string("../x"), std::string("a/b"), std::string(), std::string("x/../../y"),
          std::string("/../../../var/mobile"), std::string(300, 'a'), std::string("a\0b", 3),
          std::string("a\nb"), std::string("."), std::string("..")}) {
        forgetEarlierRestores();
        restoreBetween(identifier, appInfo());
        EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kB, kC));
        const std::string failure =
            isCoordinated()
                ? "processing app restore for " + identifier + " finished with status 0 error"
                : "failed to process app restore info for '" + identifier + "'.";
        EXPECT_THAT(platform_.messages(), Contains(StartsWith(failure)));
        EXPECT_EQ(platform_.files.paths("/var/mobile/Library/Preferences"), before);
    }
}

TEST_P(BadRestoreInfo, OfTenThousandApplicationsIsAllRestored) {
    constexpr int kCount = 10'000;
    platform_.recorder.setEnabled(false);
    PropertyList info = PropertyList::map(kCount);
    const PropertyList each = appInfo();
    for (int i = 0; i < kCount; ++i) info.set("com.example.n" + std::to_string(i), each);
    setRestoreInfo(info);
    restore();
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), SizeIs(kCount));
    EXPECT_EQ(platform_.now(), SimulatedTime(0));
}

TEST_P(BadRestoreInfo, WithADemotedListThatHoldsNoArraysIsRestored) {
    setDemotedApps(PropertyList::map(
        {{"AutomaticDowngrades", PropertyList::map({{kA, true}})}, {"IntentionalDowngrades", kA}}));
    restoreA(appInfo());
    expectPlaceholder("Shown");
    EXPECT_TRUE(logged(LogLevel::Default,
                       "processing vessik restore info for 'com.example.a' demotionStatus :0"));
}

INSTANTIATE_TEST_SUITE_P(Each, BadRestoreInfo, testing::Values(Path::Direct, Path::Coordinated),
                         nameOf);

}  // namespace
}  // namespace appsync
