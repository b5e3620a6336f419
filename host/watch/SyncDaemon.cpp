#include "host/watch/SyncDaemon.h"

#include <algorithm>
#include <array>
#include <cerrno>

#include "host/plan/TransferError.h"
#include "platform/Error.h"

namespace appsync {
namespace {

bool passes(std::int64_t errorNumber) {
    static constexpr std::array<std::int64_t, 15> kPassing = {
        EIO,       ENOSPC, EDQUOT, EINTR,  EAGAIN, ETIMEDOUT, EPIPE, ECONNRESET,
        ECANCELED, ENOMEM, EMFILE, ENFILE, EBUSY,  ESTALE,    ENODEV};
    return std::find(kPassing.begin(), kPassing.end(), errorNumber) != kPassing.end();
}

}  // namespace

bool SyncDaemon::isRecoverableError(const ErrorRecord& error) const {
    if (error.domain == kTransferErrorDomain) {
        return error.code == kTransferInterrupted || error.code == kTransferCutShort;
    }
    return error.domain == kPosixErrorDomain && passes(error.code);
}

}  // namespace appsync
