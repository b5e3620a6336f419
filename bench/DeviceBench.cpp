#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <stdexcept>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "client/AppsClient.h"
#include "client/Paths.h"
#include "device/Device.h"
#include "device/database/Database.h"
#include "device/package/PackageWriter.h"
#include "device/values/DevicePaths.h"
#include "platform/AppRegistry.h"
#include "platform/LogFacility.h"
#include "platform/SyncHost.h"
#include "system/property_list/PropertyListCodec.h"

// What a device costs: one install on an empty and on a full device, the opening of a session, and
// many installs at once, and a restore beside the plain writing of the files that it leaves. Run it
// with --benchmark_enable_random_interleaving=true to compare.

namespace appsync {
namespace {

namespace fs = std::filesystem;

void require(const Status& status) {
    if (!status) throw std::runtime_error(status.error().description());
}

template <typename Value>
Value require(Result<Value> result) {
    if (!result) throw std::runtime_error(result.error().description());
    return std::move(*result);
}

std::string infoOf(const std::string& identifier) {
    return R"(<?xml version="1.0" encoding="UTF-8"?><plist version="1.0"><dict>)"
           "<key>BundleIdentifier</key><string>" +
           identifier + "</string><key>BundleVersion</key><string>1.0</string></dict></plist>";
}

// Half of it random, half of it compressing about two to one: what applications are made of.
std::string payload(std::mt19937_64& numbers, std::size_t size) {
    constexpr std::string_view letters = "etaoinshrdlucmfw";
    std::string bytes(size, '\0');
    for (std::size_t index = 0; index < size; ++index) {
        const std::uint64_t number = numbers();
        bytes[index] = index < size / 2 ? static_cast<char>(number) : letters[number & 15U];
    }
    return bytes;
}

/// A directory of the build's own file system, with a device in it.
class Bench {
  public:
    Bench() {
        std::string pattern = (fs::current_path() / "appsync-bench-XXXXXX").string();
        if (::mkdtemp(pattern.data()) == nullptr) throw std::runtime_error("no directory");
        directory_ = pattern;
        require(Device::create(path("device")));
    }
    Bench(const Bench&) = delete;
    Bench& operator=(const Bench&) = delete;
    ~Bench() {
        device_.reset();
        fs::remove_all(directory_);
    }

    std::string path(std::string_view name) const { return (directory_ / name).string(); }
    std::string root(std::string_view devicePath) const {
        return path("device/root") + std::string(devicePath);
    }

    Device& device() { return *device_; }

    void open() { device_ = require(Device::open(path("device"), {DeviceAccess::Session})); }
    void close() { device_.reset(); }

    // As many applications as that, each with a container.
    void fill(int count) {
        const auto database =
            require(Database::open(path("device/device.db"), Database::Mode::Existing));
        require(database->execute("BEGIN"));
        for (int number = 0; number < count; ++number) {
            const std::string container = "FILLED-" + std::to_string(number);
            fs::create_directory(root(containerPath(container)));
            const std::string identifier = "com.example.filled" + std::to_string(number * 7919);
            require(database
                        ->query("INSERT INTO applications VALUES (?, '1.0', ?, 'User', 4, ?,"
                                " 'App.app', 'Icon.png', 1000000, ?)")
                        .bind(identifier, "Name of " + identifier, container, std::int64_t{number})
                        .run());
        }
        require(database->execute("COMMIT"));
    }

    // A package of 1 MiB in eight files.
    void makePackage(const std::string& identifier) {
        const fs::path folder = directory_ / "folder";
        fs::create_directories(folder / "App.app");
        std::ofstream(folder / "App.app/Info.plist") << infoOf(identifier);
        for (int part = 0; part < 8; ++part) {
            std::ofstream(folder / "App.app" / ("part" + std::to_string(part)), std::ios::binary)
                << payload(numbers_, std::size_t{128} << 10U);
        }
        SystemPropertyLists propertyLists;
        static_cast<void>(
            require(writePackage(folder.string(), root(packageOf(identifier)), propertyLists)));
        fs::remove_all(folder);
    }

    void install(const std::string& identifier) {
        require(device_->registry().installPackage(
            *FileURL::fromPath(packageOf(identifier), false),
            PropertyList::map(
                {{PackageTypeKey, PackageTypeCustomer}, {BundleIdentifierKey, identifier}})));
    }
    void uninstall(const std::string& identifier) {
        require(device_->registry().uninstallApplication(identifier, {}));
    }

  private:
    static std::string packageOf(const std::string& identifier) {
        return std::string(kPublicStagingDirectory) + "/" + identifier + ".zip";
    }

