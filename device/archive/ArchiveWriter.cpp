#include "device/archive/ArchiveWriter.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <zip.h>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <utility>

#include "device/archive/PackageArchiveFormat.h"
#include "device/archive/PackageError.h"
#include "device/archive/PackageFolder.h"
#include "system/file/PosixError.h"
#include "system/file/UniqueFd.h"

namespace appsync {

namespace {

using PackProgress = std::function<void(std::uint64_t bytes)>;

/// Gives libzip the contents of a file, which is open only while it is packed, and refuses what
/// became something else since it was listed.
class FileSource {
  public:
    FileSource(const PackageItem& item, const PackProgress& progress)
        : item_(item), progress_(progress) {
        ::zip_error_init(&error_);
    }

    /// A source that owns itself: libzip frees it.
    static zip_source_t* create(const PackageItem& item, const PackProgress& progress,
                                zip_error_t* error) {
        auto source = std::make_unique<FileSource>(item, progress);
        zip_source_t* made = ::zip_source_function_create(&command, source.get(), error);
        if (made != nullptr) static_cast<void>(source.release());
        return made;
    }

  private:
    static zip_int64_t command(void* self, void* data, zip_uint64_t length, zip_source_cmd_t what) {
        auto* source = static_cast<FileSource*>(self);
        switch (what) {
            case ZIP_SOURCE_OPEN:
                return source->open();
            case ZIP_SOURCE_READ:
                return source->read(data, length);
            case ZIP_SOURCE_CLOSE:
                source->descriptor_.reset();
                return 0;
            case ZIP_SOURCE_STAT:
                return source->stat(data);
            case ZIP_SOURCE_ERROR:
                return ::zip_error_to_data(&source->error_, data, length);
            case ZIP_SOURCE_FREE:
                delete source;
                return 0;
            case ZIP_SOURCE_SUPPORTS:
                return ::zip_source_make_command_bitmap(ZIP_SOURCE_OPEN, ZIP_SOURCE_READ,
                                                        ZIP_SOURCE_CLOSE, ZIP_SOURCE_STAT,
                                                        ZIP_SOURCE_ERROR, ZIP_SOURCE_FREE, -1);
            default:
                return source->fail(ZIP_ER_OPNOTSUPP, 0);
        }
    }

    zip_int64_t open() {
        constexpr int kFlags = O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC;
        descriptor_.reset(::open(item_.path.c_str(), kFlags));
        if (!descriptor_) return fail(ZIP_ER_OPEN, errno);
        struct stat status = {};
        if (::fstat(descriptor_.get(), &status) != 0) return fail(ZIP_ER_OPEN, errno);
        return S_ISREG(status.st_mode) ? 0 : fail(ZIP_ER_OPEN, EINVAL);
    }

    zip_int64_t read(void* data, zip_uint64_t length) {
        ssize_t count = -1;
        do {
            count = ::read(descriptor_.get(), data, length);
        } while (count < 0 && errno == EINTR);
        if (count < 0) return fail(ZIP_ER_READ, errno);
        if (progress_) progress_(static_cast<std::uint64_t>(count));
        return count;
    }

    zip_int64_t stat(void* data) const {
        auto* status = static_cast<zip_stat_t*>(data);
        ::zip_stat_init(status);
        status->size = item_.size;
        status->valid = ZIP_STAT_SIZE;
        return static_cast<zip_int64_t>(sizeof *status);
    }

    zip_int64_t fail(int zipError, int errorNumber) {
        ::zip_error_set(&error_, zipError, errorNumber);
        return -1;
    }

