#include "system/file/MachinePath.h"

#include <cerrno>
#include <set>

#include "tests/system/DeviceFilesTest.h"

namespace appsync {
namespace {

std::string named(std::size_t length, std::string_view end = "") {
    return std::string(length - end.size(), 'x').append(end);
}

TEST(MachinePathTest, IsThePathItselfWhereItsNamesAreShortEnough) {
    const std::string deep = "/" + named(200) + "/./" + named(200) + "//" + named(251) + ".app/";
    for (const std::string& path : {std::string("/"), std::string("/a/b.app"), deep}) {
        EXPECT_EQ(machinePath(path), path);
    }
}

TEST(MachinePathTest, LeavesWhatNoIdentifierHasAsItIs) {
    for (const std::string& name : {named(256), named(256) + ".app", named(255) + ".zip",
                                    named(251) + "~.app", named(248, "~app") + ".app"}) {
        EXPECT_EQ(machinePath("/d/" + name), "/d/" + name);
    }
}

TEST(MachinePathTest, GivesEachBundleANameOfItsOwn) {
    std::set<std::string> paths;
    for (const std::size_t length : {247U, 248U, 250U, 251U, 252U, 254U, 255U}) {
        for (const char* end : {"", ".app", ".app.app", "~app"}) {
            const std::string identifier = named(length, end);
            if (identifier.ends_with("~app")) continue;  // no identifier
            const std::string path = machinePath("/d/" + identifier + ".app/Info.plist");
            EXPECT_LE(path.size(), std::string("/d//Info.plist").size() + 255);
            EXPECT_TRUE(paths.insert(path).second) << "two share " << path;
        }
    }
}

using LongBundles = device_files::DeviceFilesTest;

TEST_F(LongBundles, AreMadeReadAndRemovedUnderTheirNames) {
    const std::string bundle = "/tmp/" + named(255) + ".app";
    const std::string other = "/tmp/" + named(255, ".app") + ".app";
    ASSERT_TRUE(files_->createDirectory(bundle, true, nullptr));
    ASSERT_TRUE(files_->createDirectory(other + "/in", true, nullptr));
    EXPECT_TRUE(files_->createDirectory(bundle, true, nullptr)) << "it exists";
    ASSERT_TRUE(files_->createFile(bundle + "/Icon.png", device_files::bytes("icon"), {}));
    ASSERT_TRUE(files_->writeFileAtomically(bundle + "/Info.plist", device_files::bytes("info")));
    ASSERT_TRUE(files_->copyItem(bundle + "/Icon.png", other + "/Icon.png"));
    EXPECT_EQ(device_files::text(*files_->readFile(other + "/Icon.png")), "icon");
    EXPECT_TRUE(files_->attributes(bundle)->isDirectory);
    EXPECT_EQ(names("/tmp").size(), 2U);
    EXPECT_TRUE(files_->removeItem(bundle));
    EXPECT_FALSE(files_->itemExists(bundle));
    EXPECT_TRUE(files_->itemExists(other + "/in"));
}

TEST_F(LongBundles, EndAtTheLongestIdentifier) {
    const Status made = files_->createDirectory("/tmp/" + named(256) + ".app", true, nullptr);
    ASSERT_FALSE(made);
    EXPECT_EQ(made.error().code, ENAMETOOLONG);
}

}  // namespace
}  // namespace appsync
