#include <cerrno>

#include "tests/client/AppsClientFixture.h"
#include "transfer/RestoreState.h"
#include "transfer/TransferAsset.h"
#include "transfer/TransferItem.h"

namespace appsync {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;
using Access = AppsClientTestAccess;

class OutstandingTransfers : public AppsClientFixture {
  protected:
    OutstandingTransfers() { platform_.files.addDirectory(std::string(kTodoDirectory)); }

    std::vector<std::string> transfers() {
        assets_ = client_->outstandingAssetTransfers();
        std::vector<std::string> identifiers;
        for (const SyncAssetPointer& asset : assets_) identifiers.push_back(asset->identifier);
        return identifiers;
    }
    /// The side files of an application that the host staged.
    static std::string staged(const std::string& identifier) {
        return std::string(kTodoDirectory) + "/" + identifier;
    }
    void addSystemPlaceholder(const std::string& identifier) {
        AppProxy proxy;
        proxy.applicationIdentifier = identifier;
        proxy.applicationType = kApplicationTypeSystem;
        proxy.state.placeholder = true;
        platform_.registry.add(proxy);
    }
    void requestVersion(std::string_view version) {
        PropertyList entry = todoEntry(kA, "install");
        entry.set(kTodoVersionKey, version);
        setTodoList(PropertyList::array({entry}));
    }
    void setPath(const std::string& identifier, const std::string& path,
                 const std::string& version = "1.0") {
        client_->_setRestoreStatePropertyValue(path, "path", identifier, &version);
    }

    std::vector<SyncAssetPointer> assets_;
};

TEST_F(OutstandingTransfers, AreNoneWithoutATodoList) {
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(loggedInApplications(LogLevel::Default,
                                     "outstandingAssetTransfers starting with todoList (null)"));
    EXPECT_TRUE(loggedInApplications(
        LogLevel::Default, "outstandingAssetTransfers preExistingPlaceHolders {}, idsWeWant {}"));
}

TEST_F(OutstandingTransfers, AreTheInstallEntriesOfTheTodoList) {
    setTodoList(PropertyList::array({todoEntry(kB, "install"), todoEntry(kC, "remove"),
                                     todoEntry("x", "INSTALLED"), todoEntry(kA, "install"),
                                     todoEntry("y", "Install"), "install"}));
    EXPECT_THAT(transfers(), ElementsAre(kB, kA));
}

TEST_F(OutstandingTransfers, SayAllThatTheHostNeeds) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    platform_.addPropertyList(staged(kA) + "/Info.plist",
                              PropertyList::map({{"BundleDisplayName", "Shown"}}));
    EXPECT_THAT(transfers(), ElementsAre(kA));
    const SyncAsset& asset = *assets_.front();
    EXPECT_EQ(asset.dataclass, "Application");
    EXPECT_EQ(asset.prettyName, "Shown");
    EXPECT_EQ(asset.icon,
              FileURL::fromPath(std::string(kIconDirectory) + "/com.example.a.png", false));
    EXPECT_EQ(asset.variantOptions, PropertyList::map({{"AssetParts", 1}, {"Version", "1.0"}}));
    EXPECT_EQ(asset.storeMetadataPath, staged(kA) + "/VessikMetadata.plist");
    EXPECT_EQ(asset.infoPath, staged(kA) + "/Info.plist");
    EXPECT_FALSE(asset.isRestore);
    EXPECT_EQ(asset.storeProductID, 0);
}

TEST_F(OutstandingTransfers, AreOfTheVersionThatTheHostNames) {
    requestVersion("2.5");
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_EQ(assets_.front()->variantOptions,
              PropertyList::map({{"AssetParts", 1}, {"Version", "2.5"}}));
}

TEST_F(OutstandingTransfers, RecoverTheDownloadOfTheirOwnVersion) {
    setPath(kA, "/old.zip", "1.0");
    setPath(kA, "/new.zip", "2.5");
    for (const char* path : {"/old.zip", "/new.zip"}) platform_.files.addFile(path, "package");
    requestVersion("2.5");
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_TRUE(logged(LogLevel::Default, "Recovered download path for com.example.a at /new.zip"));
}

TEST_F(OutstandingTransfers, RecoverNoDownloadOfAnotherVersion) {
    setPath(kA, "/old.zip", "1.0");
    platform_.files.addFile("/old.zip", "package");
    requestVersion("2.5");
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("ownload path"))));
}

TEST_F(OutstandingTransfers, LogEachAssetThatIsPrepared) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    platform_.addPropertyList(staged(kA) + "/Info.plist", PropertyList::map());
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Asset com.example.a (pretty=Example, version=1.0) prepped with icon "
                       "file://" +
                           std::string(kIconDirectory) + "/com.example.a.png, at " + staged(kA) +
                           ", meta at " + staged(kA) + "/VessikMetadata.plist, info at " +
                           staged(kA) + "/Info.plist, storePid=0, isRestore=n"));
}

