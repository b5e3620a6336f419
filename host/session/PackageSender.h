#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <vector>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

class Device;
class HostFile;
class NewFile;

/// Carries files from this machine to a device, in pieces. One thread at a time.
class PackageSender {
  public:
    /// Called after each piece with the bytes sent and all of them; false stops the transfer.
    using Progress = std::function<bool(std::uint64_t done, std::uint64_t total)>;

    explicit PackageSender(Device& device);
    ~PackageSender();
    PackageSender(const PackageSender&) = delete;
    PackageSender& operator=(const PackageSender&) = delete;

    /// Sends a file to `directory`/`name` of the device, in the place of what stood there. Gives
    /// the number of bytes. On failure nothing stays there. Errors are of `kPosixErrorDomain`, or
    /// of `kTransferErrorDomain` when progress stopped it or the file became shorter meanwhile.
    [[nodiscard]] Result<std::uint64_t> send(const std::string& file, const std::string& directory,
                                             const std::string& name, const Progress& progress);

    /// The same for a file that the device keeps beyond the session: it is there whole and durable,
    /// or what stood there before is, whatever ends the transfer.
    [[nodiscard]] Result<std::uint64_t> sendWhole(const std::string& file,
                                                  const std::string& directory,
                                                  const std::string& name,
                                                  const Progress& progress);

    /// The same for several files, which share what makes them durable: each is sent aside, with
    /// files of the device open for it, and `placeAll` puts all of them in their places. Without
    /// it, nothing stays of them.
    [[nodiscard]] Result<std::uint64_t> sendAside(const std::string& file,
                                                  const std::string& directory,
                                                  const std::string& name,
                                                  const Progress& progress);
    /// Gives what did not go well, by the device path.
    [[nodiscard]] std::map<std::string, ErrorRecord> placeAll();

  private:
    struct Aside;

    Result<std::uint64_t> copy(HostFile& source, const std::string& file, NewFile& target,
                               const Progress& progress);

    Device& device_;
    Bytes piece_;
    std::vector<Aside> aside_;
};

}  // namespace appsync
