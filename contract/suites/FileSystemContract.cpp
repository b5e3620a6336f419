#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <cerrno>
#include <functional>
#include <string>

#include "contract/SystemContract.h"

namespace appsync {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

Bytes bytes(std::string_view text) { return {text.begin(), text.end()}; }

/// 0 for success, otherwise the errno value; -1 for an error that is none.
template <typename Value>
std::int64_t codeOf(const Result<Value>& result) {
    if (result) return 0;
    return result.error().domain == kPosixErrorDomain ? result.error().code : -1;
}

class FileSystemContract : public SystemContract {
  protected:
    FileSystemContract() : files_(system_->files()) { make("/d"); }

    void make(const std::string& directory) {
        EXPECT_EQ(codeOf(files_.createDirectory(directory, true, nullptr)), 0);
    }
    void write(const std::string& path, std::string_view text) {
        EXPECT_EQ(codeOf(files_.writeFileAtomically(path, bytes(text))), 0);
    }
    std::string read(const std::string& path) {
        const Result<Bytes> contents = files_.readFile(path);
        return contents ? std::string(contents->begin(), contents->end())
                        : contents.error().description();
    }

    FileSystem& files_;
};

APPSYNC_CONTRACT_SUITE(FileSystemContract, systemPorts());

TEST_P(FileSystemContract, ADirectoryThatWasMadeIsThere) {
    checks("platform/FileSystem.h",
           "Makes a directory; the parents too, if asked for, and then one that exists is no "
           "failure.");
    EXPECT_FALSE(files_.itemExists("/d/e"));
    EXPECT_EQ(codeOf(files_.createDirectory("/d/e", false, nullptr)), 0);
    EXPECT_TRUE(files_.itemExists("/d/e"));
    const Result<ItemAttributes> attributes = files_.attributes("/d/e");
    ASSERT_TRUE(attributes);
    EXPECT_TRUE(attributes->isDirectory);
}

TEST_P(FileSystemContract, ADirectoryNeedsItsParent) {
    checks("platform/FileSystem.h",
           "ENOENT: the item is missing, or the directory that it is to stand in.");
    EXPECT_EQ(codeOf(files_.createDirectory("/d/e/f", false, nullptr)), ENOENT);
    EXPECT_FALSE(files_.itemExists("/d/e"));
}

TEST_P(FileSystemContract, ADirectoryIsMadeOnlyOnce) {
    checks("platform/FileSystem.h", "Else EEXIST, whatever stands there.");
    EXPECT_EQ(codeOf(files_.createDirectory("/d", false, nullptr)), EEXIST);
    write("/d/file", "");
    EXPECT_EQ(codeOf(files_.createDirectory("/d/file", false, nullptr)), EEXIST);
}

TEST_P(FileSystemContract, ParentsAreMadeOnRequest) {
    checks("platform/FileSystem.h",
           "Makes a directory; the parents too, if asked for, and then one that exists is no "
           "failure.");
    EXPECT_EQ(codeOf(files_.createDirectory("/d/e/f/g", true, nullptr)), 0);
    EXPECT_TRUE(files_.itemExists("/d/e/f/g"));
    EXPECT_EQ(codeOf(files_.createDirectory("/d/e/f/g", true, nullptr)), 0);
    EXPECT_EQ(codeOf(files_.createDirectory("/", true, nullptr)), 0);
}

TEST_P(FileSystemContract, AFileInTheWayOfADirectoryIsAFailure) {
    checks("platform/FileSystem.h", "A file in the way of it or of a parent is a failure.");
    write("/d/file", "kept");
    EXPECT_NE(codeOf(files_.createDirectory("/d/file", true, nullptr)), 0);
    EXPECT_NE(codeOf(files_.createDirectory("/d/file/below", true, nullptr)), 0);
    EXPECT_EQ(read("/d/file"), "kept");
}

TEST_P(FileSystemContract, NewItemsBelongToWhomTheyAreGiven) {
    checks("platform/FileSystem.h",
           "Whom a new file or directory belongs to: account names of the device.");
    for (const std::string& account : system_->accounts()) {
        const FileAttributes given{account, account};
        const std::string directory = "/d/" + account;
        EXPECT_EQ(codeOf(files_.createDirectory(directory + "/e", true, &given)), 0);
        EXPECT_EQ(codeOf(files_.createDirectory(directory + "/e/f", false, &given)), 0);
        EXPECT_EQ(codeOf(files_.createFile(directory + "/file", bytes("x"), given)), 0);
        for (const char* item : {"", "/e", "/e/f", "/file"}) {
            EXPECT_TRUE(system_->belongsTo(directory + item, given)) << directory << item;
        }
    }
}

TEST_P(FileSystemContract, OwnerAndGroupAreGivenEachByItself) {
    checks("platform/FileSystem.h",
           "Whom a new file or directory belongs to: account names of the device.");
    const std::vector<std::string> accounts = system_->accounts();
    if (accounts.size() < 2) GTEST_SKIP() << "this process may give items to nobody else";
    const std::string& one = accounts[0];
    const std::string& other = accounts[1];
    for (const FileAttributes& given :
         {FileAttributes{one, other}, FileAttributes{other, one},
          FileAttributes{other, std::nullopt}, FileAttributes{std::nullopt, other}}) {
        EXPECT_EQ(codeOf(files_.createDirectory("/d/e", false, &given)), 0);
        EXPECT_EQ(codeOf(files_.createFile("/d/e/file", bytes("x"), given)), 0);
        for (const char* item : {"/d/e", "/d/e/file"}) {
            EXPECT_TRUE(system_->belongsTo(item, given)) << item;
            EXPECT_FALSE(system_->belongsTo(item, {given.group, given.owner})) << item;
        }
        EXPECT_EQ(codeOf(files_.removeItem("/d/e")), 0);
    }
}

TEST_P(FileSystemContract, AFileThatIsReplacedIsGivenToo) {
    checks("platform/FileSystem.h",
           "Whom a new file or directory belongs to: account names of the device.");
    for (const std::string& account : system_->accounts()) {
        const FileAttributes given{account, account};
        EXPECT_EQ(codeOf(files_.createFile("/d/file", bytes("x"), given)), 0);
        EXPECT_TRUE(system_->belongsTo("/d/file", given)) << account;
    }
}

TEST_P(FileSystemContract, AnUnknownAccountIsRefusedAndNothingMade) {
    checks("platform/FileSystem.h",
           "One that the device does not know is refused with EINVAL, and nothing is made.");
    const FileAttributes nobody{"no such account", std::nullopt};
    EXPECT_EQ(codeOf(files_.createDirectory("/d/e", true, &nobody)), EINVAL);
    EXPECT_EQ(codeOf(files_.createFile("/d/file", bytes("x"), nobody)), EINVAL);
    EXPECT_THAT(system_->names("/d"), IsEmpty());
}

TEST_P(FileSystemContract, WhatIsWrittenIsRead) {
    checks("platform/FileSystem.h", "The whole file, past any cache of the process.");
    using std::string_literals::operator""s;
    for (const std::string& text : {""s, "text"s, "with \0 and \xff"s, std::string(1 << 20, 'x')}) {
        write("/d/file", text);
        EXPECT_EQ(read("/d/file"), text);
        EXPECT_EQ(files_.attributes("/d/file")->size, text.size());
    }
}

TEST_P(FileSystemContract, WritingLeavesNothingBeside) {
    checks("platform/FileSystem.h", "no temporary file stays for good.");
    write("/d/file", "one");
    write("/d/file", "two");
    EXPECT_EQ(codeOf(files_.createFile("/d/file", bytes("three"), {})), 0);
    EXPECT_THAT(system_->names("/d"), ElementsAre("file"));
}

TEST_P(FileSystemContract, AFileNeedsItsDirectory) {
    checks("platform/FileSystem.h",
           "ENOENT: the item is missing, or the directory that it is to stand in.");
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/d/e/file", bytes("x"))), ENOENT);
    EXPECT_EQ(codeOf(files_.createFile("/d/e/file", bytes("x"), {})), ENOENT);
    EXPECT_EQ(codeOf(files_.readFile("/d/e/file")), ENOENT);
}

TEST_P(FileSystemContract, AFileDoesNotReplaceADirectory) {
    checks("platform/FileSystem.h",
           "EISDIR: a directory stands where a file is to be read or written.");
    make("/d/e");
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/d/e", bytes("x"))), EISDIR);
    EXPECT_EQ(codeOf(files_.createFile("/d/e", bytes("x"), {})), EISDIR);
    EXPECT_THAT(system_->names("/d"), ElementsAre("e"));
}

TEST_P(FileSystemContract, CreatingReplacesWhatWasThere) {
    checks("platform/FileSystem.h",
           "Creates or replaces a file, not atomically: nothing is synced.");
    write("/d/file", "old and longer");
    EXPECT_EQ(codeOf(files_.createFile("/d/file", bytes("new"), {})), 0);
    EXPECT_EQ(read("/d/file"), "new");
}

TEST_P(FileSystemContract, WhatIsMissingHasNoAttributes) {
    checks("platform/FileSystem.h",
           "ENOENT: the item is missing, or the directory that it is to stand in.");
    EXPECT_EQ(codeOf(files_.attributes("/d/missing")), ENOENT);
    EXPECT_EQ(codeOf(files_.setTimesToNow("/d/missing")), ENOENT);
    checks("platform/FileSystem.h", "Sets the times of last access and modification to now.");
    write("/d/file", "x");
    EXPECT_EQ(codeOf(files_.setTimesToNow("/d/file")), 0);
    EXPECT_EQ(codeOf(files_.setTimesToNow("/d")), 0);
}

TEST_P(FileSystemContract, AFileIsNoDirectory) {
    checks("platform/FileSystem.h", "ENOTDIR: the path goes on below a file.");
    write("/d/file", "x");
    EXPECT_EQ(codeOf(files_.readFile("/d/file/below")), ENOTDIR);
    EXPECT_EQ(codeOf(files_.writeFileAtomically("/d/file/below", bytes("x"))), ENOTDIR);
    EXPECT_EQ(codeOf(files_.readFile("/d/file/")), ENOTDIR);
    EXPECT_FALSE(files_.itemExists("/d/file/below"));
}

TEST_P(FileSystemContract, RemovingTakesEverythingBelow) {
    checks("platform/FileSystem.h",
           "Removes a file, a link (not what it points to) or a directory with everything in it,");
    make("/d/e/f");
    write("/d/e/f/file", "x");
    write("/d/kept", "x");
    EXPECT_EQ(codeOf(files_.removeItem("/d/e")), 0);
    EXPECT_THAT(system_->names("/d"), ElementsAre("kept"));
    EXPECT_EQ(codeOf(files_.removeItem("/d/e")), ENOENT);
}

TEST_P(FileSystemContract, RemovingALinkLeavesWhatItPointsTo) {
    checks("platform/FileSystem.h",
           "Removes a file, a link (not what it points to) or a directory with everything in it,");
    make("/d/target");
    write("/d/target/file", "kept");
    system_->addLink("/d/link", "/d/target");
    make("/d/tree");
    system_->addLink("/d/tree/link", "../target");
    EXPECT_EQ(codeOf(files_.removeItem("/d/link")), 0);
    EXPECT_EQ(codeOf(files_.removeItem("/d/tree")), 0);
    EXPECT_THAT(system_->names("/d"), ElementsAre("target"));
    EXPECT_EQ(read("/d/target/file"), "kept");
}

TEST_P(FileSystemContract, MovingTakesEverythingAlong) {
    checks("platform/FileSystem.h", "Renames.");
    make("/d/e");
    write("/d/e/file", "text");
    EXPECT_EQ(codeOf(files_.moveItem("/d/e", "/d/f")), 0);
    EXPECT_THAT(system_->names("/d"), ElementsAre("f"));
    EXPECT_EQ(read("/d/f/file"), "text");
}

TEST_P(FileSystemContract, MovingReplacesNothing) {
    checks("platform/FileSystem.h", "Renames. EEXIST when something stands at `to`.");
    write("/d/from", "one");
    write("/d/to", "two");
    make("/d/directory");
    EXPECT_EQ(codeOf(files_.moveItem("/d/from", "/d/to")), EEXIST);
    EXPECT_EQ(codeOf(files_.moveItem("/d/from", "/d/directory")), EEXIST);
    EXPECT_EQ(read("/d/from"), "one");
    EXPECT_EQ(read("/d/to"), "two");
}

TEST_P(FileSystemContract, MovingNeedsBothEnds) {
    checks("platform/FileSystem.h",
           "ENOENT: the item is missing, or the directory that it is to stand in.");
    write("/d/from", "kept");
    EXPECT_EQ(codeOf(files_.moveItem("/d/missing", "/d/to")), ENOENT);
    EXPECT_EQ(codeOf(files_.moveItem("/d/from", "/d/missing/to")), ENOENT);
    EXPECT_EQ(read("/d/from"), "kept");
}

TEST_P(FileSystemContract, ADirectoryDoesNotMoveIntoItself) {
    checks("platform/FileSystem.h", "EINVAL when `to` lies inside `from`.");
    make("/d/e");
    EXPECT_EQ(codeOf(files_.moveItem("/d/e", "/d/e/f")), EINVAL);
    EXPECT_TRUE(files_.itemExists("/d/e"));
}

TEST_P(FileSystemContract, CopyingLeavesTheSource) {
    checks("platform/FileSystem.h", "Copies a regular file.");
    write("/d/from", "text");
    EXPECT_EQ(codeOf(files_.copyItem("/d/from", "/d/to")), 0);
    EXPECT_EQ(read("/d/from"), "text");
    EXPECT_EQ(read("/d/to"), "text");
}

TEST_P(FileSystemContract, CopyingReplacesNothing) {
    checks("platform/FileSystem.h", "Copies a regular file. EEXIST when something stands at `to`.");
    write("/d/from", "one");
    write("/d/to", "two");
    EXPECT_EQ(codeOf(files_.copyItem("/d/from", "/d/to")), EEXIST);
    EXPECT_EQ(codeOf(files_.copyItem("/d/missing", "/d/other")), ENOENT);
    EXPECT_EQ(codeOf(files_.copyItem("/d/from", "/d/missing/to")), ENOENT);
    EXPECT_EQ(read("/d/to"), "two");
}

TEST_P(FileSystemContract, OnlyRegularFilesAreReadOrCopied) {
    checks("platform/FileSystem.h", "Nothing but regular files is ever read or copied:");
    make("/d/e");
    system_->addPipe("/d/pipe");
    EXPECT_EQ(codeOf(files_.readFile("/d/e")), EISDIR);
    EXPECT_EQ(codeOf(files_.copyItem("/d/e", "/d/to")), EISDIR);
    checks("platform/FileSystem.h", "a device or a pipe is refused without waiting on it.");
    EXPECT_EQ(codeOf(files_.readFile("/d/pipe")), EINVAL);
    EXPECT_EQ(codeOf(files_.copyItem("/d/pipe", "/d/to")), EINVAL);
    EXPECT_FALSE(files_.itemExists("/d/to"));
}

TEST_P(FileSystemContract, LinksAreFollowed) {
    checks("platform/FileSystem.h", "a link at the end of a path is followed inside the root;");
    make("/d/e");
    write("/d/e/file", "text");
    system_->addLink("/d/relative", "e");
    system_->addLink("/d/absolute", "/d/e/file");
    EXPECT_EQ(read("/d/relative/file"), "text");
    EXPECT_EQ(read("/d/absolute"), "text");
    EXPECT_EQ(files_.attributes("/d/absolute")->size, 4U);
    EXPECT_EQ(codeOf(files_.copyItem("/d/absolute", "/d/copy")), 0);
    EXPECT_EQ(read("/d/copy"), "text");
}

TEST_P(FileSystemContract, NothingLeadsOutOfTheRoot) {
    checks("platform/FileSystem.h",
           "they are resolved inside the device's root, links and \"..\" included, and lead "
           "nowhere else.");
    write("/d/file", "inside");
    system_->addLink("/d/up", "../../../..");
    system_->addLink("/d/passwd", "/etc/passwd");
    EXPECT_EQ(read("/d/up/d/file"), "inside");
    EXPECT_EQ(read("/../../d/file"), "inside");
    EXPECT_EQ(codeOf(files_.readFile("/d/passwd")), ENOENT);
    EXPECT_FALSE(files_.itemExists("/d/up/etc/passwd"));
}

TEST_P(FileSystemContract, ALinkToNothingIsNotThereButInTheWay) {
    checks("platform/FileSystem.h", "A link that leads to nothing is neither.");
    system_->addLink("/d/link", "missing");
    write("/d/file", "x");
    EXPECT_FALSE(files_.itemExists("/d/link"));
    EXPECT_EQ(codeOf(files_.readFile("/d/link")), ENOENT);
    checks("platform/FileSystem.h", "EEXIST when something stands at `to`.");
    EXPECT_EQ(codeOf(files_.moveItem("/d/file", "/d/link")), EEXIST);
    EXPECT_EQ(codeOf(files_.copyItem("/d/file", "/d/link")), EEXIST);
}

TEST_P(FileSystemContract, LinksInACircleAreRefused) {
    checks("platform/FileSystem.h", "ELOOP: links lead in a circle.");
    system_->addLink("/d/a", "b");
    system_->addLink("/d/b", "a");
    EXPECT_EQ(codeOf(files_.readFile("/d/a")), ELOOP);
    EXPECT_FALSE(files_.itemExists("/d/a"));
}

TEST_P(FileSystemContract, AWrittenFileTakesALinksPlace) {
    checks("platform/FileSystem.h", "A link at the path is replaced, not followed.");
    write("/d/target", "kept");
    system_->addLink("/d/link", "target");
    write("/d/link", "new");
    EXPECT_EQ(read("/d/link"), "new");
    EXPECT_EQ(read("/d/target"), "kept");
}

TEST_P(FileSystemContract, TheTemporaryDirectoryIsThere) {
    checks("platform/FileSystem.h",
           "The process's directory for temporary files, without a slash at its end. It exists,");
    const std::string path = files_.temporaryDirectory();
    EXPECT_TRUE(path.starts_with('/'));
    EXPECT_FALSE(path.ends_with('/'));
    EXPECT_TRUE(files_.attributes(path)->isDirectory);
}

/// Each operation on one path, as a table.
std::vector<std::pair<std::string, std::function<std::int64_t(FileSystem&, const std::string&)>>>
operationsOnAPath() {
    return {
        {"attributes", [](auto& files, auto& path) { return codeOf(files.attributes(path)); }},
        {"createDirectory",
         [](auto& files, auto& path) {
             return codeOf(files.createDirectory(path, false, nullptr));
         }},
        {"createDirectories",
         [](auto& files, auto& path) {
             return codeOf(files.createDirectory(path, true, nullptr));
         }},
        {"removeItem", [](auto& files, auto& path) { return codeOf(files.removeItem(path)); }},
        {"moveItem from",
         [](auto& files, auto& path) { return codeOf(files.moveItem(path, "/d/new")); }},
        {"moveItem to",
         [](auto& files, auto& path) { return codeOf(files.moveItem("/d/file", path)); }},
        {"copyItem from",
         [](auto& files, auto& path) { return codeOf(files.copyItem(path, "/d/new")); }},
        {"copyItem to",
         [](auto& files, auto& path) { return codeOf(files.copyItem("/d/file", path)); }},
        {"readFile", [](auto& files, auto& path) { return codeOf(files.readFile(path)); }},
        {"writeFileAtomically",
         [](auto& files, auto& path) { return codeOf(files.writeFileAtomically(path, {})); }},
        {"createFile",
         [](auto& files, auto& path) { return codeOf(files.createFile(path, {}, {})); }},
        {"setTimesToNow",
         [](auto& files, auto& path) { return codeOf(files.setTimesToNow(path)); }},
    };
}

TEST_P(FileSystemContract, EveryOperationRefusesAPathThatIsNone) {
    checks("platform/FileSystem.h", "EINVAL: the path is empty, not absolute or holds a NUL;");
    using std::string_literals::operator""s;
    write("/d/file", "kept");
    for (const std::string& path : {""s, "d/file"s, "/d/fi\0le"s}) {
        EXPECT_FALSE(files_.itemExists(path));
        for (const auto& [name, operation] : operationsOnAPath()) {
            EXPECT_EQ(operation(files_, path), EINVAL) << name << " of '" << path << "'";
        }
    }
    EXPECT_THAT(system_->names("/d"), ElementsAre("file"));
}

TEST_P(FileSystemContract, EveryOperationRefusesAPathThatIsTooLong) {
    checks("platform/FileSystem.h",
           "ENAMETOOLONG: a name has more than 255 bytes, or the path more than the device takes.");
    write("/d/file", "kept");
    std::string longPath = "/d";
    while (longPath.size() < 5000) longPath += "/name";
    for (const std::string& path : {"/d/" + std::string(256, 'x'), longPath}) {
        for (const auto& [name, operation] : operationsOnAPath()) {
            EXPECT_EQ(operation(files_, path), ENAMETOOLONG) << name;
        }
    }
}

TEST_P(FileSystemContract, AnErrorNamesThePath) {
    checks("platform/FileSystem.h",
           "Failures are errors of `kPosixErrorDomain` with the errno value and a sentence that "
           "names the operation and the path.");
    const Result<Bytes> contents = files_.readFile("/d/missing");
    ASSERT_FALSE(contents);
    EXPECT_THAT(contents.error().description(), HasSubstr("/d/missing"));
    const Status moved = files_.moveItem("/d/from", "/d/to");
    ASSERT_FALSE(moved);
    EXPECT_THAT(moved.error().description(), HasSubstr("/d/from"));
}

}  // namespace

void linkFileSystemContract() {}

}  // namespace appsync
