#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const std::string kName = "com.korvu.deskora.trd.wsyncnotify";
const std::string kOrder(kIconOrderPath);

class SyncNotification : public AppsClientFixture {};

TEST_F(SyncNotification, SaysThatASyncStarts) {
    AppsClient::_notifyDeskora(platform_.services(), true);
    EXPECT_THAT(
        platform_.lines(),
        ElementsAre("NamedNotifications.registerForState(" + kName + ") -> token 1",
                    "8 default Notifying DK we are starting syncing",
                    "HomeScreenService.blockableConnection() -> a connection",
                    "NamedNotifications.setState(1, 1)", "NamedNotifications.post(" + kName + ")"));
}

TEST_F(SyncNotification, SaysThatASyncIsDone) {
    AppsClient::_notifyDeskora(platform_.services(), true);
    AppsClient::_notifyDeskora(platform_.services(), false);
    EXPECT_TRUE(logged(LogLevel::Default, "Notifying DK we are done syncing"));
    EXPECT_THAT(platform_.notifications.posts(), ElementsAre(kName + "=1", kName + "=0"));
}

TEST_F(SyncNotification, IsNotPostedWhenTheRegistrationFails) {
    platform_.notifications.setRegistrationStatus(9);
    AppsClient::_notifyDeskora(platform_.services(), true);
    EXPECT_THAT(platform_.lines(),
                ElementsAre("NamedNotifications.registerForState(" + kName + ") -> status 9",
                            "8 default Notifying DK we are starting syncing",
                            "HomeScreenService.blockableConnection() -> a connection",
                            "8 error Uh Oh...can't send notification to DK:9"));
}

TEST_F(SyncNotification, IsPostedEvenWhenTheHomeScreenIsNotThere) {
    platform_.homeScreen.setReachable(false);
    AppsClient::_notifyDeskora(platform_.services(), false);
    EXPECT_THAT(platform_.notifications.posts(), ElementsAre(kName + "=0"));
}

class IconOrder : public AppsClientFixture {
  protected:
    IconOrder() {
        platform_.files.addDirectory(std::string(kWorkArea));
        for (const char* identifier : {kA, kB, kC}) items_.add(identifier, identifier);
    }
    std::vector<PropertyList> ordered() {
        return AppsClient::_orderTheItems(platform_.services(), items_);
    }
    ItemMap items_;
};

TEST_F(IconOrder, PutsItemsInHomeScreenOrderFirst) {
    platform_.homeScreen.setLayout({kC, "com.example.other", kB});
    EXPECT_THAT(ordered(), ElementsAre(kC, kB, kA));
    EXPECT_THAT(
        platform_.messageLines(),
        ElementsAre("8 default saved icon sort order", "8 default prioritize com.example.c",
                    "8 default prioritize com.example.b", "8 default lastly com.example.a"));
}

TEST_F(IconOrder, LeavesInTheMapWhatItDidNotPlace) {
    platform_.homeScreen.setLayout({kC, kA});
    EXPECT_THAT(ordered(), ElementsAre(kC, kA, kB));
    EXPECT_FALSE(items_.contains(kA));
    EXPECT_TRUE(items_.contains(kB));
    EXPECT_FALSE(items_.contains(kC));
}

TEST_F(IconOrder, KeepsTheOrderOfTheMapWithoutAnAnswer) {
    platform_.homeScreen.setFlattenedIconState(std::nullopt);
    EXPECT_THAT(ordered(), ElementsAre(kA, kB, kC));
    EXPECT_TRUE(logged(LogLevel::Default, "got no icon sort order from DK"));
    EXPECT_FALSE(platform_.files.exists(kOrder));
}

TEST_F(IconOrder, KeepsTheOrderOfTheMapWithoutAHomeScreen) {
    platform_.homeScreen.setReachable(false);
    EXPECT_THAT(ordered(), ElementsAre(kA, kB, kC));
    EXPECT_TRUE(logged(LogLevel::Default, "got no icon sort order from DK"));
}

TEST_F(IconOrder, PlacesAnIdentifierThatIsListedTwiceOnce) {
    platform_.homeScreen.setLayout({kB, kA, kB});
    EXPECT_THAT(ordered(), ElementsAre(kB, kA, kC));
}

TEST_F(IconOrder, SavesTheBytesOfTheHomeScreenUnchanged) {
    const Bytes bytes{'n', 'o', ' ', 'l', 'i', 's', 't'};
    platform_.homeScreen.setFlattenedIconState(bytes);
    EXPECT_THAT(ordered(), ElementsAre(kA, kB, kC));
    EXPECT_TRUE(logged(LogLevel::Default, "saved icon sort order"));
    EXPECT_EQ(platform_.files.contents(kOrder), bytes);
}

TEST_F(IconOrder, UsesAnOrderThatCannotBeSaved) {
    platform_.homeScreen.setLayout({kC});
    platform_.files.failNext(FileOperation::WriteFileAtomically, kIconOrderPath, ENOSPC);
    EXPECT_THAT(ordered(), ElementsAre(kC, kA, kB));
}

TEST_F(IconOrder, PassesOverWhatIsNoIdentifier) {
    const Result<Bytes> bytes = codec_.serialize(PropertyList::array({7, PropertyList::map(), kB}),
                                                 PropertyListFormat::Xml);
    ASSERT_TRUE(bytes);
    platform_.homeScreen.setFlattenedIconState(*bytes);
    EXPECT_THAT(ordered(), ElementsAre(kB, kA, kC));
}

TEST_F(IconOrder, HasNothingToOrderInAnEmptyMap) {
    items_ = ItemMap();
    platform_.homeScreen.setLayout({kA});
    EXPECT_THAT(ordered(), IsEmpty());
}

}  // namespace
}  // namespace appsync
