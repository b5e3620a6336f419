// Restores on the reference device, on both paths.

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>

#include "client/Paths.h"
#include "device/Device.h"
#include "host/console/Console.h"
#include "host/session/PlugIn.h"
#include "platform/FileSystem.h"
#include "platform/PropertyListSerialization.h"
#include "platform/SyncClient.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::UnorderedElementsAreArray;

class RestoredDevice : public HostFixture, public testing::WithParamInterface<bool> {
  protected:
    RestoredDevice() : HostFixture(GetParam()) {}

    /// Everything in the device's root but the directory for temporary files, sorted.
    [[nodiscard]] std::vector<std::string> everything() const {
        std::vector<std::string> paths;
        for (const auto& entry : fs::recursive_directory_iterator(root)) {
            const std::string path = entry.path().native().substr(root.size());
            if (!path.starts_with("/var/mobile/tmp")) paths.push_back(path);
        }
        std::sort(paths.begin(), paths.end());
        return paths;
    }
    static PropertyList infoOf(Device& device) {
        const auto metadata = device.propertyLists().serialize(
            PropertyList::map({{"title", "Shown"}, {"bundleVersion", "1.0"}}),
            PropertyListFormat::Binary);
        return PropertyList::map({{"VessikMetadata", *metadata}});
    }
    /// A session in which that information, or these bytes, are restored.
    void restore(const std::vector<std::string>& identifiers) {
        const std::unique_ptr<Device> opened = open(DeviceAccess::Session);
        PropertyList info = PropertyList::map();
        for (const std::string& identifier : identifiers) info.set(identifier, infoOf(*opened));
        const auto bytes = opened->propertyLists().serialize(info, PropertyListFormat::Binary);
        restoreBytes(*opened, std::string(bytes->begin(), bytes->end()));
    }
    void restoreBytes(Device& opened, const std::string& bytes) {
        write(root + std::string(kRestoreInfoPath), bytes);
        std::ostringstream said;
        const Console console{said, said};
        const Result<std::unique_ptr<PlugIn>> plugIn = PlugIn::loadForRestore(opened, console);
        ASSERT_TRUE(plugIn.ok());
        EXPECT_TRUE((*plugIn)->client().reconcileRestoreOfType(2, nullptr));
    }
    [[nodiscard]] bool exists(std::string_view path) const {
        return fs::exists(root + std::string(path));
    }
};

TEST_P(RestoredDevice, KeepsNoTraceOfHostileIdentifiers) {
    restore({"com.example.first"});
    restore({"com.example.first"});
    const std::vector<std::string> before = everything();
    restore({"x/../../y", "../../../../z", "/../../../var/mobile/Library/Preferences/p",
             "../../../containers/Bundle/Application/q", "a/b", "..", ".", "a\nb",
             std::string("a\0b", 3), std::string(300, 'a')});
    std::vector<std::string> after = everything();
    EXPECT_EQ(after, before);
    static_cast<void>(open(DeviceAccess::Session));
    EXPECT_TRUE(fs::is_empty(root + "/var/mobile/tmp")) << "the next session clears the rest";
    EXPECT_THAT(applications(), ElementsAre("com.example.first placeholder"));
}

TEST_P(RestoredDevice, MovesRestoreInformationAlsoWhereItsPlaceWasLost) {
    fs::remove_all(root + "/var/mobile/Library");
    restore({"com.example.a"});
    EXPECT_FALSE(exists(kRestoreInfoPath));
    EXPECT_TRUE(exists(kProcessedRestoreInfoPath));
    EXPECT_THAT(applications(), ElementsAre("com.example.a placeholder"));
}

TEST_P(RestoredDevice, SurvivesRestoreInformationThatIsNone) {
    for (const std::string& bytes : {std::string(), std::string("text"), std::string("bplist00")}) {
        const std::unique_ptr<Device> opened = open(DeviceAccess::Session);
        restoreBytes(*opened, bytes);
        EXPECT_FALSE(exists(kRestoreInfoPath));
        EXPECT_TRUE(exists(kProcessedRestoreInfoPath));
    }
    EXPECT_THAT(applications(), testing::IsEmpty());
}

// The directories of their placeholders are `<identifier>.app`.
TEST_P(RestoredDevice, BringsBackApplicationsOfTheLongestIdentifiers) {
    std::vector<std::string> identifiers;
    for (const std::size_t length : {250U, 251U, 252U, 255U}) {
        identifiers.push_back(std::string(length, 'x'));
        identifiers.push_back(std::string(length - 4, 'x') + ".app");
    }
    restore(identifiers);
    std::vector<std::string> expected;
    for (const std::string& each : identifiers) expected.push_back(each + " placeholder");
    EXPECT_THAT(applications(), UnorderedElementsAreArray(expected));
    static_cast<void>(open(DeviceAccess::Session));
    EXPECT_TRUE(fs::is_empty(root + "/var/mobile/tmp"));
    EXPECT_THAT(applications(), UnorderedElementsAreArray(expected));
}

INSTANTIATE_TEST_SUITE_P(Each, RestoredDevice, testing::Bool(),
                         [](const auto& path) { return path.param ? "Coordinated" : "Direct"; });

// Identifiers of 252 to 255 bytes, of which no file name <identifier>.zip can be made.
class LongIdentifier : public RestoredDevice {};

TEST_P(LongIdentifier, IsSyncedUpdatedSentAndRemoved) {
    const std::string longest(255, 'x');
    const std::string shorter = std::string(248, 'y') + ".zip";
    addPackageAs("one.zip", longest, "1.0");
    addPackageAs("two.zip", shorter, "1.0");
    addPackage("com.example.a", "1.0");
    ASSERT_EQ(sync(), 0) << out.str() << err.str();
    EXPECT_THAT(applications(), testing::UnorderedElementsAre(longest + " 1.0", shorter + " 1.0",
                                                              "com.example.a 1.0"));
    addPackageAs("one.zip", longest, "2.0");
    ASSERT_EQ(sync({"--remove", shorter}), 0) << out.str() << err.str();
    addPackageAs("one.zip", longest, "3.0");
    ASSERT_EQ(run({"send", device, longest, library + "/one.zip"}), 0) << err.str();
    EXPECT_THAT(applications(),
                testing::UnorderedElementsAre(longest + " 3.0", "com.example.a 1.0"));
    static_cast<void>(open(DeviceAccess::Session));
    EXPECT_THAT(everything(), testing::Not(Contains(HasSubstr("PublicStaging/x"))));
}

INSTANTIATE_TEST_SUITE_P(Each, LongIdentifier, testing::Bool(),
                         [](const auto& path) { return path.param ? "Coordinated" : "Direct"; });

// Forgetting everything.

TEST_P(RestoredDevice, LeavesNoPackageBehindWhenItIsReset) {
    addPackage("com.example.a", "1.0");
    ASSERT_EQ(sync(), 0);
    write(root + std::string(kPublicStaging) + "/com.example.b.zip", "a package");
    ASSERT_EQ(run({"reset", device}), 0);
    EXPECT_TRUE(fs::is_empty(root + std::string(kPublicStaging)));
}

}  // namespace
}  // namespace appsync
