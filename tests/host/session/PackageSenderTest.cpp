#include "host/session/PackageSender.h"

#include <array>
#include <filesystem>
#include <fstream>
#include <map>
#include <system_error>
#include <utility>

#include "host/plan/TransferError.h"
#include "host/watch/SyncDaemon.h"
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

/// Several files of that kind at once.
class SendingSeveral : public WholeSending {
  protected:
    void sendAside(PackageSender& sender) {
        for (const char* name : kNames) {
            const auto goOn = [](std::uint64_t, std::uint64_t) { return true; };
            const Result<std::uint64_t> sent = sender.sendAside(file, kDirectory, name, goOn);
            ASSERT_TRUE(sent.ok()) << sent.error().description();
        }
    }
    [[nodiscard]] std::uintmax_t sizeOf(const std::string& name) const {
        std::error_code code;
        const std::uintmax_t size =
            std::filesystem::file_size(root + kDirectory + "/" + name, code);
        return code ? 0 : size;
    }
    static constexpr std::array kNames = {"com.a.zip", "com.b.zip", "com.c.zip"};
};

TEST_F(SendingSeveral, GivesThemTheirNamesTogether) {
    PackageSender sender(*opened);
    sendAside(sender);
    EXPECT_EQ(sizeOf("com.a.zip"), 3U) << "the old one stands";
    EXPECT_EQ(sizeOf("com.b.zip"), 0U);
    EXPECT_THAT(sender.placeAll(), testing::IsEmpty());
    for (const char* name : kNames) EXPECT_EQ(sizeOf(name), 2 * kMebibyte + 7) << name;
    EXPECT_THAT(temporaries(), testing::IsEmpty());
    EXPECT_THAT(sender.placeAll(), testing::IsEmpty()) << "nothing is left to place";
}

TEST_F(SendingSeveral, LeavesNothingOfWhatIsNotPlaced) {
    {
        PackageSender sender(*opened);
        sendAside(sender);
        EXPECT_THAT(temporaries(), testing::SizeIs(3));
    }
    EXPECT_THAT(temporaries(), testing::IsEmpty());
    EXPECT_EQ(sizeOf("com.a.zip"), 3U);
}

TEST_F(SendingSeveral, NamesTheOneThatHasNoPlace) {
    write(root + kDirectory + "/com.b.zip/inside", "kept");
    PackageSender sender(*opened);
    sendAside(sender);
    const std::map<std::string, ErrorRecord> failures = sender.placeAll();
    ASSERT_THAT(failures, testing::SizeIs(1));
    EXPECT_EQ(failures.begin()->first, kDirectory + "/com.b.zip");
    EXPECT_EQ(sizeOf("com.c.zip"), 2 * kMebibyte + 7);
    EXPECT_THAT(temporaries(), testing::IsEmpty());
}

}  // namespace
}  // namespace appsync
