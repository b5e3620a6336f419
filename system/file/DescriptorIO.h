#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/Bytes.h"

namespace appsync {

/// How far a write came.
struct WriteOutcome {
    std::size_t written = 0;
    /// The errno value of the failure; 0 when everything was written.
    int error = 0;
};

/// Writes all of it, in one system call where the system takes it in one.
[[nodiscard]] WriteOutcome writeWhole(int descriptor, ByteView contents);

/// Reads from where the descriptor stands to the end of the file. `expected` is the size that the
/// file seems to have, for speed; one that holds more than `limit` bytes is EFBIG. Gives the errno
/// value of the failure, or 0; the bytes are good only then.
[[nodiscard]] int readWhole(int descriptor, std::uint64_t expected, std::uint64_t limit,
                            Bytes& contents);

/// Copies what `from` holds from where it stands to its end. Gives an errno value, or 0.
[[nodiscard]] int copyWhole(int from, int to);

}  // namespace appsync
