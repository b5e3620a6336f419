#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class TodoListLoader : public AppsClientFixture {
  protected:
    std::optional<PropertyList> load() {
        return AppsClient::_loadPlist(platform_.services(), "/list", &error_);
    }
    std::optional<ErrorRecord> error_;
};

TEST_F(TodoListLoader, GivesNothingSilentlyForAFileThatIsMissingOrEmpty) {
    EXPECT_EQ(load(), std::nullopt);
    ASSERT_TRUE(error_);
    EXPECT_EQ(error_->code, ENOENT);
    error_.reset();
    platform_.files.addFile("/list", "");
    EXPECT_EQ(load(), std::nullopt);
    EXPECT_EQ(error_, std::nullopt);
    EXPECT_THAT(platform_.messages(), IsEmpty());
}

TEST_F(TodoListLoader, ReportsAFileThatIsNoPropertyList) {
    platform_.files.addFile("/list", "bplist00 and no more");
    EXPECT_EQ(load(), std::nullopt);
    EXPECT_EQ(error_.value().domain, kPropertyListErrorDomain);
    EXPECT_THAT(platform_.messageLines(), ElementsAre("8 error couldn't parse todo list"));
}

TEST_F(TodoListLoader, RefusesARootThatIsNoArray) {
    platform_.addPropertyList("/list", "text");
    EXPECT_EQ(load(), std::nullopt);
    EXPECT_EQ(error_, std::nullopt);
    EXPECT_THAT(platform_.messageLines(), ElementsAre("8 error todo list is not an array"));
}

TEST_F(TodoListLoader, NeedsNoErrorOutParameter) {
    EXPECT_EQ(AppsClient::_loadPlist(platform_.services(), "/none", nullptr), std::nullopt);
    platform_.files.addFile("/list", "damaged");
    EXPECT_EQ(AppsClient::_loadPlist(platform_.services(), "/list", nullptr), std::nullopt);
}

TEST_F(TodoListLoader, KeepsEveryEntryAsItIs) {
    const auto list = PropertyList::array(
        {todoEntry(kA, "install"), 7, "text", PropertyList::map({{"other key", -1}})});
    platform_.addPropertyList("/list", list);
    EXPECT_EQ(load(), list);
}

}  // namespace
}  // namespace appsync
