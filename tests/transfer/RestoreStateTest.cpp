#include "transfer/RestoreState.h"

#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

const std::string kFile(kRestoreStatePath);
const std::string kOne = "1.0";
const std::string kTwo = "2.0";

class RestoreStateStore : public AppsClientFixture {
  protected:
    RestoreStateStore() { platform_.files.addDirectory(std::string(kWorkArea)); }

    std::optional<PropertyList> path(const std::string& identifier, const std::string& version) {
        return client_->_restoreStatePropertyForKey("path", identifier, &version);
    }
    void setPath(const std::string& identifier, const std::string& version,
                 const std::string& value) {
        client_->_setRestoreStatePropertyValue(value, "path", identifier, &version);
    }
    void clean(const std::string& identifier) {
        client_->cleanRestoreStateForIdentifier(identifier);
    }
    [[nodiscard]] std::vector<std::string> writes() const {
        return platform_.callsTo({"FileSystem.writeFileAtomically"});
    }
};

TEST_F(RestoreStateStore, HoldsNothingAtFirst) {
    EXPECT_EQ(path(kA, kOne), std::nullopt);
    clean(kA);
    EXPECT_THAT(platform_.callsTo({"FileSystem.removeItem"}), IsEmpty());
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(RestoreStateStore, KeepsAPathForEachVersion) {
    setPath(kA, kOne, "/one");
    setPath(kA, kTwo, "/two");
    setPath(kB, kOne, "/b");
    EXPECT_EQ(path(kA, kOne), PropertyList("/one"));
    EXPECT_EQ(path(kA, kTwo), PropertyList("/two"));
    EXPECT_EQ(path(kB, kTwo), std::nullopt);
    EXPECT_EQ(path(kC, kOne), std::nullopt);
}

TEST_F(RestoreStateStore, StoresAnyKindOfProperty) {
    client_->_setRestoreStatePropertyValue(7, "number", kA, &kOne);
    setPath(kA, kOne, "/one");
    EXPECT_EQ(client_->_restoreStatePropertyForKey("number", kA, &kOne), PropertyList(7));
    EXPECT_EQ(platform_.propertyListAt(kFile),
              PropertyList::map(
                  {{kA, PropertyList::map(
                            {{kOne, PropertyList::map({{"number", 7}, {"path", "/one"}})}})}}));
}

TEST_F(RestoreStateStore, IsWrittenAsXml) {
    setPath(kA, kOne, "/one");
    EXPECT_TRUE(platform_.files.text(kFile)->starts_with("<?xml"));
}

TEST_F(RestoreStateStore, ForgetsEveryVersionOfAnApplication) {
    setPath(kA, kOne, "/one");
    setPath(kA, kTwo, "/two");
    setPath(kB, kOne, "/b");
    clean(kA);
    EXPECT_EQ(path(kA, kOne), std::nullopt);
    EXPECT_EQ(path(kA, kTwo), std::nullopt);
    EXPECT_EQ(path(kB, kOne), PropertyList("/b"));
}

TEST_F(RestoreStateStore, IsDeletedWithItsLastApplication) {
    setPath(kA, kOne, "/one");
    setPath(kA, kTwo, "/two");
    clean(kA);
    EXPECT_FALSE(platform_.files.exists(kFile));
}

TEST_F(RestoreStateStore, StaysWhenAnUnknownApplicationIsForgotten) {
    setPath(kA, kOne, "/one");
    clean(kB);
    EXPECT_EQ(path(kA, kOne), PropertyList("/one"));
}

TEST_F(RestoreStateStore, NeedsAVersion) {
    client_->_setRestoreStatePropertyValue("/one", "path", kA, nullptr);
    EXPECT_FALSE(platform_.files.exists(kFile));
    setPath(kA, kOne, "/one");
    EXPECT_EQ(client_->_restoreStatePropertyForKey("path", kA, nullptr), std::nullopt);
}

class DamagedRestoreState : public RestoreStateStore,
                            public testing::WithParamInterface<std::string> {};

TEST_P(DamagedRestoreState, HoldsNothingIsNotWrittenOverAndGoesWithTheFirstClean) {
    platform_.files.addFile(kFile, GetParam());
    EXPECT_EQ(path(kA, kOne), std::nullopt);
    setPath(kA, kOne, "/one");
    EXPECT_EQ(platform_.files.text(kFile), GetParam());
    EXPECT_THAT(writes(), IsEmpty());
    clean(kA);
    EXPECT_FALSE(platform_.files.exists(kFile));
}

INSTANTIATE_TEST_SUITE_P(
    EveryWay, DamagedRestoreState,
    testing::Values("", "no property list", "bplist00",
                    "<?xml version=\"1.0\"?><plist version=\"1.0\"><array/></plist>"));

TEST_F(RestoreStateStore, TakesALevelThatIsNoMapForAMissingOne) {
    platform_.addPropertyList(kFile, PropertyList::map({{kA, "text"}, {kB, 7}}));
    EXPECT_EQ(path(kA, kOne), std::nullopt);
    setPath(kA, kOne, "/one");
    EXPECT_EQ(path(kA, kOne), PropertyList("/one"));
    EXPECT_EQ(platform_.propertyListAt(kFile)->find(kB)->asInteger(), 7);
}

TEST_F(RestoreStateStore, IgnoresWhatCannotBeWrittenOrDeleted) {
    platform_.files.failNext(FileOperation::WriteFileAtomically, kFile, ENOSPC);
    setPath(kA, kOne, "/one");
    EXPECT_FALSE(platform_.files.exists(kFile));
    setPath(kA, kOne, "/one");
    platform_.files.failNext(FileOperation::RemoveItem, kFile, EIO);
    clean(kA);
    EXPECT_TRUE(platform_.files.exists(kFile));
}

TEST_F(RestoreStateStore, StartsAnewWhenTheFileCannotBeRead) {
    setPath(kA, kOne, "/one");
    platform_.files.failNext(FileOperation::ReadFile, kFile, EIO);
    EXPECT_EQ(path(kA, kOne), std::nullopt);
    platform_.files.failNext(FileOperation::ReadFile, kFile, EIO);
    clean(kA);
    EXPECT_EQ(path(kA, kOne), PropertyList("/one"));
    platform_.files.failNext(FileOperation::ReadFile, kFile, EIO);
    setPath(kB, kOne, "/b");
    EXPECT_EQ(path(kA, kOne), std::nullopt);
    EXPECT_EQ(path(kB, kOne), PropertyList("/b"));
}

TEST_F(RestoreStateStore, IsEditedUnderItsLock) {
    setPath(kA, kOne, "/one");
    EXPECT_THAT(platform_.callsTo({"Lock#2", "FileSystem"}),
                ElementsAre("Lock#2.lock()", HasSubstr("readFile"),
                            HasSubstr("writeFileAtomically"), "Lock#2.unlock()"));
}

TEST_F(RestoreStateStore, ThatIsDamagedIsLeftAsItIs) {
    platform_.files.addFile(kFile, "damaged");
    const Platform services = platform_.services();
    RestoreState state(services);
    EXPECT_TRUE(state.isDamaged());
    state.setProperty("/a", "path", kA, kOne);
    state.erase(kA);
    state.write(services);
    EXPECT_EQ(state.property("path", kA, &kOne), nullptr);
    EXPECT_EQ(platform_.files.text(kFile), "damaged");
    EXPECT_THAT(writes(), IsEmpty());
}

TEST_F(RestoreStateStore, IsParsedAgainOnlyWhenItsBytesAreOthers) {
    setPath(kA, kOne, "/a.zip");
    platform_.clearRecording();
    EXPECT_TRUE(path(kA, kOne));
    EXPECT_TRUE(path(kA, kOne));
    EXPECT_THAT(platform_.callsTo({"PropertyListSerialization.parse"}), testing::SizeIs(1));
    setPath(kA, kOne, "/b.zip");
    EXPECT_EQ(path(kA, kOne), "/b.zip");
}

}  // namespace
}  // namespace appsync