TEST_F(OutstandingTransfers, AreNamedByTheIdentifierInTheLastResort) {
    setTodoList(
        PropertyList::array({PropertyList::map({{"identifier", kA}, {"operation", "install"}}),
                             todoEntry(kB, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kA, kB));
    EXPECT_EQ(assets_[0]->prettyName, kA);
    EXPECT_EQ(assets_[0]->variantOptions, PropertyList::map({{"AssetParts", 1}}));
    EXPECT_EQ(assets_[1]->prettyName, "Example");
}

TEST_F(OutstandingTransfers, FallBackToTheArtworkOfTheHost) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    platform_.icons.failAt(IconStep::HomeScreenIcon);
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_EQ(assets_.front()->icon->path(), staged(kA) + "/VessikArtwork");
}

TEST_F(OutstandingTransfers, GetAPlaceholderEach) {
    setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kB, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kA, kB));
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), ElementsAre(kA, kB));
    EXPECT_EQ(platform_.registry.placeholder(kA)->installType, kInstallTypeSync);
}

TEST_F(OutstandingTransfers, AreReturnedAlthoughTheirPlaceholderFails) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    platform_.registry.failNextPlaceholderInstall(
        kA, ErrorRecord::make(kRegistryErrorDomain, 1, "refused"));
    EXPECT_THAT(transfers(), ElementsAre(kA));
}

TEST_F(OutstandingTransfers, AreNotAskedForAgainWhilePlaceholdersStand) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync, "0.9");
    setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kB, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kB));
    EXPECT_TRUE(logged(LogLevel::Default, "com.example.a already has a placeholder - skipping"));
    EXPECT_TRUE(
        logged(LogLevel::Default,
               "Not creating a placeholder app for com.example.a because we already have one"));
}

TEST_F(OutstandingTransfers, ArePreparedFromThePlaceholderThatStands) {
    platform_.registry.addPlaceholder(kA, kInstallTypeSync, "0.9");
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    EXPECT_THAT(transfers(), IsEmpty());
    const std::string container = "/var/containers/Bundle/Placeholder/com.example.a";
    EXPECT_THAT(platform_.messages(),
                Contains(testing::AllOf(StartsWith("Asset com.example.a"), HasSubstr("version=0.9"),
                                        HasSubstr("at " + container + "/com.example.a.app, "),
                                        HasSubstr("meta at " + container + "/Vessik"))));
}

TEST_F(OutstandingTransfers, LogTheItemsOfPlaceholders) {
    platform_.registry.addPlaceholder(kA, kInstallTypeRestore);
    platform_.registry.addPlaceholder(kB, kInstallTypeIntentionalDowngrade);
    platform_.registry.addPlaceholder(kC, kInstallTypeDowngrade);
    static_cast<void>(transfers());
    const auto flags = [](const char* values) { return HasSubstr(values); };
    EXPECT_THAT(
        platform_.messages(),
        Contains(testing::AllOf(
            StartsWith("outstandingAssetTransfers preExistingPlaceHolders {com.example.a = "),
            flags(
                "IsRestore = 1; intentional_demoted_app = 0; auto_demoted_app = 0; system_app = 0"),
            flags(
                "IsRestore = 0; intentional_demoted_app = 1; auto_demoted_app = 0; system_app = 0"),
            flags("IsRestore = 0; intentional_demoted_app = 0; auto_demoted_app = 1; "
                  "system_app = 0"))));
}

TEST_F(OutstandingTransfers, AreEntriesOnceForAnIdentifierThatIsListedTwice) {
    setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kA, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_EQ(platform_.countMessages("com.example.a already has a placeholder - skipping"), 1U);
}

TEST_F(OutstandingTransfers, IgnoreIdentifiersThatAreNotSafe) {
    setTodoList(PropertyList::array({todoEntry("a/../b", "install"), todoEntry(7, "install"),
                                     PropertyList::map({{"operation", "install"}})}));
    EXPECT_THAT(transfers(), IsEmpty());
    for (const char* value : {"a/../b", "7", "(null)"}) {
        EXPECT_TRUE(logged(LogLevel::Default, std::string("Ignoring invalid path: ") + value));
    }
}

TEST_F(OutstandingTransfers, AcceptTwoDotsWithoutASlashBeforeThem) {
    setTodoList(PropertyList::array({todoEntry("com..example", "install")}));
    EXPECT_THAT(transfers(), ElementsAre("com..example"));
}

