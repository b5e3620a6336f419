#pragma once

#include "platform/Bytes.h"

namespace appsync {

// Small files, good ones, of each kind that the system reads: a few hundred bytes with everything
// in them that the kind knows.

[[nodiscard]] Bytes smallXmlList();
[[nodiscard]] Bytes smallBinaryList();
[[nodiscard]] Bytes smallJsonList();
[[nodiscard]] Bytes smallPackage();
[[nodiscard]] Bytes smallDataArchive();
[[nodiscard]] Bytes smallIcon();
[[nodiscard]] Bytes smallManifest();
[[nodiscard]] Bytes smallRecording();
/// What an index says after its sum.
[[nodiscard]] Bytes smallLibraryIndex();
[[nodiscard]] Bytes smallTodoList();
[[nodiscard]] Bytes smallIconOrder();
[[nodiscard]] Bytes smallRestoreInfo();
[[nodiscard]] Bytes smallDemotedApps();
[[nodiscard]] Bytes smallRestoreState();
[[nodiscard]] Bytes smallStoreMetadata();

}  // namespace appsync
