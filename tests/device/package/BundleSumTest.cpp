#include "device/package/BundleSum.h"

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "system/file/RootDirectory.h"
#include "tests/device/package/PackageFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

class BundleSumTest : public PackageFixture {
  protected:
    /// Unpacks the package; gives the sum that it tells itself.
    std::uint64_t unpackSummed(const ZipBuilder& archive) {
        Result<PackageReader> package = open(archive);
        EXPECT_TRUE(package);
        makeDirectory("target");
        EXPECT_TRUE(package->unpackInto(openDirectory("target").get()));
        return package->bundleSum();
    }
    /// That of the bundle on disk.
    [[nodiscard]] std::uint64_t onDisk() const {
        const Result<RootDirectory> root = RootDirectory::open(path("target"));
        EXPECT_TRUE(root);
        const Result<std::uint64_t> sum = sumOfBundle(*root, "/Atlas.app");
        EXPECT_TRUE(sum);
        return sum ? *sum : 0;
    }
    [[nodiscard]] fs::path inBundle(const char* name) const {
        return path("target/Atlas.app") + "/" + name;
    }
};

ZipBuilder manyKinds() {
    return atlasWith({zipFile("VessikMetadata.plist", "meta"), zipFile("Atlas.app/a/b/c/x", "deep"),
                      zipFile("Atlas.app/a/b/y", "y"), zipFile("Atlas.app/a.b", "beside"),
                      zipFile("Atlas.app/ab/z", ""), zipDirectory("Atlas.app/Empty/"),
                      zipDirectory("Atlas.app/listed/"), zipFile("Atlas.app/listed/x", "x"),
                      zipZeros("Atlas.app/zeros", 700'000)});
}

TEST_F(BundleSumTest, aPackageTellsThatOfWhatItUnpacksTo) {
    const std::uint64_t sum = unpackSummed(manyKinds());
    EXPECT_EQ(onDisk(), sum);
}

TEST_F(BundleSumTest, theOrderOfTheEntriesAndWhichDirectoriesAreListedDoNotMatter) {
    const auto listed = open(atlasWith({zipDirectory("Atlas.app/a/"), zipFile("Atlas.app/a/x", "1"),
                                        zipFile("Atlas.app/y", "2")}));
    const auto unlisted =
        open(atlasWith({zipFile("Atlas.app/y", "2"), zipFile("Atlas.app/a/x", "1")}));
    EXPECT_EQ(listed->bundleSum(), unlisted->bundleSum());
}

TEST_F(BundleSumTest, everyChangeOfTheBundleIsSeen) {
    const std::uint64_t sum = unpackSummed(manyKinds());
    std::vector<std::uint64_t> seen{sum};
    const auto expectNew = [&](const char* what) {
        const std::uint64_t now = onDisk();
        EXPECT_EQ(std::count(seen.begin(), seen.end(), now), 0) << what;
        seen.push_back(now);
    };
    fs::remove(inBundle("a/b/y"));
    expectNew("a file is gone");
    fs::remove(inBundle("Empty"));
    expectNew("a directory is gone");
    fs::permissions(inBundle("Atlas"), fs::perms::owner_exec, fs::perm_options::remove);
    expectNew("a program cannot be run");
    fs::resize_file(inBundle("zeros"), 699'999);
    expectNew("a file is cut");
    std::ofstream(inBundle("a.b")) << "Beside";
    expectNew("a letter is another");
    fs::rename(inBundle("a/b/c/x"), inBundle("a/b/x"));
    expectNew("a file has moved");
    fs::create_symlink("x", inBundle("listed/y"));
    expectNew("a link has come");
}

TEST_F(BundleSumTest, whatOnlyTheMachineSeesIsNoChange) {
    const std::uint64_t sum = unpackSummed(manyKinds());
    fs::permissions(inBundle("a.b"), fs::perms::owner_read);
    fs::last_write_time(inBundle("a.b"), fs::file_time_type::clock::now());
    write("target/VessikMetadata.plist", "newer");
    EXPECT_EQ(onDisk(), sum);
}

TEST_F(BundleSumTest, whatCannotBeReadHasNone) {
    static_cast<void>(unpackSummed(manyKinds()));
    const Result<RootDirectory> root = RootDirectory::open(path("target"));
    EXPECT_FALSE(sumOfBundle(*root, "/Other.app"));
    fs::create_directory_symlink("Atlas.app", path("target/Link.app"));
    EXPECT_FALSE(sumOfBundle(*root, "/Link.app")) << "no link is followed";
}

}  // namespace
}  // namespace appsync
