#include <cerrno>
#include <chrono>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class BackupPreparation : public AppsClientFixture {
  protected:
    BackupPreparation() {
        platform_.registry.addApplication(kA);
        platform_.registry.addApplication(kB);
    }
    static std::string metadataPath(const std::string& identifier) {
        return "/var/containers/Bundle/Application/" + identifier + "/VessikMetadata.plist";
    }
    [[nodiscard]] std::vector<std::string> writes() const {
        return platform_.callsTo({"FileSystem.writeFileAtomically"});
    }
};

TEST_F(BackupPreparation, ClearsTheMarkAndNothingElse) {
    platform_.addPropertyList(
        metadataPath(kA),
        PropertyList::map({{"title", "A"}, {"is-auto-download", true}, {"price", 3}}));
    client_->prepareForBackup();
    EXPECT_EQ(platform_.propertyListAt(metadataPath(kA)),
              PropertyList::map({{"title", "A"}, {"price", 3}}));
    EXPECT_TRUE(platform_.files.text(metadataPath(kA))->starts_with("<?xml"));
    EXPECT_THAT(platform_.messageLines(),
                ElementsAre("8 default preparing for backup",
                            "8 default clearing is-auto-download value for com.example.a",
                            "8 default finished preparing for backup"));
    EXPECT_THAT(platform_.callsTo({"AppRegistry"}), ElementsAre("AppRegistry.enumerateBundles(1)"));
}

TEST_F(BackupPreparation, ClearsTheMarkBesideTextThatXmlCannotHold) {
    const std::string text("page\x0c break", 11);
    platform_.addPropertyList(metadataPath(kA),
                              PropertyList::map({{"is-auto-download", true}, {"text", text}}),
                              PropertyListFormat::Binary);
    client_->prepareForBackup();
    EXPECT_EQ(platform_.propertyListAt(metadataPath(kA)), PropertyList::map({{"text", text}}));
}

TEST_F(BackupPreparation, LeavesAFileWithoutTheMarkUntouched) {
    platform_.addPropertyList(metadataPath(kA), PropertyList::map({{"is-auto-download", false}}));
    platform_.addPropertyList(metadataPath(kB), PropertyList::map({{"title", "B"}}));
    const auto before = platform_.files.modificationTime(metadataPath(kA));
    platform_.advance(std::chrono::seconds(1));
    client_->prepareForBackup();
    EXPECT_THAT(writes(), IsEmpty());
    EXPECT_EQ(platform_.files.modificationTime(metadataPath(kA)), before);
}

TEST_F(BackupPreparation, TakesAnyValueThatReadsAsTrueForTheMark) {
    platform_.addPropertyList(metadataPath(kA), PropertyList::map({{"is-auto-download", 1}}));
    platform_.addPropertyList(metadataPath(kB),
                              PropertyList::map({{"is-auto-download", PropertyList::array()}}));
    client_->prepareForBackup();
    EXPECT_EQ(platform_.propertyListAt(metadataPath(kA)), PropertyList::map());
    EXPECT_THAT(writes(), testing::SizeIs(1));
}

TEST_F(BackupPreparation, SkipsAFileThatIsMissingOrNoMap) {
    platform_.addPropertyList(metadataPath(kA), PropertyList::array({"is-auto-download"}));
    client_->prepareForBackup();
    EXPECT_THAT(platform_.messages(),
                ElementsAre("preparing for backup", "finished preparing for backup"));
    EXPECT_THAT(writes(), IsEmpty());
}

TEST_F(BackupPreparation, VisitsEveryApplicationAlthoughAWriteFails) {
    for (const char* identifier : {kA, kB}) {
        platform_.addPropertyList(metadataPath(identifier),
                                  PropertyList::map({{"is-auto-download", true}}));
    }
    platform_.files.failNext(FileOperation::WriteFileAtomically, metadataPath(kA), ENOSPC);
    client_->prepareForBackup();
    EXPECT_EQ(platform_.propertyListAt(metadataPath(kA))->size(), 1U);
    EXPECT_EQ(platform_.propertyListAt(metadataPath(kB))->size(), 0U);
}

}  // namespace
}  // namespace appsync
