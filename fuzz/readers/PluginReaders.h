#pragma once

#include "fuzz/readers/Reading.h"

namespace appsync {

// The files that the plug-in reads, each by a session of it on a device in memory. Of all of them
// it is promised: the session ends, by a clock that shows less than an hour, and breaks no rule of
// platform/; files that are none of its business stay as they are; what it refuses it refuses in
// the log, in the words that it has for that file.

enum class Installs { Direct, Coordinated };

/// The todo list of a staging area. Afterwards it has as many entries as before.
[[nodiscard]] Reading readTodoList(ByteView bytes, Installs installs);

/// The icon layout of a staging area, and the home screen's own order. Every application is asked
/// for, whatever it says.
[[nodiscard]] Reading readIconOrder(ByteView bytes, Installs installs);

/// The applications that a backup brings back. The file is put away.
[[nodiscard]] Reading readRestoreInfo(ByteView bytes, Installs installs);

/// Which of them had been demoted. All come back, whatever it says.
[[nodiscard]] Reading readDemotedApps(ByteView bytes, Installs installs);

/// RestoreState.plist. Afterwards it is gone, or a map.
[[nodiscard]] Reading readRestoreState(ByteView bytes, Installs installs);

/// An application's store metadata, when accounts are asked for and before a backup. That of
/// another application is read all the same.
[[nodiscard]] Reading readStoreMetadata(ByteView bytes, Installs installs);

/// The plug-in's readers by themselves, for tables of readers.
template <Reading (*Read)(ByteView, Installs), Installs Way>
[[nodiscard]] Reading readOnDevice(ByteView bytes) {
    return Read(bytes, Way);
}

}  // namespace appsync
