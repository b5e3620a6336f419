#include "system/ActingAccount.h"

#include <linux/capability.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <array>
#include <cstdint>

namespace appsync {

namespace {

constexpr std::uint32_t bitOf(int capability) { return std::uint32_t{1} << unsigned(capability); }

// Where there are two, the former one cuts numbers off.
#ifdef SYS_setresuid32
constexpr long kSetUsers = SYS_setresuid32;
constexpr long kSetGroups = SYS_setresgid32;
#else
constexpr long kSetUsers = SYS_setresuid;
constexpr long kSetGroups = SYS_setresgid;
#endif

constexpr uid_t kUnchanged = static_cast<uid_t>(-1);

/// Whether the account is this thread's own, and not that of the process.
thread_local bool actsAlone = false;  // NOLINT(cppcoreguidelines-avoid-non-const-global-variables)

// Not that of giving files away: what replaces a file of root's is to be the account's.
constexpr std::uint32_t kKept =
    bitOf(CAP_DAC_OVERRIDE) | bitOf(CAP_DAC_READ_SEARCH) | bitOf(CAP_FOWNER);

// The change of the account has taken them out of effect.
void keepAccess() noexcept {
    __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
    std::array<__user_cap_data_struct, _LINUX_CAPABILITY_U32S_3> sets = {};
    if (::syscall(SYS_capget, &header, sets.data()) != 0) return;
    sets[0].effective |= sets[0].permitted & kKept;
    ::syscall(SYS_capset, &header, sets.data());
}

}  // namespace

void actAs(uid_t user, gid_t group) noexcept {
    if (actsAlone || ::geteuid() != 0 || user == 0) return;
    const gid_t before = ::getegid();
    if (::setegid(group) != 0) return;
    if (::seteuid(user) == 0) {
        keepAccess();
    } else if (::setegid(before) != 0) {
        return;  // the files' group is all that is left to differ
    }
}

// The C library's calls change the account of all threads; the system's own that of the caller.
void actOnThisThreadAs(uid_t user, gid_t group) noexcept {
    if (!actsAlone && ::geteuid() != 0) return;
    const gid_t itsGroup = user == 0 ? ::getgid() : group;
    if (actsAlone && ::geteuid() == user && ::getegid() == itsGroup) return;
    if (::syscall(kSetUsers, kUnchanged, 0, kUnchanged) != 0) return;
    actsAlone = true;
    if (::syscall(kSetGroups, kUnchanged, itsGroup, kUnchanged) != 0) return;
    if (user != 0 && ::syscall(kSetUsers, kUnchanged, user, kUnchanged) == 0) keepAccess();
}

}  // namespace appsync