    PackageItem item_;
    const PackProgress& progress_;
    UniqueFd descriptor_;
    zip_error_t error_ = {};
};

struct ArchiveDiscarder {
    void operator()(zip_t* archive) const noexcept { ::zip_discard(archive); }
};
using Archive = std::unique_ptr<zip_t, ArchiveDiscarder>;

ErrorRecord archiveFailure(zip_error_t* error, const std::string& path) {
    if (::zip_error_system_type(error) == ZIP_ET_SYS) {
        const int code = ::zip_error_code_system(error);
        std::string reason = ::zip_error_strerror(error);
        if (code == ENOSPC || code == EDQUOT) reason += "; free space there, and run it again";
        return posixError(code, "pack", path, reason);
    }
    return cannotPack(PackageErrorCode::Inconsistent, path, ::zip_error_strerror(error));
}

// The extra field that says when an item was changed last; empty when no archive can.
Bytes timesField(const PackageItem& item) {
    if (!item.modified || !std::in_range<std::int32_t>(*item.modified)) return {};
    const auto seconds = static_cast<std::uint32_t>(*item.modified);
    Bytes field = {kHasModificationTime};
    for (unsigned shift = 0; shift < 32; shift += 8) {
        field.push_back(static_cast<std::uint8_t>(seconds >> shift));
    }
    return field;
}

bool setTimes(zip_t* archive, zip_uint64_t place, const PackageItem& item) {
    // The first day that an archive can hold: packages of the same files are the same.
    constexpr zip_uint16_t kDosTime = 0;
    constexpr zip_uint16_t kDosDate = (1U << 5U) | 1U;
    if (::zip_file_set_dostime(archive, place, kDosTime, kDosDate, 0) != 0) return false;
    const Bytes field = timesField(item);
    return field.empty() ||
           ::zip_file_extra_field_set(archive, place, kTimesField, ZIP_EXTRA_FIELD_NEW,
                                      field.data(), static_cast<zip_uint16_t>(field.size()),
                                      ZIP_FL_LOCAL | ZIP_FL_CENTRAL) == 0;
}

Status addItem(zip_t* archive, const PackageItem& item, const PackProgress& progress) {
    zip_int64_t index = -1;
    if (S_ISDIR(item.mode)) {
        index = ::zip_dir_add(archive, item.entryName.c_str(), ZIP_FL_ENC_UTF_8);
    } else if (zip_source_t* source =
                   FileSource::create(item, progress, ::zip_get_error(archive))) {
        index = ::zip_file_add(archive, item.entryName.c_str(), source, ZIP_FL_ENC_UTF_8);
        if (index < 0) ::zip_source_free(source);
    }
    const auto place = static_cast<zip_uint64_t>(index);
    if (index < 0 || !setTimes(archive, place, item) ||
        ::zip_file_set_external_attributes(archive, place, 0, ZIP_OPSYS_UNIX, item.mode << 16U) !=
            0) {
        return archiveFailure(::zip_get_error(archive), item.path);
    }
    return {};
}

// Where libzip is to write: it makes a file beside that, whose name is seven bytes longer.
std::string workPathOf(const std::string& path) {
    constexpr std::size_t kLongestName = NAME_MAX - 7;
    const std::filesystem::path target(path);
    if (target.filename().native().size() <= kLongestName) return path;
    return (target.parent_path() / (".archive-" + std::to_string(::getpid()))).native();
}

Status writeAt(const std::vector<PackageItem>& items, const std::string& path,
               const std::string& name, const PackProgress& progress) {
    zip_error_t error = {};
    int code = 0;
    Archive archive(::zip_open(path.c_str(), ZIP_CREATE | ZIP_TRUNCATE, &code));
    if (!archive) {
        ::zip_error_init_with_code(&error, code);
        const ErrorRecord failure = archiveFailure(&error, name);
        ::zip_error_fini(&error);
        return failure;
    }
    for (const PackageItem& item : items) {
        if (Status status = addItem(archive.get(), item, progress); !status) return status;
    }
    if (::zip_close(archive.get()) != 0)
        return archiveFailure(::zip_get_error(archive.get()), name);
    static_cast<void>(archive.release());
    return {};
}

}  // namespace

Status writeArchive(const std::vector<PackageItem>& items, const std::string& path,
                    const std::string& name, const PackProgress& progress) {
    const std::string work = workPathOf(path);
    Status status = writeAt(items, work, name, progress);
    if (!status || work == path) return status;
    if (::rename(work.c_str(), path.c_str()) == 0) return {};
    const int error = errno;
    ::unlink(work.c_str());
    return posixError(error, "pack", name);
}

Status writeArchive(const std::vector<PackageItem>& items, const std::string& path) {
    return writeArchive(items, path, path, {});
}

}  // namespace appsync
