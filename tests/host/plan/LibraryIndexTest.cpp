#include "host/plan/LibraryIndex.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include <filesystem>
#include <fstream>
#include <iterator>

#include "host/plan/LibraryReader.h"
#include "system/file/UniqueFd.h"
#include "system/property_list/PropertyListCodec.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

constexpr const char* kAtlasPackage = "com.example.atlas";
constexpr const char* kBrookPackage = "com.example.brook";

class LibraryIndexTest : public HostFixture {
  protected:
    LibraryIndexTest() {
        addPackage(kAtlasPackage, "1");
        addPackage(kBrookPackage, "1");
    }

    /// "identifier version" of each package.
    std::vector<std::string> packages(const std::string& folder) {
        SystemPropertyLists propertyLists;
        const Result<Library> read = readLibrary(folder, propertyLists, {}, place);
        std::vector<std::string> result;
        if (!read) return {read.error().description()};
        for (const LibraryPackage& each : read->packages) {
            EXPECT_EQ(fs::path(each.file).parent_path(), folder);
            result.push_back(each.identifier + " " + each.version);
        }
        return result;
    }
    std::vector<std::string> packages() { return packages(library); }
    const std::vector<std::string> truth = {"com.example.atlas 1", "com.example.brook 1"};

    [[nodiscard]] std::vector<std::string> indexFiles() const {
        std::vector<std::string> files;
        if (!fs::exists(place.directory)) return files;
        for (const auto& each : fs::directory_iterator(place.directory)) {
            files.push_back(each.path().native());
        }
        return files;
    }
    [[nodiscard]] std::string indexFile() const {
        const std::vector<std::string> files = indexFiles();
        EXPECT_EQ(files.size(), 1U);
        return files.empty() ? "" : files.front();
    }
    [[nodiscard]] Bytes indexContents() const {
        std::ifstream file(indexFile(), std::ios::binary);
        return {std::istreambuf_iterator<char>(file), {}};
    }
    void writeIndex(const Bytes& bytes) const {
        std::ofstream(indexFile(), std::ios::binary | std::ios::trunc)
            << std::string(bytes.begin(), bytes.end());
    }
    [[nodiscard]] LibraryIndexContents index() const {
        auto contents = readIndex(indexContents());
        EXPECT_TRUE(contents.has_value());
        return contents.value_or(LibraryIndexContents());
    }
    [[nodiscard]] std::vector<IndexedPackage> indexed() const { return index().packages; }
    /// Lets the index say something of each package that nobody could find in its file.
    template <typename Change>
    void alterIndex(Change change) {
        LibraryIndexContents all = index();
        for (IndexedPackage& each : all.packages) {
            each.package.version = "9";
            change(each);
        }
        writeIndex(indexBytes(all));
    }
    void alterIndex() {
        alterIndex([](IndexedPackage&) {});
    }
    const std::vector<std::string> invention = {"com.example.atlas 9", "com.example.brook 9"};

    LibraryIndexPlace place{directory.path() + "/cache/appsync", std::chrono::seconds(0), 1};
};

TEST_F(LibraryIndexTest, aKnownPackageIsNotOpenedAgain) {
    EXPECT_EQ(packages(), truth);
    alterIndex();
    EXPECT_EQ(packages(), invention);
}

TEST_F(LibraryIndexTest, aPackageThatIsWrittenAnewIsRead) {
    ASSERT_EQ(packages(), truth);
    alterIndex();
    addPackage(kBrookPackage, "2.0.1");
    EXPECT_EQ(packages(),
              (std::vector<std::string>{"com.example.atlas 9", "com.example.brook 2.0.1"}));
    EXPECT_EQ(indexed().back().package.version, "2.0.1");
}

TEST_F(LibraryIndexTest, aPackageOfWhichAnythingElseIsKnownIsRead) {
    using Change = void (*)(IndexedPackage&);
    const std::vector<Change> changes = {
        [](IndexedPackage& each) { ++each.stamp.device; },
        [](IndexedPackage& each) { ++each.stamp.inode; },
        [](IndexedPackage& each) { ++each.stamp.size; },
        [](IndexedPackage& each) { --each.stamp.modified; },
        [](IndexedPackage& each) { --each.stamp.changed; },
        [](IndexedPackage& each) { each.package.file += ".zip"; },
    };
    for (std::size_t i = 0; i < changes.size(); ++i) {
        ASSERT_EQ(packages(), truth);
        alterIndex(changes[i]);
        EXPECT_EQ(packages(), truth) << i;
    }
}

TEST_F(LibraryIndexTest, aFileThatMayChangeAgainUnnoticedIsNotKept) {
    place.settling = std::chrono::hours(1);
    EXPECT_EQ(packages(), truth);
    EXPECT_TRUE(indexFiles().empty());
}

TEST_F(LibraryIndexTest, aFewPackagesAreNotWorthIt) {
    place.fewest = 3;
    EXPECT_EQ(packages(), truth);
    EXPECT_FALSE(fs::exists(place.directory));
}

