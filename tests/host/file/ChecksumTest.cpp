#include "host/file/Checksum.h"

#include <sys/stat.h>

#include <filesystem>

#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

class Checksum : public HostFixture {
  protected:
    FileSum sumOf(std::string_view contents) {
        write(file, contents);
        const Result<FileSum> sum = sumOfFile(file);
        EXPECT_TRUE(sum.ok());
        return sum ? *sum : FileSum();
    }
    const std::string file = library + "/file";
};

// The sums that FIPS 180-4's own examples give.
TEST_F(Checksum, IsTheSha256SumOfTheContents) {
    EXPECT_EQ(sumOf(""),
              (FileSum{0, "e3b0c44298fc1c149afbf4c8996fb92427ae41e4649b934ca495991b7852b855"}));
    EXPECT_EQ(sumOf("abc"),
              (FileSum{3, "ba7816bf8f01cfea414140de5dae2223b00361a396177a9cb410ff61f20015ad"}));
    EXPECT_EQ(sumOf("abcdbcdecdefdefgefghfghighijhijkijkljklmklmnlmnomnopnopq"),
              (FileSum{56, "248d6a61d20638b8e5c026930c3e6039a33ce45964ff2167f6ecedd419db06c1"}));
}

TEST_F(Checksum, GoesOverFilesOfManyPieces) {
    EXPECT_EQ(
        sumOf(std::string(1'000'000, 'a')),
        (FileSum{1'000'000, "cdc76e5c9914fb9281a1c7e284d73e67f1809a48a497200e046d39ccc7112cd0"}));
}

TEST_F(Checksum, TellsFilesOfTheSameSizeApart) {
    const FileSum one = sumOf(std::string("\0\0\0", 3));
    const FileSum other = sumOf(std::string("\0\0\1", 3));
    EXPECT_EQ(one.size, other.size);
    EXPECT_NE(one, other);
}

TEST_F(Checksum, SaysWhichFileCannotBeRead) {
    const std::string pipe = library + "/pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    for (const std::string& path : {library + "/absent", library, pipe}) {
        const Result<FileSum> sum = sumOfFile(path);
        ASSERT_FALSE(sum.ok()) << path;
        EXPECT_THAT(sum.error().description(), testing::HasSubstr(path));
    }
}

}  // namespace
}  // namespace appsync
