#include "device/archive/PackageArchiveContents.h"

#include <libdeflate.h>
#include <zlib.h>

#include <algorithm>
#include <cerrno>
#include <string>
#include <string_view>
#include <utility>

#include "device/archive/Crc.h"
#include "device/archive/PackageEntries.h"
#include "device/archive/PackageError.h"
#include "device/archive/PackageFile.h"
#include "system/file/PosixError.h"

namespace appsync {

namespace {

constexpr std::uint64_t kPackedPieceBytes = std::uint64_t{64} << 10;
/// The window of deflate; negative, as there is no header around it.
constexpr int kRawDeflate = -MAX_WBITS;

struct FreeInflater {
    void operator()(libdeflate_decompressor* inflater) const noexcept {
        libdeflate_free_decompressor(inflater);
    }
};

/// Inflates all of `packed` to all of `contents`; false where they are not the same, or memory
/// lacks.
bool inflateWhole(ByteView packed, std::span<std::uint8_t> contents) {
    const std::unique_ptr<libdeflate_decompressor, FreeInflater> inflater(
        libdeflate_alloc_decompressor());
    std::size_t used = 0;
    std::size_t made = 0;
    return inflater != nullptr &&
           libdeflate_deflate_decompress_ex(inflater.get(), packed.data(), packed.size(),
                                            contents.data(), contents.size(), &used,
                                            &made) == LIBDEFLATE_SUCCESS &&
           used == packed.size() && made == contents.size();
}

bool fitsAtOnce(const PackageEntry& entry) {
    constexpr std::uint64_t most = PackageArchiveContents::kMostAtOnce;
    return entry.size <= most && entry.packedSize <= most - entry.size;
}

ErrorRecord damaged(std::string_view reason) {
    return packageError(PackageErrorCode::DamagedEntry,
                        std::string(reason) + "; copy the package or make it again");
}

}  // namespace

PackageArchiveContents::PackageArchiveContents(const PackageFile& file, const PackageEntry& entry)
    : file_(file), entry_(entry) {}

PackageArchiveContents::~PackageArchiveContents() {
    if (stream_) ::inflateEnd(stream_.get());
}

Result<ByteView> PackageArchiveContents::next(std::span<std::uint8_t> buffer) {
    const Result<ByteView> next = piece(buffer);
    if (!next) return next;
    if (next->size() > entry_.size - done_) return damaged("it unpacks to more bytes than it says");
    if (next->empty()) {
        if (Status status = checkEnd(); !status) return status.error();
        return next;
    }
    crc_ = continueCrc(crc_, *next);
    done_ += next->size();
    return next;
}

Result<ByteView> PackageArchiveContents::piece(std::span<std::uint8_t> buffer) {
    const std::uint64_t left = entry_.size - done_;
    if (entry_.isDeflated && !std::exchange(hasTriedAtOnce_, true) && fitsAtOnce(entry_)) {
        if (Status status = inflateAtOnce(); !status) return status.error();
    }
    if (whole_) {
        return ByteView(whole_.get() + done_,
                        static_cast<std::size_t>(std::min<std::uint64_t>(buffer.size(), left)));
    }
    // One byte more than the entry says, to notice that there is more.
    buffer = buffer.first(
        static_cast<std::size_t>(std::min<std::uint64_t>(buffer.size() - 1, left) + 1));
    const Result<std::size_t> count = entry_.isDeflated ? inflate(buffer) : copy(buffer);
    if (!count) return count.error();
    return ByteView(buffer.first(*count));
}

Status PackageArchiveContents::checkEnd() const {
    if (done_ < entry_.size) return damaged("it unpacks to fewer bytes than it says");
    const bool isAllUsed = !stream_ || stream_->avail_in == 0;
    if (packedDone_ < entry_.packedSize || !isAllUsed) {
        return damaged("it has more packed bytes than it needs");
    }
    if (crc_ != entry_.crc) return damaged("its CRC is wrong");
    return {};
}

Result<std::size_t> PackageArchiveContents::copy(std::span<std::uint8_t> buffer) {
    const std::uint64_t left = entry_.packedSize - packedDone_;
    const auto piece =
        buffer.first(static_cast<std::size_t>(std::min<std::uint64_t>(buffer.size(), left)));
    if (Status status = readPacked(piece); !status) return status.error();
    return piece.size();
}

Status PackageArchiveContents::inflateAtOnce() {
    const auto packedSize = static_cast<std::size_t>(entry_.packedSize);
    const auto size = static_cast<std::size_t>(entry_.size);
    const auto packed = std::make_unique_for_overwrite<std::uint8_t[]>(packedSize);
    const std::span packedBytes(packed.get(), packedSize);
    if (Status status = readPacked(packedBytes); !status) return status;
    auto whole = std::make_unique_for_overwrite<std::uint8_t[]>(size);
    if (inflateWhole(packedBytes, {whole.get(), size})) {
        whole_ = std::move(whole);
    } else {
        packedDone_ = 0;
    }
    return {};
}

Result<std::size_t> PackageArchiveContents::inflate(std::span<std::uint8_t> buffer) {
    if (Status status = startInflating(); !status) return status.error();
    stream_->next_out = buffer.data();
    stream_->avail_out = static_cast<uInt>(buffer.size());
    while (stream_->avail_out > 0 && !isInflated_) {
        if (Status status = refill(); !status) return status.error();
        switch (::inflate(stream_.get(), Z_NO_FLUSH)) {
            case Z_STREAM_END:
                isInflated_ = true;
                break;
            case Z_OK:
                break;
            case Z_BUF_ERROR:
                return damaged("its packed bytes end too early");
            case Z_MEM_ERROR:
                return posixError(ENOMEM, "read", file_.name());
            default:
                return damaged("its packed bytes are damaged");
        }
    }
    return buffer.size() - stream_->avail_out;
}

Status PackageArchiveContents::startInflating() {
    if (stream_) return {};
    auto stream = std::make_unique<z_stream_s>();
    if (::inflateInit2(stream.get(), kRawDeflate) != Z_OK) {
        return posixError(ENOMEM, "read", file_.name());
    }
    stream_ = std::move(stream);
    packed_.resize(static_cast<std::size_t>(std::min(entry_.packedSize, kPackedPieceBytes)));
    return {};
}

/// Gives the stream more, once it has used what it had.
Status PackageArchiveContents::refill() {
    if (stream_->avail_in > 0) return {};
    const auto size = static_cast<std::size_t>(
        std::min<std::uint64_t>(packed_.size(), entry_.packedSize - packedDone_));
    const auto piece = std::span(packed_).first(size);
    if (Status status = readPacked(piece); !status) return status;
    stream_->next_in = piece.data();
    stream_->avail_in = static_cast<uInt>(size);
    return {};
}

Status PackageArchiveContents::readPacked(std::span<std::uint8_t> bytes) {
    const Result<std::size_t> count = file_.readAt(entry_.contentsAt + packedDone_, bytes);
    if (!count) return count.error();
    if (*count < bytes.size()) return damaged("it became shorter while it was read");
    packedDone_ += *count;
    return {};
}

}  // namespace appsync
