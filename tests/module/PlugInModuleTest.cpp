#include "host/module/PlugInModule.h"

#include <elf.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <vector>

#include "client/Paths.h"
#include "client/TodoList.h"
#include "contract/TemporaryMachineDirectory.h"
#include "host/console/Problem.h"
#include "platform/SyncClient.h"
#include "simulation/SimulatedPlatform.h"
#include "system/property_list/PropertyListCodec.h"
#include "tests/host/HostFixture.h"

namespace appsync {
namespace {

using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;

std::filesystem::path testsFolder() {
    return std::filesystem::read_symlink("/proc/self/exe").parent_path();
}

std::string builtModule() { return (testsFolder().parent_path() / "appsync-plugin.so").string(); }

std::string testModule(const std::string& name) {
    return (testsFolder() / "modules" / (name + ".so")).string();
}

bool isLoaded(const std::string& path) {
    const std::string name = std::filesystem::path(path).filename().string();
    std::ifstream maps("/proc/self/maps");
    for (std::string line; std::getline(maps, line);) {
        if (line.find(name) != std::string::npos) return true;
    }
    return false;
}

std::ptrdiff_t threadCount() {
    const std::filesystem::directory_iterator threads("/proc/self/task");
    return std::distance(begin(threads), end(threads));
}

/// A device in memory, and a session on it that installs one application, step by step.
class SessionInMemory {
  public:
    explicit SessionInMemory(const PlugInTable& table) : table_(table) {
        platform_.addPropertyList(
            std::string(kStagingArea) + "/ApplicationsSync.plist",
            PropertyList::array({PropertyList::map({{kTodoIdentifierKey, "com.a"},
                                                    {kTodoOperationKey, kTodoInstall},
                                                    {kTodoVersionKey, "1.0"},
                                                    {kTodoNameKey, "A"}})}));
        made_ = table.makeClient(platform_.services());
    }
    ~SessionInMemory() {
        table_.destroyClient(made_);
        platform_.runUntilIdle();
        EXPECT_EQ(platform_.scheduler.delayedTasks(), 0U);
        EXPECT_THAT(platform_.scheduler.blockedTasks(), IsEmpty());
    }
    SessionInMemory(const SessionInMemory&) = delete;
    SessionInMemory& operator=(const SessionInMemory&) = delete;

    void begin() { EXPECT_TRUE(client().reconcileSync(PropertyList::map(), "1", {}, nullptr)); }
    void transfer() {
        for (const SyncAssetPointer& asset : client().outstandingAssetTransfers()) {
            asset->path = std::string(kPublicStaging) + "/" + asset->identifier + ".zip";
            platform_.files.addFile(*asset->path, "package");
            client().assetTransferSucceeded(asset, true, nullptr);
        }
    }
    void denyItsTerminationOnce() {
        platform_.registry.addApplication("com.a", "0.9");
        platform_.homeScreen.scriptTermination("com.a", {1, 0});
    }
    void end() {
        client().assetTransferEndedWithSuccess(true);
        client().syncEndedWithSuccess(true);
    }

    [[nodiscard]] std::vector<std::string> installs() const {
        return platform_.callsTo({"AppRegistry.installPackage"});
    }
    [[nodiscard]] std::vector<std::string> terminations() const {
        return platform_.callsTo({"HomeScreenService.takeTerminationAssertion"});
    }
    [[nodiscard]] std::vector<std::string> lines() const { return platform_.lines(); }

  private:
    SyncClient& client() { return *made_.client; }

