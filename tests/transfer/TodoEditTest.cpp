#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class TodoEdit : public AppsClientFixture {
  protected:
    const std::string file_{kTodoListPath};
};

TEST_F(TodoEdit, ChangesTheOperationAndNothingElse) {
    PropertyList entry = todoEntry(kA, "install");
    entry.set("other", PropertyList::array({1, "two"}));
    setTodoList(PropertyList::array({todoEntry(kB, "install"), entry, 7}));
    client_->changeAssetID(kA, "DOWNLOADED");
    entry.set("operation", "DOWNLOADED");
    EXPECT_EQ(platform_.propertyListAt(file_),
              PropertyList::array({todoEntry(kB, "install"), entry, 7}));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default Changing com.example.a from install to DOWNLOADED"));
}

TEST_F(TodoEdit, RewritesAnXmlListInTheBinaryEncoding) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    client_->changeAssetID(kA, "SENT");
    EXPECT_TRUE(platform_.files.text(file_)->starts_with("bplist00"));
    EXPECT_EQ(operationOf(kA), "SENT");
}

TEST_F(TodoEdit, SerialisesTheListOnlyForAnOperationThatItHasNotHeldYet) {
    setTodoList(PropertyList::array(
        {todoEntry(kA, "install"), todoEntry(kB, "install"), todoEntry(kC, "install")}));
    const std::vector<std::pair<std::string, std::string>> edits{
        {kA, "SENT"}, {kB, "SENT"}, {kA, "INSTALLED"}, {kB, "INSTALLED"}, {kC, "SENT"}};
    for (const auto& [identifier, operation] : edits) client_->changeAssetID(identifier, operation);
    EXPECT_THAT(platform_.callsTo({"PropertyListSerialization.serialize"}), SizeIs(2));
    EXPECT_THAT(platform_.callsTo({"FileSystem.writeFileAtomically"}), SizeIs(edits.size()));
    EXPECT_EQ(platform_.propertyListAt(file_),
              PropertyList::array(
                  {todoEntry(kA, "INSTALLED"), todoEntry(kB, "INSTALLED"), todoEntry(kC, "SENT")}));
}

/// A codec as others may write it: with what is asked of every codec.
class PlainCodec : public PropertyListSerialization {
  public:
    Result<PropertyList> parse(ByteView bytes) override { return codec_.parse(bytes); }
    Result<Bytes> serialize(const PropertyList& value, PropertyListFormat format) override {
        return codec_.serialize(value, format);
    }

  private:
    SystemPropertyLists codec_;
};

TEST(TodoEditOfAPlainCodec, SerialisesTheListEachTime) {
    PlainCodec codec;
    SimulatedPlatform platform(codec);
    const Bytes list = *codec.serialize(
        PropertyList::array({PropertyList::map({{"identifier", "a"}, {"operation", "install"}})}),
        PropertyListFormat::Binary);
    platform.files.addFile(std::string(kTodoListPath), list);
    const auto client = AppsClient::create(platform.services());
    for (const std::string_view operation : {"SENT", "INSTALLED", "SENT"}) {
        client->changeAssetID("a", operation);
        EXPECT_EQ(client->_operationStateForIdentifier("a"), operation);
    }
    EXPECT_THAT(platform.callsTo({"PropertyListSerialization.serialize"}), SizeIs(3));
}

TEST_F(TodoEdit, SerialisesWhatSomebodyElseHasWritten) {
    setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kB, "SENT")}));
    client_->changeAssetID(kA, "SENT");
    setTodoList(PropertyList::array({todoEntry(kB, "SENT"), todoEntry(kA, "install")}));
    client_->changeAssetID(kA, "SENT");
    EXPECT_THAT(platform_.callsTo({"PropertyListSerialization.serialize"}), SizeIs(2));
    EXPECT_EQ(platform_.propertyListAt(file_),
              PropertyList::array({todoEntry(kB, "SENT"), todoEntry(kA, "SENT")}));
}

