// What planning costs for each application, directly and with a coordinator prepared for each, what
// restoring costs, and what one edit of the todo list costs beside a plain rewrite of the same
// bytes. Files are written to the working directory: it should be on a disk.
//
// Names: planning/N, coordinating/N, restoring/N, restoringCoordinated/N (one call with N
// applications), beforePlanning/N, beforeCoordinating/N (all but that call, for who counts what it
// adds), todoListEdit/N, todoListPlainRewrite/N (a list of N entries).

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <malloc.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <memory>
#include <stdexcept>
#include <string>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "simulation/SimulatedPlatform.h"
#include "system/file/RootedFileSystem.h"
#include "system/property_list/PropertyListCodec.h"

namespace appsync {
namespace {

std::string identifierOf(int number) { return "com.example.application" + std::to_string(number); }

PropertyList todoListOf(int count) {
    PropertyList list = PropertyList::array();
    for (int i = 0; i < count; ++i) {
        list.append(PropertyList::map({{kTodoIdentifierKey, identifierOf(i)},
                                       {kTodoOperationKey, kTodoInstall},
                                       {kTodoVersionKey, "1.0"},
                                       {kTodoNameKey, "Application " + std::to_string(i)}}));
    }
    return list;
}

/// What the host has staged: the todo list, and for each application its info dictionary.
void stage(SimulatedPlatform& platform, int count) {
    platform.addPropertyList(std::string(kTodoListPath), todoListOf(count));
    for (int i = 0; i < count; ++i) {
        const std::string directory =
            formatPath(kInDirectoryFormat, {kTodoDirectory, identifierOf(i)});
        platform.addPropertyList(formatPath(kInfoFormat, {directory}),
                                 PropertyList::map({{BundleIdentifierKey, identifierOf(i)},
                                                    {BundleDisplayNameKey, "Application"}}));
    }
}

void plan(benchmark::State& state, bool coordination) {
    const int count = static_cast<int>(state.range(0));
    for (auto _ : state) {
        state.PauseTiming();
        SystemPropertyLists codec;
        auto platform = std::make_unique<SimulatedPlatform>(codec);
        platform->recorder.setEnabled(false);
        platform->coordination.setEnabled(coordination);
        stage(*platform, count);
        auto client = AppsClient::create(platform->services());
        state.ResumeTiming();
        auto assets = client->outstandingAssetTransfers();
        state.PauseTiming();
        if (assets.size() != static_cast<std::size_t>(count))
            state.SkipWithError("not all planned");
        assets.clear();
        client.reset();
        platform.reset();
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * count);
}

/// All that `plan` does besides.
void doNotPlan(benchmark::State& state, bool coordination) {
    const int count = static_cast<int>(state.range(0));
    for (auto _ : state) {
        SystemPropertyLists codec;
        SimulatedPlatform platform(codec);
        platform.recorder.setEnabled(false);
        platform.coordination.setEnabled(coordination);
        stage(platform, count);
        const auto client = AppsClient::create(platform.services());
    }
}

void beforePlanning(benchmark::State& state) { doNotPlan(state, false); }
BENCHMARK(beforePlanning)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond);

void beforeCoordinating(benchmark::State& state) { doNotPlan(state, true); }
BENCHMARK(beforeCoordinating)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond);

void planning(benchmark::State& state) { plan(state, false); }
BENCHMARK(planning)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond);

void coordinating(benchmark::State& state) { plan(state, true); }
BENCHMARK(coordinating)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond);

/// What a restore has left: for each application store metadata, SINF data and an icon.
void leaveRestoreInfo(SimulatedPlatform& platform, int count) {
    constexpr std::size_t sinfSize = 1000;
    constexpr std::size_t iconSize = 4000;
    const Bytes metadata = *SystemPropertyLists().serialize(
        PropertyList::map({{"title", "Application"}, {"bundleVersion", "1.0"}, {"itemId", 12345}}),
        PropertyListFormat::Binary);
    const PropertyList info = PropertyList::map({{"VessikMetadata", metadata},
                                                 {"ApplicationSINF", Bytes(sinfSize)},
                                                 {"PlaceholderIcon", Bytes(iconSize)}});
    PropertyList all = PropertyList::map(static_cast<std::size_t>(count));
    for (int i = 0; i < count; ++i) all.set(identifierOf(i), info);
    platform.addPropertyList(std::string(kRestoreInfoPath), all, PropertyListFormat::Binary);
    platform.files.addDirectory("/var/mobile/Library/Logs/MediaServices");
}

