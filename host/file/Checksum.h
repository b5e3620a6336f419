#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/Bytes.h"
#include "platform/Result.h"

struct evp_md_ctx_st;

namespace appsync {

/// What tells whether a file is still the same.
struct FileSum {
    std::uint64_t size = 0;
    std::string sha256;  // 64 hexadecimal digits

    friend bool operator==(const FileSum&, const FileSum&) = default;
};

/// The SHA-256 sum of bytes that come piece by piece. Empty where there are no means for it.
class RunningSum {
  public:
    RunningSum();
    ~RunningSum();
    RunningSum(const RunningSum&) = delete;
    RunningSum& operator=(const RunningSum&) = delete;

    void add(ByteView piece) noexcept;
    /// 64 hexadecimal digits; nothing is added after that.
    [[nodiscard]] std::string finish();

  private:
    std::unique_ptr<evp_md_ctx_st, void (*)(evp_md_ctx_st*)> context_;
};

/// Reads a file of this machine in pieces.
[[nodiscard]] Result<FileSum> sumOfFile(const std::string& path);

}  // namespace appsync