    const PlugInTable& table_;
    SystemPropertyLists codec_;
    SimulatedPlatform platform_{codec_};
    PlugInClient made_;
};

/// What a whole session on a device in memory has called and said.
std::vector<std::string> sessionWith(const PlugInTable& table) {
    SessionInMemory session(table);
    session.begin();
    session.transfer();
    session.end();
    EXPECT_THAT(session.installs(), SizeIs(1));
    return session.lines();
}

TEST(PlugInModule, DoesAsThePlugInThatIsBuiltIn) {
    const Result<PlugInModule> loaded = PlugInModule::open(builtModule());
    ASSERT_TRUE(loaded.ok()) << loaded.error().description();
    EXPECT_NE(&loaded->table(), appsyncPlugInTable());
    EXPECT_EQ(sessionWith(loaded->table()), sessionWith(PlugInModule().table()));
}

TEST(PlugInModule, WithoutAPathIsThePlugInThatIsBuiltIn) {
    const Result<PlugInModule> builtIn = PlugInModule::open("");
    ASSERT_TRUE(builtIn.ok());
    EXPECT_EQ(&builtIn->table(), appsyncPlugInTable());
}

TEST(PlugInModule, TwoBuildsWorkSideBySide) {
    const Result<PlugInModule> one = PlugInModule::open(builtModule());
    const Result<PlugInModule> other = PlugInModule::open(testModule("OtherBuild"));
    ASSERT_TRUE(one.ok() && other.ok());
    EXPECT_STREQ(other->table().plugInVersion, "7.8.9");
    EXPECT_STRNE(one->table().plugInVersion, other->table().plugInVersion);
    SessionInMemory first(one->table());
    SessionInMemory second(other->table());
    first.begin();
    second.begin();
    second.transfer();
    first.transfer();
    first.end();
    second.end();
    EXPECT_THAT(first.installs(), SizeIs(1));
    EXPECT_EQ(first.lines(), second.lines());
}

TEST(PlugInModule, LeavesNoTimerOfWhatItHadToWaitFor) {
    const Result<PlugInModule> loaded = PlugInModule::open(builtModule());
    ASSERT_TRUE(loaded.ok());
    SessionInMemory session(loaded->table());
    session.denyItsTerminationOnce();
    session.begin();
    session.transfer();
    session.end();
    EXPECT_THAT(session.installs(), SizeIs(1));
    EXPECT_THAT(session.terminations(), SizeIs(2));
}

TEST(PlugInModule, LeavesNothingBehindWhenItIsUnloaded) {
    const std::ptrdiff_t threads = threadCount();
    for (int round = 0; round < 3; ++round) {
        const Result<PlugInModule> loaded = PlugInModule::open(builtModule());
        ASSERT_TRUE(loaded.ok());
        EXPECT_TRUE(isLoaded(builtModule()));
        sessionWith(loaded->table());
    }
    EXPECT_FALSE(isLoaded(builtModule()));
    EXPECT_EQ(threadCount(), threads);
}

class SyncWithModule : public HostFixture {};

TEST_F(SyncWithModule, LeavesNoThreadAndNoModuleBehind) {
    addPackage("com.a", "1");
    ASSERT_EQ(sync(), 0) << err.str();  // a sanitizer's own thread begins with the first other one
    addPackage("com.b", "2");
    const std::ptrdiff_t threads = threadCount();
    EXPECT_EQ(sync({"--plug-in", builtModule()}), 0) << err.str();
    EXPECT_THAT(applications(), ElementsAre("com.a 1", "com.b 2"));
    EXPECT_FALSE(isLoaded(builtModule()));
    EXPECT_EQ(threadCount(), threads);
}

TEST_F(SyncWithModule, EachCommandRunsItsSessionWithTheModuleThatIsNamed) {
    addPackage("com.a", "1");
    const std::string backup = directory.path() + "/backup";
    ASSERT_EQ(run({"backup", device, backup}), 0) << err.str();
    const std::vector<std::vector<std::string>> commands = {
        {"sync", device, library},
        {"send", device, "com.a", library + "/com.a.zip"},
        {"restore", device, backup}};
    for (std::vector<std::string> command : commands) {
        command.insert(command.end(), {"--plug-in", testModule("MakesNoClient")});
        EXPECT_EQ(run(command), 1) << command.front();
        EXPECT_THAT(err.str(), HasSubstr("the plug-in cannot make its client")) << command.front();
    }
}

TEST_F(SyncWithModule, TakesNothingOffADeviceWhereTheModuleIsRefused) {
    addPackage("com.a", "1");
    ASSERT_EQ(sync(), 0);
    addPackage("com.a", "2");
    EXPECT_EQ(sync({"--plug-in", testModule("ThrowsWhenAsked")}), 3);
    EXPECT_THAT(err.str(), HasSubstr("ThrowsWhenAsked.so threw an exception"));
    EXPECT_EQ(run({"send", "/nonexistent", "com.a", "file", "--plug-in", library}), 3);
    EXPECT_THAT(err.str(), HasSubstr("/library is not a regular file"));
    EXPECT_THAT(applications(), ElementsAre("com.a 1"));
}

struct BadModule {
    const char* name;
    const char* told;
};

void PrintTo(const BadModule& bad, std::ostream* out) { *out << bad.name; }

class RefusedModule : public testing::TestWithParam<BadModule> {};

TEST_P(RefusedModule, IsUnusableAndSaysWhy) {
    const std::string path = testModule(GetParam().name);
    const Result<PlugInModule> loaded = PlugInModule::open(path);
    ASSERT_FALSE(loaded.ok());
    EXPECT_EQ(exitStatusOf(loaded.error()), kExitUnusable);
    EXPECT_THAT(loaded.error().description(), AllOf(HasSubstr(path), HasSubstr(GetParam().told)));
    EXPECT_FALSE(isLoaded(path));
}

INSTANTIATE_TEST_SUITE_P(
    Each, RefusedModule,
    testing::Values(BadModule{"NoTable", " has no appsyncPlugInTable, so it is no build of"},
                    BadModule{"NullTable", " gives no table: name a build of appsync-plugin.so"},
                    BadModule{"NoFunctions", " lacks a function in its table"},
                    BadModule{"OtherMajorVersion",
                              " has version 42.3 of the module interface, and this command wants "
                              "1.x: name a build with that version"},
                    BadModule{"NeedsMore", "undefined symbol: appsyncTableOfAnotherLibrary"},
                    BadModule{"ThrowsWhenAsked", " threw an exception while it was loaded: it"},
                    BadModule{"AbortsWhileLoaded",
                              " ends the process that loads it, with signal 6: name a build of"},
                    BadModule{"ExitsWhileLoaded", " ends the process that loads it, with status 3"},
                    BadModule{"AbortsWhileUnloaded",
                              " ends the process that loads it, with signal 6"},
                    BadModule{"Missing", "No such file or directory"}));

TEST(PlugInModule, ThatHangsWhileItIsLoadedIsGivenUp) {
    const std::string path = testModule("HangsWhileLoaded");
    const Result<PlugInModule> loaded = PlugInModule::open(path, std::chrono::milliseconds(50));
    ASSERT_FALSE(loaded.ok());
    EXPECT_EQ(exitStatusOf(loaded.error()), kExitUnusable);
    EXPECT_THAT(loaded.error().description(),
                HasSubstr(path + " hangs: loading it had not ended after 50 ms: name a build of "));
    EXPECT_FALSE(isLoaded(path));
    EXPECT_EQ(::waitpid(-1, nullptr, WNOHANG), -1) << "a process is left";
}

#if !defined(__has_feature)
#define __has_feature(feature) 0
#endif
// ThreadSanitizer's own dlopen is not made for what is thrown through it.
#if !__has_feature(thread_sanitizer) && !defined(__SANITIZE_THREAD__)
INSTANTIATE_TEST_SUITE_P(ThrownThrough, RefusedModule,
                         testing::Values(BadModule{"ThrowsWhileLoaded",
                                                   " while it was loaded: no licence: name"}));
#endif

/// A copy of the module to be spoilt.
class SpoiltModule : public testing::Test {
  protected:
    SpoiltModule() { std::filesystem::copy_file(builtModule(), path); }