TEST_F(TodoEdit, LeavesAListWithoutTheIdentifierUntouched) {
    setTodoList(PropertyList::array({todoEntry(kB, "install")}));
    client_->changeAssetID(kA, "SENT");
    EXPECT_THAT(platform_.callsTo({"FileSystem.writeFileAtomically"}), IsEmpty());
    EXPECT_TRUE(platform_.files.text(file_)->starts_with("<?xml"));
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(TodoEdit, ChangesOnlyTheFirstEntryOfAnIdentifier) {
    setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kA, "install")}));
    client_->changeAssetID(kA, "FAILED");
    EXPECT_EQ(platform_.propertyListAt(file_),
              PropertyList::array({todoEntry(kA, "FAILED"), todoEntry(kA, "install")}));
}

TEST_F(TodoEdit, OverwritesWhateverWasThere) {
    setTodoList(PropertyList::array({PropertyList::map({{"identifier", kA}})}));
    client_->changeAssetID(kA, "INSTALLED");
    EXPECT_TRUE(logged(LogLevel::Default, "Changing com.example.a from (null) to INSTALLED"));
    client_->changeAssetID(kA, "FAILED");
    EXPECT_EQ(operationOf(kA), "FAILED");
}

TEST_F(TodoEdit, DoesNothingWithoutAList) {
    client_->changeAssetID(kA, "SENT");
    EXPECT_THAT(platform_.messages(), IsEmpty());
    setTodoList(PropertyList::array());
    client_->changeAssetID(kA, "SENT");
    EXPECT_THAT(platform_.callsTo({"FileSystem.writeFileAtomically"}), IsEmpty());
}

TEST_F(TodoEdit, LeavesAFileThatIsNoListAlone) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    client_->changeAssetID(kA, "SENT");
    platform_.recorder.clear();
    for (const std::string text : {"", "no list", "{}"}) {
        platform_.files.addFile(file_, text);
        client_->changeAssetID(kA, "FAILED");
        EXPECT_EQ(platform_.files.text(file_), text);
    }
    EXPECT_THAT(platform_.callsTo({"FileSystem.writeFileAtomically"}), IsEmpty());
    EXPECT_THAT(platform_.messages(),
                ElementsAre("couldn't parse todo list", "couldn't parse todo list"));
    setTodoList(PropertyList::array({todoEntry(kB, "install")}));
    client_->changeAssetID(kA, "FAILED");
    client_->changeAssetID(kB, "FAILED");
    EXPECT_EQ(operationOf(kB), "FAILED");
}

TEST_F(TodoEdit, WritesNothingWhenTheListCannotBeSerialised) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    platform_.propertyLists.failNextSerialize(ErrorRecord::make(kPropertyListErrorDomain, 1, "no"));
    client_->changeAssetID(kA, "SENT");
    EXPECT_EQ(operationOf(kA), "install");
}

TEST_F(TodoEdit, IgnoresThatTheListCannotBeWritten) {
    setTodoList(PropertyList::array({todoEntry(kA, "install")}));
    platform_.files.failNext(FileOperation::WriteFileAtomically, file_, ENOSPC);
    client_->changeAssetID(kA, "SENT");
    EXPECT_EQ(operationOf(kA), "install");
    client_->changeAssetID(kA, "DOWNLOADED");
    EXPECT_TRUE(logged(LogLevel::Default, "Changing com.example.a from install to DOWNLOADED"));
    EXPECT_EQ(operationOf(kA), "DOWNLOADED");
}

TEST_F(TodoEdit, ShowsInTheOperationState) {
    EXPECT_EQ(client_->_operationStateForIdentifier(kA), std::nullopt);
    setTodoList(PropertyList::array({todoEntry(kA, "install"), todoEntry(kA, "remove"),
                                     PropertyList::map({{"identifier", kB}, {"operation", 7}})}));
    EXPECT_EQ(client_->_operationStateForIdentifier(kA), "install");
    EXPECT_EQ(client_->_operationStateForIdentifier(kB), std::nullopt);
    EXPECT_EQ(client_->_operationStateForIdentifier(kC), std::nullopt);
}

}  // namespace
}  // namespace appsync
