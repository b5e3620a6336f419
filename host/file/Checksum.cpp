#include "host/file/Checksum.h"

#include <cerrno>
#include <memory>
#include <span>

#include <openssl/evp.h>

#include "host/file/HostFile.h"
#include "platform/Bytes.h"

namespace appsync {
namespace {

constexpr std::size_t kHashedAtOnce = std::size_t{256} << 10U;

struct ContextDeleter {
    void operator()(EVP_MD_CTX* context) const noexcept { ::EVP_MD_CTX_free(context); }
};
using Context = std::unique_ptr<EVP_MD_CTX, ContextDeleter>;

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

Result<FileSum> sumOfFile(const std::string& path) {
    Result<HostFile> file = HostFile::open(path);
    if (!file) return file.error();
    const Context context(::EVP_MD_CTX_new());
    if (!context || ::EVP_DigestInit_ex(context.get(), ::EVP_sha256(), nullptr) != 1) {
        return cannotSum(path);
    }
    FileSum sum;
    Bytes piece(kHashedAtOnce);
    for (;;) {
        const Result<std::size_t> count = file->read(piece);
        if (!count) return count.error().withContext(path);
        if (*count == 0) break;
        sum.size += *count;
        if (::EVP_DigestUpdate(context.get(), piece.data(), *count) != 1) return cannotSum(path);
    }
    Bytes digest(EVP_MAX_MD_SIZE);
    unsigned int length = 0;
    if (::EVP_DigestFinal_ex(context.get(), digest.data(), &length) != 1) return cannotSum(path);
    sum.sha256 = hexadecimal(std::span(digest).first(length));
    return sum;
}

}  // namespace appsync
