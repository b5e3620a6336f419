#pragma once

#include <cstdint>
#include <functional>
#include <string>

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

  private:
    Result<std::uint64_t> copy(HostFile& source, const std::string& file, NewFile& target,
                               const Progress& progress);

    Device& device_;
    Bytes piece_;
};

}  // namespace appsync