void restore(benchmark::State& state, bool coordinated) {
    const int count = static_cast<int>(state.range(0));
    for (auto _ : state) {
        state.PauseTiming();
        // As in a daemon that has just started: else few applications would find all the memory
        // that they need in the allocator's hands, and many would not.
        ::malloc_trim(0);
        SystemPropertyLists codec;
        auto platform = std::make_unique<SimulatedPlatform>(codec);
        platform->recorder.setEnabled(false);
        platform->coordination.setEnabled(coordinated);
        platform->host.setMainBundleIdentifier("bench");
        leaveRestoreInfo(*platform, count);
        auto client = AppsClient::create(platform->services());
        state.ResumeTiming();
        client->reconcileRestoreOfType(2, nullptr);
        state.PauseTiming();
        platform->runUntilIdle();
        if (platform->registry.placeholderIdentifiers().size() != static_cast<std::size_t>(count))
            state.SkipWithError("not all restored");
        client.reset();
        platform.reset();
        state.ResumeTiming();
    }
    state.SetItemsProcessed(state.iterations() * count);
}

void restoring(benchmark::State& state) { restore(state, false); }
BENCHMARK(restoring)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond);

void restoringCoordinated(benchmark::State& state) { restore(state, true); }
BENCHMARK(restoringCoordinated)->Arg(1000)->Arg(10000)->Unit(benchmark::kMillisecond);

/// A directory of its own under the working directory, gone at the end.
class ScratchDirectory {
  public:
    ScratchDirectory() {
        std::string path = (std::filesystem::current_path() / "appsync-bench-XXXXXX").string();
        if (::mkdtemp(path.data()) == nullptr) throw std::runtime_error("cannot make " + path);
        path_ = path;
    }
    ~ScratchDirectory() {
        std::error_code ignored;
        std::filesystem::remove_all(path_, ignored);
    }
    ScratchDirectory(const ScratchDirectory&) = delete;
    ScratchDirectory& operator=(const ScratchDirectory&) = delete;

    [[nodiscard]] const std::string& path() const { return path_; }

  private:
    std::string path_;
};

/// The simulated platform, but with files on disk and property lists as a device has them.
Platform withRealFiles(SimulatedPlatform& simulated, FileSystem& files,
                       PropertyListSerialization& propertyLists) {
    const Platform all = simulated.services();
    return Platform{
        all.host,   all.log,    all.registry,   all.installer,     all.coordination,
        all.policy, all.backup, all.homeScreen, all.icons,         all.transactions,
        all.queues, files,      propertyLists,  all.notifications, all.notificationCenter};
}

Bytes encodedTodoList(int length) {
    return *SystemPropertyLists().serialize(todoListOf(length), PropertyListFormat::Binary);
}

void todoListEdit(benchmark::State& state) {
    const int length = static_cast<int>(state.range(0));
    const ScratchDirectory scratch;
    const auto files = *RootedFileSystem::open(scratch.path());
    files->createDirectory(std::string(kTodoDirectory), true, nullptr).ignore();
    files->writeFileAtomically(std::string(kTodoListPath), encodedTodoList(length)).ignore();
    SystemPropertyLists codec;
    SimulatedPlatform simulated(codec);
    simulated.recorder.setEnabled(false);
    const auto client = AppsClient::create(withRealFiles(simulated, *files, codec));
    const std::string identifier = identifierOf(length / 2);
    // Others are on their way, too.
    client->changeAssetID(identifierOf(0), kTodoSent);
    client->changeAssetID(identifierOf(1), kTodoDownloaded);
    bool sent = false;
    for (auto _ : state) {
        sent = !sent;
        client->changeAssetID(identifier, sent ? kTodoSent : kTodoDownloaded);
    }
    const auto operation = client->_operationStateForIdentifier(identifier);
    if (operation != (sent ? kTodoSent : kTodoDownloaded)) state.SkipWithError("not edited");
}
BENCHMARK(todoListEdit)->Arg(1000)->Arg(10000)->Unit(benchmark::kMicrosecond)->UseRealTime();

bool rewrite(const std::string& temporary, const std::string& target, const Bytes& bytes) {
    const int file = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (file < 0) return false;
    const bool written =
        ::write(file, bytes.data(), bytes.size()) == static_cast<ssize_t>(bytes.size());
    const bool synced = ::fsync(file) == 0;
    return ::close(file) == 0 && written && synced &&
           ::rename(temporary.c_str(), target.c_str()) == 0;
}

void todoListPlainRewrite(benchmark::State& state) {
    const ScratchDirectory scratch;
    const Bytes bytes = encodedTodoList(static_cast<int>(state.range(0)));
    const std::string target = scratch.path() + "/list";
    for (auto _ : state) {
        if (!rewrite(target + ".new", target, bytes)) state.SkipWithError("not written");
    }
    state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(bytes.size()));
}
BENCHMARK(todoListPlainRewrite)
    ->Arg(1000)
    ->Arg(10000)
    ->Unit(benchmark::kMicrosecond)
    ->UseRealTime();

}  // namespace
}  // namespace appsync
