#pragma once

#include <string>

#include "host/session/Session.h"
#include "platform/Result.h"

namespace appsync {

class Device;

/// One file that a host sends unasked.
struct ParcelContents {
    std::string identifier;
    std::string file;
    bool isRestore = false;
    /// 1, 2 or 3, see AssetParts.
    unsigned parts = 1;
};

/// An application's package, on its way to where packages are received. The version is empty when
/// the package does not tell it.
[[nodiscard]] Session::Parcel packageParcel(const ParcelContents& contents,
                                            const std::string& version);

/// The data of an application whose package waits for it in that version. An archive goes where the
/// device unpacks it with the install; any other file is the data itself. An archive that the
/// device would not unpack is refused.
[[nodiscard]] Result<Session::Parcel> dataParcel(const ParcelContents& contents,
                                                 const std::string& version);

}  // namespace appsync
