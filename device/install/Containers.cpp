#include "device/install/Containers.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <array>
#include <cerrno>

#include "device/values/DevicePaths.h"
#include "system/file/PosixError.h"
#include "system/file/RandomBytes.h"
#include "system/file/RootDirectory.h"
#include "system/file/RootedFileSystem.h"

namespace appsync {

namespace {

constexpr mode_t kContainerMode = 0755;

// A random UUID (version 4) in upper case; empty when the system has no random bytes.
std::string makeUuid() {
    std::array<unsigned char, 16> bytes{};
    if (!fillWithRandomBytes(bytes)) return {};
    bytes[6] = static_cast<unsigned char>((bytes[6] & 0x0fU) | 0x40U);
    bytes[8] = static_cast<unsigned char>((bytes[8] & 0x3fU) | 0x80U);
    constexpr std::string_view digits = "0123456789ABCDEF";
    std::string text;
    for (std::size_t index = 0; index < bytes.size(); ++index) {
        if (index == 4 || index == 6 || index == 8 || index == 10) text += '-';
        text += digits[bytes.at(index) >> 4U];
        text += digits[bytes.at(index) & 15U];
    }
    return text;
}

}  // namespace

NewContainer::NewContainer(RootedFileSystem& files, std::string name, UniqueFd directory)
    : files_(files), name_(std::move(name)), directory_(std::move(directory)) {}

NewContainer::NewContainer(NewContainer&& other) noexcept
    : files_(other.files_),
      name_(std::exchange(other.name_, {})),
      directory_(std::move(other.directory_)),
      kept_(other.kept_) {}

NewContainer::~NewContainer() {
    if (!kept_ && !name_.empty()) Containers(files_).remove(name_);
}

bool isSingleName(std::string_view name) noexcept {
    constexpr std::string_view kForbidden("/\0", 2);
    return !name.empty() && name.find_first_of(kForbidden) == name.npos && name != "." &&
           name != "..";
}

Result<NewContainer> Containers::make() {
    const std::string name = makeUuid();
    const std::string path = containerPath(name);
    if (name.empty()) return posixError(errno, "create", path, "no random bytes for its name");
    const Result<ItemPlace> place = files_.root().place(path, "create");
    if (!place) return place.error();
    const int parent = place->directory.get();
    if (::mkdirat(parent, name.c_str(), kContainerMode) != 0) {
        return posixError(errno, "create", path);
    }
    const int flags = O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
    NewContainer container(files_, name, UniqueFd(::openat(parent, name.c_str(), flags)));
    if (container.descriptor() < 0) return posixError(errno, "open", path);
    return container;
}

void Containers::remove(const std::string& name) {
    if (isSingleName(name)) files_.removeItem(containerPath(name)).ignore();
}

Result<std::vector<std::string>> Containers::names() const {
    const std::string path(kContainersDirectory);
    const Result<UniqueFd> directory = files_.root().openDirectoryWithoutLinks(path, "list");
    if (!directory) return directory.error();
    return namesIn(directory->get(), path);
}

}  // namespace appsync
