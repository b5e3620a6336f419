#include "fuzz/readers/ScratchDirectory.h"

#include <fcntl.h>
#include <stdlib.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <system_error>

namespace appsync {

namespace fs = std::filesystem;

ScratchDirectory::ScratchDirectory()
    : path_(std::string(::access("/dev/shm", W_OK) == 0 ? "/dev/shm" : "/tmp") +
            "/appsync-scratch-XXXXXX") {
    if (::mkdtemp(path_.data()) == nullptr) std::abort();
}

ScratchDirectory::~ScratchDirectory() {
    std::error_code ignored;
    fs::remove_all(path_, ignored);
}

UniqueFd ScratchDirectory::open() const {
    return UniqueFd(::open(path_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
}

std::string ScratchDirectory::findDanger(std::uint64_t& bytes) const {
    constexpr fs::perms kForbidden = fs::perms::set_uid | fs::perms::set_gid |
                                     fs::perms::sticky_bit | fs::perms::group_write |
                                     fs::perms::others_write;
    bytes = 0;
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(path_)) {
        const fs::file_status status = entry.symlink_status();
        if (!fs::is_regular_file(status) && !fs::is_directory(status)) return "an odd kind of file";
        if ((status.permissions() & kForbidden) != fs::perms::none) return "a dangerous mode";
        if (fs::is_regular_file(status)) bytes += entry.file_size();
    }
    return {};
}

UniqueFd fileOf(ByteView bytes) {
    UniqueFd file(::memfd_create("appsync-fuzz", MFD_CLOEXEC));
    if (::write(file.get(), bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size())) {
        std::abort();
    }
    return file;
}

}  // namespace appsync
