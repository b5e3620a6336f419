// What a client takes up: bytes of the heap that come back when it is let go of, with its queues as
// simulation/ has them and the assets that it has handed out, and threads.
//
// Names: held/N, where N applications of a session are being sent; 0 is a client at rest.

#include <benchmark/benchmark.h>
#include <malloc.h>

#include <atomic>
#include <cstddef>
#include <cstdlib>
#include <filesystem>
#include <iterator>
#include <memory>
#include <new>
#include <stdexcept>
#include <string>
#include <vector>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "client/TodoList.h"
#include "simulation/SimulatedPlatform.h"
#include "system/property_list/PropertyListCodec.h"

namespace {

// What `new` has given and `delete` not yet taken back, in the allocator's sizes.
std::atomic<std::size_t> heapInUse = 0;

}  // namespace

// Not inlined: g++ would see what is asked of malloc go to delete, and warn of that.
[[gnu::noinline]] void* operator new(std::size_t size) {
    void* const block = std::malloc(size);
    if (block == nullptr) throw std::bad_alloc();
    heapInUse += ::malloc_usable_size(block);
    return block;
}

[[gnu::noinline]] void operator delete(void* block) noexcept {
    heapInUse -= ::malloc_usable_size(block);
    std::free(block);
}

void operator delete(void* block, std::size_t /*size*/) noexcept { ::operator delete(block); }

namespace appsync {
namespace {

std::ptrdiff_t threadCount() {
    const std::filesystem::directory_iterator threads("/proc/self/task");
    return std::distance(begin(threads), end(threads));
}

void stage(SimulatedPlatform& platform, std::int64_t count) {
    PropertyList list = PropertyList::array();
    for (std::int64_t number = 0; number < count; ++number) {
        list.append(
            PropertyList::map({{kTodoIdentifierKey, "com.example.a" + std::to_string(number)},
                               {kTodoOperationKey, kTodoInstall},
                               {kTodoVersionKey, "1.0"},
                               {kTodoNameKey, "Application " + std::to_string(number)}}));
    }
    platform.addPropertyList(std::string(kStagingArea) + "/ApplicationsSync.plist", list);
}

/// A session up to where each application is half sent.
std::vector<SyncAssetPointer> beginSession(AppsClient& client) {
    if (!client.reconcileSync(PropertyList::map(), "1", {}, nullptr))
        throw std::runtime_error("not reconciled");
    std::vector<SyncAssetPointer> assets = client.outstandingAssetTransfers();
    for (const SyncAssetPointer& each : assets) client.assetTransferUpdatedProgress(each, 0.5);
    return assets;
}

void held(benchmark::State& state) {
    const std::ptrdiff_t threadsBefore = threadCount();
    for ([[maybe_unused]] auto _ : state) {
        SystemPropertyLists codec;
        SimulatedPlatform platform(codec);
        platform.recorder.setEnabled(false);
        stage(platform, state.range(0));
        auto client = AppsClient::create(platform.services());
        std::vector<SyncAssetPointer> assets;
        if (state.range(0) > 0) assets = beginSession(*client);
        if (assets.size() != static_cast<std::size_t>(state.range(0)))
            state.SkipWithError("not all are asked for");
        platform.runUntilIdle();
        state.counters["threads"] = static_cast<double>(threadCount() - threadsBefore);
        const std::size_t before = heapInUse;
        std::vector<SyncAssetPointer>().swap(assets);
        client.reset();
        platform.runUntilIdle();
        state.counters["bytes"] = static_cast<double>(before - heapInUse);
    }
}
BENCHMARK(held)->Arg(0)->Arg(1000)->Iterations(1);

}  // namespace
}  // namespace appsync
