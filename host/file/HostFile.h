#pragma once

// host/file: files of this machine, beside the device: read and written whole or in pieces (this
// header), and their sums (Checksum.h). Includes system/ and platform/. Called by plan, session,
// backup and the commands.

#include <cstdint>
#include <string>
#include <utility>

#include "platform/Bytes.h"
#include "platform/Result.h"

namespace appsync {

/// A file of this machine, open for reading. Only regular files (and links to them) are opened: a
/// pipe or a device is refused without waiting on it.
class HostFile {
  public:
    [[nodiscard]] static Result<HostFile> open(const std::string& path);

    HostFile(HostFile&& other) noexcept
        : descriptor_(std::exchange(other.descriptor_, -1)), size_(other.size_) {}
    HostFile& operator=(HostFile&& other) noexcept;
    ~HostFile();

    /// Its size when it was opened.
    [[nodiscard]] std::uint64_t size() const noexcept { return size_; }

    /// Reads on into the buffer. Gives the number of bytes read; 0 at the end.
    [[nodiscard]] Result<std::size_t> read(std::span<std::uint8_t> buffer);

  private:
    HostFile(int descriptor, std::uint64_t size) : descriptor_(descriptor), size_(size) {}

    int descriptor_ = -1;
    std::uint64_t size_ = 0;
};

/// The whole of a file of this machine; an error when it holds more than `maximumBytes`.
[[nodiscard]] Result<Bytes> readHostFile(const std::string& path, std::uint64_t maximumBytes);

/// The same of a file that others append to meanwhile: what it held when it was opened.
[[nodiscard]] Result<Bytes> readGrowingHostFile(const std::string& path,
                                                std::uint64_t maximumBytes);

/// All that standard input brings, whatever it is; an error when that is more than `maximumBytes`.
[[nodiscard]] Result<Bytes> readStandardInput(std::uint64_t maximumBytes);

/// Creates or replaces a file of this machine, whole: on failure the old one stays. Where a link
/// stands, the file that it leads to is replaced.
[[nodiscard]] Status writeHostFile(const std::string& path, ByteView contents);

/// Whether writing this file would replace one.
[[nodiscard]] bool isHostFile(const std::string& path);

/// That a file of this machine cannot be written, and what to do about it.
[[nodiscard]] ErrorRecord cannotWriteFile(int errorNumber, const std::string& path);

/// The error of the failed call that `errorNumber` stands for: "`what`: the system's text".
[[nodiscard]] ErrorRecord systemError(int errorNumber, const std::string& what);

}  // namespace appsync
