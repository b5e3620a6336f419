#pragma once

#include <string_view>

namespace appsync {

/// Domain of errors of a transfer that the host itself finds.
inline constexpr std::string_view kTransferErrorDomain = "AppsyncTransfer";

/// The codes of `kTransferErrorDomain`.
enum TransferErrorCode : int {
    kTransferInterrupted = 1,  // the person stopped it: recoverable
    kTransferNoPackage = 2,    // the library has no package of that identifier
    kTransferIllegalName = 3,  // no legal identifier
    kTransferCutShort = 4,     // the package became shorter while it was sent: recoverable
    kTransferCancelled = 5,    // the device wants it no more
    kTransferNotUnderWay = 6,  // what the device speaks of is not to be sent
    kTransferNotTaken = 7,     // the device made nothing of what it was sent
};

}  // namespace appsync