TEST_F(OutstandingTransfers, SurviveIdentifiersOfEveryKind) {
    const std::vector<std::string> identifiers{
        "", ".", "..", "a/b", std::string("a\0b", 3), "a\nb", std::string(300, 'x'), "a//b"};
    PropertyList list = PropertyList::array();
    for (const std::string& identifier : identifiers) list.append(todoEntry(identifier, "install"));
    platform_.addPropertyList(std::string(kTodoListPath), list, PropertyListFormat::Binary);
    EXPECT_EQ(transfers(), identifiers);
    EXPECT_THAT(platform_.registry.placeholderIdentifiers(), IsEmpty());
}

TEST_F(OutstandingTransfers, LeaveOutWhatIsInProgressWhicheverSourceItComesFrom) {
    platform_.registry.addPlaceholder(kA, kInstallTypeStoreDownload);
    platform_.registry.setProgress(kA, {kInstallStateActive, kInstallPhaseLoading, 0, 0});
    platform_.registry.addPlaceholder(kB, kInstallTypeStoreDownload);
    platform_.registry.setProgress(kB, {kInstallStateActive, kInstallPhaseInstalling, 0, 0});
    setTodoList(PropertyList::array({todoEntry(kB, "install"), todoEntry(kC, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kC));
    EXPECT_TRUE(
        logged(LogLevel::Default,
               "Assets already in progress (not returning these): (com.example.a, com.example.b)"));
    EXPECT_TRUE(logged(LogLevel::Default, "Assets currently restoring: ()"));
    for (const std::string identifier : {kA, kB}) {
        EXPECT_THAT(platform_.messages(), Not(Contains(StartsWith("Asset " + identifier))));
    }
}

TEST_F(OutstandingTransfers, AreNotHeldUpByRestores) {
    platform_.registry.addPlaceholder(kA, kInstallTypeRestore);
    platform_.registry.setProgress(kA, {kInstallStateActive, kInstallPhaseLoading, 0, 0});
    static_cast<void>(transfers());
    EXPECT_TRUE(logged(LogLevel::Default, "Assets currently restoring: (com.example.a)"));
    EXPECT_THAT(platform_.messages(), Contains(StartsWith("Asset com.example.a")));
}

TEST_F(OutstandingTransfers, FollowTheHomeScreen) {
    platform_.homeScreen.setLayout({kC, kB});
    setTodoList(PropertyList::array(
        {todoEntry(kA, "install"), todoEntry(kB, "install"), todoEntry(kC, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kC, kB, kA));
}

TEST_F(OutstandingTransfers, AreRestoresOnlyWhenInstallingIsNotAllowed) {
    platform_.policy.set(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    platform_.registry.addPlaceholder(kA, kInstallTypeRestore);
    setTodoList(PropertyList::array({todoEntry(kB, "install")}));
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(
        logged(LogLevel::Default,
               "skipping com.example.b - its not a restore and app installation is disabled"));
    EXPECT_THAT(platform_.messages(), Contains(StartsWith("Asset com.example.a")));
    EXPECT_THAT(platform_.callsTo({"DevicePolicyService"}), testing::SizeIs(1));
}

TEST_F(OutstandingTransfers, SkipARestoreThatIsToBeIgnored) {
    Access::kolmAppsToIgnore(*client_) = {kA, kB};
    platform_.registry.addPlaceholder(kA, kInstallTypeRestore);
    setTodoList(PropertyList::array({todoEntry(kB, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kB)) << "only restores are ignored";
    EXPECT_TRUE(
        logged(LogLevel::Default,
               "com.example.a is currenlty marked as to be ignored for download - skipping"));
}

TEST_F(OutstandingTransfers, SkipPlaceholdersOfSystemApplications) {
    addSystemPlaceholder(kA);
    EXPECT_THAT(transfers(), IsEmpty());
    EXPECT_TRUE(logged(LogLevel::Default, "com.example.a is system app placeholder - skipping"));
    EXPECT_THAT(platform_.messages(), Contains(HasSubstr("system_app = 1")));
    EXPECT_THAT(platform_.messages(), Not(Contains(StartsWith("Asset com.example.a"))));
    EXPECT_THAT(platform_.messages(), Not(Contains(StartsWith("Not creating a placeholder"))));
}

TEST_F(OutstandingTransfers, DoNotFilterDemotedApplications) {
    platform_.registry.addPlaceholder(kA, kInstallTypeDowngrade);
    platform_.registry.addPlaceholder(kB, kInstallTypeIntentionalDowngrade);
    static_cast<void>(transfers());
    EXPECT_THAT(platform_.messages(), Contains(StartsWith("Asset com.example.a")));
    EXPECT_THAT(platform_.messages(), Contains(StartsWith("Asset com.example.b")));
}

TEST_F(OutstandingTransfers, EmptyTheIconDirectory) {
    platform_.files.addFile(std::string(kIconDirectory) + "/old.png", "old");
    platform_.addPropertyList(staged(kA) + "/Info.plist", PropertyList::map());
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    static_cast<void>(transfers());
    EXPECT_THAT(platform_.files.names(std::string(kIconDirectory)),
                ElementsAre("com.example.a.png"));
}

TEST_F(OutstandingTransfers, GoOnWithoutAnIconDirectory) {
    platform_.files.failNext(FileOperation::CreateDirectory, kIconDirectory, EROFS);
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    EXPECT_THAT(transfers(), ElementsAre(kA));
    EXPECT_THAT(platform_.messageLines(),
                Contains(StartsWith("8 error Can't create icon scratch dir! Error Domain=POSIX")));
    EXPECT_EQ(assets_.front()->icon->path(), staged(kA) + "/VessikArtwork");
}

TEST_F(OutstandingTransfers, SeeARecordedDownloadThatIsForgottenMeanwhile) {
    setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kB, "install")}));
    setPath(kA, packagePath(kA));
    setPath(kB, packagePath(kB));
    platform_.files.addFile(packagePath(kA), "package");
    platform_.onCall("AppRegistry.installPlaceholderBundle",
                     [this](const RecordEntry&) { client_->cleanRestoreStateForIdentifier(kB); });
    transfers();
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Recovered download path for com.example.a at " + packagePath(kA)));
    EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("but the file is missing"))));
}

