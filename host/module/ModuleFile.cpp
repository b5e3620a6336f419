#include "host/module/ModuleFile.h"

#include <elf.h>

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstring>
#include <optional>
#include <string_view>
#include <type_traits>
#include <utility>
#include <vector>

#include "host/console/Problem.h"
#include "host/console/Text.h"
#include "host/file/HostFile.h"
#include "platform/Bytes.h"
#include "system/file/PosixError.h"

namespace appsync {
namespace {

constexpr bool kHas64Bits = sizeof(void*) == 8;
using ElfHeader = std::conditional_t<kHas64Bits, Elf64_Ehdr, Elf32_Ehdr>;
using ElfSegment = std::conditional_t<kHas64Bits, Elf64_Phdr, Elf32_Phdr>;

constexpr const char* kNameAnother = "name a build of appsync-plugin.so";

// The start of a file that the headers of a shared object stand in.
struct FileStart {
    Bytes bytes;
    std::uint64_t fileSize = 0;

    template <typename Record>
    [[nodiscard]] std::optional<Record> at(std::uint64_t offset) const {
        if (offset > bytes.size() || bytes.size() - offset < sizeof(Record)) return std::nullopt;
        Record record;
        std::memcpy(&record, bytes.data() + offset, sizeof(Record));
        return record;
    }
};

// What tells for which machines a file was built.
struct MachineKind {
    unsigned bits = 0;
    unsigned byteOrder = 0;
    unsigned machine = 0;

    friend bool operator==(const MachineKind&, const MachineKind&) = default;
};

Result<FileStart> readStart(const std::string& path) {
    constexpr std::uint64_t kLongestStart = 65'536;
    Result<HostFile> file = HostFile::open(path);
    if (!file) return file.error();
    FileStart start;
    start.fileSize = file->size();
    start.bytes.resize(std::min(file->size(), kLongestStart));
    std::size_t length = 0;
    while (length < start.bytes.size()) {
        const Result<std::size_t> count = file->read(std::span(start.bytes).subspan(length));
        if (!count) return count.error();
        if (*count == 0) break;
        length += *count;
    }
    start.bytes.resize(length);
    return start;
}

bool isElf(const FileStart& start) {
    constexpr std::string_view kMagic(ELFMAG, SELFMAG);
    return start.bytes.size() >= EI_NIDENT + 4 &&
           std::memcmp(start.bytes.data(), kMagic.data(), kMagic.size()) == 0;
}

// Of any machine's file: the fields stand at the same place in all, in the machine's byte order.
MachineKind machineOf(const FileStart& start) {
    constexpr std::size_t kMachineOffset = EI_NIDENT + 2;
    MachineKind kind;
    kind.bits = start.bytes[EI_CLASS] == ELFCLASS64 ? 64 : 32;
    kind.byteOrder = start.bytes[EI_DATA];
    const unsigned first = start.bytes[kMachineOffset];
    const unsigned second = start.bytes[kMachineOffset + 1];
    kind.machine = kind.byteOrder == ELFDATA2MSB ? first * 256 + second : second * 256 + first;
    return kind;
}

std::string machineName(const MachineKind& kind) {
    static constexpr std::array<std::pair<unsigned, const char*>, 7> kNames = {{
        {EM_386, "x86"},
        {EM_X86_64, "x86-64"},
        {EM_ARM, "ARM"},
        {EM_AARCH64, "AArch64"},
        {EM_RISCV, "RISC-V"},
        {EM_PPC64, "POWER"},
        {EM_MIPS, "MIPS"},
    }};
    std::string name = "machine " + std::to_string(kind.machine);
    for (const auto& [machine, known] : kNames) {
        if (machine == kind.machine) name = known;
    }
    return name + " with " + std::to_string(kind.bits) + " bits" +
           (kind.byteOrder == ELFDATA2MSB ? ", big-endian" : "");
}

// This program's own; nothing where the system does not show it.
std::optional<MachineKind> ownMachine() {
    const Result<FileStart> program = readStart("/proc/self/exe");
    if (!program || !isElf(*program)) return std::nullopt;
    return machineOf(*program);
}

// How long the file must be for what its headers speak of; nothing where they are no good.
std::optional<std::uint64_t> wantedSize(const FileStart& start) {
    const auto header = start.at<ElfHeader>(0);
    if (!header || header->e_phentsize != sizeof(ElfSegment)) return std::nullopt;
    std::uint64_t size = 0;
    for (unsigned index = 0; index < header->e_phnum; ++index) {
        const auto segment = start.at<ElfSegment>(header->e_phoff + index * sizeof(ElfSegment));
        if (!segment) return std::nullopt;
        if (segment->p_type != PT_LOAD) continue;
        if (segment->p_filesz > UINT64_MAX - segment->p_offset) return std::nullopt;
        size = std::max<std::uint64_t>(size, segment->p_offset + segment->p_filesz);
    }
    return size;
}

}  // namespace

Status checkModuleFile(const std::string& path) {
    const std::string shown = displayPath(path);
    const Result<FileStart> start = readStart(path);
    if (!start) return unusable(start.error());
    if (!isElf(*start)) return unusable(shown + " is no shared object", kNameAnother);
    const MachineKind kind = machineOf(*start);
    if (const auto own = ownMachine(); own && *own != kind) {
        return unusable(shown + " is built for " + machineName(kind) + ", and this command for " +
                            machineName(*own),
                        "name a build for this machine");
    }
    const std::optional<std::uint64_t> wanted = wantedSize(*start);
    if (!wanted) return unusable(shown + " is a damaged shared object", "copy it anew");
    if (*wanted > start->fileSize) {
        return unusable(shown + " is cut short: it has " + std::to_string(start->fileSize) +
                            " bytes of at least " + std::to_string(*wanted),
                        "copy it anew");
    }
    return {};
}

}  // namespace appsync
