#pragma once

#include <chrono>
#include <cstddef>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <set>
#include <string>
#include <vector>

#include "platform/Result.h"

namespace appsync {

class ChangeBell;
class ServedDevice;

/// What is served: one device, or those in a folder, in which new ones may appear, at most 500. A
/// device that has gone is still among them, and says so. Callable on any thread.
class ServedDevices {
  public:
    using IsDevice = bool (*)(const std::string& path);

    /// The error says what stands there in place of a device or a folder with one. The bell
    /// outlives it.
    [[nodiscard]] static Result<std::unique_ptr<ServedDevices>> open(const std::string& path,
                                                                     IsDevice isDevice,
                                                                     ChangeBell& bell);

    [[nodiscard]] bool isFolder() const noexcept { return isFolder_; }
    /// By name. Looks for new ones, once a second at most.
    [[nodiscard]] std::vector<std::shared_ptr<ServedDevice>> all();
    /// How many more there are in the folder than are served, as `all` and `find` have seen it.
    [[nodiscard]] std::size_t leftOut();
    /// Nothing where there is none of that name.
    [[nodiscard]] std::shared_ptr<ServedDevice> find(const std::string& name);

  private:
    ServedDevices(std::string path, bool isFolder, IsDevice isDevice, ChangeBell& bell);

    void look();
    [[nodiscard]] std::set<std::string> newNames() const;
    void add(const std::string& path, const std::string& name);

    const std::string path_;
    const bool isFolder_;
    const IsDevice isDevice_;
    ChangeBell& bell_;
    std::mutex mutex_;
    // Protected by mutex_.
    std::map<std::string, std::shared_ptr<ServedDevice>> devices_;
    std::size_t leftOut_ = 0;
    std::chrono::steady_clock::time_point lastLook_;
};

}  // namespace appsync