TEST_F(LibraryIndexTest, aFaultIsFoundAnewEachTime) {
    write(library + "/junk.zip", "junk");
    for (int i = 0; i < 2; ++i) {
        SystemPropertyLists propertyLists;
        const Result<Library> read = readLibrary(library, propertyLists, {}, place);
        ASSERT_TRUE(read);
        EXPECT_EQ(read->faults.size(), 1U);
        EXPECT_EQ(indexed().size(), 2U);
    }
}

TEST_F(LibraryIndexTest, whatIsGoneIsForgotten) {
    ASSERT_EQ(packages(), truth);
    fs::remove(library + "/" + kBrookPackage + ".zip");
    EXPECT_EQ(packages().size(), 1U);
    EXPECT_EQ(indexed().size(), 1U);
}

TEST_F(LibraryIndexTest, aLibraryHasOneByWhateverWayItIsNamed) {
    ASSERT_EQ(packages(), truth);
    alterIndex();
    fs::create_symlink(library, directory.path() + "/link");
    EXPECT_EQ(packages(directory.path() + "/link"), invention);
    EXPECT_EQ(indexFiles().size(), 1U);
}

TEST_F(LibraryIndexTest, isForItsUserAlone) {
    ASSERT_EQ(packages(), truth);
    struct stat status {};
    ASSERT_EQ(::stat(place.directory.c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0700U);
    ASSERT_EQ(::stat(indexFile().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
}

TEST_F(LibraryIndexTest, oneThatOthersCanWriteIsNotBelieved) {
    ASSERT_EQ(packages(), truth);
    alterIndex();
    fs::permissions(indexFile(), fs::perms::group_write, fs::perm_options::add);
    EXPECT_EQ(packages(), truth);
}

TEST_F(LibraryIndexTest, oneThatALinkLeadsToIsNotBelieved) {
    ASSERT_EQ(packages(), truth);
    alterIndex();
    const std::string file = indexFile();
    fs::rename(file, directory.path() + "/elsewhere");
    fs::create_symlink(directory.path() + "/elsewhere", file);
    EXPECT_EQ(packages(), truth);
    EXPECT_EQ(packages(), truth);
    EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(file)));
}

TEST_F(LibraryIndexTest, noDamageToItIsBelieved) {
    ASSERT_EQ(packages(), truth);
    alterIndex();
    const Bytes whole = indexContents();
    ASSERT_TRUE(readIndex(whole));
    for (std::size_t i = 0; i < whole.size(); ++i) {
        Bytes damaged = whole;
        damaged[i] ^= 1U << i % 8;
        EXPECT_FALSE(readIndex(damaged)) << i;
        EXPECT_FALSE(readIndex(ByteView(whole).first(i))) << i;
    }
    writeIndex({});
    EXPECT_EQ(packages(), truth);
}

TEST_F(LibraryIndexTest, whatNoPackageCouldSayIsNotBelieved) {
    ASSERT_EQ(packages(), truth);
    for (const std::string hostile : {"../../escape", "", "a\nb"}) {
        alterIndex([&](IndexedPackage& each) { each.package.identifier = hostile; });
        EXPECT_EQ(packages(), truth) << hostile;
    }
    alterIndex([](IndexedPackage& each) { each.package.name = "\x1b[2J"; });
    EXPECT_EQ(packages(), truth);
}

TEST_F(LibraryIndexTest, mayBeMissingAndMayHaveNoPlace) {
    ASSERT_EQ(packages(), truth);
    fs::remove_all(place.directory);
    EXPECT_EQ(packages(), truth);
    EXPECT_EQ(indexFiles().size(), 1U);
    fs::remove_all(place.directory);
    write(place.directory, "a file");
    EXPECT_EQ(packages(), truth);
    place.directory.clear();
    EXPECT_EQ(packages(), truth);
}

TEST_F(LibraryIndexTest, whatAKilledProcessLeftIsWrittenOver) {
    ASSERT_EQ(packages(), truth);
    const std::string file = indexFile();
    write(file + ".new", std::string(10'000, 'x'));
    fs::permissions(file + ".new", fs::perms::owner_read | fs::perms::owner_write);
    addPackage(kBrookPackage, "2.0.1");
    EXPECT_EQ(packages().back(), "com.example.brook 2.0.1");
    EXPECT_EQ(indexed().back().package.version, "2.0.1");
}

TEST_F(LibraryIndexTest, whatAnotherProcessIsWritingIsLeftToIt) {
    ASSERT_EQ(packages(), truth);
    const std::string unfinished = indexFile() + ".new";
    const Bytes before = indexContents();
    const UniqueFd other(::open(unfinished.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
    ASSERT_EQ(::flock(other.get(), LOCK_EX | LOCK_NB), 0);
    addPackage(kBrookPackage, "2.0.1");
    EXPECT_EQ(packages().back(), "com.example.brook 2.0.1");
    fs::remove(unfinished);
    EXPECT_EQ(indexContents(), before);
}

/// The variable has that value, or none, while this lives.
class Variable {
  public:
    Variable(const char* name, const std::optional<std::string>& value) : name_(name) {
        if (const char* before = std::getenv(name)) before_ = before;
        set(value);
    }
    Variable(const Variable&) = delete;
    Variable& operator=(const Variable&) = delete;
    ~Variable() { set(before_); }

  private:
    void set(const std::optional<std::string>& value) const {
        if (value) {
            ::setenv(name_, value->c_str(), 1);
        } else {
            ::unsetenv(name_);
        }
    }

    const char* name_;
    std::optional<std::string> before_;
};

TEST_F(LibraryIndexTest, standsInTheCacheOfTheUser) {
    const std::string home = directory.path() + "/home";
    const std::string cache = directory.path() + "/xdg";
    fs::create_directory(home);
    fs::create_directory(cache);
    const Variable homeVariable("HOME", home);
    {
        const Variable cacheVariable("XDG_CACHE_HOME", cache);
        EXPECT_EQ(LibraryIndexPlace::ofUser().directory, cache + "/appsync");
    }
    {
        const Variable cacheVariable("XDG_CACHE_HOME", std::nullopt);
        EXPECT_EQ(LibraryIndexPlace::ofUser().directory, home + "/.cache/appsync");
        place.directory = LibraryIndexPlace::ofUser().directory;
        EXPECT_EQ(packages(), truth);
        EXPECT_EQ(indexed().size(), 2U);
    }
    const Variable relative("XDG_CACHE_HOME", "relative");
    EXPECT_EQ(LibraryIndexPlace::ofUser().directory, home + "/.cache/appsync");
}

TEST_F(LibraryIndexTest, aCacheThatIsMissingIsMadeForTheUserAlone) {
    const std::string cache = directory.path() + "/not/yet";
    const Variable cacheVariable("XDG_CACHE_HOME", cache);
    place.directory = LibraryIndexPlace::ofUser().directory;
    EXPECT_EQ(place.directory, cache + "/appsync");
    EXPECT_FALSE(fs::exists(directory.path() + "/not")) << "before there is anything to write";
    ASSERT_EQ(packages(), truth);
    EXPECT_EQ(indexed().size(), 2U);
    for (const char* made : {"/not", "/not/yet", "/not/yet/appsync"}) {
        EXPECT_EQ(fs::status(directory.path() + made).permissions(), fs::perms::owner_all) << made;
    }
}

TEST_F(LibraryIndexTest, somethingElseInPlaceOfTheCacheIsLeftAlone) {
    const std::string cache = directory.path() + "/cache";
    write(cache, "a file");
    const Variable cacheVariable("XDG_CACHE_HOME", cache);
    EXPECT_EQ(LibraryIndexPlace::ofUser().directory, "");
    fs::remove(cache);
    fs::create_symlink("nowhere", cache);
    EXPECT_EQ(LibraryIndexPlace::ofUser().directory, "");
}

TEST_F(LibraryIndexTest, thatOfALibraryThatIsGoneGoesWithTheNextThatIsWritten) {
    const std::string other = directory.path() + "/other";
    fs::copy(library, other);
    ASSERT_EQ(packages(other), truth);
    const std::string ofOther = indexFile();
    ASSERT_EQ(packages(), truth);
    EXPECT_TRUE(fs::exists(ofOther)) << "its library is there";
    write(place.directory + "/" + std::string(64, 'a'), "nobody knows what");
    write(place.directory + "/" + std::string(64, 'b'), "appsync library index 1\n");
    write(place.directory + "/notes", "appsync library index 1\n");
    for (const char name : {'a', 'b'}) {
        fs::permissions(place.directory + "/" + std::string(64, name),
                        fs::perms::owner_read | fs::perms::owner_write);
    }
    fs::remove_all(other);
    addPackage(kBrookPackage, "2.0.1");
    ASSERT_EQ(packages().back(), "com.example.brook 2.0.1");
    EXPECT_FALSE(fs::exists(ofOther));
    EXPECT_FALSE(fs::exists(place.directory + "/" + std::string(64, 'b'))) << "of a former form";
    EXPECT_TRUE(fs::exists(place.directory + "/" + std::string(64, 'a')));
    EXPECT_EQ(indexFiles().size(), 3U);
}

TEST_F(LibraryIndexTest, thatOfAnotherLibraryIsNotBelieved) {
    ASSERT_EQ(packages(), truth);
    alterIndex();
    LibraryIndexContents others = index();
    others.folder += "/other";
    writeIndex(indexBytes(others));
    EXPECT_EQ(packages(), truth);
}

TEST_F(LibraryIndexTest, hasNoPlaceWhereTheUserHasNone) {
    const Variable cacheVariable("XDG_CACHE_HOME", std::nullopt);
    for (const std::optional<std::string>& home :
         {std::optional<std::string>(), std::optional<std::string>(directory.path() + "/none"),
          std::optional<std::string>("")}) {
        const Variable homeVariable("HOME", home);
        EXPECT_EQ(LibraryIndexPlace::ofUser().directory, "");
    }
}

}  // namespace
}  // namespace appsync
