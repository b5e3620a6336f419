#include <cerrno>

#include "tests/client/AppsClientFixture.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const std::string kBundlePath = "/apps/A.app";
const std::string kDestination = "/tmp/a.png";

class IconRendering : public AppsClientFixture {
  protected:
    IconRendering() { platform_.addPropertyList(kBundlePath + "/Info.plist", PropertyList::map()); }

    bool render(const std::optional<std::string>& bundlePath) {
        return AppsClient::_makeIconFromBundlePath(platform_.services(), bundlePath, kDestination);
    }
    void expectFailure(const std::optional<std::string>& bundlePath, const std::string& message) {
        EXPECT_FALSE(render(bundlePath));
        EXPECT_THAT(platform_.messageLines(), ElementsAre("8 error " + message));
        EXPECT_FALSE(platform_.files.exists(kDestination));
        EXPECT_EQ(platform_.icons.liveObjects(), 0U);
    }
};

TEST_F(IconRendering, WritesTheImage) {
    EXPECT_TRUE(render(kBundlePath));
    EXPECT_EQ(platform_.files.contents(kDestination), SimulatedIconRenderer::imageOf(kBundlePath));
    EXPECT_THAT(platform_.messages(), IsEmpty());
    EXPECT_EQ(platform_.icons.liveObjects(), 0U);
}

TEST_F(IconRendering, NeedsABundlePath) { expectFailure(std::nullopt, "missing bundlePath"); }

TEST_F(IconRendering, NeedsAPathThatAURLCanHold) { expectFailure("", "couldn't create URL"); }

TEST_F(IconRendering, NeedsABundle) {
    platform_.icons.failAt(IconStep::OpenBundle);
    expectFailure(kBundlePath, "couldn't create bundle from URL");
}

TEST_F(IconRendering, NeedsAnIcon) {
    platform_.icons.failAt(IconStep::HomeScreenIcon);
    expectFailure(kBundlePath, "couldn't create DK icon from bundle");
}

TEST_F(IconRendering, NeedsAnEncoder) {
    platform_.icons.failAt(IconStep::CreateImageDestination);
    expectFailure(kBundlePath, "couldn't create image");
}

TEST_F(IconRendering, NeedsTheEncoderToFinish) {
    platform_.icons.failAt(IconStep::Finalize);
    expectFailure(kBundlePath, "Couldn't finalize image");
}

TEST_F(IconRendering, NeedsToSaveTheImage) {
    platform_.files.failNext(FileOperation::WriteFileAtomically, kDestination, ENOSPC);
    expectFailure(kBundlePath, "Couldn't save image file to /tmp/a.png");
}

}  // namespace
}  // namespace appsync
