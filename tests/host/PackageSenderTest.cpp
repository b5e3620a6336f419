#include "host/PackageSender.h"

#include <filesystem>
#include <fstream>
#include <utility>

#include "host/SyncDaemon.h"
#include "platform/FileSystem.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

constexpr std::uint64_t kMebibyte = std::uint64_t{1} << 20;
const std::string kDirectory = "/var/mobile/Media/PublicStaging";

class PackageSending : public HostFixture {
  protected:
    PackageSending() { write(file, std::string(2 * kMebibyte + 7, 'x')); }

    Result<std::uint64_t> send(const PackageSender::Progress& progress) {
        return PackageSender(*opened).send(file, kDirectory, "com.a.zip", progress);
    }

    const std::string file = library + "/package";
    const std::string arrived = root + kDirectory + "/com.a.zip";
    const std::unique_ptr<Device> opened = open(DeviceAccess::Session);
};

TEST_F(PackageSending, ComesInPiecesAndWhole) {
    std::vector<std::uint64_t> steps;
    const Result<std::uint64_t> sent = send([&](std::uint64_t done, std::uint64_t) {
        steps.push_back(done);
        return true;
    });
    ASSERT_TRUE(sent.ok());
    EXPECT_EQ(*sent, 2 * kMebibyte + 7);
    EXPECT_EQ(std::filesystem::file_size(arrived), *sent);
    EXPECT_THAT(steps, testing::ElementsAre(kMebibyte, 2 * kMebibyte, 2 * kMebibyte + 7));
}

TEST_F(PackageSending, LeavesNothingWhenItIsInterrupted) {
    const Result<std::uint64_t> sent = send([](std::uint64_t, std::uint64_t) { return false; });
    ASSERT_FALSE(sent.ok());
    EXPECT_EQ(sent.error().code, kTransferInterrupted);
    EXPECT_FALSE(std::filesystem::exists(arrived));
}

TEST_F(PackageSending, NoticesThatThePackageBecameShorter) {
    const Result<std::uint64_t> sent = send([&](std::uint64_t, std::uint64_t) {
        std::filesystem::resize_file(file, kMebibyte);
        return true;
    });
    ASSERT_FALSE(sent.ok());
    EXPECT_EQ(sent.error().code, kTransferCutShort);
    EXPECT_FALSE(std::filesystem::exists(arrived));
}

TEST_F(PackageSending, ReplacesALinkInsteadOfFollowingIt) {
    const std::string victim = directory.path() + "/victim";
    write(victim, "precious");
    std::filesystem::create_directories(root + kDirectory);
    std::filesystem::create_symlink(victim, arrived);
    ASSERT_TRUE(send([](std::uint64_t, std::uint64_t) { return true; }).ok());
    EXPECT_EQ(std::filesystem::file_size(victim), 8U);
    EXPECT_TRUE(std::filesystem::is_regular_file(std::filesystem::symlink_status(arrived)));
}

/// A file that the device keeps beyond the session.
class WholeSending : public PackageSending {
  protected:
    WholeSending() { write(arrived, "old"); }

    Result<std::uint64_t> sendWhole(const PackageSender::Progress& progress) {
        return PackageSender(*opened).sendWhole(file, kDirectory, "com.a.zip", progress);
    }
    /// The names in the directory for temporary files.
    [[nodiscard]] std::vector<std::string> temporaries() const {
        std::vector<std::string> names;
        for (const auto& entry :
             std::filesystem::directory_iterator(root + opened->files().temporaryDirectory())) {
            names.push_back(entry.path().filename());
        }
        return names;
    }
};

TEST_F(WholeSending, ShowsNothingOfTheFileBeforeItIsWhole) {
    const Result<std::uint64_t> sent = sendWhole([&](std::uint64_t, std::uint64_t) {
        EXPECT_EQ(std::filesystem::file_size(arrived), 3U) << "the old one stands";
        EXPECT_THAT(temporaries(), testing::SizeIs(1));
        return true;
    });
    ASSERT_TRUE(sent.ok()) << sent.error().description();
    EXPECT_EQ(std::filesystem::file_size(arrived), 2 * kMebibyte + 7);
    EXPECT_THAT(temporaries(), testing::IsEmpty());
}

TEST_F(WholeSending, LeavesTheOldFileWhenItIsInterrupted) {
    const Result<std::uint64_t> sent =
        sendWhole([](std::uint64_t, std::uint64_t) { return false; });
    ASSERT_FALSE(sent.ok());
    EXPECT_EQ(sent.error().code, kTransferInterrupted);
    EXPECT_EQ(std::filesystem::file_size(arrived), 3U);
    EXPECT_THAT(temporaries(), testing::IsEmpty());
}

TEST_F(WholeSending, DoesNotTakeThePlaceOfADirectory) {
    std::filesystem::remove(arrived);
    write(arrived + "/inside", "kept");
    const Result<std::uint64_t> sent = sendWhole([](std::uint64_t, std::uint64_t) { return true; });
    ASSERT_FALSE(sent.ok());
    EXPECT_THAT(sent.error().description(),
                testing::HasSubstr("cannot write " + kDirectory + "/com.a.zip"));
    EXPECT_TRUE(std::filesystem::exists(arrived + "/inside"));
    EXPECT_THAT(temporaries(), testing::IsEmpty());
}

}  // namespace
}  // namespace appsync
