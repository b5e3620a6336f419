#include <gtest/gtest.h>
#include <sys/stat.h>

#include <filesystem>

#include "device/screen/CairoIconRenderer.h"
#include "device/screen/IconDrawing.h"
#include "system/file/RootDirectory.h"
#include "tests/device/package/PackageFixture.h"
#include "tests/device/screen/IconPng.h"

namespace appsync {

namespace {

namespace fs = std::filesystem;

constexpr Color kGreen = {0, 1, 0};
constexpr std::uint32_t kOpaqueGreen = 0xff00ff00;

/// A root with one bundle in it, /Atlas.app.
class IconRendererTest : public PackageFixture {
  protected:
    IconRendererTest() {
        makeDirectory("root/Atlas.app");
        write("root/Atlas.app/Info.plist", atlasInfo());
        root_ = std::make_unique<RootDirectory>(*RootDirectory::open(path("root")));
        renderer_ = std::make_unique<CairoIconRenderer>(*root_, propertyLists());
    }

    void writeBytes(std::string_view name, const Bytes& bytes) const {
        write(name, std::string(bytes.begin(), bytes.end()));
    }

    void writeInfoWithIcon(const std::string& value) const {
        write("root/Atlas.app/Info.plist", infoWith({{"BundleIconFile", value}}));
    }

    std::unique_ptr<AppBundle> openBundle(std::string_view where = "/Atlas.app") {
        return renderer_->openBundle(*FileURL::fromPath(where, true));
    }

    /// The icon of the bundle as PNG; empty when some step fails.
    Bytes render() {
        Bytes buffer;
        const std::unique_ptr<AppBundle> bundle = openBundle();
        if (!bundle) return {};
        const std::unique_ptr<IconImage> image = renderer_->homeScreenIcon(*bundle);
        if (!image) return {};
        const auto destination = renderer_->createImageDestination("public.png", 1, buffer);
        destination->addImage(*image);
        return destination->finalize() ? buffer : Bytes();
    }

    CairoIconRenderer& renderer() { return *renderer_; }

  private:
    std::unique_ptr<RootDirectory> root_;
    std::unique_ptr<CairoIconRenderer> renderer_;
};

TEST_F(IconRendererTest, rendersTheUsualIconFile) {
    writeBytes("root/Atlas.app/Icon.png", pngOf(300, 300, kGreen));
    const Bytes icon = render();
    EXPECT_EQ(sizeOf(icon), "120x120");
    EXPECT_EQ(pixelOf(icon, 60, 60), kOpaqueGreen);
    EXPECT_EQ(pixelOf(icon, 0, 0), 0U);
}

TEST_F(IconRendererTest, rendersTheFileThatTheInfoNames) {
    writeInfoWithIcon("<string>Other.png</string>");
    writeBytes("root/Atlas.app/Other.png", pngOf(10, 10, kGreen));
    writeBytes("root/Atlas.app/Icon.png", pngOf(10, 10, {1, 0, 0}));
    EXPECT_EQ(pixelOf(render(), 60, 60), kOpaqueGreen);
}

TEST_F(IconRendererTest, whatIsNoBundleIsNotOpened) {
    EXPECT_EQ(openBundle("/None.app"), nullptr);
    makeDirectory("root/Empty.app");
    EXPECT_EQ(openBundle("/Empty.app"), nullptr);
    write("root/Atlas.app/Info.plist", "damaged");
    EXPECT_EQ(openBundle(), nullptr);
    write("root/Atlas.app/Info.plist", "<plist><array/></plist>");
    EXPECT_EQ(openBundle(), nullptr);
}

TEST_F(IconRendererTest, namesThatLeaveTheBundleAreRefused) {
    writeBytes("root/Icon.png", pngOf(10, 10, kGreen));
    for (const char* name : {"../Icon.png", "/Icon.png", "..", ".", ""}) {
        writeInfoWithIcon("<string>" + std::string(name) + "</string>");
        EXPECT_TRUE(render().empty()) << name;
    }
    writeInfoWithIcon("<integer>1</integer>");
    EXPECT_TRUE(render().empty());
}

TEST_F(IconRendererTest, linksLeadNowhereOutsideTheRoot) {
    writeBytes("secret.png", pngOf(10, 10, kGreen));
    for (const std::string& target : {path("secret.png"), std::string("../../secret.png")}) {
        fs::remove(path("root/Atlas.app/Icon.png"));
        fs::create_symlink(target, path("root/Atlas.app/Icon.png"));
        EXPECT_TRUE(render().empty()) << target;
    }
}

TEST_F(IconRendererTest, pipesAreRefusedWithoutWaiting) {
    ASSERT_EQ(::mkfifo(path("root/Atlas.app/Icon.png").c_str(), 0600), 0);
    EXPECT_TRUE(render().empty());
    fs::remove(path("root/Atlas.app/Info.plist"));
    ASSERT_EQ(::mkfifo(path("root/Atlas.app/Info.plist").c_str(), 0600), 0);
    EXPECT_EQ(openBundle(), nullptr);
}

TEST_F(IconRendererTest, iconsThatAreNotPngAreRefused) {
    EXPECT_TRUE(render().empty());
    write("root/Atlas.app/Icon.png", "GIF89a");
    EXPECT_TRUE(render().empty());
    makeDirectory("root/Directory.app");
    writeInfoWithIcon("<string>Info.plist</string>");
    EXPECT_TRUE(render().empty());
}

TEST_F(IconRendererTest, aFileThatIsTooLargeIsNotRead) {
    writeBytes("root/Atlas.app/Icon.png", pngOf(10, 10, kGreen));
    fs::resize_file(path("root/Atlas.app/Icon.png"), std::uintmax_t{1} << 40U);
    EXPECT_TRUE(render().empty());
}

TEST_F(IconRendererTest, destinationsArePngAndWantImages) {
    Bytes buffer = {1, 2, 3};
    EXPECT_EQ(renderer().createImageDestination("public.jpeg", 1, buffer), nullptr);
    EXPECT_EQ(renderer().createImageDestination("public.png", 0, buffer), nullptr);
    const auto destination = renderer().createImageDestination("public.png", 1, buffer);
    ASSERT_NE(destination, nullptr);
    EXPECT_FALSE(destination->finalize());
    EXPECT_EQ(buffer, (Bytes{1, 2, 3}));
}

}  // namespace

}  // namespace appsync
