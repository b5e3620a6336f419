#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "device/archive/PackageError.h"
#include "device/package/PackageReader.h"
#include "platform/PropertyListSerialization.h"
#include "system/file/UniqueFd.h"
#include "tests/device/package/PackageZip.h"

namespace appsync {

/// A directory of its own for each test, and packages in it.
class PackageFixture : public ::testing::Test {
  protected:
    PackageFixture();
    ~PackageFixture() override;

    /// A path in the directory.
    [[nodiscard]] std::string path(std::string_view name) const;
    void write(std::string_view name, std::string_view contents) const;
    [[nodiscard]] std::string read(std::string_view name) const;
    void makeDirectory(std::string_view name) const;
    [[nodiscard]] UniqueFd openDirectory(std::string_view name) const;
    /// Everything below a directory, sorted; directories end with a slash.
    [[nodiscard]] std::vector<std::string> list(std::string_view directory) const;
    /// The permission bits of what stands there.
    [[nodiscard]] unsigned int modeOf(std::string_view name) const;

    [[nodiscard]] Result<PackageReader> open(std::string_view archive,
                                             const PackageLimits& limits = {});
    [[nodiscard]] Result<PackageReader> open(const ZipBuilder& archive,
                                             const PackageLimits& limits = {});
    /// Unpacks into "target", which is made.
    [[nodiscard]] Status unpack(const ZipBuilder& archive,
                                const PackageUnpackOptions& options = {});

    [[nodiscard]] PropertyListSerialization& propertyLists() { return *propertyLists_; }

  private:
    std::unique_ptr<PropertyListSerialization> propertyLists_;
    std::string directory_;
};

/// An Info.plist of com.example.atlas, version 1.0, as XML.
[[nodiscard]] std::string atlasInfo();
/// An Info.plist with these entries, as XML: keys, and values as elements ("<string>1</string>").
[[nodiscard]] std::string infoWith(const std::vector<std::pair<std::string, std::string>>& entries);
/// A whole small application.
[[nodiscard]] std::vector<ZipEntry> atlasEntries();
/// Atlas, and something more.
[[nodiscard]] ZipBuilder atlasWith(const std::vector<ZipEntry>& more);

/// Whether the package was refused for that reason, by an error whose sentence holds the text.
[[nodiscard]] ::testing::AssertionResult refused(const Result<PackageReader>& package,
                                                 PackageErrorCode code, std::string_view text = "");
[[nodiscard]] ::testing::AssertionResult failedAs(const Status& status, PackageErrorCode code,
                                                  std::string_view text = "");

}  // namespace appsync
