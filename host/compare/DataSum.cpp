#include "host/compare/DataSum.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>

#include "device/Device.h"
#include "device/package/DataArchive.h"
#include "host/console/Problem.h"
#include "host/file/Checksum.h"
#include "system/file/RootDirectory.h"

namespace appsync {
namespace {

namespace fs = std::filesystem;

// The sum of what a reading hears: of each file its name, its size and its contents.
class DataSumming {
  public:
    explicit DataSumming(const std::function<void(std::uint64_t bytes)>& progress)
        : progress_(progress) {}

    DataReader reader() {
        return {[this](const std::string& name, std::uint64_t size) { begin(name, size); },
                [this](ByteView piece) {
                    sum_.add(piece);
                    progress_(piece.size());
                }};
    }

    [[nodiscard]] bool heardAnything() const { return heardAnything_; }
    [[nodiscard]] std::string finish() { return sum_.finish(); }

  private:
    void begin(const std::string& name, std::uint64_t size) {
        heardAnything_ = true;
        const std::string head = name + '\0' + std::to_string(size) + '\0';
        sum_.add(Bytes(head.begin(), head.end()));
    }

    const std::function<void(std::uint64_t bytes)>& progress_;
    RunningSum sum_;
    bool heardAnything_ = false;
};

Status readOnDevice(Device& device, const std::string& identifier, DataSumming& summing) {
    const Status read = readData(device.root(), Device::dataPath(identifier), summing.reader());
    if (!read || summing.heardAnything()) return read;
    const Result<RegularFile> waiting =
        device.root().openRegularFile(Device::restoreDataPath(identifier));
    if (!waiting) return waiting.error().code == ENOENT ? Status() : Status(waiting.error());
    // By descriptor, so that no link leads out of the device.
    return readDataArchive("/proc/self/fd/" + std::to_string(waiting->descriptor.get()),
                           summing.reader());
}

Status readInBackup(const Holdings& holdings, const std::string& identifier, DataSumming& summing) {
    const std::vector<BackedUpApplication>& all = holdings.manifest->applications;
    const auto found = std::find_if(all.begin(), all.end(), [&](const BackedUpApplication& each) {
        return each.identifier == identifier;
    });
    if (found == all.end() || !found->hasData) return {};
    const fs::path archive = fs::path(holdings.path) / dataArchiveName(identifier);
    const Status read = readDataArchive(archive.native(), summing.reader());
    return read ? read : Status(read.error().withContext(archive.native()));
}

}  // namespace

Result<std::string> sumOfData(const Holdings& holdings, const std::string& identifier,
                              const std::function<void(std::uint64_t bytes)>& progress) {
    DataSumming summing(progress);
    const Status read = holdings.device ? readOnDevice(*holdings.device, identifier, summing)
                                        : readInBackup(holdings, identifier, summing);
    if (!read) return read.error();
    std::string sum = summing.finish();
    if (sum.empty()) {
        return failure("the data of " + identifier + " cannot be summed up", "free some memory");
    }
    return sum;
}

}  // namespace appsync
