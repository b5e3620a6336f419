#include "host/file/Checksum.h"

#include <cerrno>
#include <span>

#include <openssl/evp.h>

#include "host/file/HostFile.h"
#include "platform/Bytes.h"

namespace appsync {
namespace {

constexpr std::size_t kHashedAtOnce = std::size_t{256} << 10U;

ErrorRecord cannotSum(const std::string& path) {
    return systemError(ENOMEM, "cannot compute the checksum of " + path);
}

std::string hexadecimal(ByteView bytes) {
    constexpr char kDigits[] = "0123456789abcdef";
    std::string text;
    for (const std::uint8_t byte : bytes) {
        text += kDigits[byte >> 4U];
        text += kDigits[byte & 0x0FU];
    }
    return text;
}

}  // namespace

RunningSum::RunningSum() : context_(::EVP_MD_CTX_new(), &::EVP_MD_CTX_free) {
    const bool begun =
        context_ != nullptr && ::EVP_DigestInit_ex(context_.get(), ::EVP_sha256(), nullptr) == 1;
    if (!begun) context_.reset();
}

RunningSum::~RunningSum() = default;

void RunningSum::add(ByteView piece) noexcept {
    if (context_ == nullptr) return;
    if (::EVP_DigestUpdate(context_.get(), piece.data(), piece.size()) != 1) context_.reset();
}

std::string RunningSum::finish() {
    Bytes digest(EVP_MAX_MD_SIZE);
    unsigned int length = 0;
    if (context_ == nullptr || ::EVP_DigestFinal_ex(context_.get(), digest.data(), &length) != 1) {
        return {};
    }
    return hexadecimal(std::span(digest).first(length));
}

Result<FileSum> sumOfFile(const std::string& path) {
    Result<HostFile> file = HostFile::open(path);
    if (!file) return file.error();
    RunningSum running;
    FileSum sum;
    Bytes piece(kHashedAtOnce);
    for (;;) {
        const Result<std::size_t> count = file->read(piece);
        if (!count) return count.error().withContext(path);
        if (*count == 0) break;
        sum.size += *count;
        running.add(std::span(piece).first(*count));
    }
    sum.sha256 = running.finish();
    if (sum.sha256.empty()) return cannotSum(path);
    return sum;
}

}  // namespace appsync