    void overwrite(std::streamoff offset, const std::string& bytes) const {
        std::fstream file(path, std::ios::binary | std::ios::in | std::ios::out);
        file.seekp(offset);
        file << bytes;
    }
    [[nodiscard]] std::string refusal() const {
        const Result<PlugInModule> loaded = PlugInModule::open(path);
        if (loaded) return "loaded";
        EXPECT_EQ(exitStatusOf(loaded.error()), kExitUnusable);
        return loaded.error().description();
    }

    const TemporaryMachineDirectory directory;
    const std::string path = directory.path() + "/copy.so";
};

TEST_F(SpoiltModule, OfAnotherMachineIsNamed) {
    overwrite(EI_NIDENT + 2, std::string({static_cast<char>(EM_AARCH64), '\0'}));
    EXPECT_THAT(refusal(), HasSubstr("/copy.so is built for AArch64 with 64 bits, and this command "
                                     "for "));
    overwrite(EI_NIDENT + 2, std::string({'\x34', '\x12'}));
    EXPECT_THAT(refusal(), HasSubstr("is built for machine 4660 with 64 bits"));
}

TEST_F(SpoiltModule, OfAnotherWordSizeOrByteOrderIsNamed) {
    overwrite(EI_CLASS, std::string(1, ELFCLASS32));
    EXPECT_THAT(refusal(), HasSubstr(" with 32 bits, and this command for "));
    overwrite(EI_DATA, std::string(1, ELFDATA2MSB));
    EXPECT_THAT(refusal(), HasSubstr(" with 32 bits, big-endian, and this command for "));
}

TEST_F(SpoiltModule, ThatIsCutShortIsRefusedWhereverItEnds) {
    const std::uintmax_t whole = std::filesystem::file_size(path);
    // What comes last is for debuggers, and not missed.
    for (const std::uintmax_t size : {whole / 32, whole / 64, std::uintmax_t{200}}) {
        std::filesystem::resize_file(path, size);
        EXPECT_THAT(refusal(), testing::ContainsRegex("is cut short|is a damaged shared object"));
    }
    for (const std::uintmax_t size : {std::uintmax_t{12}, std::uintmax_t{0}}) {
        std::filesystem::resize_file(path, size);
        EXPECT_THAT(refusal(), HasSubstr("is no shared object"));
    }
}

TEST_F(SpoiltModule, WithASegmentBehindTheEndOfNumbersIsDamaged) {
    std::ifstream file(path, std::ios::binary);
    Elf64_Ehdr header{};
    file.read(reinterpret_cast<char*>(&header), sizeof(header));
    const std::string farthest(sizeof(std::uint64_t), '\xff');
    for (unsigned index = 0; index < header.e_phnum; ++index) {
        overwrite(static_cast<std::streamoff>(header.e_phoff + index * sizeof(Elf64_Phdr) +
                                              offsetof(Elf64_Phdr, p_offset)),
                  farthest);
    }
    EXPECT_THAT(refusal(), testing::ContainsRegex("is cut short|is a damaged shared object"));
}

TEST_F(SpoiltModule, ThatIsATextOrNoFileIsRefusedWithoutWaiting) {
    std::ofstream(path) << "this is a text that is longer than the start of any object";
    EXPECT_THAT(refusal(), HasSubstr("/copy.so is no shared object"));
    std::filesystem::remove(path);
    ASSERT_EQ(::mkfifo(path.c_str(), 0600), 0);
    EXPECT_THAT(refusal(), HasSubstr("is not a regular file"));
    std::filesystem::remove(path);
    std::filesystem::create_directory(path);
    EXPECT_THAT(refusal(), HasSubstr("is not a regular file"));
}

TEST_F(SpoiltModule, ThatNothingHasSpoiltIsLoadedFromHere) { EXPECT_EQ(refusal(), "loaded"); }

}  // namespace
}  // namespace appsync