// The parts that are asked for. A restore comes from a placeholder that stands, so that none is
// returned; the parts are what the client would ask for.

struct PartsCase {
    bool recorded;
    bool fileExists;
    unsigned restoreParts;
    const char* message;  // how it begins
};

class AssetPartsToAskFor : public OutstandingTransfers,
                           public testing::WithParamInterface<PartsCase> {
  protected:
    AssetPartsToAskFor() {
        const std::string path = packagePath(kA);
        if (GetParam().recorded) setPath(kA, path);
        if (GetParam().fileExists) platform_.files.addFile(path, "package");
    }
    unsigned parts(bool isRestore) {
        TransferItem item;
        item.identifier = kA;
        item.version = "1.0";
        item.isRestore = isRestore;
        return assetPartsFor(*client_, platform_.services(), item);
    }
    void expectMessage() const {
        const std::string begin = GetParam().message;
        if (begin.empty()) {
            EXPECT_THAT(platform_.messages(), Not(Contains(HasSubstr("ownload path"))));
        } else {
            EXPECT_TRUE(logged(LogLevel::Default, begin + packagePath(kA)));
        }
    }
};

TEST_P(AssetPartsToAskFor, OfARestoreDependOnTheRecordedPackage) {
    EXPECT_EQ(parts(true), GetParam().restoreParts);
    expectMessage();
}

TEST_P(AssetPartsToAskFor, OfASyncAreAlwaysTheApplication) {
    EXPECT_EQ(parts(false), kAssetPartApplication);
    expectMessage();
}

constexpr const char* kRecovered = "Recovered download path for com.example.a at ";
constexpr const char* kMissing =
    "Download path recovered for com.example.a but the file is missing: ";

INSTANTIATE_TEST_SUITE_P(EveryState, AssetPartsToAskFor,
                         testing::Values(PartsCase{true, true, kAssetPartApplicationData,
                                                   kRecovered},
                                         PartsCase{true, false, kAssetPartBoth, kMissing},
                                         PartsCase{false, false, kAssetPartBoth, ""}));

/// Reads one list, from whatever bytes: the real codec is not what is tested here.
class OneListCodec : public PropertyListSerialization {
  public:
    explicit OneListCodec(PropertyList list) : list_(std::move(list)) {}
    Result<PropertyList> parse(ByteView bytes) override {
        return bytes.empty() ? PropertyList::array() : list_;
    }
    Result<Bytes> serialize(const PropertyList&, PropertyListFormat) override { return Bytes{}; }

  private:
    const PropertyList list_;
};

TEST(LongTodoList, IsPlannedWithoutTouchingWhatIsNotWanted) {
    PropertyList list = PropertyList::array();
    for (int i = 0; i < 200'000; ++i) {
        const std::string identifier = "com.example." + std::to_string(i);
        list.append(todoEntry(identifier, i % 20 == 0 ? "install" : "INSTALLED"));
    }
    OneListCodec codec(std::move(list));
    SimulatedPlatform platform(codec);
    platform.recorder.setEnabled(false);
    platform.policy.set(PolicyFeature::AppInstallationAllowed, PolicyAnswer::No);
    platform.files.addFile(std::string(kTodoListPath), "list");
    const auto client = AppsClient::create(platform.services());
    std::size_t skipped = 0;
    platform.onCall("FileSystem.readFile", [&](const RecordEntry&) { ++skipped; });
    EXPECT_THAT(client->outstandingAssetTransfers(), IsEmpty());
    EXPECT_EQ(skipped, 10'000U + 1U) << "each wanted one's info, and the list";
}

}  // namespace
}  // namespace appsync
