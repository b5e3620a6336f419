#include "simulation/FaultPlan.h"

#include "tests/simulation/SimulationFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

class FaultPlanTest : public SimulationFixture {
  protected:
    [[nodiscard]] bool write(const std::string& path) {
        return platform_.files.writeFileAtomically(path, ByteView(bytes_)).ok();
    }

    const Bytes bytes_{1, 2, 3};
    FaultPlan plan_{platform_};
};

TEST_F(FaultPlanTest, CountsTheCallsThatCanFailAndTheirWays) {
    EXPECT_TRUE(write("/tmp/a"));
    EXPECT_NE(platform_.queues.makeLock(), nullptr);
    static_cast<void>(platform_.installer.lookupUninstalled());
    ASSERT_EQ(plan_.opportunities().size(), 2U);
    EXPECT_EQ(plan_.opportunities()[0].call, "FileSystem.writeFileAtomically");
    EXPECT_EQ(plan_.opportunities()[0].ways, 3U);
    EXPECT_THAT(plan_.injected(), IsEmpty());
}

TEST_F(FaultPlanTest, OneCallFailsAndChangesNothing) {
    plan_.failAt(1, 0, FaultExtent::Once);
    EXPECT_TRUE(write("/tmp/a"));
    EXPECT_FALSE(write("/tmp/b"));
    EXPECT_TRUE(write("/tmp/c"));
    EXPECT_THAT(platform_.files.names("/tmp"), ElementsAre("a", "c"));
    EXPECT_THAT(plan_.injected(), ElementsAre(HasSubstr("FileSystem.writeFileAtomically(/tmp/b")));
}

TEST_F(FaultPlanTest, EveryLaterCallOfTheNameFailsToo) {
    plan_.failAt(0, 0, FaultExtent::SameCall);
    EXPECT_FALSE(write("/tmp/a"));
    EXPECT_TRUE(platform_.files.setTimesToNow("/tmp").ok());
    EXPECT_FALSE(write("/tmp/b"));
}

TEST_F(FaultPlanTest, EveryLaterCallFails) {
    plan_.failAt(0, 0, FaultExtent::Everything);
    EXPECT_FALSE(write("/tmp/a"));
    EXPECT_FALSE(platform_.files.setTimesToNow("/tmp").ok());
    EXPECT_EQ(platform_.installer.lookupUninstalled(), std::nullopt);
    EXPECT_EQ(platform_.homeScreen.blockableConnection(), nullptr);
}

TEST_F(FaultPlanTest, WhatIsAnsweredWithNoHasNoEffect) {
    platform_.installer.addUninstalled(kA);
    plan_.failAt(0, 0, FaultExtent::Once);
    const std::vector<std::string> identifiers{kA};
    EXPECT_FALSE(platform_.installer.clearUninstalled(identifiers));
    EXPECT_EQ(platform_.installer.uninstalled()->size(), 1U);
    EXPECT_TRUE(platform_.installer.clearUninstalled(identifiers));
}

TEST_F(FaultPlanTest, ATornFileIsThereInPart) {
    plan_.failAt(0, 3, FaultExtent::Once);
    EXPECT_FALSE(platform_.files.createFile("/tmp/a", ByteView(bytes_), {}).ok());
    EXPECT_EQ(platform_.files.text("/tmp/a"), "hal");
}

TEST_F(FaultPlanTest, SomeFailAsTheSeedSays) {
    plan_.failSometimes(1, 2);
    std::size_t written = 0;
    for (int i = 0; i < 40; ++i) written += write("/tmp/a") ? 1U : 0U;
    EXPECT_EQ(written + plan_.injected().size(), 40U);
    EXPECT_GT(written, 5U);
    EXPECT_GT(plan_.injected().size(), 5U);
}

TEST_F(FaultPlanTest, NothingFailsAfterItsEnd) {
    plan_.failAt(0, 0, FaultExtent::Everything);
    EXPECT_FALSE(write("/tmp/a"));
    plan_.stop();
    EXPECT_TRUE(write("/tmp/a"));
}

}  // namespace
}  // namespace appsync
