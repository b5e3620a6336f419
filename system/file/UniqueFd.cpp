#include "system/file/UniqueFd.h"

#include <cerrno>

#include <unistd.h>

namespace appsync {

void UniqueFd::reset(int descriptor) noexcept {
    const int saved = errno;
    if (descriptor_ >= 0) ::close(descriptor_);
    descriptor_ = descriptor;
    errno = saved;
}

}  // namespace appsync
