#include <fcntl.h>
#include <gtest/gtest.h>

#include "tests/device/package/PackageFixture.h"

namespace appsync {

namespace {

using Code = PackageErrorCode;

/// What an Info.plist says, and what becomes of it.
class PackageInfoTest : public PackageFixture {
  protected:
    Result<PackageReader> openWithInfo(std::string_view info) {
        return open(ZipBuilder().add(zipFile("Atlas.app/Info.plist", info)));
    }

    Result<PackageReader> openWith(const std::string& key, const std::string& value) {
        return openWithInfo(
            infoWith({{"BundleIdentifier", "<string>com.example.atlas</string>"}, {key, value}}));
    }

    Result<PackageReader> openWithIdentifier(const std::string& identifier) {
        return openWithInfo(
            infoWith({{"BundleIdentifier", "<string>" + identifier + "</string>"}}));
    }
};

TEST_F(PackageInfoTest, tellsWhatThePackageIs) {
    Result<PackageReader> package = open(atlasWith({zipFile("VessikMetadata.plist", "meta")}));
    ASSERT_TRUE(package.ok()) << package.error().description();
    const PackageInfo& info = package->info();
    EXPECT_EQ(info.identifier, "com.example.atlas");
    EXPECT_EQ(info.version, "1.0");
    EXPECT_EQ(info.displayName, "Atlas & Co");
    EXPECT_EQ(info.executable, "Atlas");
    EXPECT_EQ(info.iconFile, "Icon.png");
    EXPECT_EQ(info.bundleDirectoryName, "Atlas.app");
    EXPECT_EQ(info.entryCount, 4U);
    EXPECT_EQ(info.unpackedBytes, atlasInfo().size() + 10 + 4);
    EXPECT_EQ(info.packedBytes, read("app.zip").size());
    EXPECT_TRUE(info.hasStoreMetadata);
    EXPECT_EQ(info.info.size(), 4U);
}

TEST_F(PackageInfoTest, readsTheBinaryEncodingToo) {
    const PropertyList info = PropertyList::map(
        {{"BundleIdentifier", "com.example.binary"}, {"BundleVersion", "2.0"}, {"Extra", 7}});
    const Result<Bytes> bytes = propertyLists().serialize(info, PropertyListFormat::Binary);
    ASSERT_TRUE(bytes.ok());
    const Result<PackageReader> package = openWithInfo(std::string(bytes->begin(), bytes->end()));
    ASSERT_TRUE(package.ok()) << package.error().description();
    EXPECT_EQ(package->info().identifier, "com.example.binary");
    EXPECT_EQ(package->info().info, info);
}

TEST_F(PackageInfoTest, hasTheNameOfTheBundleWhenThereIsNoOther) {
    const Result<PackageReader> package = openWithIdentifier("a.b");
    ASSERT_TRUE(package.ok());
    EXPECT_EQ(package->info().displayName, "Atlas");
    EXPECT_EQ(package->info().version, "");
    EXPECT_EQ(package->info().executable, "");
    EXPECT_FALSE(package->info().hasStoreMetadata);
}

TEST_F(PackageInfoTest, aBundleWithoutInfoIsRefused) {
    EXPECT_TRUE(refused(open(ZipBuilder().add(zipFile("Atlas.app/x", "x"))),
                        Code::NoInfoPropertyList, "'Atlas.app'"));
}

TEST_F(PackageInfoTest, infoThatIsADirectoryIsNone) {
    EXPECT_TRUE(refused(open(ZipBuilder().add(zipDirectory("Atlas.app/Info.plist/"))),
                        Code::NoInfoPropertyList));
}

TEST_F(PackageInfoTest, damagedInfoIsRefusedWithTheReason) {
    EXPECT_TRUE(refused(openWithInfo("<plist><dict><key>a</key>"), Code::DamagedInfoPropertyList,
                        "Info.plist cannot be read: "));
    EXPECT_TRUE(refused(openWithInfo(""), Code::DamagedInfoPropertyList));
    EXPECT_TRUE(refused(openWithInfo(std::string(5000, '\xff')), Code::DamagedInfoPropertyList));
}

TEST_F(PackageInfoTest, infoThatIsNotAMapIsRefused) {
    EXPECT_TRUE(refused(openWithInfo("<plist><array/></plist>"), Code::DamagedInfoPropertyList,
                        "not a map"));
}

TEST_F(PackageInfoTest, infoOfMoreThanAMebibyteIsRefused) {
    EXPECT_TRUE(
        refused(openWithInfo(std::string((1U << 20U) + 1, ' ')), Code::TooLarge, "Info.plist"));
}

TEST_F(PackageInfoTest, anIdentifierIsNeeded) {
    EXPECT_TRUE(refused(openWithInfo(infoWith({})), Code::IllegalIdentifier, "missing"));
    EXPECT_TRUE(refused(openWithInfo(infoWith({{"BundleIdentifier", "<integer>1</integer>"}})),
                        Code::IllegalIdentifier));
}

TEST_F(PackageInfoTest, illegalIdentifiersAreRefused) {
    for (const std::string& identifier :
         {std::string(), std::string("."), std::string(".."), std::string("../x"),
          std::string("a/b"), std::string("a b"), std::string("caf\xc3\xa9"), std::string("a\nb"),
          std::string(256, 'x')}) {
        EXPECT_TRUE(refused(openWithIdentifier(identifier), Code::IllegalIdentifier)) << identifier;
    }
}

TEST_F(PackageInfoTest, theLongestIdentifierIsAccepted) {
    const std::string longest(255, 'x');
    const Result<PackageReader> package = openWithIdentifier(longest);
    ASSERT_TRUE(package.ok()) << package.error().description();
    EXPECT_EQ(package->info().identifier, longest);
}

TEST_F(PackageInfoTest, anotherIdentifierThanTheOneAskedForIsRefused) {
    const Result<PackageReader> package = open(atlasWith({}));
    ASSERT_TRUE(package.ok());
    EXPECT_TRUE(package->expectIdentifier("com.example.atlas").ok());
    EXPECT_TRUE(failedAs(package->expectIdentifier("com.example.beacon"), Code::IdentifierMismatch,
                         "com.example.atlas, not 'com.example.beacon'"));
}

TEST_F(PackageInfoTest, textsMustBeTexts) {
    EXPECT_TRUE(refused(openWith("BundleVersion", "<integer>3</integer>"), Code::IllegalInfoValue,
                        "'BundleVersion'"));
    EXPECT_TRUE(refused(openWith("BundleDisplayName", "<array/>"), Code::IllegalInfoValue));
    EXPECT_TRUE(
        refused(openWith("BundleDisplayName", "<string>a&#9;b</string>"), Code::IllegalInfoValue));
    EXPECT_TRUE(
        refused(openWith("BundleVersion", "<string>" + std::string(1025, '1') + "</string>"),
                Code::IllegalInfoValue, "too long"));
}

TEST_F(PackageInfoTest, filesOfTheBundleHavePlainNames) {
    for (const char* key : {"BundleIconFile", "BundleExecutable"}) {
        for (const char* name : {"..", ".", "/etc/passwd", "../Icon.png", "a/b", "a\\b"}) {
            const std::string value = "<string>" + std::string(name) + "</string>";
            EXPECT_TRUE(refused(openWith(key, value), Code::IllegalInfoValue, key)) << name;
        }
    }
}

TEST_F(PackageInfoTest, filesOfTheBundleCanBeRead) {
    Result<PackageReader> package = open(
        atlasWith({zipFile("VessikMetadata.plist", "meta"), zipFile("Atlas.app/Icon.png", "png")}));
    ASSERT_TRUE(package.ok());
    EXPECT_EQ(*package->readBundleFile("Icon.png", 3), (Bytes{'p', 'n', 'g'}));
    EXPECT_EQ(*package->readStoreMetadata(), (Bytes{'m', 'e', 't', 'a'}));
    EXPECT_EQ(package->readInfoPropertyList()->size(), atlasInfo().size());
    EXPECT_TRUE(isPackageError(package->readBundleFile("Icon.png", 2).error(), Code::TooLarge));
    EXPECT_TRUE(isPackageError(package->readBundleFile("None", 9).error(), Code::NoSuchEntry));
}

TEST_F(PackageInfoTest, metadataThatIsNotThereCannotBeRead) {
    Result<PackageReader> package = open(atlasWith({}));
    ASSERT_TRUE(package.ok());
    EXPECT_TRUE(isPackageError(package->readStoreMetadata().error(), Code::NoSuchEntry));
}

TEST_F(PackageInfoTest, aDescriptorMayBeClosedOnceThePackageIsOpen) {
    write("app.zip", atlasWith({zipFile("VessikMetadata.plist", "meta")}).bytes());
    UniqueFd file(::open(path("app.zip").c_str(), O_RDONLY | O_CLOEXEC));
    Result<PackageReader> package = PackageReader::open(file.get(), "sent.zip", propertyLists());
    file.reset();
    ASSERT_TRUE(package.ok()) << package.error().description();
    EXPECT_EQ(package->readStoreMetadata()->size(), 4U);
}

TEST_F(PackageInfoTest, packagesMayHoldPackages) {
    const std::string inner = atlasWith({}).bytes();
    EXPECT_TRUE(open(atlasWith({zipFile("Atlas.app/inner.zip", inner)})).ok());
}

TEST_F(PackageInfoTest, aCommentIsNoHarm) {
    EXPECT_TRUE(open(atlasWith({}).comment("made on a Monday")).ok());
}

}  // namespace

}  // namespace appsync
