#include "device/package/PackageArchive.h"

#include <sys/stat.h>
#include <zip.h>

#include <algorithm>
#include <cerrno>
#include <optional>
#include <utility>

#include "device/package/PackageArchiveEnd.h"
#include "device/package/PackageError.h"
#include "device/package/PackageFile.h"
#include "device/values/PackageText.h"
#include "system/PosixError.h"

namespace appsync {

namespace {

constexpr std::size_t kReadBytes = std::size_t{64} << 10;

/// What a code of libzip means for a package.
PackageErrorCode meaningOf(int zipError) noexcept {
    switch (zipError) {
        case ZIP_ER_ENCRNOTSUPP:
        case ZIP_ER_NOPASSWD:
        case ZIP_ER_WRONGPASSWD:
            return PackageErrorCode::Encrypted;
        case ZIP_ER_COMPNOTSUPP:
            return PackageErrorCode::CompressionNotSupported;
        case ZIP_ER_EXISTS:
            return PackageErrorCode::DuplicateEntry;
        case ZIP_ER_CRC:
        case ZIP_ER_ZLIB:
        case ZIP_ER_COMPRESSED_DATA:
        case ZIP_ER_EOF:
            return PackageErrorCode::DamagedEntry;
        default:
            return PackageErrorCode::Inconsistent;
    }
}

ErrorRecord damaged(std::string_view reason) {
    return packageError(PackageErrorCode::DamagedEntry,
                        std::string(reason) + "; copy the package or make it again");
}

Status checkContentsClaim(const zip_stat_t& status) {
    if (status.encryption_method != ZIP_EM_NONE) {
        return packageError(PackageErrorCode::Encrypted,
                            "it is encrypted; make the package without a password");
    }
    if (status.comp_method != ZIP_CM_STORE && status.comp_method != ZIP_CM_DEFLATE) {
        return packageError(PackageErrorCode::CompressionNotSupported,
                            "it is compressed by method " + std::to_string(status.comp_method) +
                                "; use deflate or none");
    }
    // libzip does not look at the CRC of nothing.
    if (status.size == 0 && status.crc != 0) return damaged("it is empty, which its CRC denies");
    return {};
}

struct FileCloser {
    void operator()(zip_file_t* file) const noexcept { ::zip_fclose(file); }
};

}  // namespace

/// What libzip reads the file through.
class PackageArchive::Source {
  public:
    explicit Source(PackageFile file) : file_(std::move(file)) { ::zip_error_init(&error_); }
    ~Source() { ::zip_error_fini(&error_); }
    Source(const Source&) = delete;
    Source& operator=(const Source&) = delete;

    [[nodiscard]] const PackageFile& file() const noexcept { return file_; }

    /// The error for people of a failure that libzip reports; the system's if it began with one.
    [[nodiscard]] ErrorRecord errorOf(zip_error_t* error) const {
        if (failure_) return *failure_;
        const int code = ::zip_error_code_zip(error);
        if (code == ZIP_ER_MEMORY) return posixError(ENOMEM, "read", file_.name());
        return packageError(meaningOf(code), "the archive is damaged or not consistent (" +
                                                 std::string(::zip_error_strerror(error)) +
                                                 "); copy the package or make it again");
    }

    static zip_int64_t command(void* self, void* data, zip_uint64_t length, zip_source_cmd_t what) {
        return static_cast<Source*>(self)->answer(data, length, what);
    }

