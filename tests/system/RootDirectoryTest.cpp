#include "system/file/RootDirectory.h"

#include <cerrno>

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/sysmacros.h>
#include <sys/un.h>
#include <unistd.h>

#include "tests/system/DeviceFilesTest.h"
#include "tests/system/FailingCalls.h"

namespace appsync {
namespace {

using device_files::Call;
using device_files::FailingCall;
using std::string_literals::operator""s;

class RootDirectoryTest : public device_files::DeviceFilesTest {
  protected:
    [[nodiscard]] const RootDirectory& root() const { return files_->root(); }

    /// What stands in the file that the path leads to, or why there is none.
    [[nodiscard]] std::string read(const std::string& path) const {
        const Result<Bytes> contents = files_->readFile(path);
        return contents ? device_files::text(*contents) : contents.error().description();
    }
    [[nodiscard]] std::int64_t openingFailsWith(const std::string& path) const {
        const auto opened = root().openFile(path, O_RDONLY | O_NONBLOCK);
        return opened ? 0 : opened.error().code;
    }
    [[nodiscard]] std::int64_t regularFails(const std::string& path) const {
        const auto opened = root().openRegularFile(path);
        return opened ? 0 : opened.error().code;
    }
    [[nodiscard]] std::int64_t placeFails(const std::string& path) const {
        const auto place = root().place(path);
        return place ? 0 : place.error().code;
    }
};

TEST_F(RootDirectoryTest, PathsStartAtTheRoot) {
    put("/var/mobile/x", "inside");
    EXPECT_EQ(read("/var/mobile/x"), "inside");
    EXPECT_EQ(read("//var/./mobile//x"), "inside");
}

TEST_F(RootDirectoryTest, AnAbsoluteLinkIsResolvedInside) {
    put("/etc/file", "inside");
    link("/link", "/etc/file");
    EXPECT_EQ(read("/link"), "inside");
}

TEST_F(RootDirectoryTest, ALinkToAPlaceOutsideLeadsNowhere) {
    link("/link", outside() / "file");
    link("/directory", outside());
    EXPECT_EQ(openingFailsWith("/link"), ENOENT);
    EXPECT_EQ(openingFailsWith("/directory/file"), ENOENT);
}

TEST_F(RootDirectoryTest, DotDotStopsAtTheRoot) {
    put("/file", "inside");
    link("/a/up", "../../../../../file");
    EXPECT_EQ(read("/a/up"), "inside");
    EXPECT_EQ(read("/../../../file"), "inside");
    EXPECT_EQ(openingFailsWith("/../outside/file"), ENOENT);
}

TEST_F(RootDirectoryTest, ProcLinksOfTheMachineAreNotFollowed) {
    link("/self", "/proc/self/root");
    EXPECT_EQ(openingFailsWith("/self/etc/passwd"), ENOENT);
}

TEST_F(RootDirectoryTest, LinksInACircleAreRefused) {
    link("/one", "/two");
    link("/two", "/one");
    EXPECT_EQ(openingFailsWith("/one"), ELOOP);
}

TEST_F(RootDirectoryTest, BadPathsAreRefused) {
    put("/file", "inside");
    for (const std::string& path : {""s, "file"s, "../file"s, "/file\0"s, "/fi\0le"s}) {
        EXPECT_EQ(openingFailsWith(path), EINVAL) << path;
        EXPECT_EQ(placeFails(path), EINVAL) << path;
    }
}

TEST_F(RootDirectoryTest, ARefusalSaysWhatIsWrongWithThePath) {
    const auto opened = root().openFile("a\0b"s, O_RDONLY, 0, "read");
    ASSERT_FALSE(opened);
    EXPECT_EQ(opened.error().description(), "cannot read a\\x00b: the path holds a NUL");
}

TEST_F(RootDirectoryTest, PathsThatAreTooLongAreRefused) {
    const std::string longName(300, 'x');
    std::string longPath;
    while (longPath.size() < 5000) longPath += "/x";
    EXPECT_EQ(openingFailsWith("/" + longName), ENAMETOOLONG);
    EXPECT_EQ(openingFailsWith(longPath), ENAMETOOLONG);
    EXPECT_EQ(placeFails(longPath), ENAMETOOLONG);
    EXPECT_EQ(openingFailsWith("/" + std::string(1'000'000, 'x')), ENAMETOOLONG);
}

TEST_F(RootDirectoryTest, OnlyRegularFilesAreOpenedAsSuch) {
    put("/file", "12345");
    pipe("/pipe");
    std::filesystem::create_directory(real("/directory"));
    const auto file = root().openRegularFile("/file");
    ASSERT_TRUE(file);
    EXPECT_EQ(file->size, 5U);
    EXPECT_EQ(regularFails("/directory"), EISDIR);
    EXPECT_EQ(regularFails("/pipe"), EINVAL);
    EXPECT_EQ(regularFails("/absent"), ENOENT);
}

TEST_F(RootDirectoryTest, DevicesAreRefused) {
    if (::mknod(real("/null").c_str(), S_IFCHR | 0600, makedev(1, 3)) != 0) {
        GTEST_SKIP() << "this account may not make devices";
    }
    EXPECT_EQ(regularFails("/null"), EINVAL);
}

TEST_F(RootDirectoryTest, SocketsAreRefused) {
    const UniqueFd socket(::socket(AF_UNIX, SOCK_STREAM, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    real("/socket").string().copy(address.sun_path, sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(regularFails("/socket"), ENXIO);
}

TEST_F(RootDirectoryTest, DescriptorsAreClosedOnExec) {
    put("/file", "");
    const auto file = root().openFile("/file", O_RDONLY);
    ASSERT_TRUE(file);
    EXPECT_NE(::fcntl(file->get(), F_GETFD) & FD_CLOEXEC, 0);
    EXPECT_NE(::fcntl(root().descriptor(), F_GETFD) & FD_CLOEXEC, 0);
}

TEST_F(RootDirectoryTest, MakesFilesWithTheModeThatItIsGiven) {
    ASSERT_TRUE(root().openFile("/new", O_WRONLY | O_CREAT | O_EXCL, 0600));
    EXPECT_EQ(std::filesystem::status(real("/new")).permissions(), std::filesystem::perms(0600));
}

TEST_F(RootDirectoryTest, ALinkAtTheEndIsLeftUnfollowedOnRequest) {
    link("/link", "/absent");
    EXPECT_TRUE(root().openFile("/link", O_PATH | O_NOFOLLOW));
    EXPECT_FALSE(root().openFile("/link", O_PATH));
}

TEST_F(RootDirectoryTest, APlaceIsADirectoryAndAName) {
    put("/a/b/file", "");
    const auto place = root().place("/a/./b//file");
    ASSERT_TRUE(place);
    EXPECT_EQ(place->name, "file");
    EXPECT_FALSE(place->mustBeDirectory);
    EXPECT_EQ(::faccessat(place->directory.get(), "file", F_OK, 0), 0);
}

TEST_F(RootDirectoryTest, APlaceMayEndInSlashes) {
    const auto place = root().place("/absent//");
    ASSERT_TRUE(place);
    EXPECT_EQ(place->name, "absent");
    EXPECT_TRUE(place->mustBeDirectory);
}

TEST_F(RootDirectoryTest, APlaceIsNeverTheRootOrADirectoryAbove) {
    std::filesystem::create_directory(real("/a"));
    for (const char* path : {"/", "///", "/.", "/..", "/a/.", "/a/..", "/a/../"}) {
        EXPECT_EQ(placeFails(path), EINVAL) << path;
    }
}

TEST_F(RootDirectoryTest, TheDirectoryOfAPlaceMustExist) {
    put("/file", "");
    EXPECT_EQ(placeFails("/absent/name"), ENOENT);
    EXPECT_EQ(placeFails("/file/name"), ENOTDIR);
}

TEST_F(RootDirectoryTest, ARootMustBeADirectory) {
    put("/file", "");
    EXPECT_EQ(RootDirectory::open(real("/file").string()).error().code, ENOTDIR);
    EXPECT_EQ(RootDirectory::open(real("/absent").string()).error().code, ENOENT);
}

TEST_F(RootDirectoryTest, AKernelThatCannotResolveInsideIsNamed) {
    const FailingCall failing(Call::Openat2, ENOSYS);
    const auto opened = RootDirectory::open(real("/").string());
    ASSERT_FALSE(opened);
    EXPECT_EQ(opened.error().code, ENOSYS);
    EXPECT_NE(opened.error().description().find("Linux 5.6"), std::string::npos);
}

TEST_F(RootDirectoryTest, AnInterruptedResolutionIsRepeated) {
    put("/file", "inside");
    for (const int code : {EAGAIN, EINTR}) {
        const FailingCall failing(Call::Openat2, code, 5);
        EXPECT_EQ(read("/file"), "inside");
        EXPECT_EQ(failing.failures(), 5);
    }
}

TEST_F(RootDirectoryTest, AResolutionThatNeverSucceedsIsGivenUp) {
    put("/file", "inside");
    const FailingCall failing(Call::Openat2, EAGAIN);
    EXPECT_EQ(openingFailsWith("/file"), EAGAIN);
}

TEST_F(RootDirectoryTest, AFileThatCannotBeExaminedIsNotRead) {
    put("/file", "inside");
    const FailingCall failing(Call::Fstat, EIO);
    EXPECT_EQ(regularFails("/file"), EIO);
}

}  // namespace
}  // namespace appsync
