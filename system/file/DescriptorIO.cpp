#include "system/file/DescriptorIO.h"

#include <algorithm>
#include <cerrno>
#include <new>

#include <unistd.h>

namespace appsync {

namespace {

constexpr std::size_t kCopyBuffer = std::size_t{256} * 1024;

/// read(2) that goes on after a signal; the count, or -1 with errno.
ssize_t readSome(int descriptor, std::uint8_t* target, std::size_t size) {
    ssize_t count = -1;
    do {
        count = ::read(descriptor, target, size);
    } while (count < 0 && errno == EINTR);
    return count;
}

int readInto(int descriptor, std::uint64_t expected, std::uint64_t limit, Bytes& contents) {
    if (expected > limit) return EFBIG;
    // One byte more than expected: where that is not filled, the read has met the end.
    contents.resize(static_cast<std::size_t>(expected) + 1);
    std::size_t filled = 0;
    while (filled == 0 || filled != expected) {
        const ssize_t count =
            readSome(descriptor, contents.data() + filled, contents.size() - filled);
        if (count < 0) return errno;
        if (count == 0) break;
        filled += static_cast<std::size_t>(count);
        if (filled > limit) return EFBIG;
        if (filled == contents.size()) contents.resize(filled + filled / 2 + 1);
    }
    contents.resize(filled);
    return 0;
}

}  // namespace

WriteOutcome writeWhole(int descriptor, ByteView contents) {
    WriteOutcome outcome;
    while (outcome.written < contents.size()) {
        const ByteView rest = contents.subspan(outcome.written);
        const ssize_t count = ::write(descriptor, rest.data(), rest.size());
        if (count < 0 && errno == EINTR) continue;
        if (count <= 0) {
            outcome.error = count < 0 ? errno : EIO;
            break;
        }
        outcome.written += static_cast<std::size_t>(count);
    }
    return outcome;
}

int readWhole(int descriptor, std::uint64_t expected, std::uint64_t limit, Bytes& contents) {
    try {
        return readInto(descriptor, expected, limit, contents);
    } catch (const std::bad_alloc&) {
        return ENOMEM;
    }
}

int copyWhole(int from, int to) {
    Bytes buffer(kCopyBuffer);
    while (true) {
        const ssize_t count = readSome(from, buffer.data(), buffer.size());
        if (count < 0) return errno;
        if (count == 0) return 0;
        const WriteOutcome outcome =
            writeWhole(to, ByteView(buffer).first(static_cast<std::size_t>(count)));
        if (outcome.error != 0) return outcome.error;
    }
}

}  // namespace appsync