  private:
    zip_int64_t answer(void* data, zip_uint64_t length, zip_source_cmd_t what) {
        switch (what) {
            case ZIP_SOURCE_OPEN:
                position_ = 0;
                return 0;
            case ZIP_SOURCE_READ:
                return read(data, length);
            case ZIP_SOURCE_SEEK:
                return seek(data, length);
            case ZIP_SOURCE_TELL:
                return static_cast<zip_int64_t>(position_);
            case ZIP_SOURCE_STAT:
                return stat(data);
            case ZIP_SOURCE_ERROR:
                return ::zip_error_to_data(&error_, data, length);
            case ZIP_SOURCE_SUPPORTS:
                return ::zip_source_make_command_bitmap(
                    ZIP_SOURCE_OPEN, ZIP_SOURCE_READ, ZIP_SOURCE_CLOSE, ZIP_SOURCE_STAT,
                    ZIP_SOURCE_ERROR, ZIP_SOURCE_FREE, ZIP_SOURCE_SEEK, ZIP_SOURCE_TELL,
                    ZIP_SOURCE_SUPPORTS, -1);
            case ZIP_SOURCE_CLOSE:
            case ZIP_SOURCE_FREE:
                return 0;
            default:
                ::zip_error_set(&error_, ZIP_ER_OPNOTSUPP, 0);
                return -1;
        }
    }

    zip_int64_t read(void* data, zip_uint64_t length) {
        auto* bytes = static_cast<std::uint8_t*>(data);
        const Result<std::size_t> count = file_.readAt(position_, std::span(bytes, length));
        if (!count) {
            failure_ = count.error();
            ::zip_error_set(&error_, ZIP_ER_READ, static_cast<int>(failure_->code));
            return -1;
        }
        position_ += *count;
        return static_cast<zip_int64_t>(*count);
    }

    zip_int64_t seek(void* data, zip_uint64_t length) {
        const zip_int64_t offset =
            ::zip_source_seek_compute_offset(position_, file_.size(), data, length, &error_);
        if (offset < 0) return -1;
        position_ = static_cast<std::uint64_t>(offset);
        return 0;
    }

    zip_int64_t stat(void* data) const {
        auto* status = static_cast<zip_stat_t*>(data);
        ::zip_stat_init(status);
        status->size = file_.size();
        status->valid = ZIP_STAT_SIZE;
        return static_cast<zip_int64_t>(sizeof *status);
    }