    fs::path directory_;
    std::unique_ptr<Device> device_;
    std::mt19937_64 numbers_{1};
};

template <typename Work>
double secondsOf(Work work) {
    ::sync();  // what came before is not to be written at this one's expense
    const auto start = std::chrono::steady_clock::now();
    work();
    return std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
}

/// One application of 1 MiB, on a device that holds that many.
void installOne(benchmark::State& state) {
    const std::string identifier = "com.example.new";
    Bench bench;
    bench.fill(static_cast<int>(state.range(0)));
    bench.open();
    bench.makePackage(identifier);
    for ([[maybe_unused]] auto _ : state) {
        state.SetIterationTime(secondsOf([&] { bench.install(identifier); }));
        bench.uninstall(identifier);
    }
}
BENCHMARK(installOne)->Arg(0)->Arg(10'000)->UseManualTime()->Unit(benchmark::kMillisecond);

/// The opening of a session on a device that holds that many.
void openSession(benchmark::State& state) {
    Bench bench;
    bench.fill(static_cast<int>(state.range(0)));
    for ([[maybe_unused]] auto _ : state) {
        state.SetIterationTime(secondsOf([&] { bench.open(); }));
        bench.close();
    }
}
BENCHMARK(openSession)->Arg(0)->Arg(10'000)->UseManualTime()->Unit(benchmark::kMillisecond);

/// 200 applications of 1 MiB, as many at a time as the argument says.
void installMany(benchmark::State& state) {
    constexpr int kPackages = 200;
    Bench bench;
    bench.open();
    std::vector<std::string> identifiers;
    for (int number = 0; number < kPackages; ++number) {
        identifiers.push_back("com.example.app" + std::to_string(number));
        bench.makePackage(identifiers.back());
    }
    for ([[maybe_unused]] auto _ : state) {
        std::atomic<std::size_t> next{0};
        state.SetIterationTime(secondsOf([&] {
            std::vector<std::thread> threads;
            for (std::int64_t thread = 0; thread < state.range(0); ++thread) {
                threads.emplace_back([&] {
                    for (std::size_t mine = next++; mine < identifiers.size(); mine = next++) {
                        bench.install(identifiers[mine]);
                    }
                });
            }
            for (std::thread& thread : threads) thread.join();
        }));
        for (const std::string& identifier : identifiers) bench.uninstall(identifier);
    }
}
BENCHMARK(installMany)
    ->Arg(1)
    ->Arg(10)
    ->MeasureProcessCPUTime()
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);

class QuietHost final : public SyncHost {
  public:
    [[nodiscard]] std::string mainBundleIdentifier() const override { return "bench"; }
    [[nodiscard]] std::string pluginBundleIdentifier() const override { return "bench"; }
    [[nodiscard]] bool isRecoverableError(const ErrorRecord&) const override { return false; }
};

class NoLog final : public LogFacility {
  public:
    void write(const LogMessage&) noexcept override {}
    [[nodiscard]] std::unique_ptr<LogHandle> makeHandle(std::string_view,
                                                        std::string_view) override {
        return std::make_unique<LogHandle>();
    }
};

/// What a restore leaves to be read: so many applications, each with an icon of 4 KB.
void leaveRestoreInfo(Bench& bench, std::int64_t count) {
    SystemPropertyLists propertyLists;
    const Bytes metadata = require(propertyLists.serialize(
        PropertyList::map({{"title", "Application"}, {"bundleVersion", "1.0"}}),
        PropertyListFormat::Binary));
    const PropertyList app = PropertyList::map({{"VessikMetadata", metadata},
                                                {"ApplicationSINF", Bytes(1000)},
                                                {"PlaceholderIcon", Bytes(4000)}});
    PropertyList info = PropertyList::map();
    for (std::int64_t number = 0; number < count; ++number) {
        info.set("com.example.restored" + std::to_string(number), app);
    }
    const Bytes bytes = require(propertyLists.serialize(info, PropertyListFormat::Binary));
    const std::string path(kRestoreInfoPath);
    FileSystem& files = bench.device().files();
    for (const std::string_view each : {kRestoreInfoPath, kProcessedRestoreInfoPath}) {
        require(files.createDirectory(std::string(each.substr(0, each.rfind('/'))), true, nullptr));
    }
    require(files.writeFileAtomically(path, bytes));
}

/// So many applications, from the host's call to its return.
void restoreDirectly(benchmark::State& state) {
    QuietHost host;
    NoLog log;
    for ([[maybe_unused]] auto _ : state) {
        Bench bench;
        bench.open();
        leaveRestoreInfo(bench, state.range(0));
        const auto client = AppsClient::create(bench.device().platform(host, log));
        state.SetIterationTime(secondsOf([&] { client->reconcileRestoreOfType(2, nullptr); }));
        if (require(bench.device().applications()).size() !=
            static_cast<std::size_t>(state.range(0))) {
            state.SkipWithError("not all restored");
        }
    }
}
BENCHMARK(restoreDirectly)->Arg(300)->UseManualTime()->Unit(benchmark::kMillisecond);

std::string bytesOf(const fs::path& path) {
    std::ifstream file(path, std::ios::binary);
    return {std::istreambuf_iterator<char>(file), {}};
}

void writePlainly(const fs::path& path, const std::string& bytes) {
    const std::string temporary = path.string() + ".new";
    const int file = ::open(temporary.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    const bool written = ::write(file, bytes.data(), bytes.size()) >= 0 && ::fsync(file) == 0;
    ::close(file);
    if (!written) throw std::runtime_error("cannot write " + temporary);
    fs::rename(temporary, path);
}

/// The files of the same restore, those of the placeholder bundles and the device's copies of them,
/// each written, synced and renamed by itself.
void restorePlainFiles(benchmark::State& state) {
    QuietHost host;
    NoLog log;
    Bench bench;
    bench.open();
    leaveRestoreInfo(bench, state.range(0));
    AppsClient::create(bench.device().platform(host, log))->reconcileRestoreOfType(2, nullptr);
    std::vector<std::pair<fs::path, std::string>> files;
    for (const char* tree : {"/tmp", "/private/var/tmp", "/var"}) {
        const fs::path root = bench.root(tree);
        if (!fs::is_directory(root)) continue;
        for (const auto& entry : fs::recursive_directory_iterator(root)) {
            if (!entry.is_regular_file() || entry.path().filename() == "RestoreApplications.plist")
                continue;
            files.emplace_back(entry.path(), bytesOf(entry.path()));
        }
    }
    for ([[maybe_unused]] auto _ : state) {
        state.SetIterationTime(secondsOf([&] {
            for (const auto& [path, bytes] : files) writePlainly(path, bytes);
        }));
    }
    state.counters["files"] = static_cast<double>(files.size());
}
BENCHMARK(restorePlainFiles)->Arg(300)->UseManualTime()->Unit(benchmark::kMillisecond);

}  // namespace
}  // namespace appsync
