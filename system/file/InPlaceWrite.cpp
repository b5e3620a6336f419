#include "system/file/InPlaceWrite.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

constexpr std::size_t kWordSize = 8;
constexpr std::size_t kPieceSize = std::size_t{1} << 16U;

std::size_t roundedDown(std::size_t place) { return place - place % kWordSize; }

bool isSolelyHere(int file, std::size_t size) {
    struct stat status {};
    if (::fstat(file, &status) != 0) return false;
    return S_ISREG(status.st_mode) && status.st_nlink == 1 && status.st_size > 0 &&
           static_cast<std::size_t>(status.st_size) == size;
}

/// Fills the piece with what stands there in the file.
bool readPiece(int file, std::size_t at, std::span<std::uint8_t> piece) {
    while (!piece.empty()) {
        const ssize_t count = ::pread(file, piece.data(), piece.size(), static_cast<off_t>(at));
        if (count <= 0) return false;
        at += static_cast<std::size_t>(count);
        piece = piece.subspan(static_cast<std::size_t>(count));
    }
    return true;
}

/// Whether the file has these contents but for one word; `word` is where that begins. Reads a piece
/// at a time, so that nothing of the file's size is made.
bool differsInOneWord(int file, ByteView contents, std::size_t& word) {
    std::array<std::uint8_t, kPieceSize> piece;  // NOLINT(*-member-init): what is read fills it
    bool found = false;
    for (std::size_t at = 0; at < contents.size(); at += kPieceSize) {
        const ByteView wanted = contents.subspan(at, std::min(kPieceSize, contents.size() - at));
        if (!readPiece(file, at, {piece.data(), wanted.size()})) return false;
        if (std::memcmp(piece.data(), wanted.data(), wanted.size()) == 0) continue;
        if (found) return false;
        found = true;
        const auto first = std::mismatch(wanted.begin(), wanted.end(), piece.begin()).first;
        const std::size_t begin = roundedDown(static_cast<std::size_t>(first - wanted.begin()));
        const std::size_t end = std::min(begin + kWordSize, wanted.size());
        const std::size_t rest = wanted.size() - end;
        if (std::memcmp(piece.data() + end, wanted.data() + end, rest) != 0) return false;
        word = at + begin;
    }
    return found;
}

}  // namespace

bool writeInPlace(const RootDirectory& root, const std::string& path, ByteView contents) {
    const Result<UniqueFd> file = root.openFile(path, O_RDWR | O_NOFOLLOW | O_NONBLOCK);
    if (!file || !isSolelyHere(file->get(), contents.size())) return false;
    std::size_t word = 0;
    if (!differsInOneWord(file->get(), contents, word)) return false;
    const std::size_t size = std::min(kWordSize, contents.size() - word);
    return ::pwrite(file->get(), contents.data() + word, size, static_cast<off_t>(word)) ==
           static_cast<ssize_t>(size);
}

}  // namespace appsync