    PackageFile file_;
    std::uint64_t position_ = 0;
    zip_error_t error_ = {};
    std::optional<ErrorRecord> failure_;
};

PackageArchive::PackageArchive(std::unique_ptr<Source> source) : source_(std::move(source)) {}

PackageArchive::~PackageArchive() {
    if (archive_ != nullptr) ::zip_discard(archive_);
}

Result<std::unique_ptr<PackageArchive>> PackageArchive::open(PackageFile file,
                                                             const PackageLimits& limits) {
    std::unique_ptr<PackageArchive> archive(
        new PackageArchive(std::make_unique<Source>(std::move(file))));
    Status status = checkArchiveEnd(archive->source_->file(), limits);
    if (status) status = archive->openArchive();
    if (status) status = archive->listEntries(limits);
    if (status) status = arrangeAsTree(archive->entries_);
    if (status) status = checkSizes(archive->entries_, archive->packedBytes(), limits);
    if (!status) return archive->named(status.error());
    return archive;
}

Status PackageArchive::openArchive() {
    zip_error_t error = {};
    ::zip_error_init(&error);
    zip_source_t* source = ::zip_source_function_create(&Source::command, source_.get(), &error);
    if (source != nullptr) {
        archive_ = ::zip_open_from_source(source, ZIP_RDONLY | ZIP_CHECKCONS, &error);
        if (archive_ == nullptr) ::zip_source_free(source);
    }
    Status status;
    if (archive_ == nullptr) status = source_->errorOf(&error);
    ::zip_error_fini(&error);
    return status;
}

Status PackageArchive::listEntries(const PackageLimits& limits) {
    const auto count = static_cast<std::uint64_t>(::zip_get_num_entries(archive_, 0));
    entries_.reserve(count);
    for (std::uint64_t index = 0; index < count; ++index) {
        Result<PackageEntry> entry = entryAt(index, limits);
        if (!entry) return entry.error();
        entries_.push_back(*std::move(entry));
    }
    return {};
}

Result<PackageEntry> PackageArchive::entryAt(std::uint64_t index, const PackageLimits& limits) {
    constexpr zip_uint64_t kNeeded = ZIP_STAT_SIZE | ZIP_STAT_COMP_SIZE | ZIP_STAT_CRC |
                                     ZIP_STAT_COMP_METHOD | ZIP_STAT_ENCRYPTION_METHOD;
    const char* name = ::zip_get_name(archive_, index, ZIP_FL_ENC_RAW);
    zip_stat_t status = {};
    zip_uint8_t system = 0;
    zip_uint32_t attributes = 0;
    if (name == nullptr || ::zip_stat_index(archive_, index, 0, &status) != 0 ||
        (status.valid & kNeeded) != kNeeded ||
        ::zip_file_get_external_attributes(archive_, index, 0, &system, &attributes) != 0) {
        return source_->errorOf(::zip_get_error(archive_));
    }
    if (Status claim = checkContentsClaim(status); !claim) {
        return claim.error().withContext("entry " + quotedName(name));
    }
    return checkedEntry({.name = name,
                         .mode = attributes >> 16U,
                         .size = status.size,
                         .packedSize = status.comp_size,
                         .index = index},
                        limits);
}

const std::string& PackageArchive::name() const noexcept { return source_->file().name(); }

std::uint64_t PackageArchive::packedBytes() const noexcept { return source_->file().size(); }

std::uint64_t PackageArchive::unpackedBytes() const noexcept {
    std::uint64_t sum = 0;
    for (const PackageEntry& entry : entries_) sum += entry.size;
    return sum;
}

const PackageEntry* PackageArchive::find(std::string_view entryName) const noexcept {
    return findEntry(entries_, entryName);
}

Status PackageArchive::stream(const PackageEntry& entry, std::span<std::uint8_t> buffer,
                              const std::function<Status(ByteView piece)>& sink) {
    const auto failed = [&entry](const ErrorRecord& error) {
        return error.withContext("entry " + quotedName(entry.name));
    };
    const std::unique_ptr<zip_file_t, FileCloser> file(::zip_fopen_index(archive_, entry.index, 0));
    if (!file) return failed(source_->errorOf(::zip_get_error(archive_)));
    std::uint64_t left = entry.size;
    while (true) {
        const zip_int64_t count = ::zip_fread(file.get(), buffer.data(), buffer.size());
        if (count < 0) return failed(source_->errorOf(::zip_file_get_error(file.get())));
        if (count == 0) break;
        const auto size = static_cast<std::size_t>(count);
        if (size > left) return failed(damaged("it unpacks to more bytes than it says"));
        left -= size;
        if (Status status = sink(buffer.first(size)); !status) return status;
    }
    if (left > 0) return failed(damaged("it unpacks to fewer bytes than it says"));
    return {};
}

Result<Bytes> PackageArchive::read(const PackageEntry& entry, std::uint64_t maximumBytes) {
    if (entry.size > maximumBytes) {
        return packageError(PackageErrorCode::TooLarge,
                            "entry " + quotedName(entry.name) + ": it has " +
                                std::to_string(entry.size) + " bytes, at most " +
                                std::to_string(maximumBytes) + " are allowed; make it smaller");
    }
    Bytes contents;
    contents.reserve(entry.size);
    Bytes buffer(std::min<std::uint64_t>(entry.size + 1, kReadBytes));
    Status status = stream(entry, buffer, [&contents](ByteView piece) {
        contents.insert(contents.end(), piece.begin(), piece.end());
        return Status();
    });
    if (!status) return status.error();
    return contents;
}

Status PackageArchive::verify() {
    Bytes piece(kReadBytes);
    for (const PackageEntry& entry : entries_) {
        if (entry.isDirectory) continue;
        Status status = stream(entry, piece, [](ByteView) { return Status(); });
        if (!status) return status;
    }
    return {};
}

ErrorRecord PackageArchive::named(const ErrorRecord& error) const {
    // The system's errors say which file they are about.
    if (error.domain != kInstallerErrorDomain) return error;
    return error.withContext("package " + quotedName(name()));
}

}  // namespace appsync
