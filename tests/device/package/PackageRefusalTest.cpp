#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>
#include <limits>

#include "tests/device/package/PackageFixture.h"

namespace appsync {

namespace {

using Code = PackageErrorCode;

/// A package that is refused for an entry beside a whole application.
struct RefusedEntry {
    const char* what;
    ZipEntry entry;
    Code code;
    const char* sentence;
};

std::ostream& operator<<(std::ostream& out, const RefusedEntry& entry) { return out << entry.what; }

class RefusedEntryTest : public PackageFixture,
                         public ::testing::WithParamInterface<RefusedEntry> {};

TEST_P(RefusedEntryTest, isRefusedBeforeAnythingIsUnpacked) {
    const RefusedEntry& param = GetParam();
    EXPECT_TRUE(refused(open(atlasWith({param.entry})), param.code, param.sentence));
}

std::string repeated(std::string_view text, int times) {
    std::string result;
    for (int i = 0; i < times; ++i) result += text;
    return result;
}

ZipEntry encrypted() {
    ZipEntry entry = zipFile("Atlas.app/secret", "0123456789abcdef");
    entry.flags = 1;
    return entry;
}

ZipEntry ofMethod(std::uint16_t method) {
    ZipEntry entry = zipFile("Atlas.app/packed", "contents");
    entry.method = method;
    return entry;
}

ZipEntry withLocalName(std::string_view name) {
    ZipEntry entry = zipFile("Atlas.app/one", "contents");
    entry.localName = name;
    return entry;
}

ZipEntry withLocalSize(std::uint32_t size) {
    ZipEntry entry = zipFile("Atlas.app/one", "contents");
    entry.localSize = size;
    return entry;
}

ZipEntry withUnicodeName(std::string_view name) {
    ZipEntry entry = zipFile("Atlas.app/one", "contents");
    entry.unicodeName = name;
    return entry;
}

/// 500 kB that say they are 500 MB.
ZipEntry bomb() {
    ZipEntry entry = zipFile("Atlas.app/bomb", "");
    entry.packed = std::string(500'000, '\0');
    entry.method = 8;
    entry.size = 500'000'000;
    return entry;
}

ZipEntry overlapping() {
    ZipEntry entry = atlasEntries().back();
    entry.name = "Atlas.app/Btlas";
    entry.overlapsLast = true;
    return entry;
}

INSTANTIATE_TEST_SUITE_P(
    Names, RefusedEntryTest,
    ::testing::Values(
        RefusedEntry{"parent", zipFile("../evil", "x"), Code::IllegalName, "'../evil'"},
        RefusedEntry{"parent inside", zipFile("Atlas.app/../../evil", "x"), Code::IllegalName, ""},
        RefusedEntry{"parent at the end", zipDirectory("Atlas.app/../"), Code::IllegalName, ""},
        RefusedEntry{"only a parent", zipFile("..", "x"), Code::IllegalName, ""},
        RefusedEntry{"dot", zipFile("Atlas.app/./x", "x"), Code::IllegalName, "'.'"},
        RefusedEntry{"absolute", zipFile("/etc/passwd", "x"), Code::IllegalName, "absolute"},
        RefusedEntry{"slash", zipDirectory("/"), Code::IllegalName, ""},
        RefusedEntry{"backslash", zipFile("Atlas.app\\x", "x"), Code::IllegalName, "backslash"},
        RefusedEntry{"drive", zipFile("C:\\x", "x"), Code::IllegalName, "backslash"},
        RefusedEntry{"NUL", zipFile(std::string_view("Atlas.app/a\0b", 13), "x"), Code::IllegalName,
                     "'Atlas.app/a\\x00b'"},
        RefusedEntry{"newline", zipFile("Atlas.app/a\nb", "x"), Code::IllegalName, "\\x0a"},
        RefusedEntry{"escape", zipFile("Atlas.app/\x1b[2J", "x"), Code::IllegalName, "\\x1b"},
        RefusedEntry{"not UTF-8", zipFile("Atlas.app/\xff", "x"), Code::IllegalName, "\\xff"},
        RefusedEntry{"empty component", zipFile("Atlas.app//x", "x"), Code::IllegalName, "empty"},
        RefusedEntry{"two slashes at the end", zipDirectory("Atlas.app/x//"), Code::IllegalName,
                     "empty"},
        RefusedEntry{"no name", zipFile("", "x"), Code::IllegalName, "no name"},
        RefusedEntry{"long component", zipFile("Atlas.app/" + std::string(256, 'x'), "x"),
                     Code::IllegalName, "too long"},
        RefusedEntry{"long name",
                     zipFile("Atlas.app/" + repeated(std::string(200, 'd') + "/", 6), "x"),
                     Code::IllegalName, "too long"},
        RefusedEntry{"one deeper than names are long",
                     zipFile("Atlas.app/" + repeated("d/", 507) + "x", "x"), Code::IllegalName,
                     "too long"},
        RefusedEntry{"other local name", withLocalName("Atlas.app/two"), Code::Inconsistent,
                     "'Atlas.app/one' has another name"},
        RefusedEntry{"parent in an extra field", withUnicodeName("../evil"), Code::IllegalName,
                     "'../evil'"},
        RefusedEntry{"duplicate in an extra field", withUnicodeName("Atlas.app/Atlas"),
                     Code::DuplicateEntry, ""},
        RefusedEntry{"hidden local name", withLocalName("../../evil/xx"), Code::Inconsistent,
                     "another name"}));

INSTANTIATE_TEST_SUITE_P(
    Kinds, RefusedEntryTest,
    ::testing::Values(
        RefusedEntry{"link", zipOfMode("Atlas.app/x", S_IFLNK | 0777), Code::NotAFileOrDirectory,
                     "symbolic link"},
        RefusedEntry{"link called a directory", zipOfMode("Atlas.app/x/", S_IFLNK | 0777),
                     Code::NotAFileOrDirectory, "symbolic link"},
        RefusedEntry{"character device", zipOfMode("Atlas.app/x", S_IFCHR | 0666),
                     Code::NotAFileOrDirectory, "device"},
        RefusedEntry{"block device", zipOfMode("Atlas.app/x", S_IFBLK | 0666),
                     Code::NotAFileOrDirectory, "device"},
        RefusedEntry{"pipe", zipOfMode("Atlas.app/x", S_IFIFO | 0666), Code::NotAFileOrDirectory,
                     "pipe"},
        RefusedEntry{"socket", zipOfMode("Atlas.app/x", S_IFSOCK | 0666), Code::NotAFileOrDirectory,
                     "socket"},
        RefusedEntry{"unknown kind", zipOfMode("Atlas.app/x", 0150000), Code::NotAFileOrDirectory,
                     "unknown"},
        RefusedEntry{"directory without a slash", zipOfMode("Atlas.app/x", S_IFDIR | 0755),
                     Code::NotAFileOrDirectory, "not by both"},
        RefusedEntry{"file with a slash", zipOfMode("Atlas.app/x/", S_IFREG | 0644),
                     Code::NotAFileOrDirectory, "not by both"},
        RefusedEntry{"directory with contents",
                     ZipEntry{.name = "Atlas.app/x/", .contents = "abc", .mode = S_IFDIR | 0755},
                     Code::DirectoryWithContents, "'Atlas.app/x/'"}));

INSTANTIATE_TEST_SUITE_P(
    Trees, RefusedEntryTest,
    ::testing::Values(RefusedEntry{"duplicate file", zipFile("Atlas.app/Atlas", "other"),
                                   Code::DuplicateEntry, "'Atlas.app/Atlas'"},
                      RefusedEntry{"duplicate directory", zipDirectory("Atlas.app/"),
                                   Code::DuplicateEntry, "'Atlas.app/'"},
                      RefusedEntry{"file and directory", zipDirectory("Atlas.app/Atlas/"),
                                   Code::DuplicateEntry, "'Atlas.app/Atlas'"},
                      RefusedEntry{"file used as a directory", zipFile("Atlas.app/Atlas/x", "x"),
                                   Code::FileUsedAsDirectory, "'Atlas.app/Atlas/x'"},
                      RefusedEntry{"file deep below a file",
                                   zipFile("Atlas.app/Info.plist/a/b", "x"),
                                   Code::FileUsedAsDirectory, "Info.plist"},
                      RefusedEntry{"file beside the bundle", zipFile("README", "x"),
                                   Code::UnexpectedTopLevelEntry, "'README'"},
                      RefusedEntry{"directory beside the bundle", zipDirectory("Extra/"),
                                   Code::UnexpectedTopLevelEntry, "'Extra'"},
                      RefusedEntry{"metadata as a directory", zipDirectory("VessikMetadata.plist/"),
                                   Code::UnexpectedTopLevelEntry, ""},
                      RefusedEntry{"metadata with a file in it",
                                   zipFile("VessikMetadata.plist/x", "x"),
                                   Code::UnexpectedTopLevelEntry, ""},
                      RefusedEntry{"second bundle", zipFile("Beacon.app/x", "x"),
                                   Code::SeveralBundles, "'Beacon.app'"},
                      RefusedEntry{"bundle that is a file", zipFile("Beacon.app", "x"),
                                   Code::UnexpectedTopLevelEntry, "'Beacon.app'"}));

INSTANTIATE_TEST_SUITE_P(
    Contents, RefusedEntryTest,
    ::testing::Values(
        RefusedEntry{"encrypted", encrypted(), Code::Encrypted, "'Atlas.app/secret'"},
        RefusedEntry{"bzip2", ofMethod(12), Code::CompressionNotSupported, "method 12"},
        RefusedEntry{"unknown method", ofMethod(77), Code::CompressionNotSupported, "method 77"},
        RefusedEntry{"other local size", withLocalSize(3), Code::Inconsistent, ""},
        RefusedEntry{"bomb", bomb(), Code::CompressionRatio, "'Atlas.app/bomb'"},
        RefusedEntry{"overlap", overlapping(), Code::Inconsistent, "another name"}));

using PackageRefusalTest = PackageFixture;

TEST_F(PackageRefusalTest, theApplicationBesideThoseEntriesIsAccepted) {
    EXPECT_TRUE(open(atlasWith({zipFile("Atlas.app/x", "x")})).ok());
}

TEST_F(PackageRefusalTest, anEmptyFileIsNoPackage) {
    EXPECT_TRUE(refused(open(std::string_view()), Code::NotAnArchive));
}

TEST_F(PackageRefusalTest, aTextIsNoPackage) {
    EXPECT_TRUE(refused(open(std::string(100'000, 'x')), Code::NotAnArchive, "not a zip archive"));
}

TEST_F(PackageRefusalTest, anArchiveWithNothingInItHoldsNoBundle) {
    EXPECT_TRUE(refused(open(ZipBuilder()), Code::NoBundle));
}

TEST_F(PackageRefusalTest, aPackageOfMetadataAloneHoldsNoBundle) {
    EXPECT_TRUE(
        refused(open(ZipBuilder().add(zipFile("VessikMetadata.plist", "x"))), Code::NoBundle));
}

TEST_F(PackageRefusalTest, aBundleWithoutANameIsNone) {
    EXPECT_TRUE(refused(open(ZipBuilder().add(zipFile(".app/Info.plist", atlasInfo()))),
                        Code::UnexpectedTopLevelEntry));
}

TEST_F(PackageRefusalTest, whereverItIsCutOffItIsRefused) {
    const std::string whole = atlasWith({}).bytes();
    for (std::size_t length = 0; length < whole.size(); ++length) {
        EXPECT_FALSE(open(whole.substr(0, length)).ok()) << length;
    }
}

TEST_F(PackageRefusalTest, aCutOffEndIsCalledThat) {
    const std::string whole = atlasWith({}).bytes();
    EXPECT_TRUE(refused(open(whole.substr(0, whole.size() - 30)), Code::NotAnArchive, "cut off"));
}

TEST_F(PackageRefusalTest, bytesAfterTheEndAreRefused) {
    EXPECT_FALSE(open(atlasWith({}).bytes() + "x").ok());
}

TEST_F(PackageRefusalTest, aCountThatIsTooLowIsRefused) {
    EXPECT_TRUE(refused(open(atlasWith({}).claimCount(2)), Code::Inconsistent,
                        "has 2 entries and lists 3"));
}

TEST_F(PackageRefusalTest, aCountThatIsTooHighIsRefused) {
    EXPECT_TRUE(refused(open(atlasWith({}).claimCount(60'000)), Code::Inconsistent,
                        "has 60000 entries and lists 3"));
}

TEST_F(PackageRefusalTest, aDirectoryLargerThanTheFileIsRefused) {
    EXPECT_TRUE(
        refused(open(atlasWith({}).claimExtraDirectoryBytes(1'000'000)), Code::Inconsistent));
}

TEST_F(PackageRefusalTest, aDirectoryLargerThanItIsIsRefused) {
    EXPECT_TRUE(refused(open(atlasWith({}).claimExtraDirectoryBytes(10)), Code::Inconsistent));
}

TEST_F(PackageRefusalTest, aDirectoryThatDevicesDoNotTakeIsRefused) {
    EXPECT_TRUE(
        refused(open(atlasWith({}).claimExtraDirectoryBytes(1U << 30U)), Code::TooManyEntries));
}

TEST_F(PackageRefusalTest, aLargeArchiveMustCountRight) {
    EXPECT_TRUE(open(atlasWith({}).largeEnd(3)).ok());
    EXPECT_TRUE(
        refused(open(atlasWith({}).largeEnd(4)), Code::Inconsistent, "has 4 entries and lists 3"));
}

TEST_F(PackageRefusalTest, aLargeArchiveThatClaimsTooManyEntriesIsRefused) {
    EXPECT_TRUE(
        refused(open(atlasWith({}).largeEnd(std::uint64_t{1} << 40U)), Code::TooManyEntries));
    EXPECT_TRUE(refused(open(atlasWith({}).largeEnd(~std::uint64_t{0})), Code::TooManyEntries));
}

TEST_F(PackageRefusalTest, aLargeArchiveWhoseEndIsElsewhereIsRefused) {
    std::string bytes = atlasWith({}).largeEnd(3).bytes();
    const std::size_t locator = bytes.rfind("PK\6\7");
    bytes[locator + 15] = '\x7f';
    EXPECT_TRUE(refused(open(bytes), Code::Inconsistent, "outside"));
    bytes[locator + 15] = '\0';
    bytes[locator + 8] = '\1';
    EXPECT_TRUE(refused(open(bytes), Code::Inconsistent, "damaged"));
}

TEST_F(PackageRefusalTest, anEndInTheCommentIsRefused) {
    std::string inner = ZipBuilder().bytes();
    EXPECT_TRUE(refused(open(atlasWith({}).comment(inner)), Code::Inconsistent, "two ends"));
}

TEST_F(PackageRefusalTest, manyEndsAreRefused) {
    std::string ends;
    for (int i = 0; i < 100; ++i) ends += "PK\5\6" + std::string(18, '\0');
    EXPECT_TRUE(refused(open(atlasWith({}).comment(ends + "x")), Code::Inconsistent, "ends"));
}

TEST_F(PackageRefusalTest, moreEntriesThanTheLimitAreRefused) {
    PackageLimits limits;
    limits.entries = 2;
    EXPECT_TRUE(refused(open(atlasWith({}), limits), Code::TooManyEntries, "(2)"));
}

TEST_F(PackageRefusalTest, moreBytesThanTheLimitAreRefused) {
    PackageLimits limits;
    limits.unpackedBytes = 1000;
    const ZipBuilder archive = atlasWith({zipFile("Atlas.app/x", std::string(1000, 'x'))});
    EXPECT_TRUE(refused(open(archive, limits), Code::TooLarge, "1000"));
}

TEST_F(PackageRefusalTest, manySmallBombsAreOneLargeOne) {
    ZipBuilder archive = atlasWith({});
    for (int i = 0; i < 40; ++i) {
        ZipEntry entry = zipFile("Atlas.app/bomb" + std::to_string(i), "");
        entry.packed = std::string(1000, '\0');
        entry.method = 8;
        entry.size = 15'000'000;
        archive.add(entry);
    }
    EXPECT_TRUE(refused(open(archive), Code::CompressionRatio));
}

TEST_F(PackageRefusalTest, entriesThatShareBytesAreRefused) {
    ZipBuilder archive = atlasWith({zipFile("Atlas.app/kernel", std::string(100'000, 'k'))});
    ZipEntry again = zipFile("Atlas.app/kernel", std::string(100'000, 'k'));
    again.overlapsLast = true;
    EXPECT_TRUE(refused(open(archive.add(again)), Code::DuplicateEntry));
}

TEST_F(PackageRefusalTest, aDirectoryIsNoPackage) {
    makeDirectory("app.zip");
    EXPECT_TRUE(
        refused(PackageReader::open(path("app.zip"), propertyLists()), Code::NotARegularFile));
}

TEST_F(PackageRefusalTest, aPipeIsRefusedWithoutWaitingForItsOtherEnd) {
    ASSERT_EQ(::mkfifo(path("app.zip").c_str(), 0600), 0);
    EXPECT_TRUE(
        refused(PackageReader::open(path("app.zip"), propertyLists()), Code::NotARegularFile));
}

TEST_F(PackageRefusalTest, aMissingPackageIsAnErrorOfTheSystem) {
    const Result<PackageReader> package = PackageReader::open(path("none.zip"), propertyLists());
    ASSERT_FALSE(package.ok());
    EXPECT_EQ(package.error().domain, kPosixErrorDomain);
    EXPECT_EQ(package.error().code, ENOENT);
    EXPECT_NE(package.error().description().find("none.zip"), std::string::npos);
}

}  // namespace

}  // namespace appsync
