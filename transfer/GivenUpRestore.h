#pragma once

#include <string>

#include "client/Log.h"
#include "platform/BackupService.h"

namespace appsync {

/// Gives up the restore of an application whose package came to nothing: the backup service cancels
/// it, or, where installs are coordinated, `whereCoordinated` says that nobody has to. No restore
/// comes here today; one that did would have its restore given up.
inline void giveUpRestore(BackupManager& backup, bool isCoordinated, const Log& log,
                          const std::string& identifier,
                          LogFormat<true, std::string> whereCoordinated) {
    if (isCoordinated) {
        log(Level::Default, whereCoordinated, identifier);
    } else {
        backup.cancelApplicationRestore(identifier);
    }
}

}  // namespace appsync
