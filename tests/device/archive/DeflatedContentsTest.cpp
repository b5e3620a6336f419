#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <filesystem>
#include <string>

#include "device/archive/PackageArchiveContents.h"
#include "tests/device/package/PackageFixture.h"

namespace appsync {

namespace {

using Code = PackageErrorCode;

// What fits is inflated at once, the rest as it comes: that must not show.
constexpr std::uint32_t kTiny = 1000;
constexpr std::uint32_t kLargestAtOnce = 2'050'000;
constexpr std::uint32_t kStreamed = 3'000'000;

class DeflatedContentsTest : public PackageFixture,
                             public testing::WithParamInterface<std::uint32_t> {
  protected:
    const ZipEntry good = zipZeros("Atlas.app/x", GetParam());
};

TEST_P(DeflatedContentsTest, areUnpackedInPieces) {
    std::uint64_t before = 0;
    std::uint64_t longest = 0;
    PackageUnpackOptions options;
    options.progress = [&](std::uint64_t done, std::uint64_t /*total*/) {
        longest = std::max(longest, done - before);
        before = done;
        return true;
    };
    ASSERT_TRUE(unpack(atlasWith({good}), options).ok());
    EXPECT_EQ(read("target/Atlas.app/x"), good.contents);
    EXPECT_LE(longest, 256U << 10U);
}

TEST_P(DeflatedContentsTest, mustHaveTheirCrc) {
    ZipEntry entry = good;
    entry.crc = 7;
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "its CRC is wrong"));
}

TEST_P(DeflatedContentsTest, mustNotBeMoreThanTheySay) {
    ZipEntry entry = good;
    entry.size = GetParam() - 1;
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "to more bytes than"));
}

TEST_P(DeflatedContentsTest, mustNotBeFewerThanTheySay) {
    ZipEntry entry = good;
    entry.size = GetParam() + 1;
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "to fewer bytes than"));
}

TEST_P(DeflatedContentsTest, mustUseAllThatIsPacked) {
    ZipEntry entry = good;
    entry.packed->push_back('\0');
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "more packed bytes"));
}

TEST_P(DeflatedContentsTest, mustNotEndTooEarly) {
    ZipEntry entry = good;
    entry.packed->pop_back();
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "end too early"));
}

TEST_P(DeflatedContentsTest, mustBeDeflated) {
    ZipEntry entry = good;
    entry.packed->front() = '\xff';  // a block of no kind
    EXPECT_TRUE(failedAs(unpack(atlasWith({entry})), Code::DamagedEntry, "bytes are damaged"));
}

INSTANTIATE_TEST_SUITE_P(, DeflatedContentsTest, testing::Values(kTiny, kLargestAtOnce, kStreamed),
                         [](const auto& size) { return "of" + std::to_string(size.param); });

TEST(DeflatedContents, areTestedOnBothSidesOfTheBound) {
    const std::uint64_t packed = zipZeros("x", kLargestAtOnce).packed->size();
    EXPECT_LE(kLargestAtOnce + packed, PackageArchiveContents::kMostAtOnce);
    EXPECT_GT(kStreamed, PackageArchiveContents::kMostAtOnce);
}

using KeptPackageTest = PackageFixture;

TEST_F(KeptPackageTest, aSmallPackageIsReadOnceAndThenWhole) {
    Result<PackageReader> package = open(atlasWith({zipFile("Atlas.app/x", "contents")}));
    ASSERT_TRUE(package.ok());
    std::filesystem::resize_file(path("app.zip"), 0);
    makeDirectory("target");
    EXPECT_TRUE(package->unpackInto(openDirectory("target").get()).ok());
    EXPECT_EQ(read("target/Atlas.app/x"), "contents");
}

}  // namespace

}  // namespace appsync
