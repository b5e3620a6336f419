#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;

class MisplacedDevice : public HostFixture {};

TEST_F(MisplacedDevice, IsToldFromOneThatIsMissing) {
    const std::vector<std::vector<std::string>> lines = {
        {"sync", library, device},
        {"plan", library, device, "--remove", "com.a"},
        {"run", "com.a", device},
        {"set", "removal=yes", device},
        {"screen", "nowhere.png", device},
        {"data", "pull", "com.a", device, "nowhere"},
        {"send", "com.a", device, "a.zip"},
        {"restore", library, device},
        {"data", "pull", "com.a", "nowhere", device}};
    for (const std::vector<std::string>& line : lines) {
        EXPECT_EQ(run(line), 3);
        const std::string command = line[0] == "data" ? "data pull" : line[0];
        const std::string& given = line.at(command == line[0] ? 1 : 2);
        EXPECT_EQ(err.str(), "appsync: " + given + " is no device, and " + device +
                                 " is one: DEVICE is the first argument: see appsync " + command +
                                 " --help\n");
    }
}

TEST_F(MisplacedDevice, IsNoneWhereNoOtherArgumentIsADevice) {
    EXPECT_EQ(run({"sync", library, library}), 3);
    EXPECT_THAT(err.str(), Not(HasSubstr("first argument")));
    EXPECT_EQ(run({"sync", device, device}), 3) << "a device is no library";
    EXPECT_THAT(err.str(), EndsWith("name the folder of packages, which is LIBRARY\n"));
}

}  // namespace
}  // namespace appsync
