#include "host/serve/DeviceStamp.h"

#include <sys/stat.h>

#include <algorithm>

#include "device/values/DevicePaths.h"

namespace appsync {
namespace {

// The clock of file systems goes on by 4 or 10 milliseconds.
constexpr std::chrono::milliseconds kYouth{50};

ServedFileStamp fileStamp(const std::string& path) {
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) return {};
    const auto changed = std::chrono::seconds(status.st_ctim.tv_sec) +
                         std::chrono::nanoseconds(status.st_ctim.tv_nsec);
    return {status.st_dev, status.st_ino, status.st_size, changed.count()};
}

bool isYoungAt(const ServedFileStamp& stamp, std::chrono::nanoseconds now) {
    return std::chrono::nanoseconds(stamp.changed) + kYouth > now;
}

}  // namespace

bool DeviceStamp::holdsSameAs(const DeviceStamp& other) const {
    return !isYoung && !other.isYoung && database == other.database && journal == other.journal &&
           root.number == other.root.number && root.device == other.root.device;
}

DeviceStamp deviceStampOf(const std::string& device) {
    const std::chrono::nanoseconds now = std::chrono::system_clock::now().time_since_epoch();
    const std::string database = device + "/" + std::string(kDatabaseName);
    DeviceStamp stamp;
    stamp.database = fileStamp(database);
    stamp.journal = fileStamp(database + "-wal");
    if (stamp.journal.size == 0) stamp.journal = {};
    stamp.root = fileStamp(device + "/" + std::string(kRootName));
    stamp.log = fileStamp(device + "/" + std::string(kLogName));
    stamp.isYoung = isYoungAt(stamp.database, now) || isYoungAt(stamp.journal, now);
    return stamp;
}

}  // namespace appsync
