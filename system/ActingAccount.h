#pragma once

#include <sys/types.h>

namespace appsync {

/// Lets this process, where it is root's, act as that account from now on, all of its threads:
/// what it makes belongs to the account. What root may read, write and remove it still may, on
/// this thread and those that it starts. Nothing happens in a process of anybody else, for the
/// account of root, and where the system does not know the account.
void actAs(uid_t user, gid_t group) noexcept;

/// The same for this thread alone and those that it starts. It may be told of another account
/// later, that of root too; `actAs` leaves it as it is.
void actOnThisThreadAs(uid_t user, gid_t group) noexcept;

}  // namespace appsync
