#include <gtest/gtest.h>

#include <algorithm>
#include <memory>
#include <string>

#include "contract/Sentence.h"
#include "contract/SystemContract.h"

namespace appsync {

void linkFileSystemAtomicityContract() {}

namespace {

constexpr const char* kFile = "/d/file";
constexpr int kRounds = 30;
constexpr std::size_t kSize = 10000;

class FileSystemAtomicityContract : public SystemContract {
  protected:
    FileSystemAtomicityContract() {
        EXPECT_TRUE(files_.createDirectory("/d", true, nullptr));
        write('a');
    }

    void write(char letter) {
        EXPECT_TRUE(
            files_.writeFileAtomically(kFile, Bytes(kSize, static_cast<std::uint8_t>(letter))));
    }
    void readAWholeFile() {
        const Result<Bytes> contents = files_.readFile(kFile);
        ASSERT_TRUE(contents) << contents.error().description();
        EXPECT_EQ(contents->size(), kSize);
        EXPECT_EQ(std::count(contents->begin(), contents->end(), contents->at(0)),
                  static_cast<std::ptrdiff_t>(kSize));
    }

    FileSystem& files_ = system_->files();
};

APPSYNC_CONTRACT_SUITE(FileSystemAtomicityContract, systemPorts());

TEST_P(FileSystemAtomicityContract, WhoReadsSeesTheOldFileOrTheNewOne) {
    checks("platform/FileSystem.h",
           "Writes the file whole: temporary file in the same directory, sync, rename; or "
           "otherwise, where that comes to the same.");
    const auto operations = system_->queues().makeOperationQueue();
    operations->setMaximumConcurrentOperations(2);
    operations->add([this] {
        for (int round = 0; round < kRounds; ++round) write(round % 2 == 0 ? 'b' : 'a');
    });
    operations->add([this] {
        for (int round = 0; round < kRounds; ++round) readAWholeFile();
    });
}

TEST_P(FileSystemAtomicityContract, TwoMayWriteOneFileAtOnce) {
    checks("platform/FileSystem.h",
           "two threads must not change one file at once (the atomic operations may).");
    {
        const auto operations = system_->queues().makeOperationQueue();
        operations->setMaximumConcurrentOperations(2);
        for (const char letter : {'b', 'c'}) {
            operations->add([this, letter] {
                for (int round = 0; round < kRounds; ++round) write(letter);
            });
        }
    }
    readAWholeFile();
    EXPECT_EQ(system_->names("/d"), std::vector<std::string>{"file"});
}

}  // namespace
}  // namespace appsync
