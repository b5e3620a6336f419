#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr std::string_view kDownloadInfo = "com.korvu.VessikStore.downloadInfo";

/// Store metadata with this account information.
PropertyList metadata(const PropertyList& accountInfo) {
    return PropertyList::map({{kDownloadInfo, PropertyList::map({{"accountInfo", accountInfo}})}});
}

class Accounts : public AppsClientFixture {
  protected:
    void addApplication(const std::string& identifier, const PropertyList& storeMetadata) {
        platform_.registry.addApplication(identifier);
        platform_.addPropertyList(metadataPath(identifier), storeMetadata);
    }
    static std::string metadataPath(const std::string& identifier) {
        return "/var/containers/Bundle/Application/" + identifier + "/VessikMetadata.plist";
    }
    [[nodiscard]] std::size_t unexpectedTypes(std::string_view name) const {
        const std::string text = "unexpected type for " + std::string(name);
        EXPECT_EQ(platform_.hasMessage(LogLevel::Error, LogCategory::General, text),
                  platform_.countMessages(text) != 0);
        return platform_.countMessages(text);
    }
};

TEST_F(Accounts, HaveTheirIdentifiersInEitherPlace) {
    addApplication(kA, PropertyList::map({{"korvuId", "one"}}));
    addApplication(kB, metadata(PropertyList::map({{"KorvuID", "two"}})));
    EXPECT_THAT(client_->korvuIDsForAssets(), ElementsAre("one", "two"));
    EXPECT_TRUE(logged(LogLevel::Default, "getting id's for assets"));
    EXPECT_TRUE(logged(LogLevel::Default, "Returning korvu ID set: (one, two)"));
    EXPECT_THAT(platform_.messages(), testing::SizeIs(2));
    EXPECT_THAT(platform_.callsTo({"AppRegistry"}), ElementsAre("AppRegistry.enumerateBundles(1)"));
}

TEST_F(Accounts, CountBothIdentifiersThatDiffer) {
    PropertyList map = metadata(PropertyList::map({{"KorvuID", "two"}}));
    map.set("korvuId", "one");
    addApplication(kA, map);
    EXPECT_THAT(client_->korvuIDsForAssets(), ElementsAre("one", "two"));
    EXPECT_TRUE(logged(LogLevel::Default, "mismatched KorvuID keys for com.example.a: one vs two"));
}

TEST_F(Accounts, SayNothingOfIdentifiersThatAgree) {
    PropertyList map = metadata(PropertyList::map({{"KorvuID", "one"}}));
    map.set("korvuId", "one");
    addApplication(kA, map);
    EXPECT_THAT(client_->korvuIDsForAssets(), ElementsAre("one"));
    EXPECT_THAT(platform_.messages(),
                ElementsAre("getting id's for assets", "Returning korvu ID set: (one)"));
}

TEST_F(Accounts, NameTheMetadataThatHasNone) {
    addApplication(kA, PropertyList::map());
    platform_.registry.addApplication(kB);  // without a file
    EXPECT_THAT(client_->korvuIDsForAssets(), IsEmpty());
    for (const std::string identifier : {kA, kB}) {
        EXPECT_TRUE(logged(LogLevel::Default, "unknown KorvuID for " + identifier + " (plist at " +
                                                  metadataPath(identifier) + ")"));
    }
}

TEST_F(Accounts, OfTheSameIdentifierAreOneAccount) {
    addApplication(
        kA,
        metadata(PropertyList::map({{"KorvuID", "one"}, {"QPPersonID", 7}, {"AltQPID", "seven"}})));
    addApplication(kB, metadata(PropertyList::map({{"KorvuID", "one"}, {"QPPersonID", 8}})));
    EXPECT_THAT(client_->accountsForAssets(), ElementsAre(SyncAccountInfo{"one", 7, "seven"}));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default getting accounts for assets",
                            "8 default Returning accountInfo: ({accountID = one; personID = 7; "
                            "alternatePersonID = seven;})"));
}

TEST_F(Accounts, HaveAPersonWhoseNumberNeedsAllOf64Bits) {
    constexpr std::uint64_t kLargest = std::numeric_limits<std::uint64_t>::max();
    addApplication(kA, metadata(PropertyList::map({{"KorvuID", "one"}, {"QPPersonID", kLargest}})));
    EXPECT_THAT(client_->accountsForAssets(),
                ElementsAre(SyncAccountInfo{"one", kLargest, std::nullopt}));
    EXPECT_TRUE(logged(LogLevel::Default,
                       "Returning accountInfo: ({accountID = one; personID = "
                       "18446744073709551615;})"));
    EXPECT_EQ(unexpectedTypes("QPPersonID"), 0U);
}

TEST_F(Accounts, AreKnownByTheTopLevelIdentifierToo) {
    addApplication(kA, PropertyList::map({{"korvuId", "one"}}));
    addApplication(kB, PropertyList::map());
    EXPECT_THAT(client_->accountsForAssets(),
                ElementsAre(SyncAccountInfo{"one", std::nullopt, std::nullopt}));
}

TEST_F(Accounts, TakeAnIdentifierOfTheWrongTypeFromTheTopLevel) {
    PropertyList map = metadata(PropertyList::map({{"KorvuID", 12}, {"QPPersonID", 7}}));
    map.set("korvuId", "one");
    addApplication(kA, map);
    EXPECT_THAT(client_->accountsForAssets(), ElementsAre(SyncAccountInfo{"one", 7, std::nullopt}));
    EXPECT_EQ(unexpectedTypes("KorvuID"), 1U);
}

TEST_F(Accounts, NameEachValueOfTheWrongType) {
    addApplication(kA, PropertyList::map({{"korvuId", 1}, {kDownloadInfo, "text"}}));
    addApplication(kB, metadata("text"));
    addApplication(kC, metadata(PropertyList::map({{"KorvuID", "one"},
                                                   {"QPPersonID", "seven"},
                                                   {"AltQPID", PropertyList::array()}})));
    EXPECT_THAT(client_->accountsForAssets(),
                ElementsAre(SyncAccountInfo{"one", std::nullopt, std::nullopt}));
    for (const char* name : {"korvuID", "downloadInfo", "accountInfo", "QPPersonID", "AltQPID"}) {
        EXPECT_EQ(unexpectedTypes(name), 1U) << name;
    }
}

TEST_F(Accounts, HavePersonsThatAreWholeNumbersOnly) {
    addApplication(kA, metadata(PropertyList::map({{"KorvuID", "one"}, {"QPPersonID", 1.5}})));
    addApplication(kB, metadata(PropertyList::map({{"KorvuID", "two"}, {"QPPersonID", -3}})));
    EXPECT_THAT(client_->accountsForAssets(),
                ElementsAre(SyncAccountInfo{"one", std::nullopt, std::nullopt},
                            SyncAccountInfo{"two", -3, std::nullopt}));
    EXPECT_EQ(unexpectedTypes("QPPersonID"), 1U);
}

TEST_F(Accounts, SkipMetadataThatIsDamagedOrNoMap) {
    platform_.registry.addApplication(kA);
    platform_.files.addFile(metadataPath(kA), "damaged");
    addApplication(kB, PropertyList::array({"one"}));
    EXPECT_THAT(client_->accountsForAssets(), IsEmpty());
    EXPECT_THAT(client_->korvuIDsForAssets(), IsEmpty());
}

}  // namespace
}  // namespace appsync
